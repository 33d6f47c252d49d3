// The room of processes: other processes, this one's threads and clock, and the service manager that started it.
//
// The process table as /proc shows it.
//
// The sender's name is asked for with every message, so what was read is believed for a second. That a process
// changed its name, or that its number went to another, is noticed that much later, unless it is forgotten before.
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
    static constexpr std::size_t mostKept = 64; // processes; each has one place, which it may lose to another

    explicit LinuxProcessTable(Now now = &coarseMonotonicTime);

    [[nodiscard]] std::int32_t ownProcessIdentifier() const override { return ownIdentifier_; }
    [[nodiscard]] std::string ownProcessName() const override { return ownName_; }
    // The name with a "?" for each byte that is not UTF-8.
    [[nodiscard]] std::optional<ProcessTableEntry> entry(std::int32_t processIdentifier) const override;
    void forget(std::int32_t processIdentifier) override;

    // To the tick, which is much finer than a second and much faster to read than the exact time.
    [[nodiscard]] static std::chrono::nanoseconds coarseMonotonicTime();

private:
    struct Kept {
        ProcessTableEntry entry; // of process 0, which there is not, while the place is free
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
