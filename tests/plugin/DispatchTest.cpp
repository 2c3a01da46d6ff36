#include "AnswerLedger.h"
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
#include <stdexcept>
#include <thread>

namespace {

using Response = ResponseRecorder::Response;

const QStringList RULE_COMMANDS = {"retrieveVcaRawRuleInfo", "getRecordingVCARule"};
// Every command; HostEndToEndTest and CameraFaultTest check what each camera command answers.
const QStringList COMMANDS =
    RULE_COMMANDS + QStringLiteral("retrievePTZIdleAction setPTZIdleAction retrievePTZTrackingType "
                                   "setPTZTrackingType stopPTZMovement areaZoom "
                                   "gotoSmartTrackingAdvPreset getSmartTrackingAdvPresetList")
                        .split(' ');

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
    for (const auto& call : std::as_const(rules->calls))
        reached << call.what;
    EXPECT_EQ(reached.join('\n').toStdString(),
              "live cam-7\nrecording l1,l2 6553f100\nrecording l1 c\n"
              "recording l1 0\nrecording  ffffffffffffffff\nrecording  0");

    rules->calls[0].callback(false, "7", "from the rules", 3);
    rules->calls[1].callback(true, "0", "", 5);
    EXPECT_EQ(answers.responses(),
              (QList<Response>{{false, "7", "from the rules", 3}, {true, "0", "", 5}}));
}

TEST_F(DispatchTest, UnmatchedAndBlockingRequestsStartNothingAndGetNoAnswer) {
    for (const char* command : {"AreaZoom", "areazoom", "areaZoom ", "GetVCARules",
                                "RetrieveVcaRawRuleInfo", "getRecordingVcaRule", ""})
        request(command, cameraParams());
    FakeResponser responser;
    for (const QString& command : COMMANDS)
        plugin.RequestBlock(command, cameraParams(), RequestSenderInfo{}, responser);
    EXPECT_EQ(responser.count, 0);
    EXPECT_TRUE(camera->calls.isEmpty());
    EXPECT_TRUE(rules->calls.isEmpty());
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
struct FaultRow {
    const char* name;
    int serviceThrows; // 0: no; 1: a standard exception; 2: something else
    bool serviceAnswersAtOnce;
    bool clientThrows;
    const char* code; // of the one answer
};

void PrintTo(const FaultRow& row, std::ostream* out) {
    *out << row.name;
}

class DispatchFaultTest
    : public DispatchTest
    , public ::testing::WithParamInterface<FaultRow> {};

TEST_P(DispatchFaultTest, EveryCommandIsAnsweredExactlyOnceAndNothingEscapes) {
    const FaultRow& row = GetParam();
    const auto serviceFault = [&row] {
        if (row.serviceThrows == 2)
            throw 42;
        if (row.serviceThrows == 1)
            throw std::runtime_error("service failed");
    };
    camera->onCall = [&](const FakeCameraProxy::Call& call) {
        if (row.serviceAnswersAtOnce)
            call.complete(true, QVariant());
        serviceFault();
    };
    rules->onCall = [&](const ResponseCallback& callback) {
        if (row.serviceAnswersAtOnce)
            callback(true, "0", "", QVariant());
        serviceFault();
    };
    for (const QString& command : COMMANDS) {
        QList<Response> received;
        const ResponseCallback callback = [&received, &row](bool handled, const QString& code,
                                                            const QString& message,
                                                            const QVariant&) {
            received.append({handled, code, message, QVariant()});
            if (row.clientThrows)
                throw std::runtime_error("client failed");
        };
        EXPECT_NO_THROW(plugin.Request(command, cameraParams(), RequestSenderInfo{}, callback));
        if (!row.serviceThrows && !row.serviceAnswersAtOnce) {
            EXPECT_NO_THROW(RULE_COMMANDS.contains(command)
                                ? rules->calls.last().callback(true, "0", "", QVariant())
                                : camera->calls.last().complete(true, QVariant()));
        }
        EXPECT_EQ(received, (QList<Response>{{true, row.code, "", QVariant()}}))
            << qPrintable(command);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Faults, DispatchFaultTest,
    ::testing::Values(FaultRow{"ServiceThrows", 1, false, false, "-1"},
                      FaultRow{"ServiceThrowsSomethingElse", 2, false, false, "-1"},
                      FaultRow{"ServiceAnswersThenThrows", 1, true, false, "0"},
                      FaultRow{"ClientThrowsOnAnImmediateAnswer", 0, true, true, "0"},
                      FaultRow{"ClientThrowsOnALaterAnswer", 0, false, true, "0"}),
    [](const ::testing::TestParamInfo<FaultRow>& info) { return info.param.name; });

TEST(DispatchBeforeInitialisationTest, EveryCommandIsAnsweredAsFailed) {
    PluginQuenvar plugin;
    ResponseRecorder answers;
    for (const QString& command : COMMANDS) {
        plugin.Request(command, cameraParams(), RequestSenderInfo{}, answers.callback());
        EXPECT_NO_THROW(
            plugin.Request(command, cameraParams(), RequestSenderInfo{}, ResponseCallback()));
    }
    EXPECT_EQ(answers.responses(), QList<Response>(COMMANDS.size(), {true, "-1", "", {}}));
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

    std::thread delivery(rules->calls.at(0).callback, true, "0", "", QVariant());
    entered.get_future().wait();
    std::thread destruction([&] { rules->calls.at(1).callback(true, "0", "", QVariant()); });
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    EXPECT_FALSE(destroyed);
    release.set_value();
    delivery.join();
    destruction.join();
    EXPECT_TRUE(destroyed);
}

// Each request answered once, with its code, and none after the ledger was closed.
void expectAnsweredOnce(const AnswerLedger& ledger, const QStringList& codes) {
    for (int id = 0; id < codes.size(); ++id) {
        EXPECT_EQ(ledger.entry(id).calls, 1) << id;
        EXPECT_EQ(ledger.entry(id).first["code"].toString(), codes.at(id)) << id;
    }
    EXPECT_EQ(ledger.late(), 0);
}

// An area-zoom step holds the HTTP client on the client's thread while it sends the next request.
// The plugin destroyed in that moment on another thread has answered every operation "-1" before
// its destructor returns, and nothing the client answers afterwards reaches a client: not the
// zoom under way, nor the operations queued behind it. The client's last holder is then that
// step, so the client goes on its own thread.
TEST(DispatchAfterDestructionTest, AreaZoomStepOnTheClientThreadAnswersNothingAfterDestruction) {
    FakeFrameworkTools tools;
    auto* plugin = new PluginQuenvar;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    std::shared_ptr<ThreadedHttpClient::Shared> client;
    {
        // The centring request of an area zoom is the slow one. The plugin's proxy holds the
        // client's only reference.
        auto only = std::make_shared<ThreadedHttpClient>(QStringLiteral("stretch=1"));
        client = only->state();
        auto proxy = std::make_shared<CameraProxy>();
        proxy->setHTTPClient(only);
        plugin->setCameraProxy(proxy);
    }
    AnswerLedger ledger;
    const QString commands[] = {"areaZoom", "areaZoom", "stopPTZMovement", "setPTZIdleAction"};
    for (int id = 0; id < 4; ++id)
        plugin->Request(commands[id], cameraParams(), RequestSenderInfo{}, ledger.callback(id));

    // The first zoom's centring step holds the client's thread; the rest wait behind it.
    ASSERT_EQ(client->slowEntered.get_future().wait_for(ThreadedHttpClient::DEADLINE),
              std::future_status::ready);
    delete plugin;
    ledger.close();
    expectAnsweredOnce(ledger, QStringList(4, "-1"));
    client->slowReleased.set_value();
    ASSERT_EQ(client->finished.get_future().wait_for(ThreadedHttpClient::DEADLINE),
              std::future_status::ready);
    EXPECT_EQ(ledger.late(), 0);
}

// A camera answer whose callback destroys the plugin is not held back by itself; the operations
// still open are answered "-1" before the destructor returns, and each request once.
TEST(DispatchAfterDestructionTest, CameraAnswerThatDestroysThePluginLeavesNoneUnanswered) {
    FakeFrameworkTools tools;
    auto camera = std::make_shared<FakeCameraProxy>();
    auto* plugin = new PluginQuenvar;
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    plugin->setCameraProxy(camera);
    AnswerLedger ledger;
    plugin->Request("stopPTZMovement", cameraParams(), RequestSenderInfo{}, ledger.callback(0));
    plugin->Request("areaZoom", cameraParams(), RequestSenderInfo{}, ledger.callback(1));
    plugin->Request("stopPTZMovement", cameraParams(), RequestSenderInfo{},
                    [plugin, answer = ledger.callback(2)](auto&&... arguments) {
                        answer(arguments...);
                        delete plugin;
                    });
    std::thread delivery(camera->calls.at(2).complete, true, QVariant());
    delivery.join();
    ledger.close();
    camera->calls.at(0).complete(true, QVariant());
    camera->calls.at(1).complete(true, QVariant());

    expectAnsweredOnce(ledger, {"-1", "-1", "0"});
}

} // namespace
