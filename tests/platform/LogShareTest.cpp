// SPDX-License-Identifier: Apache-2.0
// A client's share of the log, with moments that the test makes up.
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
    LogShare share_{"client 7", now_};
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
    EXPECT_GT(share_.takeLeftOut(), 0U) << "at the end in any case";
    EXPECT_EQ(share_.takeLeftOut(), 0U);
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

} // namespace
} // namespace platform
