#include "PendingAnswer.h"

#include <gtest/gtest.h>

using namespace std::chrono_literals;

TEST(PendingAnswerTest, FirstAnswerStandsAndDroppingEveryCopyUnansweredAbandons) {
    int notified = 0;
    const auto answered = PendingAnswer::create();
    answered->setListener([&]() { ++notified; });
    {
        const ResponseCallback callback = answered->callback();
        callback(true, QStringLiteral("0"), QStringLiteral("m"), QStringLiteral("first"));
        callback(false, QStringLiteral("-1"), QString(), QStringLiteral("second"));
    }
    EXPECT_EQ(answered->state(), PendingAnswer::State::Answered);
    EXPECT_EQ(answered->answer().payload.toString(), QStringLiteral("first"));
    EXPECT_TRUE(answered->answer().handled);

    const auto abandoned = PendingAnswer::create();
    abandoned->setListener([&]() { ++notified; });
    {
        const ResponseCallback callback = abandoned->callback();
        const ResponseCallback copy = callback;
    }
    EXPECT_EQ(abandoned->waitFor(0ms), PendingAnswer::State::Abandoned);
    EXPECT_EQ(notified, 2);
}
