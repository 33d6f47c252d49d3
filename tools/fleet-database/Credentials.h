// SPDX-License-Identifier: Apache-2.0
// User and password stand in a file of their own, in TOML: a command line can be seen by everybody, and a configuration
// is shown to others.
#pragma once

#include "foundation/values/Value.h"

#include <expected>
#include <filesystem>
#include <initializer_list>
#include <string>
#include <string_view>

namespace fleet_database {

// The errors name the file, and what is wrong in it.
[[nodiscard]] std::expected<foundation::Dictionary, std::string> readToml(const std::filesystem::path& file);
// Texts with these keys. A file that everybody may read is refused, an empty path is a file without keys.
[[nodiscard]] std::expected<foundation::Dictionary, std::string>
readCredentials(const std::filesystem::path& file, std::initializer_list<std::string_view> keys);
// Empty if the key is not there.
[[nodiscard]] std::string textIn(const foundation::Dictionary& values, std::string_view key);

} // namespace fleet_database
