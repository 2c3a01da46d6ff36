#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"
#include "ResponseRecorder.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>

namespace {

using Response = ResponseRecorder::Response;

const QStringList RULE_COMMANDS = {"retrieveVcaRawRuleInfo", "getRecordingVCARule"};

QVariantMap cameraParams() {
    return {{"host", "10.1.2.3"}, {"port", 8080}, {"user", "admin"}, {"zoomRatio", 2.5}};
}

class DispatchTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(plugin.InitialPluginBase(&tools));
        plugin.setCameraProxy(camera);
        plugin.setVcaRuleRetriever(rules);
    }

    void request(const QString& command, const QVariant& params) {
        plugin.Request(command, params, RequestSenderInfo{}, answers.callback());
    }

    FakeFrameworkTools tools;
    PluginQuenvar plugin;
    std::shared_ptr<FakeCameraProxy> camera = std::make_shared<FakeCameraProxy>();
    std::shared_ptr<FakeVcaRuleRetriever> rules = std::make_shared<FakeVcaRuleRetriever>();
    ResponseRecorder answers;
};

// Each command's operation, and what the operation's callback is completed with: the client gets
// that as its payload through the command's adapter, whether the operation succeeded or not.
struct CameraRow {
    QString command;
    QString operation;
    QVariant result;
};

const QList<CameraRow> CAMERA_ROWS = {
    {"retrievePTZIdleAction", "getPTZIdleAction", QVariantMap{{"interval", 30}}},
    {"setPTZIdleAction", "setPTZIdleAction", {}},
    {"retrievePTZTrackingType", "getPTZTrackingType", QVariantMap{{"type", "auto"}}},
    {"setPTZTrackingType", "setPTZTrackingType", {}},
    {"stopPTZMovement", "stopPTZMovement", {}},
    {"areaZoom", "areaZoom", {}},
    {"gotoSmartTrackingAdvPreset", "gotoSmartTrackingAdvPreset", "404 Not Found"},
    {"getSmartTrackingAdvPresetList", "getSmartTrackingAdvPresetList", QStringList{"Gate"}},
};

TEST_F(DispatchTest, CameraCommandsReachTheirOperationAndAnswerOnceUniformly) {
    QList<Response> expected;
    for (const CameraRow& row : CAMERA_ROWS) {
        request(row.command, cameraParams());
        request(row.command, cameraParams());
        // An adapter never calls an empty callback.
        plugin.Request(row.command, cameraParams(), RequestSenderInfo{}, ResponseCallback());
        ASSERT_EQ(camera->calls.size(), 3) << qPrintable(row.command);
        for (const auto& call : std::as_const(camera->calls)) {
            EXPECT_EQ(call.operation, row.operation);
            EXPECT_EQ(call.params, cameraParams());
        }
        camera->calls[0].complete(true, row.result);
        camera->calls[1].complete(false, row.result);
        camera->calls[2].complete(false, row.result);
        camera->calls.clear();
        expected << Response{true, "0", "", row.result} << Response{true, "-1", "", row.result};
    }
    EXPECT_EQ(answers.responses(), expected);
    request("stopPTZMovement", QStringLiteral("not a map"));
    ASSERT_EQ(camera->calls.size(), 1);
    EXPECT_TRUE(camera->calls[0].params.isEmpty());
}

TEST_F(DispatchTest, RuleCommandsConvertTheirParametersAndPassTheCallbackThrough) {
    const std::pair<QString, QVariant> requests[] = {
        {"retrieveVcaRawRuleInfo", "cam-7"},
        {"getRecordingVCARule",
         QVariantMap{{"locationIDs", QStringList{"l1", "l2"}}, {"timestamp", 1700000000}}},
        {"getRecordingVCARule",
         QVariantMap{{"locationIDs", QVariantList{"l1"}}, {"timestamp", "12"}}},
        {"getRecordingVCARule", QVariantMap{{"locationIDs", QStringList{"l1"}}}},
        // A negative time, sign-extended into the unsigned argument.
        {"getRecordingVCARule", QVariantMap{{"timestamp", -1}}},
        {"getRecordingVCARule", "l1"},
    };
    for (const auto& [command, params] : requests)
        request(command, params);
    QStringList reached;
    for (const auto& call : rules->liveCalls)
        reached << "live " + call.cameraId;
    for (const auto& call : rules->recordingCalls)
        reached << "recording " + call.locationIDs.join(',') + " " +
                       QString::number(call.timestamp, 16);
    EXPECT_EQ(reached.join('\n').toStdString(),
              "live cam-7\nrecording l1,l2 6553f100\nrecording l1 c\n"
              "recording l1 0\nrecording  ffffffffffffffff\nrecording  0");

    rules->liveCalls[0].callback(false, "7", "from the rules", 3);
    rules->recordingCalls[0].callback(true, "0", "", 5);
    EXPECT_EQ(answers.responses(),
              (QList<Response>{{false, "7", "from the rules", 3}, {true, "0", "", 5}}));
}

TEST_F(DispatchTest, UnmatchedAndBlockingRequestsStartNothingAndGetNoAnswer) {
    for (const char* command : {"AreaZoom", "areazoom", "areaZoom ", "GetVCARules",
                                "RetrieveVcaRawRuleInfo", "getRecordingVcaRule", ""})
        request(command, cameraParams());
    FakeResponser responser;
    for (const QString& command : RULE_COMMANDS + QStringList{"areaZoom", "stopPTZMovement"})
        plugin.RequestBlock(command, cameraParams(), RequestSenderInfo{}, responser);
    EXPECT_EQ(responser.count, 0);
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());
    EXPECT_TRUE(answers.responses().isEmpty());
}

// After a second InitialPluginBase, the services set before it and the first tools are out of use.
TEST_F(DispatchTest, SecondInitialisationReplacesBothServicesAndTheTools) {
    FakeFrameworkTools second;
    int delivered = 0;
    second.emitter = [&delivered](PluginObjBase_EventInfoBase*) { ++delivered; };
    FakeResponser responser;
    plugin.SubscribeEventBlock("A", EVENT_LIVE_VCA_RULE_CHANGED, {}, {}, responser);
    ASSERT_TRUE(plugin.InitialPluginBase(&second));

    // The new camera proxy refuses an unaddressable port at once.
    request("stopPTZMovement", QVariantMap{{"port", -1}});
    plugin.handleVCAMetadataChanged("cam-1");
    EXPECT_EQ(answers.responses(), (QList<Response>{{true, "-1", "", {}}}));
    ASSERT_EQ(second.channel.count(), 1);
    second.channel.reply(0, true, "", "relay", "0", "", true);
    EXPECT_EQ(delivered, 1);
}

TEST(DispatchBeforeInitialisationTest, EveryCommandIsAnsweredAsFailed) {
    PluginQuenvar plugin;
    ResponseRecorder answers;
    QStringList commands = RULE_COMMANDS;
    for (const CameraRow& row : CAMERA_ROWS)
        commands << row.command;
    for (const QString& command : commands) {
        plugin.Request(command, cameraParams(), RequestSenderInfo{}, answers.callback());
        EXPECT_NO_THROW(
            plugin.Request(command, cameraParams(), RequestSenderInfo{}, ResponseCallback()));
    }
    EXPECT_EQ(answers.responses(), QList<Response>(commands.size(), {true, "-1", "", {}}));
}

// An answer under way on another thread holds the destructor back until it returns; a callback
// that destroys the plugin itself is not held back by its own answer.
TEST(DispatchAfterDestructionTest, DestructionWaitsForAnswersUnderWayOnOtherThreads) {
    FakeFrameworkTools tools;
    auto rules = std::make_shared<FakeVcaRuleRetriever>();
    auto* plugin = new PluginQuenvar;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    plugin->setVcaRuleRetriever(rules);

    std::promise<void> entered;
    std::promise<void> release;
    std::atomic<bool> destroyed{false};
    plugin->Request(RULE_COMMANDS[0], QVariant(), RequestSenderInfo{},
                    [&entered, released = release.get_future().share()](auto&&...) {
                        entered.set_value();
                        released.wait();
                    });
    plugin->Request(RULE_COMMANDS[1], QVariant(), RequestSenderInfo{},
                    [plugin, &destroyed](auto&&...) {
                        delete plugin;
                        destroyed = true;
                    });

    std::thread delivery(rules->liveCalls.at(0).callback, true, "0", "", QVariant());
    entered.get_future().wait();
    std::thread destruction(
        [&] { rules->recordingCalls.at(0).callback(true, "0", "", QVariant()); });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_FALSE(destroyed);
    release.set_value();
    delivery.join();
    destruction.join();
    EXPECT_TRUE(destroyed);
}

} // namespace
