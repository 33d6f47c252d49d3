// Setting and removing single keys in a TOML text that a person may have written: all else, comments and order
// included, stays as it is, byte for byte.
//
// The text is cut into statements, and the service's own parser says where one ends: at the first line's end up to
// which the text is TOML by itself. So values over many lines are cut right without a second grammar.
#pragma once

#include "foundation/values/Value.h"

#include <optional>
#include <string>
#include <string_view>

// The value that the text is in TOML; nothing when it is none, or more than one.
[[nodiscard]] std::optional<foundation::Value> tomlValue(std::string_view text);

// The text as TOML has it, in quotes. Control characters are escapes.
[[nodiscard]] std::string tomlString(std::string_view text);

// The TOML text `toml`, in which `value`, TOML too, is now that of the key: in the place of the value before, with what
// stands behind it on its line, else behind the last key that belongs to no table. Tables of that name go.
[[nodiscard]] std::string withTomlKey(std::string_view toml, std::string_view key, std::string_view value);

// The same without the key, or without the tables of that name. Comments in lines of their own stay.
[[nodiscard]] std::string withoutTomlKey(std::string_view toml, std::string_view key);
