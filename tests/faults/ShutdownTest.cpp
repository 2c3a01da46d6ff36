// The plugin destroyed while camera operations and rule requests are still in flight.
#include "AnswerLedger.h"
#include "CameraCommands.h"
#include "CamsimProcess.h"
#include "EventLoopWait.h"
#include "FakeFrameworkTools.h"
#include "PluginQuenvar.h"

#include <QCoreApplication>

#include <gtest/gtest.h>

#include <memory>

namespace {

const int CAMERA_OPERATIONS = 1000;
const int RULE_REQUESTS = 100;

} // namespace

TEST(ShutdownTest, DestroyedPluginHasAnsweredAllItsWorkAndAnswersNothingLater) {
    // A camera that holds every request long past the test.
    CamsimProcess camsim({"--fault", "delay", "--fault-delay-ms", "60000"});
    ASSERT_NE(camsim.port(), 0) << qPrintable(camsim.error());
    FakeFrameworkTools tools;
    auto plugin = std::make_unique<PluginQuenvar>();
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    AnswerLedger ledger;

    const auto& commands = cameraCommands();
    for (int i = 0; i < CAMERA_OPERATIONS; ++i) {
        const CameraCommand& command = commands.at(i % commands.size());
        plugin->Request(command.name, command.to(camsim.port()), RequestSenderInfo(),
                        ledger.callback(i));
    }
    for (int i = CAMERA_OPERATIONS; i < CAMERA_OPERATIONS + RULE_REQUESTS; ++i) {
        const bool live = i % 2 == 0;
        plugin->Request(live ? "retrieveVcaRawRuleInfo" : "getRecordingVCARule",
                        live ? QVariant("cam1")
                             : QVariantMap{{"locationIDs", QStringList{"lobby"}}, {"timestamp", 1}},
                        RequestSenderInfo(), ledger.callback(i));
    }
    // Some are on the wire, the rest queued in the client.
    ASSERT_TRUE(runEventLoopUntil([&camsim] { return camsim.logLines().size() >= 4; }, 10000));
    ASSERT_EQ(tools.channel.count(), RULE_REQUESTS);

    plugin.reset();
    const int answeredBeforeGone = ledger.calls();
    // The host answers the rule requests only now, and queued work gets its turn.
    for (int i = 0; i < RULE_REQUESTS; ++i)
        tools.channel.reply(i, true, QString(), "vca", "0", "<GetVCARulesRes/>", true);
    QCoreApplication::processEvents();

    EXPECT_EQ(ledger.calls(), answeredBeforeGone);
    // Everything under way is given up as failed while the plugin goes.
    EXPECT_EQ(answeredBeforeGone, CAMERA_OPERATIONS + RULE_REQUESTS);
    for (int i = 0; i < CAMERA_OPERATIONS + RULE_REQUESTS; ++i) {
        const char* name =
            i < CAMERA_OPERATIONS ? commands.at(i % commands.size()).name : "rule request";
        ASSERT_EQ(ledger.entry(i).calls, 1) << name;
        ASSERT_EQ(ledger.entry(i).first["code"].toString(), "-1") << name;
    }
}
