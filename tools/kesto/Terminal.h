// Text for a person at a terminal: control characters are replaced, and lines are cut to its width. Every character
// counts as one column.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <string>
#include <string_view>

// The text with "?" for every control character: those of ASCII, and U+0080 to U+009F.
[[nodiscard]] std::string printable(std::string_view text);
// At most so many columns of the text; a cut text ends in "…".
[[nodiscard]] std::string fitted(std::string_view text, std::size_t columns);
// At least so many columns, with blanks behind the text.
[[nodiscard]] std::string padded(std::string text, std::size_t columns);

// How many columns standard output has: those of the terminal, else $COLUMNS, else unlimited (npos).
[[nodiscard]] std::size_t outputWidth();
// How many lines the terminal of standard output has; unlimited (npos) where there is none.
[[nodiscard]] std::size_t outputHeight();
// The rest of the width behind so many columns, but not too little.
[[nodiscard]] std::size_t columnsBehind(std::size_t used, std::size_t width);

// Whether the environment's locale writes in UTF-8.
[[nodiscard]] bool showsUTF8();
// The text for another locale: "~" for the sign of a cut, "?" for every other character that ASCII does not have.
[[nodiscard]] std::string asciiText(std::string_view text);

// 35200000 as "35.2 MB".
[[nodiscard]] std::string sizeText(std::uint64_t bytes);

// A string as it is, a date in ISO 8601, anything else as JSON.
[[nodiscard]] std::string shownText(const foundation::Value& value);
