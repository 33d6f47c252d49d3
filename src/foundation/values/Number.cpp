// SPDX-License-Identifier: Apache-2.0
// Conversions that never leave the range of their result, and exact equality, which does not compare an integer by way
// of a double that cannot hold it.
#include "foundation/values/Number.h"

#include <cmath>
#include <fmt/compile.h>
#include <limits>

namespace foundation {
namespace {

constexpr double twoTo63 = 9223372036854775808.0;
constexpr double twoTo64 = 18446744073709551616.0;

bool equalsInteger(double value, std::int64_t integer) noexcept
{
    return value >= -twoTo63 && value < twoTo63 && std::trunc(value) == value
        && static_cast<std::int64_t>(value) == integer;
}

bool equalsInteger(double value, std::uint64_t integer) noexcept
{
    return value >= 0 && value < twoTo64 && std::trunc(value) == value && static_cast<std::uint64_t>(value) == integer;
}

} // namespace

std::int64_t Number::int64Value() const noexcept
{
    constexpr auto least = std::numeric_limits<std::int64_t>::min();
    constexpr auto most = std::numeric_limits<std::int64_t>::max();
    if (kind_ == Kind::Unsigned64)
        return std::in_range<std::int64_t>(bits_) ? signedBits() : most;
    if (!isFloat())
        return signedBits();
    const double value = doubleValue();
    if (std::isnan(value))
        return 0;
    if (value >= twoTo63)
        return most;
    return value < -twoTo63 ? least : static_cast<std::int64_t>(value);
}

std::string Number::text() const
{
    std::string text;
    appendText(text);
    return text;
}

char* Number::writeText(char* out) const
{
    const auto write = [out](auto value) { return fmt::format_to(out, FMT_COMPILE("{}"), value); };
    switch (kind_) {
    case Kind::Unsigned64: return write(bits_);
    case Kind::Float32: return write(static_cast<float>(doubleValue()));
    case Kind::Float64: return write(doubleValue());
    default: return write(signedBits());
    }
}

bool operator==(const Number& left, const Number& right) noexcept
{
    if (left.isFloat() && right.isFloat())
        return left.doubleValue() == right.doubleValue();
    if (right.isFloat())
        return right == left;
    if (left.isFloat())
        return right.kind_ == Number::Kind::Unsigned64 ? equalsInteger(left.doubleValue(), right.bits_)
                                                       : equalsInteger(left.doubleValue(), right.signedBits());
    // Equal bits mean equal integers, unless the kinds read the highest bit differently.
    const bool sameSign = (left.kind_ == Number::Kind::Unsigned64) == (right.kind_ == Number::Kind::Unsigned64);
    return left.bits_ == right.bits_ && (sameSign || left.signedBits() >= 0);
}

} // namespace foundation
