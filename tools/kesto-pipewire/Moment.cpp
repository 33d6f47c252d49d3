// SPDX-License-Identifier: Apache-2.0
// The uptime is that of CLOCK_BOOTTIME, which goes on while the device sleeps. CLOCK_MONOTONIC does not, so a time on
// it only gives the time that has passed since.
#include "kesto-pipewire/Moment.h"

#include <ctime>

namespace kesto_pipewire {

namespace {

double secondsOf(clockid_t clock)
{
    timespec time{};
    clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

} // namespace

Moment currentMoment()
{
    return {secondsOf(CLOCK_REALTIME), secondsOf(CLOCK_BOOTTIME)};
}

Moment momentOfMonotonic(std::int64_t nanoseconds)
{
    const auto age = secondsOf(CLOCK_MONOTONIC) - static_cast<double>(nanoseconds) / 1e9;
    const auto now = currentMoment();
    return {now.secondsSince1970 - age, now.uptime - age};
}

} // namespace kesto_pipewire
