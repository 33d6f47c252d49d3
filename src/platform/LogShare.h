// SPDX-License-Identifier: Apache-2.0
// What one process may write to the log: many lines at once, and then so many a second; of errors as many again, and of
// lines about its connections, so that other lines displace none. So a process that makes a hundred thousand calls a
// second, or opens and closes thousands of connections, costs the service neither the processor nor the disk for as
// many lines, and displaces no lines of others.
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

    // `who` is named in the report, such as "process 4711".
    explicit LogShare(std::string who, Clock::time_point now = Clock::now()) : who_(std::move(who)), at_(now) { }

    enum class Part : std::uint8_t { Errors, Others, Connections };
    // Takes a line of that part of the share. False if there is none: the line is left out, and counted here.
    [[nodiscard]] bool take(Part part, Clock::time_point now);
    // The lines that were left out and not reported yet, if the last report was some time ago; else 0.
    [[nodiscard]] std::uint64_t takeLeftOut(Clock::time_point now);
    // All of them, if the share has a line about connections for that report: for a client's end.
    [[nodiscard]] std::uint64_t takeLeftOutAtEnd(Clock::time_point now);
    // Whether it may write as much as a new one.
    [[nodiscard]] bool isFull(Clock::time_point now);
    [[nodiscard]] const std::string& who() const noexcept { return who_; }

    enum class About : std::uint8_t { Calls, Connections };
    // While it lives, the calling thread writes for that share; null: for none.
    class Writing {
    public:
        explicit Writing(LogShare* share, About about = About::Calls) noexcept;
        ~Writing();
        Writing(const Writing&) = delete;
        Writing& operator=(const Writing&) = delete;

    private:
        LogShare* const shareBefore_;
        const About aboutBefore_;
    };
    // Of the calling thread; null: it writes for none.
    [[nodiscard]] static LogShare* ofThisThread() noexcept;
    // What the calling thread writes about.
    [[nodiscard]] static About aboutOfThisThread() noexcept;

private:
    void fill(Clock::time_point now) KESTO_REQUIRES(lock_);
    [[nodiscard]] bool takeFrom(Part part) KESTO_REQUIRES(lock_);

    const std::string who_;
    foundation::Mutex lock_;
    // The lines of each part that may be written.
    std::array<double, 3> lines_ KESTO_GUARDED_BY(lock_) = {mostAtOnce, mostAtOnce, mostAtOnce};
    Clock::time_point at_ KESTO_GUARDED_BY(lock_); // the moment of `lines_`
    std::uint64_t leftOut_ KESTO_GUARDED_BY(lock_) = 0; // since the last report
    Clock::time_point reportedAt_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
