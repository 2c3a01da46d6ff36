// quenvar-host: loads the plugins of a folder and serves client requests to PluginQuenvar from
// the command line (request) or over HTTP (serve).
#include "AccessToken.h"
#include "CommandLineFront.h"
#include "FrontGate.h"
#include "HostJson.h"
#include "HostLog.h"
#include "HostOptions.h"
#include "HttpFront.h"
#include "PluginHost.h"
#include "QuitOnSignal.h"

#include <QCoreApplication>
#include <QDir>

#include <csignal>
#include <cstdio>
#include <memory>

namespace {

const QString QUENVAR_PLUGIN_ID = QStringLiteral("4a6c7db2eaf84341b0a1e30507161c73");
const int EXIT_FAILED = 1;
const int EXIT_USAGE = 2;
const char TOKEN_VARIABLE[] = "QUENVAR_HOST_TOKEN";

void print(FILE* stream, const QString& text) {
    const QByteArray bytes = text.toLocal8Bit();
    std::fwrite(bytes.constData(), 1, static_cast<size_t>(bytes.size()), stream);
    std::fflush(stream);
}

int usageError(const QString& message) {
    print(stderr, QStringLiteral("quenvar-host: %1\n%2").arg(message, HostOptions::usage()));
    return EXIT_USAGE;
}

// The token of serve, and whether it was made here (and so is to be printed).
struct ServeToken {
    QByteArray value;
    bool generated = false;
};

bool takeToken(ServeToken* token, QString* error) {
    if (!qEnvironmentVariableIsSet(TOKEN_VARIABLE)) {
        *token = ServeToken{AccessToken::generate(), true};
        return true;
    }
    *token = ServeToken{qgetenv(TOKEN_VARIABLE), false};
    // The plugins and anything they start need not see it.
    qunsetenv(TOKEN_VARIABLE);
    if (AccessToken::acceptable(token->value, error))
        return true;
    *error = QStringLiteral("%1: %2").arg(QLatin1String(TOKEN_VARIABLE), *error);
    return false;
}

// How the front's own address appears in a URL and a Host header.
QString urlHost(const QString& address) {
    return address.contains(QLatin1Char(':')) ? QLatin1Char('[') + address + QLatin1Char(']')
                                              : address;
}

int serve(PluginHost& host, IPluginObjectBase& plugin, const HostOptions& options,
          const ServeToken& token, const QuitOnSignal& quitOnSignal) {
    HttpFront front(host, plugin);
    QString error;
    const bool started =
        front.listen(options.listenHost, options.listenPort, &error) &&
        (options.tokenFile.isEmpty() ||
         AccessToken::writeFile(options.tokenFile, token.value, &error)) &&
        front.start(FrontGate(token.value, QStringList{options.listenHost} + options.allowedHosts,
                              front.port()),
                    &error);
    if (!started) {
        hostLog().print(KalbLogClient::Failure, __FILE__, __LINE__, "%s", qUtf8Printable(error));
        return EXIT_FAILED;
    }
    print(stdout, QStringLiteral("listening on http://%1:%2\n")
                      .arg(urlHost(options.listenHost))
                      .arg(front.port()));
    if (token.generated)
        print(stdout, QStringLiteral("token: %1\n").arg(QString::fromLatin1(token.value)));
    if (!quitOnSignal.received())
        QCoreApplication::exec();
    front.stop();
    return 0;
}

} // namespace

int main(int argc, char** argv) {
    // A client that goes away mid-answer must not end the server.
    std::signal(SIGPIPE, SIG_IGN);
    QCoreApplication app(argc, argv);

    HostOptions options;
    QString error;
    if (!options.parse(QCoreApplication::arguments().mid(1), &error))
        return usageError(error);
    if (options.mode == HostOptions::Mode::Help) {
        print(stdout, HostOptions::usage());
        return 0;
    }
    // From here on, serve ends cleanly on SIGINT and SIGTERM, however many come.
    std::unique_ptr<QuitOnSignal> quitOnSignal;
    ServeToken token;
    if (options.mode == HostOptions::Mode::Serve) {
        quitOnSignal = std::make_unique<QuitOnSignal>();
        if (!takeToken(&token, &error)) {
            print(stderr, QStringLiteral("quenvar-host: %1\n").arg(error));
            return EXIT_USAGE;
        }
    }
    QVariant params;
    if (options.hasParams && !HostJson::parseParameter(options.paramsJson, &params, &error))
        return usageError(QStringLiteral("PARAMS_JSON is %1").arg(error));

    // The logging library reads its level when first used, which loading the plugins does.
    if (options.verbose)
        qputenv("KALBLOG_LEVEL", "5");
    if (!options.vcaDir.isEmpty())
        qputenv("VCASIM_DIR", QDir(options.vcaDir).absolutePath().toLocal8Bit());
    const QString pluginDir = options.pluginDir.isEmpty()
                                  ? QDir::cleanPath(QCoreApplication::applicationDirPath() +
                                                    QStringLiteral("/../plugins"))
                                  : options.pluginDir;

    PluginHost host;
    host.loadFolder(pluginDir);
    const LoadedPlugin* quenvar = host.plugin(QUENVAR_PLUGIN_ID);
    if (!quenvar) {
        hostLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s",
            qUtf8Printable(QStringLiteral("no PluginQuenvar (PluginID %1) in the plugin folder %2")
                               .arg(QUENVAR_PLUGIN_ID, pluginDir)));
        return EXIT_USAGE;
    }
    host.start();

    if (options.mode == HostOptions::Mode::Serve)
        return serve(host, *quenvar->object, options, token, *quitOnSignal);
    return CommandLineFront(*quenvar->object).run(options.command, params, options.timeoutMs);
}
