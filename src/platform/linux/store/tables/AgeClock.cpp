// SPDX-License-Identifier: Apache-2.0
// The wall clock's way beyond the running time is summed up with its sign: a clock that starts in 1970 and is then
// corrected leaves the time that the service did not run.
#include "platform/linux/store/tables/AgeClock.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace platform {

AgeClock::AgeClock(const Clock& clock, const AgeClockState& state, std::int64_t nextEvent)
    : clock_(&clock),
      state_(state),
      firstOfThisRun_(nextEvent),
      uptime_(clock.systemUptime())
{
    const double wall = clock.secondsSince1970();
    const double pause = wall - std::exchange(state_.wall, wall);
    if (std::abs(pause) > longestBelieved)
        state_.trial = 0;
    note(pause);
}

void AgeClock::note(double jump)
{
    if (state_.away == 0)
        state_.awayBelow = firstOfThisRun_;
    state_.away += jump;
}

std::optional<AgeClock::Correction> AgeClock::advance()
{
    const double uptime = clock_->systemUptime();
    const double wall = clock_->secondsSince1970();
    const double ran = std::max(uptime - uptime_, 0.0);
    const double jump = wall - state_.wall - ran;
    uptime_ = uptime;
    state_.wall = wall;
    state_.time += ran;
    state_.trial += ran;
    if (std::abs(jump) > longestCorrection) {
        note(jump);
        state_.trial = 0;
    }
    const bool isBelieved = (state_.away >= 0 && state_.away <= longestBelieved) || state_.trial >= trialTime;
    if (!isBelieved)
        return std::nullopt;
    const double away = std::exchange(state_.away, 0);
    state_.trial = 0;
    return away > 0 ? std::optional(Correction{state_.awayBelow, away}) : std::nullopt;
}

} // namespace platform
