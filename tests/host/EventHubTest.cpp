#include "EventHub.h"

#include <gtest/gtest.h>

using namespace std::chrono_literals;

namespace {

PluginObjBase_EventSignalInfo record(const QString& subscriberId) {
    PluginObjBase_EventSignalInfo info;
    info.timestamp = 42;
    info.eventName = QStringLiteral("liveVCARuleChanged");
    info.eventData = QVariantMap{{"camID", "cam1"}};
    info.sourcePluginId = QStringLiteral("P");
    info.subscriberId = subscriberId;
    return info;
}

} // namespace

TEST(EventHubTest, FirstAttachAndLastDetachOfASubscriberAreReported) {
    EventHub hub;
    auto first = std::make_shared<EventQueue>();
    auto second = std::make_shared<EventQueue>();
    EXPECT_TRUE(hub.attach("A", first));
    EXPECT_FALSE(hub.attach("A", second));
    EXPECT_FALSE(hub.detach("A", first));
    EXPECT_TRUE(first->isClosed());
    EXPECT_TRUE(hub.detach("A", second));
    EXPECT_FALSE(hub.detach("A", second));
}

TEST(EventHubTest, DeliversACopyToEveryStreamOfTheNamedSubscriberOnly) {
    EventHub hub;
    auto a1 = std::make_shared<EventQueue>();
    auto a2 = std::make_shared<EventQueue>();
    auto b = std::make_shared<EventQueue>();
    hub.attach("A", a1);
    hub.attach("A", a2);
    hub.attach("B", b);
    {
        PluginObjBase_EventSignalInfo info = record("A");
        EXPECT_EQ(hub.deliver(&info), 2);
    }
    for (const auto& queue : {a1, a2}) {
        const std::optional<HostEvent> event = queue->next(0ms);
        ASSERT_TRUE(event.has_value());
        EXPECT_EQ(event->subscriberId, QStringLiteral("A"));
        EXPECT_EQ(event->sourcePluginId, QStringLiteral("P"));
        EXPECT_EQ(event->timestamp, 42);
        EXPECT_EQ(event->eventData.toMap().value("camID").toString(), QStringLiteral("cam1"));
    }
    EXPECT_FALSE(b->next(0ms).has_value());
}
