// SPDX-License-Identifier: Apache-2.0
// Whole numbers in place of fractions: their sums do not depend on the order in which they are added, and every reader
// of their digits gets the same number.
//
// The device's own report and that of a fleet are equal to the last digit because both round here, and add afterwards.
#pragma once

#include <cmath>
#include <cstdint>

namespace foundation {

inline constexpr double millionthsOfOne = 1e6;

// The nearest, and of two the even one. The number is finite and below 2^63 millionths.
[[nodiscard]] inline std::int64_t wholeMillionths(double number)
{
    return static_cast<std::int64_t>(std::nearbyint(number * millionthsOfOne));
}
[[nodiscard]] inline std::int64_t wholeMicroseconds(double seconds)
{
    return wholeMillionths(seconds);
}
[[nodiscard]] inline double secondsOf(std::int64_t microseconds)
{
    return static_cast<double>(microseconds) / millionthsOfOne;
}

} // namespace foundation
