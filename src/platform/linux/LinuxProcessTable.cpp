#include "platform/linux/LinuxProcessTable.h"

#include "foundation/String.h"
#include "platform/linux/SmallFile.h"

#include <cerrno>
#include <ctime>
#include <fmt/format.h>
#include <string_view>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::size_t longestName = 64; // of kernel threads; processes have at most 15 bytes

std::size_t lengthOfFirstCharacter(std::string_view text)
{
    for (std::size_t length = 1; length <= std::min<std::size_t>(4, text.size()); ++length)
        if (foundation::isValidUtf8(text.substr(0, length)))
            return length;
    return 0;
}

// A process names itself, in any bytes; the kernel cuts the name, be it inside a character.
void replaceWhatIsNotUtf8(std::string& name)
{
    if (foundation::isValidUtf8(name))
        return;
    for (std::size_t at = 0; at < name.size();) {
        const std::size_t length = lengthOfFirstCharacter(std::string_view(name).substr(at));
        if (length == 0)
            name[at] = '?';
        at += std::max<std::size_t>(1, length);
    }
}

std::optional<std::string> readName(std::string_view process)
{
    auto name = readSmallFile(fmt::format("/proc/{}/comm", process), longestName);
    if (!name)
        return std::nullopt;
    if (name->ends_with('\n'))
        name->pop_back();
    replaceWhatIsNotUtf8(*name);
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
    Kept& kept = kept_[static_cast<std::size_t>(processIdentifier) % mostKept];
    if (kept.entry.processIdentifier != processIdentifier || now - kept.readAt >= longestBelieved) {
        auto name = readName(fmt::to_string(processIdentifier));
        if (!name)
            return std::nullopt;
        kept = {{processIdentifier, std::move(*name)}, now};
    }
    return kept.entry;
}

} // namespace platform
