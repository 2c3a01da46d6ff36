#include "PendingAnswer.h"

#include <gtest/gtest.h>

// A request whose callback is dropped unanswered is seen end to end, where quenvar-host request
// then ends long before its time-out.
TEST(PendingAnswerTest, FirstAnswerStandsAlsoOnceEveryCopyIsDropped) {
    int notified = 0;
    const auto pending = PendingAnswer::create();
    pending->setListener([&]() { ++notified; });
    {
        const ResponseCallback callback = pending->callback();
        callback(true, QStringLiteral("0"), QStringLiteral("m"), QStringLiteral("first"));
        callback(false, QStringLiteral("-1"), QString(), QStringLiteral("second"));
    }
    EXPECT_EQ(pending->state(), PendingAnswer::State::Answered);
    EXPECT_EQ(pending->answer().payload.toString(), QStringLiteral("first"));
    EXPECT_TRUE(pending->answer().handled);
    EXPECT_EQ(notified, 1);
}
