// SPDX-License-Identifier: Apache-2.0
// Setting and removing single keys in a TOML text that a person may have written: all other parts, with comments and
// order, stay the same, byte for byte.
//
// The text is cut into statements, with the service's own parser: a statement ends at the first end of a line up to
// which the text alone is TOML. So values over many lines are cut correctly without a second grammar.
#pragma once

#include "foundation/values/Value.h"

#include <optional>
#include <string>
#include <string_view>

// The value of the text in TOML; nothing if it is not exactly one value.
[[nodiscard]] std::optional<foundation::Value> tomlValue(std::string_view text);

// The text as a quoted TOML string. Control characters become escapes.
[[nodiscard]] std::string tomlString(std::string_view text);

// The TOML text `toml` with `value`, which is TOML too, as the value of the key. An old value is replaced, and the rest
// of its line stays; otherwise the key is added behind the last key outside tables. Tables of that name are removed.
[[nodiscard]] std::string withTomlKey(std::string_view toml, std::string_view key, std::string_view value);

// The same without the key, or without the tables of that name. Comments in lines of their own stay.
[[nodiscard]] std::string withoutTomlKey(std::string_view toml, std::string_view key);
