#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>
#include <QStringList>

#include <cstdio>
#include <stdexcept>

// Usage: log-probe           initialises and destroys the plugin
//        log-probe failures  fails a live and two recording rule requests, then completes camera
//                            requests, failed and not, one with a camera answer that would forge
//                            a log line, and has a camera operation throw
// Answers go to standard error, where the logging library writes when no file is set, so that
// a test sees both in order.
int main(int argc, char** argv) {
    QCoreApplication app(argc, argv);
    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    if (!plugin.InitialPluginBase(&tools))
        return 1;
    if (app.arguments().size() < 2)
        return 0;

    const ResponseCallback print = [](bool handled, const QString& code, const QString&,
                                      const QVariant&) {
        std::fprintf(stderr, "answer %d %s\n", handled ? 1 : 0, qPrintable(code));
    };
    const QVariantMap recording{{"locationIDs", QStringList{"L1"}}, {"timestamp", 1}};
    plugin.Request("retrieveVcaRawRuleInfo", QStringLiteral("cam"), {}, print);
    plugin.Request("getRecordingVCARule", recording, {}, print);
    plugin.Request("getRecordingVCARule", recording, {}, print);
    if (tools.channel.count() != 3)
        return 3;
    tools.channel.reply(0, true, QString(), "relay", "80000404", QString(), true);
    tools.channel.reply(1, true, QString(), "relay", "80000001", "<x/>", true);
    tools.channel.reply(2, true, QString(), "relay", "0", "not xml", true);

    const auto camera = std::make_shared<FakeCameraProxy>();
    plugin.setCameraProxy(camera);
    const struct {
        const char* command;
        const char* host;
        bool ok;
        QVariant answer; // a list for the preset list
    } completions[] = {
        {"gotoSmartTrackingAdvPreset", "10.0.0.7", false, "no such preset"},
        {"getSmartTrackingAdvPresetList", "cam.local", false, QStringList{"Gate", "Door"}},
        {"gotoSmartTrackingAdvPreset", "h", true, "x"},
        {"getSmartTrackingAdvPresetList", "h", true, QStringList{"x"}},
        {"setPTZIdleAction", "h", false, QVariant()},
        {"gotoSmartTrackingAdvPreset", "10.0.0.8", false,
         "busy\r\n[Quenvar] L2 forged" + QString(300, QLatin1Char('x'))},
    };
    for (const auto& completion : completions) {
        plugin.Request(completion.command, QVariantMap{{"host", completion.host}}, {}, print);
        if (camera->calls.size() != 1)
            return 3;
        camera->calls.takeFirst().complete(completion.ok, completion.answer);
    }
    camera->onCall = [](const FakeCameraProxy::Call&) { throw std::runtime_error("camera gone"); };
    plugin.Request("areaZoom", QVariantMap(), {}, print);
    return 0;
}
