// SPDX-License-Identifier: Apache-2.0
// Says in the log that events were removed, and why: one line at the first removal, and then at most one an hour.
#pragma once

#include "platform/Clock.h"
#include "platform/linux/log/ProviderLog.h"

#include <cstdint>
#include <optional>

namespace platform {

struct RemovedEvents {
    std::uint64_t forAge = 0;
    std::uint64_t forSize = 0;
    std::uint64_t forShare = 0;

    [[nodiscard]] std::uint64_t sum() const noexcept { return forAge + forSize + forShare; }
};

// One thread.
class RemovalReport {
public:
    static constexpr double secondsBetweenLines = 3600;

    RemovalReport(const Clock& clock, ProviderLog log) : clock_(clock), log_(log) { }
    // Says what is not said yet.
    ~RemovalReport();
    RemovalReport(const RemovalReport&) = delete;
    RemovalReport& operator=(const RemovalReport&) = delete;

    [[nodiscard]] RemovedEvents& removed() noexcept { return removed_; }
    // Says it if an hour has passed since the last line.
    void report();

private:
    void say();

    const Clock& clock_;
    const ProviderLog log_;
    RemovedEvents removed_; // since the last line
    std::optional<double> saidAt_; // uptime, in seconds
};

} // namespace platform
