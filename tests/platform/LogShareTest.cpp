// SPDX-License-Identifier: Apache-2.0
// A process's share of the log, with moments that the test makes up.
#include "platform/LogShare.h"

#include <gtest/gtest.h>
#include <thread>

namespace platform {
namespace {

using namespace std::chrono_literals;

class LogShareTest : public testing::Test {
protected:
    int take(int lines, LogShare::Part part = LogShare::Part::Others)
    {
        int taken = 0;
        for (; lines > 0; --lines)
            taken += share_.take(part, now_) ? 1 : 0;
        return taken;
    }

    LogShare::Clock::time_point now_{1h};
    LogShare share_{"process 7", now_};
};

TEST_F(LogShareTest, HasTwoThousandLinesAtOnceAndFiftyASecond)
{
    EXPECT_EQ(take(2100), 2000);
    now_ += 1s;
    EXPECT_EQ(take(100), 50);
    now_ += 10ms;
    EXPECT_EQ(take(1), 0);
    now_ += 10ms;
    EXPECT_EQ(take(1), 1);
    now_ += 1h;
    EXPECT_EQ(take(2100), 2000) << "what is not used is not saved up";
}

TEST_F(LogShareTest, HasAsManyErrorsBesideTheOthers)
{
    EXPECT_EQ(take(2100), 2000);
    EXPECT_EQ(take(2100, LogShare::Part::Errors), 2000);
    now_ += 1s;
    EXPECT_EQ(take(100, LogShare::Part::Errors), 50);
    EXPECT_EQ(take(100), 50);
}

TEST_F(LogShareTest, HasAsManyLinesAboutConnectionsBesideTheOthers)
{
    EXPECT_EQ(take(2100), 2000);
    EXPECT_EQ(take(2100, LogShare::Part::Connections), 2000);
    now_ += 1s;
    EXPECT_EQ(take(100, LogShare::Part::Connections), 50);
    EXPECT_EQ(take(100), 50);
}

TEST_F(LogShareTest, IsFullWhenItMayWriteAsMuchAsANewOne)
{
    EXPECT_TRUE(share_.isFull(now_));
    take(1, LogShare::Part::Errors);
    EXPECT_FALSE(share_.isFull(now_));
    now_ += 19ms;
    EXPECT_FALSE(share_.isFull(now_));
    now_ += 2ms;
    EXPECT_TRUE(share_.isFull(now_));
}

TEST_F(LogShareTest, SaysHowManyWereLeftOutAtMostEveryTenSeconds)
{
    EXPECT_EQ(share_.takeLeftOut(now_), 0U);
    take(2003);
    EXPECT_EQ(share_.takeLeftOut(now_), 3U);
    EXPECT_EQ(share_.takeLeftOut(now_), 0U);
    take(4);
    now_ += 9s;
    EXPECT_EQ(share_.takeLeftOut(now_), 0U);
    now_ += 1s;
    EXPECT_EQ(share_.takeLeftOut(now_), 4U);
    take(2000);
    EXPECT_EQ(share_.takeLeftOut(now_), 0U);
    EXPECT_EQ(share_.takeLeftOutAtEnd(now_), 1500U) << "10 s have earned 500 lines";
    EXPECT_EQ(share_.takeLeftOutAtEnd(now_), 0U);
}

TEST_F(LogShareTest, SaysAtAClientsEndHowManyWereLeftOutIfALineAboutConnectionsIsLeft)
{
    take(2003);
    take(2000, LogShare::Part::Connections);
    EXPECT_EQ(share_.takeLeftOutAtEnd(now_), 0U);
    now_ += 20ms;
    EXPECT_EQ(share_.takeLeftOutAtEnd(now_), 3U);
    EXPECT_EQ(take(1, LogShare::Part::Connections), 0) << "the report was that line";
}

TEST_F(LogShareTest, AThreadWritesForItWhileTheWritingLives)
{
    EXPECT_EQ(LogShare::ofThisThread(), nullptr);
    {
        const LogShare::Writing writing(&share_);
        EXPECT_EQ(LogShare::ofThisThread(), &share_);
        {
            const LogShare::Writing forNone(nullptr);
            EXPECT_EQ(LogShare::ofThisThread(), nullptr);
        }
        EXPECT_EQ(LogShare::ofThisThread(), &share_);
        std::jthread([] { EXPECT_EQ(LogShare::ofThisThread(), nullptr); });
    }
    EXPECT_EQ(LogShare::ofThisThread(), nullptr);
}

TEST_F(LogShareTest, AThreadWritesAboutCallsUnlessItSaysOtherwise)
{
    using enum LogShare::About;
    EXPECT_EQ(LogShare::aboutOfThisThread(), Calls);
    const LogShare::Writing aboutConnection(&share_, Connections);
    EXPECT_EQ(LogShare::aboutOfThisThread(), Connections);
    {
        const LogShare::Writing writing(&share_);
        EXPECT_EQ(LogShare::aboutOfThisThread(), Calls);
    }
    EXPECT_EQ(LogShare::aboutOfThisThread(), Connections);
}

} // namespace
} // namespace platform
