// SPDX-License-Identifier: Apache-2.0
// The time of an event, on the two clocks that reports need.
#pragma once

#include <cstdint>

namespace kesto_pipewire {

struct Moment {
    double secondsSince1970 = 0; // may be set back and forth by the device's owner
    double uptime = 0; // seconds since the device started, time asleep included: measures durations
};

// Any thread.
[[nodiscard]] Moment currentMoment();
// A recent point of CLOCK_MONOTONIC, in nanoseconds, which is PipeWire's clock. Any thread.
[[nodiscard]] Moment momentOfMonotonic(std::int64_t nanoseconds);

} // namespace kesto_pipewire
