// Text for a person at a terminal: what could disturb the terminal is taken out, and lines are cut to its width. Every
// character counts as one column.
#pragma once

#include "foundation/values/Value.h"

#include <string>
#include <string_view>

// The text with "?" for every control character: those of ASCII, and U+0080 to U+009F.
[[nodiscard]] std::string printable(std::string_view text);
// So many columns of the text at most; what is cut ends in "…".
[[nodiscard]] std::string fitted(std::string_view text, std::size_t columns);
// So many columns at least, with blanks behind the text.
[[nodiscard]] std::string padded(std::string text, std::size_t columns);

// How many columns standard output has: those of the terminal, else $COLUMNS, else without end (npos).
[[nodiscard]] std::size_t outputWidth();
// What is left of the width behind so many columns, and something at least.
[[nodiscard]] std::size_t columnsBehind(std::size_t used, std::size_t width);

// A string as it is, a date in ISO 8601, anything else as JSON.
[[nodiscard]] std::string shownText(const foundation::Value& value);
