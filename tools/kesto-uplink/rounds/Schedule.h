// SPDX-License-Identifier: Apache-2.0
// When the next round is due. At most one round begins in an interval. While servers do not answer, the waits grow at
// random up to hours: servers that come back must not meet all devices of a fleet at once.
#pragma once

#include "kesto-uplink/rounds/Round.h"

#include <cstdint>
#include <functional>
#include <utility>

namespace kesto_uplink {

// Seconds are those of a clock that nobody sets. One thread.
class Schedule {
public:
    // `random` gives numbers from 0 up to 1.
    Schedule(double interval, std::function<double()> random) : interval_(interval), random_(std::move(random)) { }

    void setInterval(double interval) { interval_ = interval; }

    [[nodiscard]] double untilFirstRound();
    [[nodiscard]] double untilNextRound(Outcome last);
    // Whether there is no reason for the next round before the store has something new.
    [[nodiscard]] static bool needsNews(Outcome last) noexcept;

private:
    double interval_;
    std::function<double()> random_;
    unsigned failures_ = 0; // in a row
};

// The day to which bytes are counted: that of the device's clock, in days since 1970, UTC. A clock that is set to and
// fro gives no more days than have passed, and one more. One thread.
class DayCount {
public:
    // The clock's seconds since 1970, and seconds that nobody sets.
    [[nodiscard]] std::int64_t day(double now, double uptime);

private:
    bool hasBegun_ = false;
    std::int64_t firstDay_ = 0;
    double firstUptime_ = 0;
    std::int64_t lastDay_ = 0;
};

} // namespace kesto_uplink
