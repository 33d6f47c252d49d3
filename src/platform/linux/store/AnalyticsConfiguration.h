// SPDX-License-Identifier: Apache-2.0
// The device owner's settings for analytics events, in analytics.toml: which events the service keeps, for how long and
// how many, and how much a power failure may cost.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

enum class StoreSynchronization : std::uint8_t {
    Normal, // a power failure may take the last moments, never the database
    Full // acknowledged events survive a power failure too; every commit waits for the disk
};

struct AnalyticsConfiguration {
    bool enabled = true; // false: no event is stored
    std::vector<std::string> used = {"com.quarn.*"}; // globs
    double maximumAgeDays = 90;
    std::uint64_t maximumSizeMegabytes = 256; // of 1024 * 1024 bytes
    StoreSynchronization synchronization = StoreSynchronization::Normal;
    bool stretches = true; // whether the store keeps who played what for how long

    friend bool operator==(const AnalyticsConfiguration&, const AnalyticsConfiguration&) = default;
};

// A configuration, and what was wrong with the values: one line each, for a person. Missing and wrong values have their
// defaults.
struct CheckedAnalyticsConfiguration {
    AnalyticsConfiguration configuration;
    std::vector<std::string> problems;
};

// Any thread.
[[nodiscard]] CheckedAnalyticsConfiguration readAnalyticsConfiguration(const foundation::Dictionary& values);

// Whether the name matches one of the globs. "*" is any text, "?" any character, "[a-z]" and "[^a-z]" one character of
// a set: as in SQL's GLOB, so that a pattern means the same here and in a query. Any thread.
[[nodiscard]] bool matchesAny(const std::vector<std::string>& globs, const std::string& name);

} // namespace platform
