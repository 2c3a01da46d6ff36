#include "PendingAnswer.h"

#include <gtest/gtest.h>

using namespace std::chrono_literals;

TEST(PendingAnswerTest, DroppedCallbackAbandonsTheRequestAtOnce) {
    auto pending = PendingAnswer::create();
    int notified = 0;
    pending->setListener([&]() { ++notified; });
    {
        ResponseCallback callback = pending->callback();
        ResponseCallback copy = callback;
    }
    EXPECT_EQ(pending->waitFor(0ms), PendingAnswer::State::Abandoned);
    EXPECT_EQ(notified, 1);
}

TEST(PendingAnswerTest, FirstAnswerStandsAndLaterOnesAndTheDropAreIgnored) {
    auto pending = PendingAnswer::create();
    int notified = 0;
    pending->setListener([&]() { ++notified; });
    {
        ResponseCallback callback = pending->callback();
        callback(true, QStringLiteral("0"), QStringLiteral("m"), QStringLiteral("first"));
        callback(false, QStringLiteral("-1"), QString(), QStringLiteral("second"));
    }
    EXPECT_EQ(pending->state(), PendingAnswer::State::Answered);
    EXPECT_EQ(pending->answer().payload.toString(), QStringLiteral("first"));
    EXPECT_TRUE(pending->answer().handled);
    EXPECT_EQ(notified, 1);
}
