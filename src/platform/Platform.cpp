// SPDX-License-Identifier: Apache-2.0
// The installed platform, and the log categories that have their threshold from it.
#include "platform/Platform.h"

#include "foundation/Mutex.h"

#include <atomic>
#include <cassert>
#include <optional>
#include <vector>

namespace platform {
namespace {

std::optional<Platform> installed;
std::atomic<std::uint64_t> installations;

// The categories that have the installed log's threshold.
foundation::Mutex resolvedLock;
std::vector<LogCategory*> resolved KESTO_GUARDED_BY(resolvedLock);

void forgetThresholds()
{
    const foundation::Lock lock(resolvedLock);
    for (LogCategory* category : resolved)
        category->forgetThreshold();
    resolved.clear();
}

} // namespace

void install(const Platform& platform)
{
    installed.emplace(platform);
    ++installations;
    forgetThresholds();
}

void uninstall()
{
    installed.reset();
    forgetThresholds();
}

bool isInstalled() noexcept
{
    return installed.has_value();
}

std::uint64_t installationNumber() noexcept
{
    return installations;
}

Platform& current()
{
    assert(installed && "no platform is installed");
    return *installed;
}

bool LogCategory::isEnabledOnceResolved(LogLevel level) noexcept
{
    if (!installed)
        return false;
    const LogLevel threshold = installed->log.threshold(*this);
    threshold_.store(static_cast<std::uint8_t>(threshold), std::memory_order_relaxed);
    const foundation::Lock lock(resolvedLock);
    resolved.push_back(this);
    return level <= threshold;
}

} // namespace platform
