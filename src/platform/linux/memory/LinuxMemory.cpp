// The thread that reaches the limit submits the work, so that there is nothing to lock. The limits are read for each
// piece that a client sends, so they are plain numbers; while they change, a reader may see old beside new ones.
#include "platform/linux/memory/LinuxMemory.h"

#include "platform/linux/memory/MemoryConfiguration.h"
#include "platform/linux/queues/ThreadHeap.h"
#include "platform/linux/settings/CheckedSettings.h"

#include <unistd.h>

namespace platform {
namespace {

std::size_t bytesOfThisMachine()
{
    return static_cast<std::size_t>(::sysconf(_SC_PHYS_PAGES)) * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
}

} // namespace

LinuxMemory::LinuxMemory(WorkQueues& queues, ConfigurationWatcher& watcher, ProviderLog log)
    : queues_(queues),
      log_(log),
      limitsFile_(watcher, "limits.toml", log, [this] { applyLimits(); })
{
    applyLimits();
}

void LinuxMemory::applyLimits()
{
    const auto [limits, problems] = readMemoryLimits(limitsFile_.values(), bytesOfThisMachine());
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
    queues_.submitAfter(delay, queues_.backgroundQueue(), [this] {
        bytes_ = 0;
        ThreadHeap::askAll();
    });
}

} // namespace platform
