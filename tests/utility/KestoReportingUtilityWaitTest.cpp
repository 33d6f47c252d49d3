// SPDX-License-Identifier: Apache-2.0
// Waiting for a flag that another thread sets. Only these tests of the folder take real time, and as little as
// possible: they wait for threads, never for a fixed time.
#include "support/TestPlatform.h"
#include "support/WatchedThread.h"
#include "utility/KestoReportingUtility.h"

#include <chrono>
#include <future>
#include <gmock/gmock.h>
#include <limits>
#include <thread>

namespace {

using enum platform::LogLevel;
using support::IsLine;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr double aMinute = 60;
constexpr double aMoment = 0.001;

class WaitTest : public testing::Test {
protected:
    bool wait(double timeout)
    {
        return KestoReportingUtilityWait(condition, timeout, flag, "waiting for it", "it never came",
                                         KestoReportingTraceCategory());
    }

    // Returns when so many other threads have logged that they wait and have released the lock: they then sleep.
    void letThemFallAsleep(std::size_t threads)
    {
        while (platform.log.lines().size() < threads)
            std::this_thread::yield();
        const foundation::Lock lock(condition.lock);
    }
    void letItFallAsleep() { letThemFallAsleep(1); }

    support::TestPlatform platform;
    utility::ConditionWithLock condition;
    bool flag = false;
};

TEST_F(WaitTest, ReturnsAtOnceWithoutAWordWhenTheFlagIsSet)
{
    flag = true;
    EXPECT_TRUE(wait(0));
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(WaitTest, GivesUpAfterOneTimeoutWithoutASignal)
{
    const auto begun = std::chrono::steady_clock::now();
    EXPECT_FALSE(wait(aMoment));
    EXPECT_GE(std::chrono::steady_clock::now() - begun, std::chrono::milliseconds(1));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kert", "waiting for it"), IsLine(Error, "kert", "it never came")));
}

TEST_F(WaitTest, ReleasesTheLockWhenItGivesUp)
{
    EXPECT_FALSE(wait(aMoment));
    KestoReportingUtilitySignal(condition, flag); // would block for ever otherwise
    EXPECT_TRUE(wait(0));
}

TEST_F(WaitTest, GoesOnWhenItIsSignalled)
{
    auto waited = std::async(std::launch::async, [this] { return wait(aMinute); });
    letItFallAsleep();
    KestoReportingUtilitySignal(condition, flag);
    EXPECT_TRUE(waited.get());
    EXPECT_TRUE(flag);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kert", "waiting for it"), IsLine(Info, "kert", "continuing")));
}

TEST_F(WaitTest, GoesOnAloneWhenTwoWaitForOneSignal)
{
    const auto waitLong = [this] { EXPECT_TRUE(wait(aMinute)); };
    const support::WatchedThread first(waitLong);
    const support::WatchedThread second(waitLong);
    letThemFallAsleep(2);
    KestoReportingUtilitySignal(condition, flag);
    while (!first.isDone() && !second.isDone())
        std::this_thread::yield();
    EXPECT_NE(first.fallsAsleep(), second.fallsAsleep()) << "the other is not woken, although the flag is set";
    KestoReportingUtilitySignal(condition, flag);
}

TEST_F(WaitTest, BeginsAnewAfterAWakeUpWithoutTheFlag)
{
    auto waited = std::async(std::launch::async, [this] { return wait(aMinute); });
    letItFallAsleep();
    while (platform.log.lines().size() < 3) { // "waiting for it", "continuing", "waiting for it"
        condition.signal.notifyOne();
        std::this_thread::yield();
    }
    KestoReportingUtilitySignal(condition, flag);
    EXPECT_TRUE(waited.get());

    const auto lines = platform.log.lines();
    ASSERT_EQ(lines.size() % 2, 0U);
    for (std::size_t place = 0; place < lines.size(); place += 2) {
        EXPECT_THAT(lines[place], IsLine(Info, "kert", "waiting for it"));
        EXPECT_THAT(lines[place + 1], IsLine(Info, "kert", "continuing"));
    }
}

TEST_F(WaitTest, WaitsItsWholeTimeAgainAfterAWakeUpWithoutTheFlag)
{
    constexpr std::chrono::milliseconds timeout(200);
    const auto saidTwice = [this] { return platform.log.lines().size() == 4; };
    std::chrono::steady_clock::time_point woken;
    std::chrono::steady_clock::time_point ended;
    for (int attempt = 0; attempt < 10 && !saidTwice();
         ++attempt) { // on a busy machine it may give up before it is woken
        platform.log.clear();
        auto waited = std::async(std::launch::async, [&] {
            EXPECT_FALSE(wait(std::chrono::duration<double>(timeout).count()));
            ended = std::chrono::steady_clock::now();
        });
        letItFallAsleep();
        waited.wait_for(timeout / 2);
        woken = std::chrono::steady_clock::now();
        condition.signal.notifyOne();
        waited.get();
    }
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kert", "waiting for it"), IsLine(Info, "kert", "continuing"),
                            IsLine(Info, "kert", "waiting for it"), IsLine(Error, "kert", "it never came")));
    EXPECT_GE(ended - woken, timeout);
}

TEST_F(WaitTest, TakesEveryNumberForATimeout)
{
    EXPECT_FALSE(wait(-1));
    EXPECT_FALSE(wait(-std::numeric_limits<double>::infinity()));
    for (const double endless : {std::numeric_limits<double>::infinity(), std::numeric_limits<double>::max(),
                                 std::numeric_limits<double>::quiet_NaN()}) {
        flag = false;
        platform.log.clear();
        auto waited = std::async(std::launch::async, [&] { return wait(endless); });
        letItFallAsleep();
        KestoReportingUtilitySignal(condition, flag);
        EXPECT_TRUE(waited.get()) << endless;
    }
}

TEST_F(WaitTest, FindsTheFlagOfASignalThatCameBefore)
{
    KestoReportingUtilitySignal(condition, flag);
    EXPECT_TRUE(wait(aMinute));
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

} // namespace
