#include "EventQueue.h"

#include <gtest/gtest.h>

namespace {

HostEvent event(int number) {
    return HostEvent{number, QStringLiteral("changed"), number, QString(), QStringLiteral("S")};
}

// A stream whose client stopped reading must not hold the host's memory.
TEST(EventQueueTest, ClosesWhenItsReaderFallsTooFarBehind) {
    EventQueue queue;
    int announced = 0;
    queue.setListener([&announced]() { ++announced; });
    for (int i = 0; i < EventQueue::CAPACITY; ++i)
        queue.push(event(i));
    EXPECT_FALSE(queue.isClosed());
    EXPECT_EQ(queue.next(std::chrono::milliseconds(0))->timestamp, 0);
    queue.push(event(EventQueue::CAPACITY));
    EXPECT_FALSE(queue.isClosed());

    queue.push(event(EventQueue::CAPACITY + 1));
    EXPECT_TRUE(queue.isClosed());
    EXPECT_FALSE(queue.next(std::chrono::milliseconds(0)));
    queue.push(event(0));
    queue.close();
    // Each push announced, and the closing once.
    EXPECT_EQ(announced, EventQueue::CAPACITY + 2);
}

} // namespace
