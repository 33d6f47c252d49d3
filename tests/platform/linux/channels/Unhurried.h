// SPDX-License-Identifier: Apache-2.0
// A time for tests in which other limits than the time end a reading, however busy the machine is.
#pragma once

#include <chrono>

namespace platform {

constexpr std::chrono::milliseconds unhurried = std::chrono::minutes(1);

} // namespace platform
