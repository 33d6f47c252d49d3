// SPDX-License-Identifier: Apache-2.0
// The age time of the store: clocks that are wrong, set, or stand still do not make events older than they are.
#include "platform/linux/store/tables/AgeClock.h"

#include "platform/linux/store/ManualClock.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

constexpr double hour = 3600;
constexpr double day = 24 * hour;

class AgeClockTest : public testing::Test {
protected:
    // A run of the service, on a database that was left in that state.
    AgeClock run(const AgeClockState& state, std::int64_t nextEvent) const { return {wall, state, nextEvent}; }
    [[nodiscard]] AgeClockState leftNow() const
    {
        return {.time = 1000, .wall = wall.secondsSince1970(), .away = 0, .trial = 0, .awayBelow = 0};
    }

    support::ManualClock wall;
};

TEST_F(AgeClockTest, GoesOnWithTheMachine)
{
    AgeClock clock = run(leftNow(), 5);
    EXPECT_FALSE(clock.advance());
    EXPECT_EQ(clock.state().time, 1000);
    wall.advance(3 * day);
    EXPECT_FALSE(clock.advance());
    EXPECT_EQ(clock.state().time, 1000 + 3 * day);
}

TEST_F(AgeClockTest, APauseOfADayOrLessIsBelievedAtOnce)
{
    const AgeClockState left = leftNow();
    wall.advance(20 * hour);
    AgeClock clock = run(left, 5);
    const auto correction = clock.advance();
    ASSERT_TRUE(correction);
    EXPECT_EQ(correction->below, 5);
    EXPECT_EQ(correction->seconds, 20 * hour);
    EXPECT_EQ(clock.state().time, 1000) << "the service did not run";
    EXPECT_FALSE(clock.advance());
}

TEST_F(AgeClockTest, ALongerPauseIsBelievedAfterADay)
{
    const AgeClockState left = leftNow();
    wall.advance(30 * day);
    AgeClock clock = run(left, 5);
    EXPECT_FALSE(clock.advance());
    wall.advance(23 * hour);
    EXPECT_FALSE(clock.advance());
    wall.advance(1 * hour);
    const auto correction = clock.advance();
    ASSERT_TRUE(correction);
    EXPECT_EQ(correction->below, 5);
    EXPECT_EQ(correction->seconds, 30 * day);
    EXPECT_EQ(clock.state().away, 0);
}

TEST_F(AgeClockTest, SettingTheClockBeginsTheDayAnew)
{
    const AgeClockState left = leftNow();
    wall.advance(30 * day);
    AgeClock clock = run(left, 5);
    wall.advance(23 * hour);
    EXPECT_FALSE(clock.advance());
    wall.set(wall.secondsSince1970() + 2 * hour);
    EXPECT_FALSE(clock.advance());
    wall.advance(23 * hour);
    EXPECT_FALSE(clock.advance());
    wall.advance(1 * hour);
    const auto correction = clock.advance();
    ASSERT_TRUE(correction);
    EXPECT_EQ(correction->seconds, 30 * day + 2 * hour);
}

TEST_F(AgeClockTest, AClockThatStartsIn1970LeavesThePauseOnceItIsSet)
{
    const AgeClockState left = leftNow();
    const double then = wall.secondsSince1970();
    wall.set(0);
    AgeClock clock = run(left, 5);
    EXPECT_FALSE(clock.advance());
    wall.advance(60);
    EXPECT_FALSE(clock.advance());
    wall.set(then + 5 * hour + 60);
    const auto correction = clock.advance();
    ASSERT_TRUE(correction) << "five hours are believed";
    EXPECT_EQ(correction->below, 5);
    EXPECT_EQ(correction->seconds, 5 * hour);
}

TEST_F(AgeClockTest, AClockThatJumpsDuringARunChangesOnlyWhatWasKeptBefore)
{
    AgeClock clock = run(leftNow(), 5);
    EXPECT_FALSE(clock.advance());
    wall.set(wall.secondsSince1970() + 400 * day);
    EXPECT_FALSE(clock.advance());
    EXPECT_EQ(clock.state().time, 1000);
    wall.advance(1 * day);
    const auto correction = clock.advance();
    ASSERT_TRUE(correction);
    EXPECT_EQ(correction->below, 5);
    EXPECT_EQ(correction->seconds, 400 * day);
}

TEST_F(AgeClockTest, AClockThatIsSetBackIsForgottenAfterADay)
{
    AgeClock clock = run(leftNow(), 5);
    wall.set(wall.secondsSince1970() - 400 * day);
    EXPECT_FALSE(clock.advance());
    EXPECT_EQ(clock.state().away, -400 * day);
    wall.advance(1 * day);
    EXPECT_FALSE(clock.advance());
    EXPECT_EQ(clock.state().away, 0);
    EXPECT_EQ(clock.state().time, 1000 + 1 * day);
}

TEST_F(AgeClockTest, ASmallCorrectionOfTheClockIsNoJump)
{
    const AgeClockState left = leftNow();
    wall.advance(30 * day);
    AgeClock clock = run(left, 5);
    for (int step = 0; step < 24; ++step) {
        EXPECT_FALSE(clock.advance());
        wall.advance(1 * hour);
        wall.set(wall.secondsSince1970() + 2);
    }
    EXPECT_TRUE(clock.advance());
}

} // namespace
} // namespace platform
