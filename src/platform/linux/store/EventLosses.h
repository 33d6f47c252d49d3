// SPDX-License-Identifier: Apache-2.0
// Logs the events that could not be kept, by reason: at the first loss of a kind, and then once a
// minute while losses go on, so that a full disk does not also fill the log.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Clock.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/store/StoreError.h"

#include <array>
#include <cstdint>
#include <filesystem>

namespace platform {

// Any thread.
class EventLosses {
public:
    static constexpr double secondsBetweenLines = 60;

    // The path is that of the database; the log names it.
    EventLosses(std::filesystem::path path, const Clock& clock, ProviderLog log)
        : path_(std::move(path)),
          clock_(clock),
          log_(log)
    {
    }
    // Reports the remaining losses.
    ~EventLosses() { reportAll(); }
    EventLosses(const EventLosses&) = delete;
    EventLosses& operator=(const EventLosses&) = delete;

    void add(StoreError reason, std::uint64_t events);
    // Reports new losses, except for reasons that were reported within the last minute.
    void report();
    // Reports all new losses, because no later report will come.
    void reportAll();

private:
    struct Loss {
        std::uint64_t events = 0;
        std::uint64_t reported = 0;
        double reportedAt = 0; // the time of the last report (uptime, in seconds)
    };

    template <typename IsDue> void reportIf(IsDue isDue);
    void log(StoreError reason, Loss& loss) KESTO_REQUIRES(lock_);

    const std::filesystem::path path_;
    const Clock& clock_;
    const ProviderLog log_;
    foundation::Mutex lock_;
    std::array<Loss, storeErrorCount> losses_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
