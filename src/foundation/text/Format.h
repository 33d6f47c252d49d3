// Formatting of text. It is {fmt}, which is what std::format became; when the compilers that the project supports
// have that, only this file changes.
#pragma once

#include <fmt/format.h>

namespace foundation {

using fmt::format;
using fmt::format_to;
using fmt::join;

} // namespace foundation
