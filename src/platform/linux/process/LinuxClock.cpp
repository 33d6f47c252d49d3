// SPDX-License-Identifier: Apache-2.0
// The uptime is CLOCK_BOOTTIME: unlike the monotonic clock, it goes on while the device sleeps.
#include "platform/linux/process/LinuxClock.h"

#include <ctime>

namespace platform {
namespace {

double secondsOf(clockid_t clock)
{
    timespec time = {};
    ::clock_gettime(clock, &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

} // namespace

double LinuxClock::secondsSince1970() const
{
    return secondsOf(CLOCK_REALTIME);
}

double LinuxClock::systemUptime() const
{
    return secondsOf(CLOCK_BOOTTIME);
}

} // namespace platform
