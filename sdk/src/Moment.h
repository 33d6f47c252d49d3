// SPDX-License-Identifier: Apache-2.0
// The time of what a program reports, on the two clocks that reports need.
//
// The uptime is that of CLOCK_BOOTTIME, which goes on while the device sleeps. Both clocks are read without a system
// call where the kernel lends them to programs, as Linux does on all usual machines.
#pragma once

#include <ctime>

namespace libkesto {

struct Moment {
    double secondsSince1970 = 0; // the device's owner may set it back and forth
    double uptime = 0; // seconds since the device started: measures durations
};

// Any thread, real-time threads too.
[[nodiscard]] inline Moment currentMoment() noexcept
{
    const auto secondsOf = [](clockid_t clock) {
        constexpr double nanosecondsInASecond = 1e9;
        timespec time{};
        ::clock_gettime(clock, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / nanosecondsInASecond;
    };
    return {secondsOf(CLOCK_REALTIME), secondsOf(CLOCK_BOOTTIME)};
}

} // namespace libkesto
