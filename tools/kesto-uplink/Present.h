// SPDX-License-Identifier: Apache-2.0
// The time on the wall.
#pragma once

#include <chrono>

namespace kesto_uplink {

// Seconds since 1970 UTC.
[[nodiscard]] inline double present()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

} // namespace kesto_uplink
