// SPDX-License-Identifier: Apache-2.0
// How old events are, whatever the clock on the wall showed when they came.
//
// Wall clocks are wrong: a device without a battery for its clock starts in 1970, a user tries another year. So the
// store counts on a time of its own, the age time: it goes on by the running time of the machine while the service
// runs. Only the time between two runs has to be taken from the wall clock. If that is more than a day, it may be the
// clock that is wrong; it is believed once the service has run for a day without the clock being set again. Then
// everything kept before is that much older.
#pragma once

#include "platform/Clock.h"

#include <cstdint>
#include <optional>

namespace platform {

// What the database remembers of the clock from run to run. In seconds.
struct AgeClockState {
    double time = 0; // the age time of the last transaction
    double wall = 0; // what the wall clock showed then
    double away = 0; // what the wall clock went on beyond the running time, not believed yet
    double trial = 0; // how long the service has run since
    std::int64_t awayBelow = 0; // the events that it would make older: those with an ID below

    friend bool operator==(const AgeClockState&, const AgeClockState&) = default;
};

// One thread at a time.
class AgeClock {
public:
    static constexpr double longestBelieved = 86400;
    static constexpr double trialTime = 86400;
    // A wall clock that is corrected by less was not set.
    static constexpr double longestCorrection = 3600;

    // All events below that ID are older than the service believed, by so many seconds.
    struct Correction {
        std::int64_t below = 0;
        double seconds = 0;
    };

    // The state of the database that is opened. `nextEvent` is the ID of the first event of this run.
    AgeClock(const Clock& clock, const AgeClockState& state, std::int64_t nextEvent);

    // Goes on to this moment. What it returns must be kept in the same transaction as the state.
    [[nodiscard]] std::optional<Correction> advance();
    [[nodiscard]] const AgeClockState& state() const noexcept { return state_; }

private:
    void note(double jump);

    const Clock* clock_;
    AgeClockState state_;
    std::int64_t firstOfThisRun_;
    double uptime_;
};

} // namespace platform
