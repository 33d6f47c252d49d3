// SPDX-License-Identifier: Apache-2.0
// The IDs that a run of the service skips after a loss of power: exactly so many, far more than one log can hold. So a
// reader can tell a gap of theirs from rows that were removed.
#pragma once

#include <algorithm>
#include <cstdint>

namespace platform {

constexpr std::int64_t skippedEvents = 1'000'000'000;
constexpr std::int64_t skippedOrigins = 1'000'000; // sources, and sessions

// How many of so many neighbouring IDs without a row had one. A reader may have read some that the store has lost
// since: then fewer than were skipped are left between its place and the next row.
[[nodiscard]] constexpr std::int64_t removedOf(std::int64_t missing) noexcept
{
    const std::int64_t skips = (missing + skippedEvents / 2) / skippedEvents;
    return std::max<std::int64_t>(missing - skips * skippedEvents, 0);
}

} // namespace platform
