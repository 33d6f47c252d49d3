// SPDX-License-Identifier: Apache-2.0
// The status for a person at a terminal.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <string>
#include <string_view>

// What a person reads while the configuration says so.
constexpr std::string_view nothingIsStored = "no event is stored: analytics.toml says enabled = false";
constexpr std::string_view noStretchesAreStored = "no playing times are stored: analytics.toml says stretches = false";

// Tables of what the service counted, cut to the width.
[[nodiscard]] std::string statusText(const foundation::Dictionary& report, std::size_t width);
