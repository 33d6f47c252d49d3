// SPDX-License-Identifier: Apache-2.0
// What one client may write to the log: many lines at once, and then so many a second; of errors as many again, so that
// other lines displace none. So a client that makes a hundred thousand calls a second costs the service neither the
// processor nor the disk for as many lines, and displaces no lines of others.
//
// A queue that works for many clients says for whose share a thread writes while it runs a client's items.
#pragma once

#include "foundation/Mutex.h"

#include <array>
#include <chrono>
#include <cstdint>
#include <string>
#include <utility>

namespace platform {

// Any thread.
class LogShare {
public:
    using Clock = std::chrono::steady_clock;

    static constexpr double mostAtOnce = 2000;
    static constexpr double perSecond = 50;
    static constexpr std::chrono::seconds betweenReports{10};

    // `who` is named in the report, such as "client 4711".
    explicit LogShare(std::string who, Clock::time_point now = Clock::now()) : who_(std::move(who)), at_(now) { }

    enum class Part : std::uint8_t { Errors, Others };
    // Takes a line of that part of the share. False if there is none: the line is left out, and counted here.
    [[nodiscard]] bool take(Part part, Clock::time_point now);
    // The lines that were left out and not reported yet, if the last report was some time ago; else 0.
    [[nodiscard]] std::uint64_t takeLeftOut(Clock::time_point now);
    // All of them: for the client's end.
    [[nodiscard]] std::uint64_t takeLeftOut();
    [[nodiscard]] const std::string& who() const noexcept { return who_; }

    // While it lives, the calling thread writes for that share; null: for none.
    class Writing {
    public:
        explicit Writing(LogShare* share) noexcept;
        ~Writing();
        Writing(const Writing&) = delete;
        Writing& operator=(const Writing&) = delete;

    private:
        LogShare* const before_;
    };
    // Of the calling thread; null: it writes for none.
    [[nodiscard]] static LogShare* ofThisThread() noexcept;

private:
    const std::string who_;
    foundation::Mutex lock_;
    // The lines of each part that may be written.
    std::array<double, 2> lines_ KESTO_GUARDED_BY(lock_) = {mostAtOnce, mostAtOnce};
    Clock::time_point at_ KESTO_GUARDED_BY(lock_); // the moment of `lines_`
    std::uint64_t leftOut_ KESTO_GUARDED_BY(lock_) = 0; // since the last report
    Clock::time_point reportedAt_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
