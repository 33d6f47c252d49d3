// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Clock.h: a time of day, and an uptime that never decreases.
#include "platform/contract/Contract.h"
#include "platform/linux/process/LinuxClock.h"
#include "support/fakes/FakeClock.h"

namespace contract {
namespace {

class ClockSubject {
public:
    virtual ~ClockSubject() = default;
    [[nodiscard]] virtual const platform::Clock& clock() const = 0;
    // Returns when some milliseconds have passed.
    virtual void letTimePass() = 0;
};

class FakeClockSubject final : public ClockSubject {
public:
    [[nodiscard]] const platform::Clock& clock() const override { return clock_; }
    void letTimePass() override { clock_.advance(0.005); }

private:
    support::FakeClock clock_;
};

class LinuxClockSubject final : public ClockSubject {
public:
    [[nodiscard]] const platform::Clock& clock() const override { return clock_; }
    void letTimePass() override
    {
        const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(5);
        while (std::chrono::steady_clock::now() < end)
            std::this_thread::yield();
    }

private:
    platform::LinuxClock clock_;
};

using ClockContract = Suite<ClockSubject>;
KESTO_CONTRACT(ClockContract, (provider<ClockSubject, FakeClockSubject>("Fake")),
               (provider<ClockSubject, LinuxClockSubject>("Linux")));

TEST_P(ClockContract, TellsSecondsSince1970)
{
    constexpr double september2001 = 1'000'000'000; // this test is younger
    EXPECT_GE(subject->clock().secondsSince1970(), september2001);
    EXPECT_LT(subject->clock().secondsSince1970(), 10 * september2001) << "and not milliseconds";
}

TEST_P(ClockContract, TellsAnUptimeThatBeganAfter1970)
{
    EXPECT_GT(subject->clock().systemUptime(), 0);
    EXPECT_LT(subject->clock().systemUptime(), subject->clock().secondsSince1970());
}

TEST_P(ClockContract, LetsBothTimesPassAlike)
{
    constexpr double tolerance = 1; // the clock may be corrected meanwhile
    const double time = subject->clock().secondsSince1970();
    const double uptime = subject->clock().systemUptime();
    subject->letTimePass();
    const double passed = subject->clock().secondsSince1970() - time;
    const double uptimePassed = subject->clock().systemUptime() - uptime;
    EXPECT_GE(uptimePassed, 0.004);
    EXPECT_NEAR(passed, uptimePassed, tolerance);
}

TEST_P(ClockContract, NeverTurnsTheUptimeBack)
{
    double last = subject->clock().systemUptime();
    for (int reading = 0; reading < 10'000; ++reading) {
        const double now = subject->clock().systemUptime();
        ASSERT_GE(now, last);
        last = now;
    }
}

} // namespace
} // namespace contract
