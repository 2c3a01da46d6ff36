// Many threads using the plugin at once: mixed camera commands and rule requests, while others
// subscribe, unsubscribe and trigger change events. Meant for ThreadSanitizer, so the camera and
// the host answer on the calling thread: hand-offs through Qt's event queue, which is not
// instrumented, would only show up as false reports.
#include "AnswerLedger.h"
#include "AnsweringHttpClient.h"
#include "CameraCommands.h"
#include "FakeFrameworkTools.h"
#include "NullResponser.h"
#include "PluginQuenvar.h"
#include "camera/CameraProxy.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <utility>
#include <vector>

namespace {

const int SENDERS = 8;
const int REQUESTS_PER_SENDER = 30;
const int SUBSCRIBERS = 2;
const int ROUNDS_PER_SUBSCRIBER = 100;

AnsweringHttpClient::Answer cameraAnswer(const QString& path) {
    if (path.contains("getparam.cgi"))
        return {QNetworkReply::NoError, "camctrl_c0_idleaction_enable='1'\r\n"
                                        "camctrl_c0_idleaction_type='objtrack'\r\n"
                                        "camctrl_c0_idleaction_interval='30'\r\n"};
    if (path.contains("getratio"))
        return {QNetworkReply::NoError, "zoom=2\r\nmaxratio=20\r\n"};
    if (path.contains("getCurrentType"))
        return {QNetworkReply::NoError, "ptztrack_type=smarttracking\r\n"};
    if (path.contains("PresetWithRule"))
        return {QNetworkReply::NoError, R"({"PresetInfo":[{"Name":"Gate","HasRule":true}]})"};
    return {QNetworkReply::NoError, "OK\r\n"};
}

// Answers every rule request at once, on the thread that sends it.
class AnsweringTools
    : public FakeFrameworkTools
    , public IPluginRequestChannel {
public:
    IPluginRequestChannel* GetRequestChannel() override { return this; }
    Context GetRequestContext() override { return nullptr; }
    bool SendRequest(const QString&, Context, int, const QString& command,
                     PluginRequestInfo& info) override {
        info.callback(true, QString(), "vca", "0",
                      command == "GetVCARules"
                          ? "<GetVCARulesRes><Camera><CamName>cam1</CamName><Rules Format=\"json\">"
                            "<Rule Type=\"Intrusion\" Name=\"Door\">{\"a\":1}</Rule></Rules>"
                            "</Camera></GetVCARulesRes>"
                          : "<GetRecordingVCARulesRes><Location><LocName>lobby</LocName>"
                            "<JsonRules>{}</JsonRules></Location></GetRecordingVCARulesRes>",
                      true);
        return true;
    }
};

} // namespace

TEST(ConcurrencyTest, MixedCommandsWhileSubscribersComeAndGo) {
    AnsweringTools tools;
    std::atomic<int> events{0};
    tools.emitter = [&events](PluginObjBase_EventInfoBase*) { ++events; };
    PluginQuenvar plugin;
    ASSERT_TRUE(plugin.InitialPluginBase(&tools));
    auto camera = std::make_shared<CameraProxy>();
    camera->setHTTPClient(std::make_shared<AnsweringHttpClient>(cameraAnswer));
    plugin.setCameraProxy(camera);
    AnswerLedger ledger;

    std::vector<std::pair<QString, QVariant>> mixed;
    for (const CameraCommand& command : cameraCommands())
        mixed.emplace_back(command.name, command.to(80));
    mixed.emplace_back("retrieveVcaRawRuleInfo", "cam1");
    mixed.emplace_back("getRecordingVCARule", QVariantMap{{"locationIDs", QStringList{"lobby"}}});

    std::vector<std::thread> threads;
    for (int sender = 0; sender < SENDERS; ++sender) {
        threads.emplace_back([&, sender] {
            for (int id = sender * REQUESTS_PER_SENDER; id < (sender + 1) * REQUESTS_PER_SENDER;
                 ++id) {
                const auto& [command, params] = mixed.at(id % mixed.size());
                plugin.Request(command, params, RequestSenderInfo(), ledger.callback(id));
            }
        });
    }
    for (int subscriber = 0; subscriber < SUBSCRIBERS; ++subscriber) {
        threads.emplace_back([&, subscriber] {
            const QString id = QStringLiteral("subscriber%1").arg(subscriber);
            NullResponser responser;
            for (int round = 0; round < ROUNDS_PER_SUBSCRIBER; ++round) {
                plugin.SubscribeEventBlock(id, "liveVCARuleChanged", QVariant(),
                                           RequestSenderInfo(), responser);
                plugin.handleVCAMetadataChanged("cam1");
                plugin.UnsubscribeEventBlock(id, QVariant(), responser);
            }
        });
    }
    for (std::thread& thread : threads)
        thread.join();

    EXPECT_TRUE(ledger.waitForAll(30000));
    for (int id = 0; id < SENDERS * REQUESTS_PER_SENDER; ++id) {
        EXPECT_EQ(ledger.entry(id).calls, 1) << "request " << id;
        EXPECT_EQ(ledger.entry(id).first["code"].toString(), "0") << "request " << id;
    }
    // Each change reaches the subscribers of its moment: the one that made it, perhaps the other.
    EXPECT_GE(events, SUBSCRIBERS * ROUNDS_PER_SUBSCRIBER);
    EXPECT_LE(events, SUBSCRIBERS * SUBSCRIBERS * ROUNDS_PER_SUBSCRIBER);
}
