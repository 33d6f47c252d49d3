// SPDX-License-Identifier: Apache-2.0
// Numbers of every kind, at the limits where a careless comparison or conversion is wrong.
#include "foundation/values/Number.h"

#include <array>
#include <cmath>
#include <cstdint>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <vector>

namespace foundation {
namespace {

using NumberKind = Number::Kind;

constexpr auto leastInt64 = std::numeric_limits<std::int64_t>::min();
constexpr auto mostInt64 = std::numeric_limits<std::int64_t>::max();
constexpr auto mostUint64 = std::numeric_limits<std::uint64_t>::max();
constexpr double infinity = std::numeric_limits<double>::infinity();
constexpr double nan = std::numeric_limits<double>::quiet_NaN();
constexpr std::int64_t twoTo53 = std::int64_t{1} << 53;

TEST(Number, RemembersItsKind)
{
    EXPECT_EQ(Number().kind(), NumberKind::Signed64);
    EXPECT_EQ(Number(true).kind(), NumberKind::Boolean);
    EXPECT_EQ(Number(1).kind(), NumberKind::Signed64);
    EXPECT_EQ(Number(1U).kind(), NumberKind::Unsigned64);
    EXPECT_EQ(Number(std::uint8_t{1}).kind(), NumberKind::Unsigned64);
    EXPECT_EQ(Number(1.0F).kind(), NumberKind::Float32);
    EXPECT_EQ(Number(1.0).kind(), NumberKind::Float64);
    EXPECT_TRUE(Number(1.0F).isFloat());
    EXPECT_FALSE(Number(1U).isFloat());
}

TEST(Number, EqualsAcrossKindsWhenWorthTheSame)
{
    const std::vector<Number> ones{Number(true), Number(1), Number(1U), Number(1.0F), Number(1.0)};
    const std::vector<Number> zeros{Number(false), Number(0), Number(0U), Number(0.0F), Number(-0.0)};
    for (const Number& one : ones) {
        for (const Number& other : ones)
            EXPECT_EQ(one, other);
        for (const Number& zero : zeros)
            EXPECT_NE(one, zero);
    }
    for (const Number& zero : zeros)
        for (const Number& other : zeros)
            EXPECT_EQ(zero, other);
}

TEST(Number, TheHighestBitIsASignInOneKindOnly)
{
    EXPECT_NE(Number(-1), Number(mostUint64));
    EXPECT_NE(Number(mostUint64), Number(-1));
    EXPECT_NE(Number(leastInt64), Number(std::uint64_t{1} << 63));
    EXPECT_EQ(Number(mostInt64), Number(static_cast<std::uint64_t>(mostInt64)));
}

TEST(Number, IntegersThatADoubleCannotHoldDoNotEqualTheNearestDouble)
{
    EXPECT_EQ(Number(twoTo53), Number(0x1p53));
    EXPECT_NE(Number(twoTo53 + 1), Number(0x1p53));
    EXPECT_NE(Number(0x1p53), Number(twoTo53 + 1));
    EXPECT_NE(Number(static_cast<std::uint64_t>(twoTo53) + 1), Number(0x1p53));
    EXPECT_NE(Number((1 << 24) + 1), Number(0x1p24F));
}

TEST(Number, EqualityHoldsAtTheEndsOfTheIntegerRanges)
{
    EXPECT_EQ(Number(leastInt64), Number(-0x1p63));
    EXPECT_NE(Number(mostInt64), Number(0x1p63)); // a cast would round to this
    EXPECT_EQ(Number(std::uint64_t{1} << 63), Number(0x1p63));
    EXPECT_NE(Number(mostUint64), Number(0x1p64));
    EXPECT_NE(Number(0), Number(0x1p64));
    EXPECT_NE(Number(leastInt64), Number(-0x1p64));
    EXPECT_NE(Number(1U), Number(-1.0));
    EXPECT_NE(Number(0U), Number(-0.5));
    EXPECT_NE(Number(1), Number(1.5));
}

TEST(Number, FloatsOfBothWidthsAreComparedExactly)
{
    EXPECT_EQ(Number(0.5F), Number(0.5));
    EXPECT_NE(Number(0.6F), Number(0.6));
}

TEST(Number, NotANumberAndInfinity)
{
    EXPECT_NE(Number(nan), Number(nan));
    EXPECT_NE(Number(nan), Number(0));
    EXPECT_NE(Number(0U), Number(nan));
    EXPECT_EQ(Number(infinity), Number(std::numeric_limits<float>::infinity()));
    EXPECT_NE(Number(infinity), Number(mostInt64));
    EXPECT_NE(Number(mostUint64), Number(infinity));
    EXPECT_NE(Number(-infinity), Number(leastInt64));
}

// The simplest comparison: `long double` (64 bits of mantissa) holds both sides exactly, as long as both fit.
RC_GTEST_PROP(NumberProperty, EqualityIsThatOfTheExactValues, (std::int64_t integer, double fraction))
{
    const std::array<Number, 5> numbers{Number(integer), Number(static_cast<std::uint64_t>(integer)), Number(fraction),
                                        Number(static_cast<double>(integer)), Number(static_cast<float>(integer))};
    const std::array<long double, 5> exact{
        static_cast<long double>(integer), static_cast<long double>(static_cast<std::uint64_t>(integer)),
        static_cast<long double>(fraction), static_cast<long double>(static_cast<double>(integer)),
        static_cast<long double>(static_cast<float>(integer))};
    for (std::size_t left = 0; left < numbers.size(); ++left)
        for (std::size_t right = 0; right < numbers.size(); ++right)
            RC_ASSERT((numbers[left] == numbers[right]) == (exact[left] == exact[right]));
}

TEST(Number, BooleanValueIsWhetherItIsNotZero)
{
    EXPECT_TRUE(Number(true).booleanValue());
    EXPECT_FALSE(Number(false).booleanValue());
    EXPECT_TRUE(Number(-1).booleanValue());
    EXPECT_TRUE(Number(mostUint64).booleanValue());
    EXPECT_FALSE(Number(0U).booleanValue());
    EXPECT_TRUE(Number(0.1F).booleanValue());
    EXPECT_FALSE(Number(-0.0).booleanValue());
    EXPECT_TRUE(Number(nan).booleanValue());
    EXPECT_TRUE(Number(std::numeric_limits<double>::denorm_min()).booleanValue());
}

TEST(Number, Int64ValueCutsTowardsZeroAndStopsAtTheEnds)
{
    EXPECT_EQ(Number(true).int64Value(), 1);
    EXPECT_EQ(Number(leastInt64).int64Value(), leastInt64);
    EXPECT_EQ(Number(static_cast<std::uint64_t>(mostInt64)).int64Value(), mostInt64);
    EXPECT_EQ(Number(static_cast<std::uint64_t>(mostInt64) + 1).int64Value(), mostInt64);
    EXPECT_EQ(Number(mostUint64).int64Value(), mostInt64);
    EXPECT_EQ(Number(2.9F).int64Value(), 2);
    EXPECT_EQ(Number(-2.9).int64Value(), -2);
    EXPECT_EQ(Number(0x1p63).int64Value(), mostInt64);
    EXPECT_EQ(Number(std::nextafter(0x1p63, 0.0)).int64Value(), 0x7FFFFFFFFFFFFC00);
    EXPECT_EQ(Number(-0x1p63).int64Value(), leastInt64);
    EXPECT_EQ(Number(-0x1p64).int64Value(), leastInt64);
    EXPECT_EQ(Number(infinity).int64Value(), mostInt64);
    EXPECT_EQ(Number(-infinity).int64Value(), leastInt64);
    EXPECT_EQ(Number(nan).int64Value(), 0);
}

TEST(Number, DoubleValueOfEveryKind)
{
    EXPECT_EQ(Number(true).doubleValue(), 1.0);
    EXPECT_EQ(Number(-3).doubleValue(), -3.0);
    EXPECT_EQ(Number(mostUint64).doubleValue(), 0x1p64);
    EXPECT_EQ(Number(0.1F).doubleValue(), static_cast<double>(0.1F));
    EXPECT_EQ(Number(0.1).doubleValue(), 0.1);
}

TEST(Number, ExactlyGivesIntegersInRangeOnly)
{
    EXPECT_EQ(Number(255).exactly<std::uint8_t>(), 255);
    EXPECT_EQ(Number(256).exactly<std::uint8_t>(), std::nullopt);
    EXPECT_EQ(Number(-1).exactly<std::uint64_t>(), std::nullopt);
    EXPECT_EQ(Number(mostUint64).exactly<std::uint64_t>(), mostUint64);
    EXPECT_EQ(Number(mostUint64).exactly<std::int64_t>(), std::nullopt);
    EXPECT_EQ(Number(leastInt64).exactly<std::int64_t>(), leastInt64);
    EXPECT_EQ(Number(true).exactly<int>(), std::nullopt);
    EXPECT_EQ(Number(1.0).exactly<int>(), std::nullopt);
}

TEST(Number, TextOfIntegersAndBooleans)
{
    EXPECT_EQ(Number(true).text(), "1");
    EXPECT_EQ(Number(false).text(), "0");
    EXPECT_EQ(Number(leastInt64).text(), "-9223372036854775808");
    EXPECT_EQ(Number(mostUint64).text(), "18446744073709551615");
}

TEST(Number, TextOfFloatsIsTheShortestThatReadsBack)
{
    EXPECT_EQ(Number(0.6F).text(), "0.6");
    EXPECT_EQ(Number(static_cast<double>(0.6F)).text(), "0.6000000238418579");
    EXPECT_EQ(Number(0.1 + 0.2).text(), "0.30000000000000004");
    EXPECT_EQ(Number(1.0).text(), "1");
    EXPECT_EQ(Number(-0.0).text(), "-0");
    EXPECT_EQ(Number(44100.0).text(), "44100");
    EXPECT_EQ(Number(1e15).text(), "1000000000000000");
    EXPECT_EQ(Number(1e16).text(), "1e+16");
    EXPECT_EQ(Number(1e-5).text(), "1e-05");
    EXPECT_EQ(Number(0.0001).text(), "0.0001");
    EXPECT_EQ(Number(std::numeric_limits<double>::denorm_min()).text(), "5e-324");
    EXPECT_EQ(Number(std::numeric_limits<double>::max()).text(), "1.7976931348623157e+308");
    EXPECT_EQ(Number(nan).text(), "nan");
    EXPECT_EQ(Number(-infinity).text(), "-inf");
}

RC_GTEST_PROP(NumberProperty, TextReadsBackToTheSameFloat, (double wide, float narrow))
{
    RC_ASSERT(std::stod(Number(wide).text()) == wide);
    RC_ASSERT(std::stof(Number(narrow).text()) == narrow);
}

TEST(Number, TextIsAppended)
{
    std::string text = "gain=";
    Number(0.5F).appendText(text);
    EXPECT_EQ(text, "gain=0.5");
}

} // namespace
} // namespace foundation
