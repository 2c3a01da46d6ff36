#include "HostRequestChannel.h"

#include "EventLoopWait.h"
#include "PluginHost.h"

#include <QCoreApplication>
#include <QJsonArray>
#include <QJsonObject>
#include <QThread>

#include <gtest/gtest.h>

#include <memory>
#include <thread>

namespace {

const QString TARGET_ID = QStringLiteral("T1");
const QString SENDER_ID = QStringLiteral("S1");

// The plugin that answers "Answer" at once and keeps the callback of "Hold".
class TargetPlugin : public IPluginObjectBase {
public:
    void Request(const QString& command, const QVariant& params, const RequestSenderInfo& sender,
                 ResponseCallback callback) override {
        requestThread = QThread::currentThread();
        lastParams = params;
        lastSender = sender.senderId;
        if (command == QStringLiteral("Answer"))
            callback(true, QStringLiteral("0"), QStringLiteral("done"), params);
        else
            held = callback;
    }
    bool InitialPluginBase(IFrameworkTools*) override { return true; }
    void RequestBlock(const QString&, const QVariant&, const RequestSenderInfo&,
                      IResponser&) override {}
    void SubscribeEventBlock(const QString&, const QString&, const QVariant&,
                             const RequestSenderInfo&, IResponser&) override {}
    void UnsubscribeEventBlock(const QString&, const QVariant&, IResponser&) override {}

    QThread* requestThread = nullptr;
    QVariant lastParams;
    QString lastSender;
    ResponseCallback held;
};

using Replies = std::shared_ptr<std::vector<std::string>>;

// Keeps the replies to one request as text; the host answers in the main thread.
PluginReplyCallback recordInto(const Replies& replies) {
    return [replies](bool success, const QString& message, const QString& relayPath,
                     const QString& statusCode, const QString& replyText, bool flag) {
        const QStringList fields{
            success ? "true" : "false", message, relayPath, statusCode, replyText,
            flag ? "true" : "false"};
        replies->push_back(fields.join('|').toStdString());
    };
}

class HostRequestChannelTest : public ::testing::Test {
protected:
    void SetUp() override {
        const QJsonObject metaData{
            {"IID", QUENVAR_PLUGIN_INTERFACE_IID},
            {"MetaData",
             QJsonObject{{"PluginID", TARGET_ID}, {"Commands", QJsonArray{"Answer", "Hold"}}}}};
        ASSERT_TRUE(host.addPlugin(&target, metaData, QStringLiteral("in-process")));
    }

    // Sends from a record that is gone when SendRequest returns, as a plugin's local would be.
    Replies send(const QString& command, int timeoutMs) {
        const auto replies = std::make_shared<std::vector<std::string>>();
        PluginRequestInfo info;
        info.timeoutMs = timeoutMs;
        info.content = QStringLiteral("<Q>%1</Q>").arg(command);
        info.callback = recordInto(replies);
        channel.SendRequest(SENDER_ID, channel.GetRequestContext(), 1, command, info);
        return replies;
    }

    TargetPlugin target;
    PluginHost host;
    HostRequestChannel channel{host, SENDER_ID};
};

TEST_F(HostRequestChannelTest, AnswersLaterWithTheServingPluginsAnswerOrNoPlugin) {
    const Replies answered = send(QStringLiteral("Answer"), 1000);
    const Replies unserved = send(QStringLiteral("GetNothing"), 1000);
    EXPECT_TRUE(answered->empty() && unserved->empty()) << "answered within SendRequest";

    ASSERT_TRUE(runEventLoopUntil([&]() { return !answered->empty() && !unserved->empty(); }));
    EXPECT_EQ(*answered, std::vector<std::string>{"true|done|T1|0|<Q>Answer</Q>|true"});
    EXPECT_EQ(*unserved,
              std::vector<std::string>{"false|no plugin serves the command||80000404||false"});
    EXPECT_EQ(target.lastParams.userType(), QMetaType::QString);
    EXPECT_EQ(target.lastSender, SENDER_ID);
    EXPECT_EQ(target.requestThread, QCoreApplication::instance()->thread());
}

TEST_F(HostRequestChannelTest, FirstOfAnswerAndTimeoutIsTheOnlyReply) {
    // Sent from another thread; the target still runs in the main thread.
    Replies timedOut;
    std::thread([&]() { timedOut = send(QStringLiteral("Hold"), 30); }).join();
    ASSERT_TRUE(runEventLoopUntil([&]() { return !timedOut->empty(); }));
    EXPECT_EQ(target.requestThread, QCoreApplication::instance()->thread());
    ASSERT_TRUE(target.held);
    target.held(true, QStringLiteral("0"), QString(), QStringLiteral("late"));
    target.held = nullptr;

    const Replies answered = send(QStringLiteral("Hold"), 50);
    ASSERT_TRUE(runEventLoopUntil([&]() { return static_cast<bool>(target.held); }));
    target.held(false, QStringLiteral("80000404"), QStringLiteral("none"), QVariant());
    target.held(true, QStringLiteral("0"), QString(), QStringLiteral("again"));
    // A later request with the same time-out: once it has timed out, so has the one before.
    const Replies later = send(QStringLiteral("Hold"), 50);
    ASSERT_TRUE(runEventLoopUntil([&]() { return !later->empty(); }));

    EXPECT_EQ(*timedOut, std::vector<std::string>{"false|timeout||80000102||false"});
    EXPECT_EQ(*answered, std::vector<std::string>{"true|none|T1|80000404||false"});
}

} // namespace
