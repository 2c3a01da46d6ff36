#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "ResponseRecorder.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <climits>
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

// Each command's operation, and what the operation's callback is completed with on success and
// on failure: the client gets that as its payload through the command's adapter.
struct CameraRow {
    QString command;
    QString operation;
    QVariant success;
    QVariant failure;
};

const QList<CameraRow> CAMERA_ROWS = {
    {"retrievePTZIdleAction", "getPTZIdleAction", QVariantMap{{"interval", 30}}, QVariantMap{}},
    {"setPTZIdleAction", "setPTZIdleAction", {}, {}},
    {"retrievePTZTrackingType", "getPTZTrackingType", QVariantMap{{"type", "auto"}}, QVariantMap{}},
    {"setPTZTrackingType", "setPTZTrackingType", {}, {}},
    {"stopPTZMovement", "stopPTZMovement", {}, {}},
    {"areaZoom", "areaZoom", {}, {}},
    {"gotoSmartTrackingAdvPreset", "gotoSmartTrackingAdvPreset", "moved", "404 Not Found"},
    {"getSmartTrackingAdvPresetList", "getSmartTrackingAdvPresetList", QStringList{"Gate", "Door"},
     QStringList{}},
};

TEST_F(DispatchTest, CameraCommandsReachTheirOperationAndAnswerOnceUniformly) {
    QStringList expectedOperations;
    QList<Response> expectedAnswers;
    for (const CameraRow& row : CAMERA_ROWS) {
        request(row.command, cameraParams());
        request(row.command, cameraParams());
        // An adapter never calls an empty callback.
        plugin.Request(row.command, cameraParams(), RequestSenderInfo{}, ResponseCallback());
        expectedOperations << row.operation << row.operation << row.operation;
        expectedAnswers << Response{true, "0", "", row.success}
                        << Response{true, "-1", "", row.failure};
    }
    request("stopPTZMovement", QStringLiteral("not a map"));
    ASSERT_TRUE(answers.responses().isEmpty());

    QStringList operations;
    for (const auto& call : camera->calls)
        operations << call.operation;
    EXPECT_EQ(operations, expectedOperations + QStringList{"stopPTZMovement"});
    EXPECT_TRUE(camera->calls.takeLast().params.isEmpty());
    for (const auto& call : camera->calls)
        EXPECT_EQ(call.params, cameraParams());
    for (int i = 0; i < CAMERA_ROWS.size(); ++i) {
        camera->calls[3 * i].complete(true, CAMERA_ROWS[i].success);
        camera->calls[3 * i + 1].complete(false, CAMERA_ROWS[i].failure);
        EXPECT_NO_THROW(camera->calls[3 * i + 2].complete(false, CAMERA_ROWS[i].failure));
    }
    EXPECT_EQ(answers.responses(), expectedAnswers);
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());
}

TEST_F(DispatchTest, RuleCommandsConvertTheirParametersAndPassTheCallbackThrough) {
    const std::pair<QString, QVariant> requests[] = {
        {"retrieveVcaRawRuleInfo", "cam-7"},
        {"retrieveVcaRawRuleInfo", 42},
        {"retrieveVcaRawRuleInfo", QVariantMap{{"cam", "cam-7"}}},
        {"getRecordingVCARule",
         QVariantMap{{"locationIDs", QStringList{"l1", "l2"}}, {"timestamp", 1700000000}}},
        {"getRecordingVCARule",
         QVariantMap{{"locationIDs", QVariantList{"l1"}}, {"timestamp", "12"}}},
        {"getRecordingVCARule", QVariantMap{{"locationIDs", QStringList{"l1"}}}},
        // A negative time, sign-extended into the unsigned argument.
        {"getRecordingVCARule", QVariantMap{{"timestamp", -1}}},
        {"getRecordingVCARule", QVariantMap{{"timestamp", INT_MIN}}},
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
              "live cam-7\nlive 42\nlive \nrecording l1,l2 6553f100\nrecording l1 c\n"
              "recording l1 0\nrecording  ffffffffffffffff\nrecording  ffffffff80000000\n"
              "recording  0");

    rules->liveCalls[0].callback(false, "7", "from the rules", 3);
    rules->recordingCalls[0].callback(true, "0", "", 5);
    EXPECT_EQ(answers.responses(),
              (QList<Response>{{false, "7", "from the rules", 3}, {true, "0", "", 5}}));
    EXPECT_TRUE(camera->calls.isEmpty());
}

TEST_F(DispatchTest, UnmatchedAndBlockingRequestsStartNothingAndGetNoAnswer) {
    for (const char* command : {"AreaZoom", "areazoom", "areaZoom ", "GetVCARules",
                                "RetrieveVcaRawRuleInfo", "getRecordingVcaRule", ""})
        request(command, cameraParams());
    FakeResponser responser;
    for (const CameraRow& row : CAMERA_ROWS)
        plugin.RequestBlock(row.command, cameraParams(), RequestSenderInfo{}, responser);
    for (const QString& command : RULE_COMMANDS)
        plugin.RequestBlock(command, cameraParams(), RequestSenderInfo{}, responser);
    EXPECT_EQ(responser.count, 0);
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->liveCalls.isEmpty());
    EXPECT_TRUE(rules->recordingCalls.isEmpty());
    EXPECT_TRUE(answers.responses().isEmpty());
}

TEST(DispatchBeforeInitialisationTest, EveryCommandIsAnsweredAsFailed) {
    PluginQuenvar plugin;
    ResponseRecorder answers;
    QList<Response> expected;
    QStringList commands = RULE_COMMANDS;
    for (const CameraRow& row : CAMERA_ROWS)
        commands << row.command;
    for (const QString& command : commands) {
        plugin.Request(command, cameraParams(), RequestSenderInfo{}, answers.callback());
        EXPECT_NO_THROW(
            plugin.Request(command, cameraParams(), RequestSenderInfo{}, ResponseCallback()));
        expected << Response{true, "-1", "", {}};
    }
    EXPECT_EQ(answers.responses(), expected);
}

TEST(DispatchAfterDestructionTest, RuleAnswersDeliveredLaterReachNoOne) {
    FakeFrameworkTools tools;
    auto rules = std::make_shared<FakeVcaRuleRetriever>();
    ResponseRecorder answers;
    {
        PluginQuenvar plugin;
        ASSERT_TRUE(plugin.InitialPluginBase(&tools));
        plugin.setVcaRuleRetriever(rules);
        for (const QString& command : RULE_COMMANDS)
            plugin.Request(command, QVariant(), RequestSenderInfo{}, answers.callback());
    }
    rules->liveCalls.at(0).callback(true, "0", "", 1);
    rules->recordingCalls.at(0).callback(true, "0", "", 2);
    EXPECT_TRUE(answers.responses().isEmpty());
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
