// SPDX-License-Identifier: Apache-2.0
// One TOML file of the configuration, and the last good values that it held.
//
// A person who edits a file may break it for a while. Its earlier content then stays in force, or the defaults if it
// had none, and one log line names the place of the error.
#pragma once

#include "foundation/values/Value.h"
#include "platform/linux/log/ProviderLog.h"

#include <cstddef>
#include <expected>
#include <filesystem>
#include <map>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

namespace platform {

// The place of an error in a TOML text, from 1, and its reason.
struct TomlError {
    unsigned line = 0;
    unsigned column = 0;
    std::string reason;
};

// TOML 1.0 as values, tables in the order of their keys. A date, with or without time, is a `Date`, in UTC unless it
// names an offset; a time of day without a date stays text. Any thread.
[[nodiscard]] std::expected<foundation::Dictionary, TomlError> parseToml(std::string_view text);

// A key's way through the tables, and the line in which it stands first.
using TomlLines = std::map<std::vector<std::string>, unsigned>;

struct TomlDocument {
    foundation::Dictionary values;
    TomlLines lines;
};

// The same with the lines of all keys, for messages that name them. Any thread.
[[nodiscard]] std::expected<TomlDocument, TomlError> parseTomlWithLines(std::string_view text);

// One thread at a time.
class TomlFile {
public:
    static constexpr std::size_t largest = 1024 * 1024;

    TomlFile(std::filesystem::path path, ProviderLog log) : path_(std::move(path)), log_(log) { }

    // Reads the file; true if its values changed. A missing file has no values; a file that cannot be read or is not
    // TOML keeps its earlier values, and the error is logged once.
    bool reload();

    [[nodiscard]] const foundation::Dictionary& values() const noexcept { return values_; }
    [[nodiscard]] const std::filesystem::path& path() const noexcept { return path_; }

private:
    using Content = std::expected<std::string, std::error_code>;

    [[nodiscard]] std::string_view whatApplies() const noexcept;
    [[nodiscard]] bool setValues(foundation::Dictionary values);

    std::filesystem::path path_;
    ProviderLog log_;
    Content seen_; // the content of `values_`, or the present error of the file
    foundation::Dictionary values_;
};

} // namespace platform
