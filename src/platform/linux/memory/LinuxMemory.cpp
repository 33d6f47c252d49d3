// SPDX-License-Identifier: Apache-2.0
// The thread that reaches the limit submits the work, so that there is nothing to lock. The limits are read for each
// piece that a client sends, so they are plain numbers; while they change, a reader may see old beside new ones.
#include "platform/linux/memory/LinuxMemory.h"

#include "platform/linux/memory/MemoryConfiguration.h"
#include "platform/linux/queues/ThreadHeap.h"
#include "platform/linux/settings/CheckedSettings.h"

#include <fstream>
#include <unistd.h>

namespace platform {
namespace {

// A machine may have more memory than a process of 32 bits has addresses.
std::uint64_t bytesOfPages(long pages)
{
    return static_cast<std::uint64_t>(pages) * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
}

} // namespace

// 0 if the system does not tell.
std::size_t LinuxMemory::residentBytes()
{
    std::ifstream statm("/proc/self/statm");
    long mapped = 0;
    long resident = 0;
    statm >> mapped >> resident;
    return static_cast<std::size_t>(bytesOfPages(resident));
}

LinuxMemory::LinuxMemory(WorkQueues& queues, ConfigurationWatcher& watcher, ProviderLog log, std::size_t (*resident)())
    : queues_(queues),
      log_(log),
      resident_(resident),
      residentWhenTidy_(resident()),
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
    queues_.submitAfter(delay, queues_.backgroundQueue(), [this] { tidy(); });
}

// The client's memory may not be free yet. It is in the process's, and it will be free when the heaps are tidied.
void LinuxMemory::clientGone()
{
    const std::size_t before = residentWhenTidy_;
    const std::size_t now = resident_();
    if (now > before && now - before >= much)
        letGo(now - before);
}

void LinuxMemory::tidy()
{
    bytes_ = 0;
    ThreadHeap::askAll();
    queues_.submitAfter(timeToTidy, queues_.backgroundQueue(), [this] { residentWhenTidy_ = resident_(); });
}

} // namespace platform
