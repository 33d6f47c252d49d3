// SPDX-License-Identifier: Apache-2.0
// The values that each key may have.
#include "platform/linux/store/AnalyticsConfiguration.h"

#include "platform/linux/settings/CheckedSettings.h"

#include <algorithm>
#include <cmath>
#include <optional>
#include <sqlite3.h>

namespace platform {

using foundation::Value;

namespace {

constexpr double mostMegabytes = 1024.0 * 1024;

constexpr Setting<AnalyticsConfiguration> settings[] = {
    {"enabled", "true or false",
     [](const Value& value, AnalyticsConfiguration& configuration) {
         return readBoolean(value, configuration.enabled);
     }},
    {"used", "a list of patterns such as [\"com.quarn.*\"]",
     [](const Value& value, AnalyticsConfiguration& configuration) { return readStrings(value, configuration.used); }},
    {"maximum_age_days", "a number of days above 0",
     [](const Value& value, AnalyticsConfiguration& configuration) {
         const auto days = positiveNumberOf(value);
         configuration.maximumAgeDays = days.value_or(configuration.maximumAgeDays);
         return days.has_value();
     }},
    {"maximum_size_mb", "a number of megabytes from 1 to 1048576",
     [](const Value& value, AnalyticsConfiguration& configuration) {
         const auto megabytes = positiveNumberOf(value);
         if (!megabytes || *megabytes < 1 || *megabytes > mostMegabytes)
             return false;
         configuration.maximumSizeMegabytes = static_cast<std::uint64_t>(*megabytes);
         return true;
     }},
    {"synchronous", "\"normal\" or \"full\"",
     [](const Value& value, AnalyticsConfiguration& configuration) {
         configuration.synchronization =
             value == Value("full") ? StoreSynchronization::Full : StoreSynchronization::Normal;
         return value == Value("full") || value == Value("normal");
     }},
    {"stretches", "true or false", [](const Value& value, AnalyticsConfiguration& configuration) {
         return readBoolean(value, configuration.stretches);
     }}};

} // namespace

CheckedAnalyticsConfiguration readAnalyticsConfiguration(const foundation::Dictionary& values)
{
    CheckedAnalyticsConfiguration checked;
    checked.problems = readSettings<AnalyticsConfiguration>(values, settings, checked.configuration);
    return checked;
}

bool matchesAny(const std::vector<std::string>& globs, const std::string& name)
{
    return std::ranges::any_of(
        globs, [&name](const std::string& glob) { return ::sqlite3_strglob(glob.c_str(), name.c_str()) == 0; });
}

} // namespace platform
