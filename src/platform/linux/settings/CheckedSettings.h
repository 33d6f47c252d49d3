// SPDX-License-Identifier: Apache-2.0
// Settings of a configuration file, one by one, by a table of its keys: a wrong value affects only its own setting, and
// a line says which value belongs there.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/log/ProviderLog.h"

#include <algorithm>
#include <filesystem>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <optional>
#include <ranges>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

template <typename Configuration> struct Setting {
    std::string_view key;
    std::string_view expected; // what a right value is, for a person
    bool (*read)(const foundation::Value& value, Configuration& configuration); // false: it is a wrong one
};

// Reads the values into the configuration. The result has a line for each wrong value and each key that is not in the
// table. Any thread.
template <typename Configuration>
std::vector<std::string> readSettings(const foundation::Dictionary& values,
                                      std::span<const Setting<Configuration>> settings, Configuration& configuration)
{
    std::vector<std::string> problems;
    for (const auto& [key, value] : values) {
        const auto setting = std::ranges::find(settings, key.view(), &Setting<Configuration>::key);
        if (setting == settings.end())
            problems.push_back(
                fmt::format("unknown key {}, ignored; the keys are {}", key.view(),
                            fmt::join(settings | std::views::transform(&Setting<Configuration>::key), ", ")));
        else if (!setting->read(value, configuration))
            problems.push_back(fmt::format("{} = {} should be {}; the default counts until this is corrected",
                                           key.view(), value.text(), setting->expected));
    }
    return problems;
}

// Any thread.
[[nodiscard]] inline std::optional<double> positiveNumberOf(const foundation::Value& value)
{
    const auto number = value.number();
    const bool isNumber = number && number->kind() != foundation::Number::Kind::Boolean;
    return isNumber && number->doubleValue() > 0 ? std::optional(number->doubleValue()) : std::nullopt;
}

// False, and the setting stays, if the value is not true or false. Any thread.
[[nodiscard]] inline bool readBoolean(const foundation::Value& value, bool& setting)
{
    const auto number = value.number();
    if (!number || number->kind() != foundation::Number::Kind::Boolean)
        return false;
    setting = number->booleanValue();
    return true;
}

// The same for a list of texts. Any thread.
[[nodiscard]] inline bool readStrings(const foundation::Value& value, std::vector<std::string>& setting)
{
    const auto array = value.array();
    const auto isText = [](const foundation::Value& each) { return each.kind() == foundation::Value::Kind::String; };
    if (!array || !std::ranges::all_of(*array, isText))
        return false;
    setting.clear();
    for (const foundation::Value& each : *array)
        setting.push_back(each.text());
    return true;
}

inline void logProblems(const std::filesystem::path& file, const std::vector<std::string>& problems, ProviderLog log)
{
    for (const std::string& problem : problems)
        log.error("{}: {}", file.native(), problem);
}

} // namespace platform
