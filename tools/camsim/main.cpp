// quenvar-camsim: a simulated PTZ camera for the demo and for end-to-end tests.
#include "CameraSimulator.h"
#include "CamsimOptions.h"

#include <QCommandLineParser>
#include <QCoreApplication>

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <iostream>

namespace {

const char DESCRIPTION[] = R"(A simulated PTZ camera speaking its CGI interface over HTTP(S).

The first line on standard output is "listening on http://HOST:PORT" (https with --tls-cert);
port 0 picks a free port.

Camera endpoints (authenticated with --auth, logged with --log):
  GET  /cgi-bin/admin/getparam.cgi?camctrl     camctrl_c0_idleaction_* as name='value' lines
  POST /cgi-bin/admin/setparam.cgi             sets them from a form body
  GET  /cgi-bin/camctrl/camctrl.cgi?getratio&getmaxratio      zoom=... and maxratio=... lines
       ...?x=X&y=Y&videosize=WxH&resolution=WxH&stretch=1     records the centring request
       ...?setptmode=nonblock&setratio=R                      sets the zoom (1 to maxratio)
       ...?vx=0&vy=0&vs=0&zoom=stop&zs=0&auto=stop            counts a stop
       ...?ptztrack=getCurrentType                            ptztrack_type=... line
       ...?ptztrack=track&name=N                              records N as the last preset
  POST /cgi-bin/camctrl/camctrl.cgi  ptztrack=setSmartTracking|setAutoTracking
  GET  /VCA/PTZAdv/PresetWithRule              JSON: PresetInfo entries with Name and HasRule
  Any other path answers 404 with a text body.

Request log (--log FILE): one line per authenticated camera request,
  METHOD<TAB>TARGET<TAB>BODY
where TARGET is the request target as received (path, and "?" and the raw query if any) and
BODY has backslash, LF, CR and TAB escaped as \\, \n, \r and \t. Credentials are never logged.

Test control (no authentication, never logged):
  GET  /_sim/state    the camera state as JSON: zoom, maxratio, idleEnable, idleType,
                      idleInterval, trackingType, lastPreset, stopCount,
                      center {x, y, videosize, resolution}
  POST /_sim/fault    form body mode=none|status|delay|close|oversize [status=N] [delayMs=N]
                      [bytes=N]; replaces the current fault, unnamed values take their defaults

Faults (after authentication and logging, for every camera request; --fault and --fault-*
set the one at start, /_sim/fault changes it):
  status    answer with status N (default 500) and a short text body
  delay     wait N ms (default 15000), then answer normally
  close     send the headers and part of the body, then close the connection
  oversize  answer a body of N bytes (default 9437184))";

bool fail(const QString& message) {
    std::cerr << "quenvar-camsim: " << message.toStdString() << std::endl;
    return false;
}

bool parseListen(const QString& listen, CamsimOptions* options) {
    const qsizetype colon = listen.lastIndexOf(QLatin1Char(':'));
    bool portOk = false;
    const int port = colon < 0 ? -1 : listen.mid(colon + 1).toInt(&portOk);
    if (!portOk || port < 0 || port > 65535)
        return fail(QStringLiteral("--listen wants HOST:PORT, got ") + listen);
    QString host = listen.left(colon);
    if (host.startsWith(QLatin1Char('[')) && host.endsWith(QLatin1Char(']')))
        host = host.mid(1, host.size() - 2);
    options->host = host.toStdString();
    options->port = port;
    return true;
}

bool parseNumber(const QCommandLineParser& parser, const QString& name, long long* value) {
    if (!parser.isSet(name))
        return true;
    bool ok = false;
    *value = parser.value(name).toLongLong(&ok);
    return ok && *value >= 0
               ? true
               : fail(QStringLiteral("--%1 wants a number, got %2").arg(name, parser.value(name)));
}

bool parseOptions(const QCoreApplication& app, CamsimOptions* options) {
    QCommandLineParser parser;
    parser.setApplicationDescription(QString::fromUtf8(DESCRIPTION));
    parser.addHelpOption();
    parser.addOptions({
        {QStringLiteral("listen"), QStringLiteral("Address to listen on (default 127.0.0.1:0)."),
         QStringLiteral("HOST:PORT"), QStringLiteral("127.0.0.1:0")},
        {QStringLiteral("auth"), QStringLiteral("none, basic or digest (default none)."),
         QStringLiteral("SCHEME"), QStringLiteral("none")},
        {QStringLiteral("user"), QStringLiteral("User name (default admin)."), QStringLiteral("U"),
         QStringLiteral("admin")},
        {QStringLiteral("pass"), QStringLiteral("Password (default admin)."), QStringLiteral("P"),
         QStringLiteral("admin")},
        {QStringLiteral("tls-cert"), QStringLiteral("PEM certificate: serve HTTPS."),
         QStringLiteral("F")},
        {QStringLiteral("tls-key"), QStringLiteral("PEM private key of --tls-cert."),
         QStringLiteral("F")},
        {QStringLiteral("log"), QStringLiteral("Append the request log to this file."),
         QStringLiteral("FILE")},
        {QStringLiteral("fault"), QStringLiteral("none, status, delay, close or oversize."),
         QStringLiteral("MODE"), QStringLiteral("none")},
        {QStringLiteral("fault-status"), QStringLiteral("Status of the status fault."),
         QStringLiteral("N")},
        {QStringLiteral("fault-delay-ms"), QStringLiteral("Wait of the delay fault."),
         QStringLiteral("N")},
        {QStringLiteral("fault-bytes"), QStringLiteral("Body length of the oversize fault."),
         QStringLiteral("N")},
    });
    parser.process(app);

    if (!parseListen(parser.value(QStringLiteral("listen")), options))
        return false;
    if (!CamsimAuth::parseScheme(parser.value(QStringLiteral("auth")).toStdString(),
                                 &options->auth))
        return fail(QStringLiteral("--auth wants none, basic or digest"));
    options->user = parser.value(QStringLiteral("user")).toStdString();
    options->password = parser.value(QStringLiteral("pass")).toStdString();
    options->tlsCert = parser.value(QStringLiteral("tls-cert")).toStdString();
    options->tlsKey = parser.value(QStringLiteral("tls-key")).toStdString();
    if (options->tlsCert.empty() != options->tlsKey.empty())
        return fail(QStringLiteral("--tls-cert and --tls-key go together"));
    options->logFile = parser.value(QStringLiteral("log")).toStdString();

    CamsimFault& fault = options->fault;
    if (!CamsimFault::parseMode(parser.value(QStringLiteral("fault")).toStdString(), &fault.mode))
        return fail(QStringLiteral("--fault wants none, status, delay, close or oversize"));
    long long status = fault.status;
    long long delayMs = fault.delayMs;
    if (!parseNumber(parser, QStringLiteral("fault-status"), &status) ||
        !parseNumber(parser, QStringLiteral("fault-delay-ms"), &delayMs) ||
        !parseNumber(parser, QStringLiteral("fault-bytes"), &fault.bytes))
        return false;
    if (status < 200 || status > 599)
        return fail(QStringLiteral("--fault-status wants a status from 200 to 599"));
    fault.status = static_cast<int>(status);
    fault.delayMs = static_cast<int>(std::min<long long>(delayMs, 24LL * 3600 * 1000));
    return true;
}

} // namespace

int main(int argc, char** argv) {
#if !defined(_WIN32)
    // A client that goes away mid-answer must not end the simulator.
    std::signal(SIGPIPE, SIG_IGN);
#endif
    QCoreApplication app(argc, argv);
    QCoreApplication::setApplicationName(QStringLiteral("quenvar-camsim"));
    CamsimOptions options;
    if (!parseOptions(app, &options))
        return 2;

    CameraSimulator simulator(options);
    std::string error;
    if (!simulator.bind(&error)) {
        fail(QString::fromStdString(error));
        return 1;
    }
    std::cout << "listening on " << simulator.url() << std::endl;
    simulator.run();
    return 0;
}
