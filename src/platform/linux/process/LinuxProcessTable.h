// SPDX-License-Identifier: Apache-2.0
// The room of processes: other processes, this one's threads and clock, and the service manager that started it.
//
// The process table as /proc shows it.
//
// Every message asks for the sender's name, so a name is cached for a second. If a process changes its name, or its
// number passes to another process, the cache notices this up to a second later, unless `forget` was called.
#pragma once

#include "foundation/Mutex.h"
#include "platform/ProcessTable.h"

#include <array>
#include <chrono>
#include <filesystem>

namespace platform {

// Any thread.
class LinuxProcessTable final : public ProcessTable {
public:
    using Now = std::chrono::nanoseconds (*)(); // a clock that never goes back

    static constexpr std::chrono::seconds longestBelieved{1};
    static constexpr std::size_t mostKept = 64; // processes; two processes may compete for one place

    explicit LinuxProcessTable(Now now = &coarseMonotonicTime);

    [[nodiscard]] std::int32_t ownProcessIdentifier() const override { return ownIdentifier_; }
    [[nodiscard]] std::string ownProcessName() const override { return ownName_; }
    // In the name, each byte that is not UTF-8 is a "?".
    [[nodiscard]] std::optional<ProcessTableEntry> entry(std::int32_t processIdentifier) const override;
    void forget(std::int32_t processIdentifier) override;

    // Exact to a tick, which is much finer than a second and much faster to read than the exact time.
    [[nodiscard]] static std::chrono::nanoseconds coarseMonotonicTime();

private:
    struct Kept {
        ProcessTableEntry entry; // of process 0, which does not exist, while the place is free
        std::chrono::nanoseconds readAt{};
    };

    [[nodiscard]] Kept& placeOf(std::int32_t processIdentifier) const KESTO_REQUIRES(lock_)
    {
        return kept_[static_cast<std::size_t>(processIdentifier) % mostKept];
    }

    const Now now_;
    const std::int32_t ownIdentifier_;
    const std::string ownName_;
    mutable foundation::Mutex lock_;
    mutable std::array<Kept, mostKept> kept_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
