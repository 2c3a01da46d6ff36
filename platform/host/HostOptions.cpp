#include "HostOptions.h"

#include <QCommandLineParser>
#include <QRegularExpression>

#include <arpa/inet.h>

namespace {

bool parseListen(const QString& text, QString* host, quint16* port) {
    const int colon = text.lastIndexOf(QLatin1Char(':'));
    if (colon <= 0)
        return false;
    QString address = text.left(colon);
    if (address.startsWith(QLatin1Char('[')) && address.endsWith(QLatin1Char(']')))
        address = address.mid(1, address.size() - 2);
    bool ok = false;
    const uint number = text.mid(colon + 1).toUInt(&ok);
    if (!ok || number > 65535 || address.isEmpty())
        return false;
    *host = address;
    *port = static_cast<quint16>(number);
    return true;
}

// A host name or an IP address, as it may stand before the port in a Host header.
bool isHostName(const QString& name) {
    if (name.contains(QLatin1Char(':'))) {
        QString address = name;
        if (address.startsWith(QLatin1Char('[')) && address.endsWith(QLatin1Char(']')))
            address = address.mid(1, address.size() - 2);
        in6_addr parsed{};
        return inet_pton(AF_INET6, address.toLatin1().constData(), &parsed) == 1;
    }
    static const QRegularExpression hostName(QStringLiteral("^[A-Za-z0-9._-]+$"));
    return hostName.match(name).hasMatch();
}

} // namespace

bool HostOptions::parse(const QStringList& arguments, QString* error) {
    QCommandLineParser parser;
    const QCommandLineOption help(QStringList{QStringLiteral("h"), QStringLiteral("help")});
    const QCommandLineOption plugins(QStringLiteral("plugins"), QString(), QStringLiteral("DIR"));
    const QCommandLineOption vca(QStringLiteral("vca-dir"), QString(), QStringLiteral("DIR"));
    const QCommandLineOption timeout(QStringLiteral("timeout-ms"), QString(), QStringLiteral("N"));
    const QCommandLineOption listen(QStringLiteral("listen"), QString(),
                                    QStringLiteral("HOST:PORT"));
    const QCommandLineOption allowHost(QStringLiteral("allow-host"), QString(),
                                       QStringLiteral("NAME"));
    const QCommandLineOption token(QStringLiteral("token-file"), QString(), QStringLiteral("FILE"));
    const QCommandLineOption verboseOption(QStringLiteral("verbose"));
    parser.addOptions({help, plugins, vca, timeout, listen, allowHost, token, verboseOption});
    if (!parser.parse(QStringList{QStringLiteral("quenvar-host")} + arguments)) {
        *error = parser.errorText();
        return false;
    }
    if (parser.isSet(help)) {
        mode = Mode::Help;
        return true;
    }

    QStringList positional = parser.positionalArguments();
    if (positional.isEmpty()) {
        *error = QStringLiteral("missing the mode, request or serve");
        return false;
    }
    const QString modeName = positional.takeFirst();
    if (modeName == QStringLiteral("request")) {
        mode = Mode::Request;
    } else if (modeName == QStringLiteral("serve")) {
        mode = Mode::Serve;
    } else {
        *error = QStringLiteral("unknown mode \"%1\"").arg(modeName);
        return false;
    }

    pluginDir = parser.value(plugins);
    vcaDir = parser.value(vca);
    verbose = parser.isSet(verboseOption);
    if ((parser.isSet(plugins) && pluginDir.isEmpty()) || (parser.isSet(vca) && vcaDir.isEmpty())) {
        *error = QStringLiteral("a folder option needs a folder");
        return false;
    }

    if (mode == Mode::Request) {
        for (const QCommandLineOption& option : {listen, allowHost, token}) {
            if (parser.isSet(option)) {
                *error = QStringLiteral("--%1 belongs to serve").arg(option.names().first());
                return false;
            }
        }
        if (parser.isSet(timeout)) {
            bool ok = false;
            timeoutMs = parser.value(timeout).toInt(&ok);
            if (!ok || timeoutMs <= 0) {
                *error = QStringLiteral("--timeout-ms needs a positive number of milliseconds, "
                                        "not \"%1\"")
                             .arg(parser.value(timeout));
                return false;
            }
        }
        if (positional.isEmpty() || positional.size() > 2) {
            *error = positional.isEmpty() ? QStringLiteral("missing the COMMAND")
                                          : QStringLiteral("too many arguments");
            return false;
        }
        command = positional.at(0);
        hasParams = positional.size() == 2;
        if (hasParams)
            paramsJson = positional.at(1).toUtf8();
        return true;
    }

    if (parser.isSet(timeout)) {
        *error = QStringLiteral("--timeout-ms belongs to request");
        return false;
    }
    if (!positional.isEmpty()) {
        *error = QStringLiteral("serve takes no arguments");
        return false;
    }
    if (parser.isSet(listen) && !parseListen(parser.value(listen), &listenHost, &listenPort)) {
        *error = QStringLiteral("--listen needs HOST:PORT, not \"%1\"").arg(parser.value(listen));
        return false;
    }
    allowedHosts = parser.values(allowHost);
    for (const QString& name : std::as_const(allowedHosts)) {
        if (!isHostName(name)) {
            *error = QStringLiteral("--allow-host needs a host name or address without a port, "
                                    "not \"%1\"")
                         .arg(name);
            return false;
        }
    }
    tokenFile = parser.value(token);
    if (parser.isSet(token) && tokenFile.isEmpty()) {
        *error = QStringLiteral("--token-file needs a file");
        return false;
    }
    return true;
}

QString HostOptions::usage() {
    return QStringLiteral(
        "usage: quenvar-host request [--plugins DIR] [--vca-dir DIR] [--timeout-ms N] [--verbose]\n"
        "                            COMMAND [PARAMS_JSON]\n"
        "       quenvar-host serve [--plugins DIR] [--vca-dir DIR] [--listen HOST:PORT]\n"
        "                          [--allow-host NAME]... [--token-file FILE] [--verbose]\n"
        "\n"
        "request  sends one client request to PluginQuenvar and prints its answer as\n"
        "         {\"handled\":B,\"code\":S,\"message\":S,\"payload\":P}; exit status 0 when\n"
        "         answered, 3 with {\"answered\":false} when nothing answers within N ms\n"
        "         (default 30000), 2 for a usage error\n"
        "serve    serves POST /api/request, GET /api/events?subscriber=ID (Server-Sent Events)\n"
        "         and GET /api/plugins on HOST:PORT (default 127.0.0.1:8700; port 0 picks a\n"
        "         free one) to requests with Authorization: Bearer TOKEN, TOKEN from\n"
        "         QUENVAR_HOST_TOKEN (16 characters or more) or made for the run and printed\n"
        "         as the second line, \"token: TOKEN\"\n"
        "\n"
        "--plugins DIR      the plugin folder (default: the plugins folder beside the\n"
        "                   executable's)\n"
        "--vca-dir DIR      the simulated VCA plugin's data folder (sets VCASIM_DIR)\n"
        "--allow-host NAME  serve requests whose Host is NAME:PORT too (repeatable); the\n"
        "                   loopback names and the listen address always are\n"
        "--token-file FILE  also write the token to FILE, readable by the owner only\n"
        "--verbose          logging level 5: the plugins' and the host's traces\n");
}
