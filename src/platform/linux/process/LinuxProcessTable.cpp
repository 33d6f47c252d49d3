// SPDX-License-Identifier: Apache-2.0
// Names from /proc/<pid>/comm. A process's place in the cache is its number modulo the size: the cache needs no order,
// and clients cannot make it grow.
#include "platform/linux/process/LinuxProcessTable.h"

#include "foundation/values/String.h"
#include "platform/linux/files/SmallFile.h"

#include <cerrno>
#include <ctime>
#include <fmt/format.h>
#include <string_view>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::size_t longestName = 64; // of kernel threads; processes have at most 15 bytes

std::optional<std::string> readName(std::string_view process)
{
    auto name = readSmallFile(fmt::format("/proc/{}/comm", process), longestName);
    if (!name)
        return std::nullopt;
    if (name->ends_with('\n'))
        name->pop_back();
    // A process names itself, in any bytes; the kernel cuts the name, even inside a character.
    foundation::replaceWhatIsNotUtf8(*name);
    return std::move(*name);
}

} // namespace

std::chrono::nanoseconds LinuxProcessTable::coarseMonotonicTime()
{
    timespec time = {};
    ::clock_gettime(CLOCK_MONOTONIC_COARSE, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

LinuxProcessTable::LinuxProcessTable(Now now)
    : now_(now),
      ownIdentifier_(::getpid()),
      ownName_(readName("self").value_or(program_invocation_short_name))
{
}

std::optional<ProcessTableEntry> LinuxProcessTable::entry(std::int32_t processIdentifier) const
{
    if (processIdentifier < 1)
        return std::nullopt;
    const std::chrono::nanoseconds now = now_();
    const foundation::Lock lock(lock_);
    Kept& kept = placeOf(processIdentifier);
    if (kept.entry.processIdentifier != processIdentifier || now - kept.readAt >= longestBelieved) {
        auto name = readName(fmt::to_string(processIdentifier));
        if (!name)
            return std::nullopt;
        kept = {{processIdentifier, std::move(*name)}, now};
    }
    return kept.entry;
}

void LinuxProcessTable::forget(std::int32_t processIdentifier)
{
    const foundation::Lock lock(lock_);
    if (Kept& kept = placeOf(processIdentifier); kept.entry.processIdentifier == processIdentifier)
        kept = {};
}

} // namespace platform
