// SPDX-License-Identifier: Apache-2.0
// The thread that reaches the limit submits the work, so that there is nothing to lock. The limits are read for each
// piece that a client sends, so they are plain numbers; while they change, a reader may see old beside new ones.
#include "platform/linux/memory/LinuxMemory.h"

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/memory/MemoryConfiguration.h"
#include "platform/linux/queues/ThreadHeap.h"
#include "platform/linux/settings/CheckedSettings.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <unistd.h>

namespace platform {
namespace {

// A machine may have more memory than a process of 32 bits has addresses.
std::uint64_t bytesOfPages(long pages)
{
    return static_cast<std::uint64_t>(pages) * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
}

// 0 if the system does not tell. The file stays open, because this is asked whenever a client goes.
std::size_t residentBytes()
{
    static const FileDescriptor statm(::open("/proc/self/statm", O_RDONLY | O_CLOEXEC));
    std::array<char, 128> text = {};
    if (::pread(statm.get(), text.data(), text.size() - 1, 0) <= 0)
        return 0;
    const char* const behindMapped = std::ranges::find(text, ' ');
    return static_cast<std::size_t>(bytesOfPages(std::strtol(behindMapped, nullptr, 10)));
}

std::chrono::nanoseconds usedTime()
{
    timespec time = {};
    ::clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &time);
    return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

} // namespace

const LinuxMemory::Process LinuxMemory::thisProcess = {.residentBytes = platform::residentBytes,
                                                       .usedTime = platform::usedTime};

LinuxMemory::LinuxMemory(WorkQueues& queues, ConfigurationWatcher& watcher, ProviderLog log, const Process& process)
    : queues_(queues),
      log_(log),
      process_(process),
      residentWhenTidy_(process.residentBytes()),
      limitsFile_(watcher, "limits.toml", log, [this] { applyLimits(); })
{
    applyLimits();
}

void LinuxMemory::applyLimits()
{
    const auto [limits, problems] = readMemoryLimits(limitsFile_.values(), bytesOfPages(::sysconf(_SC_PHYS_PAGES)));
    mostOfTheService_ = limits.ofTheService;
    mostOfAUser_ = limits.ofAUser;
    mostOfAClient_ = limits.ofAClient;
    logProblems(limitsFile_.path(), problems, log_);
}

MemoryLimits LinuxMemory::limits() const
{
    return {.ofTheService = mostOfTheService_.load(std::memory_order_relaxed),
            .ofAUser = mostOfAUser_.load(std::memory_order_relaxed),
            .ofAClient = mostOfAClient_.load(std::memory_order_relaxed)};
}

void LinuxMemory::letGo(std::size_t bytes)
{
    const std::size_t before = bytes_.fetch_add(bytes);
    if (before >= much || bytes < much - before)
        return;
    queues_.submitAfter(delay - std::chrono::seconds(1), queues_.backgroundQueue(),
                        [this] { tidyAtRest(mostSecondsWithoutRest); });
}

// The client's memory may not be free yet. It is in the process's, and it will be free when the heaps are tidied.
void LinuxMemory::clientGone()
{
    const std::size_t before = residentWhenTidy_;
    const std::size_t now = process_.residentBytes();
    if (now > before && now - before >= much)
        letGo(now - before);
}

// Looks a second later whether the service rested meanwhile.
void LinuxMemory::tidyAtRest(int secondsLeft)
{
    const auto look = [this, secondsLeft, before = process_.usedTime()] {
        if (secondsLeft == 0 || process_.usedTime() - before < timeOfRest)
            tidy();
        else
            tidyAtRest(secondsLeft - 1);
    };
    queues_.submitAfter(std::chrono::seconds(1), queues_.backgroundQueue(), look);
}

void LinuxMemory::tidy()
{
    bytes_ = 0;
    ThreadHeap::askAll();
    queues_.submitAfter(timeToTidy, queues_.backgroundQueue(),
                        [this] { residentWhenTidy_ = process_.residentBytes(); });
}

} // namespace platform
