// SPDX-License-Identifier: Apache-2.0
// A wait after a failure is the interval, and anything up to a limit that doubles with each failure.
#include "kesto-uplink/rounds/Schedule.h"

#include <algorithm>
#include <cmath>

namespace kesto_uplink {

namespace {

constexpr double hour = 3600;
constexpr double longestFirstWait = 60;
constexpr double longestAway = 4 * hour;
constexpr double longestRefused = 12 * hour; // a person has to change something
constexpr double refusalsAreLonger = 4;
constexpr unsigned mostDoublings = 20; // beyond each longest wait
constexpr double secondsOfDay = 86'400;

} // namespace

double Schedule::untilFirstRound()
{
    return random_() * std::min(interval_, longestFirstWait);
}

double Schedule::untilNextRound(Outcome last)
{
    switch (last) {
    case Outcome::Nothing:
    case Outcome::Sent:
    case Outcome::Waiting:
    case Outcome::Metered:
    case Outcome::Off:
    case Outcome::Interrupted: failures_ = 0; return interval_;
    case Outcome::DayUsedUp: failures_ = 0; return std::max(interval_, hour);
    case Outcome::Away:
    case Outcome::Full:
    case Outcome::Refused:
    case Outcome::Failed: break;
    }
    const bool isRefused = last == Outcome::Refused;
    const double first = isRefused ? refusalsAreLonger * interval_ : interval_;
    const double most = std::min(std::ldexp(first, static_cast<int>(std::min(failures_, mostDoublings))),
                                 isRefused ? longestRefused : longestAway);
    ++failures_;
    return interval_ + random_() * most;
}

bool Schedule::needsNews(Outcome last) noexcept
{
    return last == Outcome::Nothing || last == Outcome::Sent || last == Outcome::Off;
}

std::int64_t DayCount::day(double now, double uptime)
{
    const auto today = static_cast<std::int64_t>(std::floor(now / secondsOfDay));
    if (!hasBegun_) {
        hasBegun_ = true;
        firstDay_ = lastDay_ = today;
        firstUptime_ = uptime;
    }
    const std::int64_t most = firstDay_ + static_cast<std::int64_t>((uptime - firstUptime_) / secondsOfDay) + 1;
    lastDay_ = std::clamp(today, lastDay_, std::max(lastDay_, most));
    return lastDay_;
}

} // namespace kesto_uplink
