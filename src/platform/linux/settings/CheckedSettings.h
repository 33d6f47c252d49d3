// Settings of a configuration file, read one by one: a wrong value affects only its own setting, and a line says which
// value belongs there.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/log/ProviderLog.h"

#include <filesystem>
#include <fmt/format.h>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

// Calls `read` with each key and its value. It stores the value and returns nothing, or returns what should stand there
// instead. The result has a line for each of these. Any thread.
template <typename Read> std::vector<std::string> checkSettings(const foundation::Dictionary& values, Read read)
{
    std::vector<std::string> problems;
    for (const auto& [key, value] : values)
        if (const std::string_view expected = read(key.view(), value); !expected.empty())
            problems.push_back(fmt::format("{} = {} should be {}", key.view(), value.text(), expected));
    return problems;
}

// Any thread.
[[nodiscard]] inline std::optional<double> positiveNumberOf(const foundation::Value& value)
{
    const auto number = value.number();
    const bool isNumber = number && number->kind() != foundation::Number::Kind::Boolean;
    return isNumber && number->doubleValue() > 0 ? std::optional(number->doubleValue()) : std::nullopt;
}

inline void logProblems(const std::filesystem::path& file, const std::vector<std::string>& problems, ProviderLog log)
{
    for (const std::string& problem : problems)
        log.error("{}: {}; the default counts until this is corrected", file.native(), problem);
}

} // namespace platform
