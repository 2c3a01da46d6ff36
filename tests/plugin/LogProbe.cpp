#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>
#include <QStringList>

#include <cstdio>

// Usage: log-probe                            initialises and destroys the plugin
//        log-probe rules                      fails a live and two recording rule requests
//        log-probe COMMAND HOST ok|fail [PART...]
//                                             completes one camera request with the parts (a
//                                             list for the preset list, the first otherwise)
// Answers go to standard error, where the logging library writes when no file is set, so that
// a test sees both in order.
int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    const QStringList arguments = app.arguments().mid(1);
    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    if (!plugin.InitialPluginBase(&tools))
        return 1;
    if (arguments.isEmpty())
        return 0;

    const ResponseCallback print = [](bool handled, const QString& code, const QString&,
                                      const QVariant&) {
        std::fprintf(stderr, "answer %d %s\n", handled ? 1 : 0, qPrintable(code));
    };
    if (arguments[0] == QStringLiteral("rules")) {
        const QVariantMap recording{{"locationIDs", QStringList{"L1"}}, {"timestamp", 1}};
        plugin.Request("retrieveVcaRawRuleInfo", QStringLiteral("cam"), {}, print);
        plugin.Request("getRecordingVCARule", recording, {}, print);
        plugin.Request("getRecordingVCARule", recording, {}, print);
        tools.channel.reply(0, true, QString(), "relay", "80000404", QString(), true);
        tools.channel.reply(1, true, QString(), "relay", "80000001", "<x/>", true);
        tools.channel.reply(2, true, QString(), "relay", "0", "not xml", true);
        return tools.channel.count() == 3 ? 0 : 3;
    }
    if (arguments.size() < 3)
        return 2;
    const auto camera = std::make_shared<FakeCameraProxy>();
    plugin.setCameraProxy(camera);
    plugin.Request(arguments[0], QVariantMap{{"host", arguments[1]}}, {}, print);
    if (camera->calls.size() != 1)
        return 3;
    const QStringList parts = arguments.mid(3);
    const QVariant answer = arguments[0] == QStringLiteral("getSmartTrackingAdvPresetList")
                                ? QVariant(parts)
                                : QVariant(parts.value(0));
    camera->calls[0].complete(arguments[2] == QStringLiteral("ok"), answer);
    return 0;
}
