#include "FakeFrameworkTools.h"
#include "FakeResponser.h"
#include "FakeVcaRuleRetriever.h"
#include "PluginQuenvar.h"
#include "PluginQuenvarDefs.h"

#include <QDateTime>
#include <QElapsedTimer>
#include <QEventLoop>
#include <QTimer>

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <thread>

namespace {

// Plays the VCA plugin for the change signal.
class VcaPluginStandIn : public QObject {
    Q_OBJECT
signals:
    void vcaMetadataChanged(const QString& cameraID);
};

struct Delivery {
    bool signalInfo = false;
    qint64 timestamp = 0;
    QString eventName;
    QVariant eventData;
    QString sourcePluginId;
    QString subscriberId;
};

// The host's event emitter: keeps a copy of every record; deliveries may come from any thread.
class EventRecorder {
public:
    EventEmitter emitter() const {
        return [state = state](PluginObjBase_EventInfoBase* event) {
            Delivery delivery{false, event->timestamp, event->eventName, event->eventData, {}, {}};
            if (const auto* info = dynamic_cast<PluginObjBase_EventSignalInfo*>(event)) {
                delivery.signalInfo = true;
                delivery.sourcePluginId = info->sourcePluginId;
                delivery.subscriberId = info->subscriberId;
            }
            std::function<void(const Delivery&)> hook;
            {
                std::lock_guard<std::mutex> lock(state->mutex);
                state->deliveries.append(delivery);
                hook = state->hook;
            }
            if (hook)
                hook(delivery);
        };
    }

    QList<Delivery> deliveries() const {
        std::lock_guard<std::mutex> lock(state->mutex);
        return state->deliveries;
    }

    QStringList subscriberIds() const {
        QStringList ids;
        for (const Delivery& delivery : deliveries())
            ids << delivery.subscriberId;
        return ids;
    }

    // Runs after each record is kept, on the delivering thread.
    void setHook(std::function<void(const Delivery&)> hook) {
        std::lock_guard<std::mutex> lock(state->mutex);
        state->hook = std::move(hook);
    }

private:
    struct State {
        std::mutex mutex;
        QList<Delivery> deliveries;
        std::function<void(const Delivery&)> hook;
    };
    std::shared_ptr<State> state = std::make_shared<State>();
};

QVariant rulesPayload(const QString& cameraId) {
    return QVariantMap{{"camID", cameraId},
                       {"relayPath", "/relay/1"},
                       {"isJSON", true},
                       {"rules", "[{\"name\":\"line\"}]"}};
}

// Runs the event loop until done() holds or clock reaches deadlineMs; returns done().
bool runEventLoopUntil(const QElapsedTimer& clock, qint64 deadlineMs,
                       const std::function<bool()>& done) {
    QEventLoop loop;
    QTimer poll;
    QObject::connect(&poll, &QTimer::timeout, &loop, [&]() {
        if (done() || clock.elapsed() >= deadlineMs)
            loop.quit();
    });
    poll.start(10);
    if (!done() && clock.elapsed() < deadlineMs)
        loop.exec();
    return done();
}

class EventsTest : public ::testing::Test {
protected:
    void SetUp() override {
        tools.emitter = recorder.emitter();
        ASSERT_TRUE(plugin.InitialPluginBase(&tools));
        plugin.setVcaRuleRetriever(rules);
    }

    void TearDown() override { EXPECT_EQ(responser.count, 0); }

    void subscribe(const QString& id, const QString& eventName = EVENT_LIVE_VCA_RULE_CHANGED) {
        plugin.SubscribeEventBlock(id, eventName, QVariant(), RequestSenderInfo{}, responser);
    }

    void unsubscribe(const QString& id) { plugin.UnsubscribeEventBlock(id, QVariant(), responser); }

    // One fetch, answered with payload.
    void deliver(const QVariant& payload, bool ok = true) {
        plugin.handleVCAMetadataChanged(QStringLiteral("cam-1"));
        ASSERT_FALSE(rules->liveCalls.isEmpty());
        rules->liveCalls.last().callback(ok, ok ? "0" : "-1", "", payload);
    }

    FakeFrameworkTools tools;
    EventRecorder recorder;
    FakeResponser responser;
    PluginQuenvar plugin;
    std::shared_ptr<FakeVcaRuleRetriever> rules = std::make_shared<FakeVcaRuleRetriever>();
};

TEST_F(EventsTest, DeliversOneRecordPerSubscriptionInOrder) {
    // Holding each record until the clock moves on shows whether each gets its own time.
    recorder.setHook([](const Delivery& delivery) {
        QElapsedTimer guard;
        guard.start();
        while (QDateTime::currentMSecsSinceEpoch() <= delivery.timestamp && guard.elapsed() < 100)
            ;
    });
    subscribe("A");
    subscribe("A");
    subscribe("B", "someOtherEvent");
    subscribe("C");

    const qint64 before = QDateTime::currentMSecsSinceEpoch();
    deliver(rulesPayload("cam-1"));
    const qint64 after = QDateTime::currentMSecsSinceEpoch();

    ASSERT_EQ(rules->liveCalls.size(), 1);
    EXPECT_EQ(rules->liveCalls[0].cameraId, "cam-1");
    const QList<Delivery> deliveries = recorder.deliveries();
    EXPECT_EQ(recorder.subscriberIds(), (QStringList{"A", "A", "B", "C"}));
    qint64 previous = before - 1;
    for (const Delivery& delivery : deliveries) {
        SCOPED_TRACE(qPrintable(delivery.subscriberId));
        EXPECT_TRUE(delivery.signalInfo);
        EXPECT_EQ(delivery.eventName, "liveVCARuleChanged");
        EXPECT_EQ(delivery.sourcePluginId, PLUGIN_ID);
        EXPECT_EQ(delivery.eventData, rulesPayload("cam-1"));
        EXPECT_GT(delivery.timestamp, previous);
        EXPECT_LE(delivery.timestamp, after);
        previous = delivery.timestamp;
    }
}

TEST_F(EventsTest, FailedFetchIsStillDelivered) {
    subscribe("A");
    deliver(QVariant(), false);
    ASSERT_EQ(recorder.deliveries().size(), 1);
    EXPECT_FALSE(recorder.deliveries()[0].eventData.isValid());
}

TEST_F(EventsTest, UnsubscribeRemovesEveryEntryOfExactlyThatId) {
    subscribe("A");
    subscribe("B");
    subscribe("A");
    subscribe("C");
    unsubscribe("A");
    unsubscribe("a");
    unsubscribe("Z");
    deliver(rulesPayload("cam-1"));
    EXPECT_EQ(recorder.subscriberIds(), (QStringList{"B", "C"}));

    unsubscribe("B");
    unsubscribe("C");
    deliver(rulesPayload("cam-1"));
    EXPECT_EQ(rules->liveCalls.size(), 2);
    EXPECT_EQ(recorder.deliveries().size(), 2);
}

TEST_F(EventsTest, SubscriptionChangesDuringADeliveryApplyFromTheNextOne) {
    // Each subscriber leaves on receipt; A's receipt brings in D.
    recorder.setHook([this](const Delivery& delivery) {
        unsubscribe(delivery.subscriberId);
        if (delivery.subscriberId == "A")
            subscribe("D");
    });
    subscribe("A");
    subscribe("B");
    subscribe("C");

    deliver(rulesPayload("cam-1"));
    EXPECT_EQ(recorder.subscriberIds(), (QStringList{"A", "B", "C"}));
    deliver(rulesPayload("cam-1"));
    EXPECT_EQ(recorder.subscriberIds(), (QStringList{"A", "B", "C", "D"}));
    deliver(rulesPayload("cam-1"));
    EXPECT_EQ(recorder.deliveries().size(), 4);
}

TEST_F(EventsTest, ConcurrentSubscriptionsDuringDeliveriesKeepEveryEntry) {
    const int count = 2000;
    plugin.handleVCAMetadataChanged(QStringLiteral("cam-1"));
    ASSERT_EQ(rules->liveCalls.size(), 1);
    const ResponseCallback answer = rules->liveCalls[0].callback;
    // The stress run's records are counted, not kept.
    std::atomic<int> delivered{0};
    tools.emitter = [&delivered](PluginObjBase_EventInfoBase*) { ++delivered; };
    ASSERT_TRUE(plugin.InitialPluginBase(&tools));

    std::atomic<int> writersLeft{2};
    std::thread deliverer([&]() {
        for (int round = 0; writersLeft > 0 || round < 3; ++round)
            answer(true, "0", "", QVariant(round));
    });
    std::thread first([&]() {
        FakeResponser own;
        for (int i = 0; i < count; ++i)
            plugin.SubscribeEventBlock(QString("x%1").arg(i), EVENT_LIVE_VCA_RULE_CHANGED,
                                       QVariant(), RequestSenderInfo{}, own);
        --writersLeft;
    });
    std::thread second([&]() {
        FakeResponser own;
        for (int i = 0; i < count; ++i) {
            plugin.SubscribeEventBlock(QString("y%1").arg(i), EVENT_LIVE_VCA_RULE_CHANGED,
                                       QVariant(), RequestSenderInfo{}, own);
            plugin.SubscribeEventBlock("passing", EVENT_LIVE_VCA_RULE_CHANGED, QVariant(),
                                       RequestSenderInfo{}, own);
            plugin.UnsubscribeEventBlock("passing", QVariant(), own);
        }
        --writersLeft;
    });
    first.join();
    second.join();
    deliverer.join();
    EXPECT_GT(delivered, 0);

    tools.emitter = recorder.emitter();
    ASSERT_TRUE(plugin.InitialPluginBase(&tools));
    answer(true, "0", "", QVariant());
    QStringList xs;
    QStringList ys;
    for (const QString& id : recorder.subscriberIds())
        (id.startsWith('x') ? xs : ys) << id;
    ASSERT_EQ(xs.size(), count);
    ASSERT_EQ(ys.size(), count);
    for (int i = 0; i < count; ++i) {
        ASSERT_EQ(xs[i], QString("x%1").arg(i));
        ASSERT_EQ(ys[i], QString("y%1").arg(i));
    }
}

TEST_F(EventsTest, SecondInitialisationSendsEventsThroughTheNewEmitter) {
    FakeFrameworkTools second;
    EventRecorder secondRecorder;
    second.emitter = secondRecorder.emitter();
    subscribe("A");
    ASSERT_TRUE(plugin.InitialPluginBase(&second));
    plugin.setVcaRuleRetriever(rules);

    deliver(rulesPayload("cam-1"));
    EXPECT_TRUE(recorder.deliveries().isEmpty());
    EXPECT_EQ(secondRecorder.subscriberIds(), QStringList{"A"});
}

TEST(EventsLifetimeTest, DeliveryBeforeInitialisationDeliversNothing) {
    FakeFrameworkTools tools;
    EventRecorder recorder;
    tools.emitter = recorder.emitter();
    FakeResponser responser;
    const auto rules = std::make_shared<FakeVcaRuleRetriever>();
    PluginQuenvar plugin;
    plugin.setVcaRuleRetriever(rules);
    plugin.SubscribeEventBlock("A", EVENT_LIVE_VCA_RULE_CHANGED, QVariant(), RequestSenderInfo{},
                               responser);

    plugin.handleVCAMetadataChanged("cam-1");
    ASSERT_EQ(rules->liveCalls.size(), 1);
    EXPECT_NO_THROW(rules->liveCalls[0].callback(true, "0", "", rulesPayload("cam-1")));

    ASSERT_TRUE(plugin.InitialPluginBase(&tools));
    plugin.setVcaRuleRetriever(rules);
    plugin.handleVCAMetadataChanged("cam-1");
    ASSERT_EQ(rules->liveCalls.size(), 2);
    rules->liveCalls[1].callback(true, "0", "", rulesPayload("cam-1"));
    EXPECT_EQ(recorder.subscriberIds(), QStringList{"A"});
}

TEST(EventsLifetimeTest, AnswerAfterDestructionDeliversNothing) {
    FakeFrameworkTools tools;
    EventRecorder recorder;
    tools.emitter = recorder.emitter();
    FakeResponser responser;
    const auto rules = std::make_shared<FakeVcaRuleRetriever>();
    auto plugin = std::make_unique<PluginQuenvar>();
    ASSERT_TRUE(plugin->InitialPluginBase(&tools));
    plugin->setVcaRuleRetriever(rules);
    plugin->SubscribeEventBlock("A", EVENT_LIVE_VCA_RULE_CHANGED, QVariant(), RequestSenderInfo{},
                                responser);
    plugin->handleVCAMetadataChanged("cam-1");
    ASSERT_EQ(rules->liveCalls.size(), 1);

    plugin.reset();
    rules->liveCalls[0].callback(true, "0", "", rulesPayload("cam-1"));
    EXPECT_TRUE(recorder.deliveries().isEmpty());
}

// A plugin connected to a stand-in VCA plugin, with its own tools and rule service.
struct Rig {
    Rig() {
        tools.emitter = recorder.emitter();
        tools.registerPlugin(VCA_PLUGIN_ID, &vca);
        plugin->InitialPluginBase(&tools);
        plugin->setVcaRuleRetriever(rules);
        plugin->AllPluginLoaded();
    }

    void subscribe(const QString& id) {
        plugin->SubscribeEventBlock(id, EVENT_LIVE_VCA_RULE_CHANGED, QVariant(),
                                    RequestSenderInfo{}, responser);
    }

    void answerAll() {
        for (const auto& call : rules->liveCalls)
            call.callback(true, "0", "", rulesPayload(call.cameraId));
    }

    FakeFrameworkTools tools;
    EventRecorder recorder;
    FakeResponser responser;
    VcaPluginStandIn vca;
    std::shared_ptr<FakeVcaRuleRetriever> rules = std::make_shared<FakeVcaRuleRetriever>();
    std::unique_ptr<PluginQuenvar> plugin = std::make_unique<PluginQuenvar>();
};

// The three cases share one wait for the delay to pass.
TEST(EventsDelayTest, ChangeSignalFetchesOnceAfterTheDelayPerSignal) {
    Rig lonely;
    Rig busy;
    busy.subscribe("A");
    busy.subscribe("B");
    Rig gone;
    gone.subscribe("A");

    QElapsedTimer clock;
    clock.start();
    emit lonely.vca.vcaMetadataChanged("cam-1");
    for (int i = 0; i < 3; ++i)
        emit busy.vca.vcaMetadataChanged("cam-2");
    emit gone.vca.vcaMetadataChanged("cam-3");
    gone.plugin.reset();

    const auto fetched = [&]() {
        return lonely.rules->liveCalls.size() + busy.rules->liveCalls.size() +
               gone.rules->liveCalls.size();
    };
    EXPECT_FALSE(runEventLoopUntil(clock, 1500, [&]() { return fetched() > 0; }))
        << "fetched after " << clock.elapsed() << " ms";
    EXPECT_TRUE(runEventLoopUntil(clock, 5000, [&]() {
        return lonely.rules->liveCalls.size() == 1 && busy.rules->liveCalls.size() == 3;
    }));
    // Past the destroyed plugin's timer too, coarse timers included.
    runEventLoopUntil(clock, 2300, []() { return false; });

    EXPECT_EQ(lonely.rules->liveCalls.size(), 1);
    EXPECT_EQ(lonely.rules->liveCalls.value(0).cameraId, "cam-1");
    EXPECT_EQ(busy.rules->liveCalls.size(), 3);
    EXPECT_EQ(gone.rules->liveCalls.size(), 0);

    lonely.answerAll();
    busy.answerAll();
    EXPECT_TRUE(lonely.recorder.deliveries().isEmpty());
    EXPECT_EQ(busy.recorder.subscriberIds(), (QStringList{"A", "B", "A", "B", "A", "B"}));
    for (const Delivery& delivery : busy.recorder.deliveries())
        EXPECT_EQ(delivery.eventData, rulesPayload("cam-2"));
    EXPECT_TRUE(gone.recorder.deliveries().isEmpty());
}

} // namespace

#include "EventsTest.moc"
