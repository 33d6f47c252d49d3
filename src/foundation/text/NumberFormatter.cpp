// SPDX-License-Identifier: Apache-2.0
// The standard library rounds the exact binary value half to even; this file only drops zeros.
#include "foundation/text/NumberFormatter.h"

#include <algorithm>
#include <array>
#include <charconv>

namespace foundation {

std::string formatDecimal(double number, unsigned minimumFractionDigits, unsigned maximumFractionDigits)
{
    // A double has at most 309 digits before the point and 1,074 behind it.
    constexpr unsigned mostFractionDigits = 1074;
    std::array<char, 1400> buffer;
    const unsigned digits = std::min(maximumFractionDigits, mostFractionDigits);
    const auto written = std::to_chars(buffer.data(), buffer.data() + buffer.size(), number, std::chars_format::fixed,
                                       static_cast<int>(digits));
    std::string text(buffer.data(), written.ptr);
    const std::size_t point = text.find('.');
    if (point == std::string::npos)
        return text;
    const std::size_t shortest = point + (minimumFractionDigits == 0 ? 0 : minimumFractionDigits + 1);
    std::size_t length = text.size();
    while (length > shortest && text[length - 1] == '0')
        --length;
    if (length == point + 1)
        length = point;
    text.resize(length);
    return text;
}

} // namespace foundation
