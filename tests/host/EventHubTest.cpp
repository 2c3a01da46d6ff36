#include "EventHub.h"

#include <gtest/gtest.h>

using namespace std::chrono_literals;

TEST(EventHubTest, DeliversToEveryStreamOfTheNamedSubscriberAndReportsFirstAndLast) {
    EventHub hub;
    const auto a1 = std::make_shared<EventQueue>();
    const auto a2 = std::make_shared<EventQueue>();
    const auto b = std::make_shared<EventQueue>();
    EXPECT_TRUE(hub.attach("A", a1));
    EXPECT_FALSE(hub.attach("A", a2));
    EXPECT_TRUE(hub.attach("B", b));

    PluginObjBase_EventSignalInfo info;
    info.timestamp = 42;
    info.eventName = QStringLiteral("liveVCARuleChanged");
    info.eventData = QVariantMap{{"camID", "cam1"}};
    info.sourcePluginId = QStringLiteral("P");
    info.subscriberId = QStringLiteral("A");
    EXPECT_EQ(hub.deliver(&info), 2);
    info.subscriberId = QStringLiteral("Z");
    EXPECT_EQ(hub.deliver(&info), 0);
    for (const auto& queue : {a1, a2}) {
        const std::optional<HostEvent> event = queue->next(0ms);
        ASSERT_TRUE(event.has_value());
        EXPECT_EQ(QStringList({QString::number(event->timestamp), event->eventName,
                               event->eventData.toMap().value("camID").toString(),
                               event->sourcePluginId, event->subscriberId})
                      .join(' ')
                      .toStdString(),
                  "42 liveVCARuleChanged cam1 P A");
        EXPECT_FALSE(queue->next(0ms).has_value());
    }
    EXPECT_FALSE(b->next(0ms).has_value());

    EXPECT_FALSE(hub.detach("A", a1));
    EXPECT_TRUE(a1->isClosed());
    EXPECT_TRUE(hub.detach("A", a2));
    EXPECT_FALSE(hub.detach("A", a2));
}
