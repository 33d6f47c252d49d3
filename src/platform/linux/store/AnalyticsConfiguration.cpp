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

std::optional<std::vector<std::string>> stringsOf(const Value& value)
{
    const auto array = value.array();
    if (!array || std::ranges::any_of(*array, [](const Value& each) { return each.kind() != Value::Kind::String; }))
        return std::nullopt;
    std::vector<std::string> strings;
    for (const Value& each : *array)
        strings.push_back(each.text());
    return strings;
}

// Stores the value, or returns what should stand there instead.
std::string_view read(std::string_view key, const Value& value, AnalyticsConfiguration& configuration)
{
    if (key == "used") {
        auto strings = stringsOf(value);
        if (!strings)
            return "a list of patterns such as [\"com.quarn.*\"]";
        configuration.used = std::move(*strings);
    } else if (key == "maximum_age_days") {
        const auto days = positiveNumberOf(value);
        if (!days)
            return "a number of days above 0";
        configuration.maximumAgeDays = *days;
    } else if (key == "maximum_size_mb") {
        const auto megabytes = positiveNumberOf(value);
        if (!megabytes || *megabytes < 1 || *megabytes > mostMegabytes)
            return "a number of megabytes from 1 to 1048576";
        configuration.maximumSizeMegabytes = static_cast<std::uint64_t>(*megabytes);
    } else if (key == "synchronous") {
        if (value != Value("normal") && value != Value("full"))
            return "\"normal\" or \"full\"";
        configuration.synchronization =
            value == Value("full") ? StoreSynchronization::Full : StoreSynchronization::Normal;
    } else {
        return "nothing: the keys are used, maximum_age_days, maximum_size_mb and synchronous";
    }
    return {};
}

} // namespace

CheckedAnalyticsConfiguration readAnalyticsConfiguration(const foundation::Dictionary& values)
{
    CheckedAnalyticsConfiguration checked;
    checked.problems = checkSettings(
        values, [&](std::string_view key, const Value& value) { return read(key, value, checked.configuration); });
    return checked;
}

bool matchesAny(const std::vector<std::string>& globs, const std::string& name)
{
    return std::ranges::any_of(
        globs, [&name](const std::string& glob) { return ::sqlite3_strglob(glob.c_str(), name.c_str()) == 0; });
}

} // namespace platform
