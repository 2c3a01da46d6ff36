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
class AnsweringChannel : public IPluginRequestChannel {
public:
    Context GetRequestContext() override { return nullptr; }
    bool SendRequest(const QString&, Context, int, const QString& command,
                     PluginRequestInfo& info) override {
        const QString reply =
            command == "GetVCARules"
                ? "<GetVCARulesRes><Camera><CamName>cam1</CamName><Rules Format=\"json\">"
                  "<Rule Type=\"Intrusion\" Name=\"Door\">{\"a\":1}</Rule></Rules></Camera>"
                  "</GetVCARulesRes>"
                : "<GetRecordingVCARulesRes><Location><LocName>lobby</LocName><JsonRules>{}"
                  "</JsonRules></Location></GetRecordingVCARulesRes>";
        info.callback(true, QString(), "vca", "0", reply, true);
        return true;
    }
};

class AnsweringTools : public FakeFrameworkTools {
public:
    IPluginRequestChannel* GetRequestChannel() override { return &answering; }

private:
    AnsweringChannel answering;
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

    const auto& commands = cameraCommands();
    const int kinds = static_cast<int>(commands.size()) + 2;
    std::vector<ResponseCallback> callbacks;
    for (int id = 0; id < SENDERS * REQUESTS_PER_SENDER; ++id)
        callbacks.push_back(ledger.callback(id));

    std::vector<std::thread> threads;
    for (int sender = 0; sender < SENDERS; ++sender) {
        threads.emplace_back([&, sender] {
            for (int i = 0; i < REQUESTS_PER_SENDER; ++i) {
                const int id = sender * REQUESTS_PER_SENDER + i;
                const int kind = id % kinds;
                if (kind < static_cast<int>(commands.size()))
                    plugin.Request(commands.at(kind).name,
                                   commands.at(kind).to("10.0.0.5", 80, "admin", "admin"),
                                   RequestSenderInfo(), callbacks.at(id));
                else if (kind == kinds - 2)
                    plugin.Request("retrieveVcaRawRuleInfo", "cam1", RequestSenderInfo(),
                                   callbacks.at(id));
                else
                    plugin.Request("getRecordingVCARule",
                                   QVariantMap{{"locationIDs", QStringList{"lobby"}}},
                                   RequestSenderInfo(), callbacks.at(id));
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

    EXPECT_TRUE(ledger.waitForAll(30000)) << ledger.unanswered() << " unanswered";
    EXPECT_EQ(ledger.answeredTwice(), 0);
    // Each change reaches the subscribers of its moment: the one that made it, perhaps the other.
    EXPECT_GE(events, SUBSCRIBERS * ROUNDS_PER_SUBSCRIBER);
    EXPECT_LE(events, SUBSCRIBERS * SUBSCRIBERS * ROUNDS_PER_SUBSCRIBER);
    for (int id = 0; id < SENDERS * REQUESTS_PER_SENDER; ++id)
        EXPECT_EQ(ledger.entry(id).code, "0") << "request " << id;
}
