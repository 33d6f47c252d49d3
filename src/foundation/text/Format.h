// SPDX-License-Identifier: Apache-2.0
// The room of text: how numbers, times and values become text for people, and how long text is put together. Only local
// time depends on the system: on its time zone.
//
// Formatting of text. It is {fmt}, the model of std::format; when all compilers that the project supports have
// std::format, only this file changes.
#pragma once

#include <fmt/format.h>

namespace foundation {

using fmt::format;
using fmt::format_to;
using fmt::join;

} // namespace foundation
