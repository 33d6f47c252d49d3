// SPDX-License-Identifier: Apache-2.0
// Text for a person at a terminal: control characters are replaced, and lines are cut to its width. Every character
// counts as one column.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <string>
#include <string_view>

// The text with "?" for every control character: those of ASCII, U+0080 to U+009F, and those that change the direction
// of text (U+061C, U+200E, U+200F, U+202A to U+202E, U+2066 to U+2069), with which one name looks like another.
[[nodiscard]] std::string printable(std::string_view text);
// How many columns the text takes.
[[nodiscard]] std::size_t columnsOf(std::string_view text);
// At most so many columns of the text; a cut text ends in "…".
[[nodiscard]] std::string fitted(std::string_view text, std::size_t columns);
// At least so many columns, with blanks behind the text.
[[nodiscard]] std::string padded(std::string text, std::size_t columns);

// The same, with blanks before the text.
[[nodiscard]] std::string alignedRight(std::string_view text, std::size_t columns);
// Whether the locale's text is UTF-8, by its name.
[[nodiscard]] bool showsUTF8();
// A bar of that share of the columns, in eighths of a column, or with "#" where the terminal does not show UTF-8. A
// share above 0 is always seen. At least one column.
[[nodiscard]] std::string bar(double share, std::size_t columns, bool isUTF8);

// A moment for a person, in local time: "2026-01-31 18:00:00".
[[nodiscard]] std::string momentText(double secondsSince1970);

// How many columns standard output has: those of the terminal, else $COLUMNS, else unlimited (npos).
[[nodiscard]] std::size_t outputWidth();
// How many lines the terminal of standard output has; unlimited (npos) where there is none.
[[nodiscard]] std::size_t outputHeight();
// The rest of the width behind so many columns, but not too little.
[[nodiscard]] std::size_t columnsBehind(std::size_t used, std::size_t width);

// The text where the terminal does not show UTF-8: "~" for the sign of a cut, "?" for every other character that ASCII
// does not have.
[[nodiscard]] std::string asciiText(std::string_view text);

// 35200000 as "35.2 MB".
[[nodiscard]] std::string sizeText(std::uint64_t bytes);

// A string as it is, a date in ISO 8601, anything else as JSON.
[[nodiscard]] std::string shownText(const foundation::Value& value);
