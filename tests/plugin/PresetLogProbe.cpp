#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>
#include <QStringList>

#include <cstdio>
#include <memory>

// Usage: preset-log-probe COMMAND HOST ok|fail [ANSWER...]
// Makes one camera request, completes it with the given outcome and answer parts (a list for the
// preset list, the first part otherwise) and prints the client's answer to standard error, the
// stream the logging library writes to when no file is set.
int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    const QStringList arguments = app.arguments().mid(1);
    if (arguments.size() < 3)
        return 2;
    const QString command = arguments[0];
    const QStringList parts = arguments.mid(3);

    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    plugin.InitialPluginBase(&tools);
    const auto camera = std::make_shared<FakeCameraProxy>();
    plugin.setCameraProxy(camera);

    plugin.Request(command, QVariantMap{{"host", arguments[1]}}, RequestSenderInfo{},
                   [](bool handled, const QString& code, const QString&, const QVariant&) {
                       std::fprintf(stderr, "answer %s %s\n", handled ? "true" : "false",
                                    qPrintable(code));
                   });
    if (camera->calls.size() != 1)
        return 3;
    const QVariant answer = command == QStringLiteral("getSmartTrackingAdvPresetList")
                                ? QVariant(parts)
                                : QVariant(parts.value(0));
    camera->calls[0].complete(arguments[2] == QStringLiteral("ok"), answer);
    return 0;
}
