// SPDX-License-Identifier: Apache-2.0
// Decimal text as people read it in bucket names.
#include "foundation/text/NumberFormatter.h"

#include <gtest/gtest.h>
#include <limits>
#include <locale>
#include <string>

namespace foundation {
namespace {

TEST(NumberFormatter, RoundsHalfToEven)
{
    EXPECT_EQ(formatDecimal(0.5, 0, 0), "0");
    EXPECT_EQ(formatDecimal(1.5, 0, 0), "2");
    EXPECT_EQ(formatDecimal(2.5, 0, 0), "2");
    EXPECT_EQ(formatDecimal(-2.5, 0, 0), "-2");
    EXPECT_EQ(formatDecimal(0.125, 1, 2), "0.12");
    EXPECT_EQ(formatDecimal(0.375, 1, 2), "0.38");
    EXPECT_EQ(formatDecimal(0.3125, 1, 2), "0.31");
    EXPECT_EQ(formatDecimal(0.9375, 1, 3), "0.938");
    EXPECT_EQ(formatDecimal(0.0625, 1, 3), "0.062");
}

TEST(NumberFormatter, DropsTrailingZerosDownToTheMinimum)
{
    EXPECT_EQ(formatDecimal(0.5, 1, 2), "0.5");
    EXPECT_EQ(formatDecimal(0.5, 0, 2), "0.5");
    EXPECT_EQ(formatDecimal(0.5, 2, 4), "0.50");
    EXPECT_EQ(formatDecimal(3, 1, 2), "3.0");
    EXPECT_EQ(formatDecimal(3, 0, 2), "3");
    EXPECT_EQ(formatDecimal(10, 0, 2), "10");
    EXPECT_EQ(formatDecimal(100, 0, 0), "100");
    EXPECT_EQ(formatDecimal(100, 1, 0), "100");
    EXPECT_EQ(formatDecimal(0.001, 1, 2), "0.0");
}

TEST(NumberFormatter, ShowsNoExponentAndNoGrouping)
{
    EXPECT_EQ(formatDecimal(18000, 0, 0), "18000");
    EXPECT_EQ(formatDecimal(1e21, 1, 1), "1000000000000000000000.0");
    EXPECT_EQ(formatDecimal(1e-7, 0, 7), "0.0000001");
}

TEST(NumberFormatter, HoldsTheLongestNumbersThereAre)
{
    EXPECT_EQ(formatDecimal(std::numeric_limits<double>::max(), 0, 0).size(), 309U);
    const std::string longest = formatDecimal(-std::numeric_limits<double>::max(), 4'000'000'000, 4'000'000'000);
    EXPECT_EQ(longest.size(), 1 + 309 + 1 + 1074U);
    EXPECT_EQ(formatDecimal(std::numeric_limits<double>::denorm_min(), 0, 4'000'000'000).size(), 2 + 1074U);
}

TEST(NumberFormatter, NaNIsAWord)
{
    EXPECT_EQ(formatDecimal(std::numeric_limits<double>::infinity(), 1, 2), "inf");
    EXPECT_EQ(formatDecimal(std::numeric_limits<double>::quiet_NaN(), 1, 2), "nan");
}

// A decimal comma, as in much of Europe; the test makes the locale so that it need not be installed.
class CommaPunctuation : public std::numpunct<char> {
    [[nodiscard]] char do_decimal_point() const override { return ','; }
    [[nodiscard]] char do_thousands_sep() const override { return '.'; }
    [[nodiscard]] std::string do_grouping() const override { return "\3"; }
};

TEST(NumberFormatter, WritesAPointInEveryLocale)
{
    const std::locale before = std::locale::global(std::locale(std::locale(), new CommaPunctuation));
    const std::string text = formatDecimal(12345.25, 1, 2);
    std::locale::global(before);
    EXPECT_EQ(text, "12345.25");
}

} // namespace
} // namespace foundation
