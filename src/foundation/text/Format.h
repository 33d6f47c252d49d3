// Formatting of text. It is {fmt}, the model of std::format; when all compilers that the project supports have
// std::format, only this file changes.
#pragma once

#include <fmt/format.h>

namespace foundation {

using fmt::format;
using fmt::format_to;
using fmt::join;

} // namespace foundation
