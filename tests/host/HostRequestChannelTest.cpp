#include "HostRequestChannel.h"

#include "PluginHost.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QJsonArray>
#include <QJsonObject>
#include <QThread>

#include <gtest/gtest.h>

#include <mutex>
#include <thread>

namespace {

const QString TARGET_ID = QStringLiteral("T1");
const QString SENDER_ID = QStringLiteral("S1");

// The plugin that serves "Answer" at once, keeps the callback of "Hold" and drops "Drop".
class TargetPlugin : public IPluginObjectBase {
public:
    void Request(const QString& command, const QVariant& params, const RequestSenderInfo& sender,
                 ResponseCallback callback) override {
        requestThread = QThread::currentThread();
        lastParams = params;
        lastSender = sender.senderId;
        if (command == QStringLiteral("Answer"))
            callback(true, QStringLiteral("0"), QStringLiteral("done"), params);
        else if (command == QStringLiteral("Hold"))
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

struct Reply {
    bool success = false;
    QString message;
    QString relayPath;
    QString statusCode;
    QString replyText;
    bool flag = false;
};

// Collects the replies of one request, from whichever thread they come.
class ReplyRecorder {
public:
    PluginReplyCallback callback() {
        return [this](bool success, const QString& message, const QString& relayPath,
                      const QString& statusCode, const QString& replyText, bool flag) {
            std::lock_guard<std::mutex> lock(mutex);
            replies.append(Reply{success, message, relayPath, statusCode, replyText, flag});
        };
    }
    int count() const {
        std::lock_guard<std::mutex> lock(mutex);
        return static_cast<int>(replies.size());
    }
    Reply first() const {
        std::lock_guard<std::mutex> lock(mutex);
        return replies.value(0);
    }

private:
    mutable std::mutex mutex;
    QList<Reply> replies;
};

bool processEventsUntil(const std::function<bool()>& done, int timeoutMs = 5000) {
    QDeadlineTimer deadline(timeoutMs);
    while (!done()) {
        if (deadline.hasExpired())
            return false;
        QCoreApplication::processEvents(QEventLoop::WaitForMoreEvents, 20);
    }
    return true;
}

} // namespace

class HostRequestChannelTest : public ::testing::Test {
protected:
    void SetUp() override {
        const QJsonObject metaData{
            {"IID", QUENVAR_PLUGIN_INTERFACE_IID},
            {"MetaData", QJsonObject{{"PluginID", TARGET_ID},
                                     {"Commands", QJsonArray{"Answer", "Hold", "Drop"}}}}};
        ASSERT_TRUE(host.addPlugin(&target, metaData, QStringLiteral("in-process")));
    }

    // Sends from a record that is gone when SendRequest returns, as a plugin's local would be.
    void send(const QString& command, int timeoutMs, ReplyRecorder& recorder) {
        PluginRequestInfo info;
        info.timeoutMs = timeoutMs;
        info.content = QStringLiteral("<Q>%1</Q>").arg(command);
        info.callback = recorder.callback();
        channel.SendRequest(SENDER_ID, channel.GetRequestContext(), 1, command, info);
    }

    TargetPlugin target;
    PluginHost host;
    HostRequestChannel channel{host, SENDER_ID};
};

TEST_F(HostRequestChannelTest, AnswersWithTheServingPluginsAnswerInTheMainThread) {
    ReplyRecorder recorder;
    send(QStringLiteral("Answer"), 1000, recorder);
    EXPECT_EQ(recorder.count(), 0) << "answered from within SendRequest";

    ASSERT_TRUE(processEventsUntil([&]() { return recorder.count() > 0; }));
    const Reply reply = recorder.first();
    EXPECT_TRUE(reply.success);
    EXPECT_EQ(reply.message, QStringLiteral("done"));
    EXPECT_EQ(reply.relayPath, TARGET_ID);
    EXPECT_EQ(reply.statusCode, QStringLiteral("0"));
    EXPECT_EQ(reply.replyText, QStringLiteral("<Q>Answer</Q>"));
    EXPECT_TRUE(reply.flag);
    EXPECT_EQ(target.lastParams.userType(), QMetaType::QString);
    EXPECT_EQ(target.lastSender, SENDER_ID);
    EXPECT_EQ(target.requestThread, QCoreApplication::instance()->thread());
}

TEST_F(HostRequestChannelTest, UnservedCommandIsAnsweredNoPluginLater) {
    ReplyRecorder recorder;
    send(QStringLiteral("GetNothing"), 1000, recorder);
    EXPECT_EQ(recorder.count(), 0);

    ASSERT_TRUE(processEventsUntil([&]() { return recorder.count() > 0; }));
    const Reply reply = recorder.first();
    EXPECT_FALSE(reply.success);
    EXPECT_EQ(reply.message, QStringLiteral("no plugin serves the command"));
    EXPECT_EQ(reply.relayPath, QString());
    EXPECT_EQ(reply.statusCode, QStringLiteral("80000404"));
    EXPECT_EQ(reply.replyText, QString());
    EXPECT_FALSE(reply.flag);
}

TEST_F(HostRequestChannelTest, TimeoutAnswersOnceAndDropsTheLateAnswer) {
    ReplyRecorder recorder;
    send(QStringLiteral("Hold"), 30, recorder);
    ASSERT_TRUE(processEventsUntil([&]() { return recorder.count() > 0; }));
    const Reply reply = recorder.first();
    EXPECT_FALSE(reply.success);
    EXPECT_EQ(reply.message, QStringLiteral("timeout"));
    EXPECT_EQ(reply.statusCode, QStringLiteral("80000102"));
    EXPECT_FALSE(reply.flag);

    ASSERT_TRUE(target.held);
    target.held(true, QStringLiteral("0"), QString(), QStringLiteral("late"));
    QCoreApplication::processEvents();
    EXPECT_EQ(recorder.count(), 1);
}

TEST_F(HostRequestChannelTest, AnswerBeforeTheTimeoutIsTheOnlyOne) {
    ReplyRecorder answered;
    send(QStringLiteral("Hold"), 50, answered);
    ASSERT_TRUE(processEventsUntil([&]() { return static_cast<bool>(target.held); }));
    target.held(false, QStringLiteral("80000404"), QStringLiteral("none"), QVariant());
    target.held(true, QStringLiteral("0"), QString(), QStringLiteral("again"));

    // A later request with the same time-out: once it has timed out, so has the first one.
    ReplyRecorder later;
    send(QStringLiteral("Hold"), 50, later);
    ASSERT_TRUE(processEventsUntil([&]() { return later.count() > 0; }));
    ASSERT_EQ(answered.count(), 1);
    EXPECT_TRUE(answered.first().success);
    EXPECT_EQ(answered.first().statusCode, QStringLiteral("80000404"));
    EXPECT_EQ(answered.first().message, QStringLiteral("none"));
    EXPECT_FALSE(answered.first().flag);
}

TEST_F(HostRequestChannelTest, RequestsFromAnotherThreadTimeOutToo) {
    ReplyRecorder recorder;
    std::thread sender([&]() { send(QStringLiteral("Hold"), 30, recorder); });
    sender.join();
    ASSERT_TRUE(processEventsUntil([&]() { return recorder.count() > 0; }));
    EXPECT_EQ(recorder.first().statusCode, QStringLiteral("80000102"));
    EXPECT_EQ(target.requestThread, QCoreApplication::instance()->thread());
}
