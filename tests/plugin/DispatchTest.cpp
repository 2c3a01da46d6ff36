#include "FakeCameraProxy.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"
#include "ResponseRecorder.h"
#include "ThreadedHttpClient.h"
#include "camera/CameraProxy.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <map>
#include <mutex>
#include <stdexcept>
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

// Where an exception comes from: the service as it starts the operation (before or after it
// answered), or the client's callback as it is answered, at once or later.
enum class Fault {
    ServiceThrows,
    ServiceThrowsSomethingElse,
    ServiceAnswersThenThrows,
    ClientThrowsOnAnImmediateAnswer,
    ClientThrowsOnALaterAnswer
};

struct FaultRow {
    const char* name;
    Fault fault;
    const char* code; // of the one answer
};

void PrintTo(const FaultRow& row, std::ostream* out) {
    *out << row.name;
}

class DispatchFaultTest
    : public DispatchTest
    , public ::testing::WithParamInterface<FaultRow> {};

TEST_P(DispatchFaultTest, EveryCommandIsAnsweredExactlyOnceAndNothingEscapes) {
    const Fault fault = GetParam().fault;
    const bool answerAtOnce =
        fault == Fault::ServiceAnswersThenThrows || fault == Fault::ClientThrowsOnAnImmediateAnswer;
    const auto serviceFault = [fault] {
        if (fault == Fault::ServiceThrowsSomethingElse)
            throw 42;
        if (fault == Fault::ServiceThrows || fault == Fault::ServiceAnswersThenThrows)
            throw std::runtime_error("service failed");
    };
    camera->onCall = [&](const FakeCameraProxy::Call& call) {
        if (answerAtOnce)
            call.complete(true, QVariant());
        serviceFault();
    };
    rules->onCall = [&](const ResponseCallback& callback) {
        if (answerAtOnce)
            callback(true, "0", "", QVariant());
        serviceFault();
    };
    const bool clientThrows = fault == Fault::ClientThrowsOnAnImmediateAnswer ||
                              fault == Fault::ClientThrowsOnALaterAnswer;

    QStringList commands = RULE_COMMANDS;
    for (const CameraRow& row : CAMERA_ROWS)
        commands << row.command;
    for (const QString& command : commands) {
        QList<Response> received;
        const ResponseCallback callback = [&received,
                                           clientThrows](bool handled, const QString& code,
                                                         const QString& message, const QVariant&) {
            received.append({handled, code, message, QVariant()});
            if (clientThrows)
                throw std::runtime_error("client failed");
        };
        EXPECT_NO_THROW(plugin.Request(command, cameraParams(), RequestSenderInfo{}, callback));
        if (fault == Fault::ClientThrowsOnALaterAnswer) {
            if (command == RULE_COMMANDS[0])
                EXPECT_NO_THROW(rules->liveCalls.last().callback(true, "0", "", QVariant()));
            else if (command == RULE_COMMANDS[1])
                EXPECT_NO_THROW(rules->recordingCalls.last().callback(true, "0", "", QVariant()));
            else
                EXPECT_NO_THROW(camera->calls.last().complete(true, QVariant()));
        }
        EXPECT_EQ(received, (QList<Response>{{true, GetParam().code, "", QVariant()}}))
            << qPrintable(command);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Faults, DispatchFaultTest,
    ::testing::Values(
        FaultRow{"ServiceThrows", Fault::ServiceThrows, "-1"},
        FaultRow{"ServiceThrowsSomethingElse", Fault::ServiceThrowsSomethingElse, "-1"},
        FaultRow{"ServiceAnswersThenThrows", Fault::ServiceAnswersThenThrows, "0"},
        FaultRow{"ClientThrowsOnAnImmediateAnswer", Fault::ClientThrowsOnAnImmediateAnswer, "0"},
        FaultRow{"ClientThrowsOnALaterAnswer", Fault::ClientThrowsOnALaterAnswer, "0"}),
    [](const ::testing::TestParamInfo<FaultRow>& info) { return info.param.name; });

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

// The answers each request got, and how many came after the plugin's destructor had returned.
class DestructionLedger {
public:
    ResponseCallback callback(int id) {
        std::lock_guard<std::mutex> lock(shared->mutex);
        shared->codes[id];
        return [shared = shared, id](bool, const QString& code, const QString&, const QVariant&) {
            std::lock_guard<std::mutex> lock(shared->mutex);
            shared->codes[id] << code;
            if (shared->destroyed)
                ++shared->late;
        };
    }
    void destructorReturned() {
        std::lock_guard<std::mutex> lock(shared->mutex);
        shared->destroyed = true;
    }
    std::map<int, QStringList> codes() const {
        std::lock_guard<std::mutex> lock(shared->mutex);
        return shared->codes;
    }
    int late() const {
        std::lock_guard<std::mutex> lock(shared->mutex);
        return shared->late;
    }

private:
    struct Shared {
        std::mutex mutex;
        std::map<int, QStringList> codes;
        bool destroyed = false;
        int late = 0;
    };
    std::shared_ptr<Shared> shared = std::make_shared<Shared>();
};

// An area-zoom step holds the HTTP client on the client's thread while it sends the next request.
// The plugin destroyed in that moment on another thread has answered every operation "-1" before
// its destructor returns, and nothing the client answers afterwards reaches a client: not the
// zoom under way, nor the operations queued behind it. The client's last holder is then that
// step, so the client goes on its own thread.
TEST(DispatchAfterDestructionTest, AreaZoomStepOnTheClientThreadAnswersNothingAfterDestruction) {
    FakeFrameworkTools tools;
    auto* plugin = new PluginQuenvar;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    const auto slow = std::make_shared<SlowCall>();
    std::shared_future<void> clientFinished;
    {
        // The centring request of an area zoom is the slow one. The plugin's proxy holds the
        // client's only reference.
        auto client = std::make_shared<ThreadedHttpClient>(QStringLiteral("stretch=1"), slow);
        clientFinished = client->finished();
        auto proxy = std::make_shared<CameraProxy>();
        proxy->setHTTPClient(client);
        plugin->setCameraProxy(proxy);
    }
    DestructionLedger ledger;
    const QString commands[] = {"areaZoom", "areaZoom", "stopPTZMovement", "setPTZIdleAction"};
    for (int id = 0; id < 4; ++id)
        plugin->Request(commands[id], cameraParams(), RequestSenderInfo{}, ledger.callback(id));

    // The first zoom's centring step holds the client's thread; the rest wait behind it.
    ASSERT_TRUE(slow->waitUntilEntered());
    delete plugin;
    ledger.destructorReturned();
    const std::map<int, QStringList> answered = ledger.codes();
    slow->release();
    ASSERT_EQ(clientFinished.wait_for(SlowCall::DEADLINE), std::future_status::ready);

    EXPECT_EQ(answered,
              (std::map<int, QStringList>{{0, {"-1"}}, {1, {"-1"}}, {2, {"-1"}}, {3, {"-1"}}}));
    EXPECT_EQ(ledger.late(), 0);
    EXPECT_EQ(ledger.codes(), answered);
}

// A camera answer whose callback destroys the plugin is not held back by itself; the operations
// still open are answered "-1" before the destructor returns, and each request once.
TEST(DispatchAfterDestructionTest, CameraAnswerThatDestroysThePluginLeavesNoneUnanswered) {
    FakeFrameworkTools tools;
    auto camera = std::make_shared<FakeCameraProxy>();
    auto* plugin = new PluginQuenvar;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    plugin->setCameraProxy(camera);
    DestructionLedger ledger;
    plugin->Request("stopPTZMovement", cameraParams(), RequestSenderInfo{}, ledger.callback(0));
    plugin->Request("areaZoom", cameraParams(), RequestSenderInfo{}, ledger.callback(1));
    plugin->Request("stopPTZMovement", cameraParams(), RequestSenderInfo{},
                    [plugin, answer = ledger.callback(2)](auto&&... arguments) {
                        answer(arguments...);
                        delete plugin;
                    });
    std::thread delivery(camera->calls.at(2).complete, true, QVariant());
    delivery.join();
    ledger.destructorReturned();
    camera->calls.at(0).complete(true, QVariant());
    camera->calls.at(1).complete(true, QVariant());

    EXPECT_EQ(ledger.codes(), (std::map<int, QStringList>{{0, {"-1"}}, {1, {"-1"}}, {2, {"0"}}}));
    EXPECT_EQ(ledger.late(), 0);
}

} // namespace
