// SPDX-License-Identifier: Apache-2.0
// The clock of a process counts nanoseconds, where /proc counts hundredths of a second.
#include "fleet/ProcessFigures.h"

#include <ctime>
#include <fmt/format.h>
#include <fstream>
#include <string>

namespace fleet {

Memory memoryOf(pid_t process)
{
    Memory memory;
    std::ifstream status(fmt::format("/proc/{}/status", process));
    for (std::string key; status >> key;) {
        if (key == "VmHWM:")
            status >> memory.peak;
        else if (key == "RssAnon:")
            status >> memory.own;
    }
    return memory;
}

std::chrono::nanoseconds processorTimeOf(pid_t process)
{
    clockid_t clock{};
    timespec time{};
    if (::clock_getcpuclockid(process, &clock) != 0 || ::clock_gettime(clock, &time) != 0)
        return {};
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

} // namespace fleet
