#include "foundation/Number.h"

#include <cmath>
#include <fmt/format.h>
#include <iterator>
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

bool Number::booleanValue() const noexcept
{
    return isFloat() ? doubleValue() != 0 : unsigned_ != 0;
}

std::int64_t Number::int64Value() const noexcept
{
    constexpr auto least = std::numeric_limits<std::int64_t>::min();
    constexpr auto most = std::numeric_limits<std::int64_t>::max();
    if (kind_ == Kind::Unsigned64)
        return unsigned_ > static_cast<std::uint64_t>(most) ? most : static_cast<std::int64_t>(unsigned_);
    if (!isFloat())
        return signed_;
    const double value = doubleValue();
    if (std::isnan(value))
        return 0;
    if (value >= twoTo63)
        return most;
    return value < -twoTo63 ? least : static_cast<std::int64_t>(value);
}

double Number::doubleValue() const noexcept
{
    switch (kind_) {
    case Kind::Float32: return float32_;
    case Kind::Float64: return float64_;
    case Kind::Unsigned64: return static_cast<double>(unsigned_);
    default: return static_cast<double>(signed_);
    }
}

std::string Number::text() const
{
    std::string text;
    appendText(text);
    return text;
}

void Number::appendText(std::string& out) const
{
    const auto append = [&out](auto value) { fmt::format_to(std::back_inserter(out), "{}", value); };
    switch (kind_) {
    case Kind::Unsigned64: return append(unsigned_);
    case Kind::Float32: return append(float32_);
    case Kind::Float64: return append(float64_);
    default: return append(signed_);
    }
}

bool operator==(const Number& left, const Number& right) noexcept
{
    if (left.isFloat() && right.isFloat())
        return left.doubleValue() == right.doubleValue();
    if (right.isFloat())
        return right == left;
    if (left.isFloat())
        return right.kind_ == Number::Kind::Unsigned64 ? equalsInteger(left.doubleValue(), right.unsigned_)
                                                       : equalsInteger(left.doubleValue(), right.signed_);
    if (left.kind_ == Number::Kind::Unsigned64)
        return right.kind_ == Number::Kind::Unsigned64 ? left.unsigned_ == right.unsigned_
                                                       : std::cmp_equal(left.unsigned_, right.signed_);
    return right.kind_ == Number::Kind::Unsigned64 ? std::cmp_equal(left.signed_, right.unsigned_)
                                                   : left.signed_ == right.signed_;
}

} // namespace foundation
