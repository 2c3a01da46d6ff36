#include "EventLoopWait.h"
#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"

#include <QDateTime>
#include <QElapsedTimer>

#include <gtest/gtest.h>

namespace {

// Plays the VCA plugin for the change signal.
class VcaPluginStandIn : public QObject {
    Q_OBJECT
signals:
    void vcaMetadataChanged(const QString& cameraID);
};

// The plugin with its own rule service, which fetches through the fake request channel.
class EventsTest : public ::testing::Test {
protected:
    void SetUp() override {
        tools.emitter = [this](PluginObjBase_EventInfoBase* event) {
            const auto* info = dynamic_cast<PluginObjBase_EventSignalInfo*>(event);
            ASSERT_NE(info, nullptr);
            delivered << info->subscriberId;
            timestamps << info->timestamp;
            if (onDelivery)
                onDelivery(info->subscriberId, info->timestamp);
        };
        ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    }

    void TearDown() override { EXPECT_EQ(responser.count, 0); }

    void subscribe(const QString& id, const QString& eventName = EVENT_LIVE_VCA_RULE_CHANGED) {
        plugin->SubscribeEventBlock(id, eventName, QVariant(), RequestSenderInfo{}, responser);
    }

    void unsubscribe(const QString& id) {
        plugin->UnsubscribeEventBlock(id, QVariant(), responser);
    }

    // A change of cam-1 whose fetch fails without text.
    void change() {
        plugin->handleVCAMetadataChanged(QStringLiteral("cam-1"));
        tools.channel.reply(tools.channel.count() - 1, false, "", "relay", "80000404", "", true);
    }

    // Whom the records went to, in order.
    std::string recipients() const { return delivered.join(' ').toStdString(); }

    FakeFrameworkTools tools;
    FakeResponser responser;
    QStringList delivered;
    QList<qint64> timestamps;
    std::function<void(const QString&, qint64)> onDelivery;
    std::unique_ptr<PluginQuenvar> plugin = std::make_unique<PluginQuenvar>();
};

TEST_F(EventsTest, OneRecordPerSubscriptionInOrderEvenForAFailedFetch) {
    // Holding each record until the clock moves on shows whether each gets its own time.
    onDelivery = [](const QString&, qint64 timestamp) {
        QElapsedTimer guard;
        guard.start();
        while (QDateTime::currentMSecsSinceEpoch() <= timestamp && guard.elapsed() < 100)
            ;
    };
    subscribe("A");
    subscribe("A");
    subscribe("B", "someOtherEvent");
    subscribe("C");
    const qint64 before = QDateTime::currentMSecsSinceEpoch();
    change();

    EXPECT_EQ(recipients(), "A A B C");
    ASSERT_EQ(timestamps.size(), 4);
    EXPECT_GE(timestamps[0], before);
    for (int i = 1; i < timestamps.size(); ++i)
        EXPECT_GT(timestamps[i], timestamps[i - 1]);
}

TEST_F(EventsTest, UnsubscribeRemovesEveryEntryAndChangesDuringADeliveryApplyAfterIt) {
    for (const char* id : {"A", "B", "A", "C"})
        subscribe(id);
    for (const char* id : {"A", "a", "Z"})
        unsubscribe(id);
    // Each subscriber leaves on receipt; B's receipt brings in D.
    onDelivery = [this](const QString& id, qint64) {
        unsubscribe(id);
        if (id == "B")
            subscribe("D");
    };
    change();
    change();
    change();
    EXPECT_EQ(tools.channel.count(), 3);
    EXPECT_EQ(recipients(), "B C D");
}

TEST_F(EventsTest, NothingIsDeliveredBeforeInitialisationOrAfterDestruction) {
    PluginQuenvar early;
    const auto rules = std::make_shared<FakeVcaRuleRetriever>();
    early.setVcaRuleRetriever(rules);
    early.SubscribeEventBlock("A", EVENT_LIVE_VCA_RULE_CHANGED, {}, {}, responser);
    early.handleVCAMetadataChanged("cam-1");
    ASSERT_EQ(rules->calls.size(), 1);
    EXPECT_NO_THROW(rules->calls[0].callback(true, "0", "", QVariant()));
    subscribe("B");
    plugin->handleVCAMetadataChanged("cam-1");
    plugin.reset();
    tools.channel.reply(0, false, "", "relay", "80000404", "", true);
    EXPECT_TRUE(delivered.isEmpty());

    ASSERT_TRUE(early.InitialPluginBase(&tools));
    early.handleVCAMetadataChanged("cam-1");
    tools.channel.reply(1, false, "", "relay", "80000404", "", true);
    EXPECT_EQ(recipients(), "A");
}

// A plugin connected to a stand-in VCA plugin, with subscribers, recording whom it delivers to.
struct Rig {
    explicit Rig(const QStringList& subscribers) {
        tools.emitter = [this](PluginObjBase_EventInfoBase* event) {
            delivered << static_cast<PluginObjBase_EventSignalInfo*>(event)->subscriberId;
        };
        tools.registerPlugin(VCA_PLUGIN_ID, &vca);
        plugin->InitialPluginBase(&tools);
        plugin->AllPluginLoaded();
        for (const QString& id : subscribers)
            plugin->SubscribeEventBlock(id, EVENT_LIVE_VCA_RULE_CHANGED, {}, {}, responser);
    }

    FakeFrameworkTools tools;
    VcaPluginStandIn vca;
    FakeResponser responser;
    QStringList delivered;
    std::unique_ptr<PluginQuenvar> plugin = std::make_unique<PluginQuenvar>();
};

// The cases share one wait for the delay to pass.
TEST(EventsDelayTest, EachChangeSignalFetchesOnceTwoSecondsLater) {
    Rig busy({"A", "B"});
    Rig gone({"A"});
    QElapsedTimer clock;
    clock.start();
    for (int i = 0; i < 3; ++i)
        emit busy.vca.vcaMetadataChanged("cam-2");
    emit gone.vca.vcaMetadataChanged("cam-3");
    gone.plugin.reset();

    FakeRequestChannel& channel = busy.tools.channel;
    EXPECT_FALSE(runEventLoopUntil([&]() { return channel.count() > 0; }, 1500))
        << "fetched after " << clock.elapsed() << " ms";
    EXPECT_TRUE(runEventLoopUntil([&]() { return channel.count() == 3; }, 5000 - clock.elapsed()));
    // Past the destroyed plugin's timer too, coarse timers included.
    runEventLoopUntil([]() { return false; }, 2300 - clock.elapsed());
    EXPECT_EQ(gone.tools.channel.count(), 0);
    EXPECT_EQ(channel.count(), 3);
    EXPECT_EQ(channel.sent().value(0).info.content, "<GetVCARules><Cam>cam-2</Cam></GetVCARules>");
    // Automatic, so that the fetch starts in the plugin's thread whoever emits.
    EXPECT_EQ(busy.tools.connections.value(0).connectionType, static_cast<int>(Qt::AutoConnection));

    for (int i = 0; i < channel.count(); ++i)
        channel.reply(i, true, "", "relay", "0", "", true);
    EXPECT_EQ(busy.delivered, (QStringList{"A", "B", "A", "B", "A", "B"}));
}

} // namespace

#include "EventsTest.moc"
