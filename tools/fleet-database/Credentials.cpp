// SPDX-License-Identifier: Apache-2.0
// Nothing is guessed: a key that is not known is an error.
#include "fleet-database/Credentials.h"

#include "platform/linux/files/SmallFile.h"
#include "platform/linux/settings/TomlFile.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include <sys/stat.h>

#include <algorithm>

namespace fleet_database {

using foundation::Dictionary;
using foundation::Value;

namespace {

std::unexpected<std::string> problem(const std::filesystem::path& file, std::string_view what)
{
    return std::unexpected(fmt::format("{}: {}", file.native(), what));
}

} // namespace

std::expected<Dictionary, std::string> readToml(const std::filesystem::path& file)
{
    const auto text = platform::readSmallFile(file, platform::TomlFile::largest);
    if (!text)
        return problem(file, text.error().message());
    auto values = platform::parseToml(*text);
    if (!values)
        return problem(file, fmt::format("line {}: {}", values.error().line, values.error().reason));
    return *std::move(values);
}

// A file that others may read is no place for a password.
std::expected<Dictionary, std::string> readCredentials(const std::filesystem::path& file,
                                                       std::initializer_list<std::string_view> keys)
{
    if (file.empty())
        return Dictionary();
    struct stat status{};
    if (::stat(file.c_str(), &status) == 0 && (status.st_mode & S_IROTH) != 0)
        return problem(file, "everybody may read it: chmod o-r");
    auto values = readToml(file);
    if (!values)
        return values;
    for (const auto& [key, value] : *values)
        if (std::ranges::find(keys, key.view()) == keys.end() || value.kind() != Value::Kind::String)
            return problem(file, fmt::format("{} is not one of {}, each a text", key.view(), fmt::join(keys, ", ")));
    return values;
}

std::string textIn(const Dictionary& values, std::string_view key)
{
    const Value* const value = values.find(key);
    return value == nullptr ? std::string() : value->text();
}

} // namespace fleet_database
