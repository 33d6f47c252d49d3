// One TOML file of the configuration, and the last good values that it held.
//
// Whoever edits a file may break it for a while. What it said before then stays in force, and one line of the
// log says where it is broken.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/log/ProviderLog.h"

#include <cstddef>
#include <expected>
#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

namespace platform {

// Where a text stops being TOML, from 1, and why.
struct TomlError {
    unsigned line = 0;
    unsigned column = 0;
    std::string reason;
};

// TOML 1.0 as values, tables in the order of their keys. A date, with or without time, is a `Date`, in UTC when
// it names no offset; a time of day without a date belongs to no moment and stays text. Any thread.
[[nodiscard]] std::expected<foundation::Dictionary, TomlError> parseToml(std::string_view text);

// One thread at a time.
class TomlFile {
public:
    static constexpr std::size_t largest = 1024 * 1024;

    TomlFile(std::filesystem::path path, ProviderLog log) : path_(std::move(path)), log_(log) { }

    // Reads the file; true when its values are now others. A file that is not there has no values; one that
    // cannot be read or is no TOML keeps those it had, and is complained about once.
    bool reload();

    [[nodiscard]] const foundation::Dictionary& values() const noexcept { return values_; }
    [[nodiscard]] const std::filesystem::path& path() const noexcept { return path_; }

private:
    using Content = std::expected<std::string, std::error_code>;

    [[nodiscard]] bool setValues(foundation::Dictionary values);

    std::filesystem::path path_;
    ProviderLog log_;
    Content seen_; // what `values_` was made of, or what is wrong with the file now
    foundation::Dictionary values_;
};

} // namespace platform
