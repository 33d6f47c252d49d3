// SPDX-License-Identifier: Apache-2.0
// Percentiles and histograms of a few values by hand, and properties for all values.
#include "kesto/trace/TraceStatistics.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <numeric>
#include <rapidcheck/gtest.h>

namespace {

using testing::ElementsAre;
using testing::FieldsAre;

TEST(TraceStatisticsOf, OneValueAreThatValue)
{
    EXPECT_THAT(traceStatistics(std::vector<double>{7}), FieldsAre(7, 7, 7, 7, 7));
}

TEST(TraceStatisticsOf, ManyValuesAreTheOnesThatSoManyPercentDoNotExceed)
{
    std::vector<double> values(100);
    std::iota(values.begin(), values.end(), 1);
    EXPECT_THAT(traceStatistics(values), FieldsAre(1, 50, 90, 99, 100));
    values.push_back(1000);
    EXPECT_THAT(traceStatistics(values), FieldsAre(1, 51, 91, 100, 1000));
    EXPECT_THAT(traceStatistics(std::vector<double>{1, 2}), FieldsAre(1, 1, 2, 2, 2));
}

TEST(TraceHistogramOf, ValuesThatAreAllTheSameIsOneRow)
{
    EXPECT_THAT(traceHistogram(std::vector<double>{3, 3, 3}), ElementsAre(FieldsAre(3, 3, 3)));
}

TEST(TraceHistogramOf, ValuesHasRowsOfARoundWidth)
{
    EXPECT_THAT(traceHistogram(std::vector<double>{1, 10, 19, 20, 39, 41}),
                ElementsAre(FieldsAre(0, 5, 1), FieldsAre(5, 10, 0), FieldsAre(10, 15, 1), FieldsAre(15, 20, 1),
                            FieldsAre(20, 25, 1), FieldsAre(25, 30, 0), FieldsAre(30, 35, 0), FieldsAre(35, 40, 1),
                            FieldsAre(40, 45, 1)));
}

TEST(TraceHistogramOf, ValuesFarBeyondTheOthersHasThemInOneRow)
{
    std::vector<double> values(198);
    std::iota(values.begin(), values.end(), 0);
    values.push_back(1'000'000);
    values.push_back(5'000'000);
    const auto rows = traceHistogram(values);
    EXPECT_THAT(rows.front(), FieldsAre(0, 20, 20));
    EXPECT_THAT(rows.back(), FieldsAre(200, 5'000'000, 2));
}

TEST(TraceHistogramOf, ValuesThatAreNearlyAllTheSameReachesToTheOthers)
{
    std::vector<double> values(1000, 5);
    values.push_back(105);
    const auto rows = traceHistogram(values);
    EXPECT_THAT(rows.front(), FieldsAre(0, 10, 1000));
    EXPECT_THAT(rows.back(), FieldsAre(100, 110, 1));
}

TEST(TraceHistogramOf, ValuesThatNoWidthTellsApartIsOneRow)
{
    constexpr double most = std::numeric_limits<double>::max();
    EXPECT_THAT(traceHistogram(std::vector<double>{-most, most}), ElementsAre(FieldsAre(-most, most, 2)));
    EXPECT_THAT(traceHistogram(std::vector<double>{0, 5e-324}), ElementsAre(FieldsAre(0, 5e-324, 2)));
    EXPECT_THAT(traceHistogram(std::vector<double>{1e19, 1e19 + 2048}), ElementsAre(FieldsAre(1e19, 1e19 + 2048, 2)));
}

std::vector<double> anyValues()
{
    const auto times = rc::gen::map(rc::gen::inRange<std::uint64_t>(0, std::uint64_t(1) << *rc::gen::inRange(1, 64)),
                                    [](std::uint64_t time) { return static_cast<double>(time); });
    auto values = *rc::gen::nonEmpty(rc::gen::container<std::vector<double>>(times));
    std::ranges::sort(values);
    return values;
}

RC_GTEST_PROP(TraceHistogramOf, AnyValuesHasEachOfThemInOneRow, ())
{
    const std::vector<double> values = anyValues();
    const auto rows = traceHistogram(values);
    RC_ASSERT(!rows.empty() && rows.size() <= mostHistogramRows);
    std::size_t counted = 0;
    for (std::size_t index = 0; index < rows.size(); ++index) {
        const HistogramRow& row = rows[index];
        const bool isLast = index + 1 == rows.size();
        RC_ASSERT(row.lower <= row.upper);
        if (!isLast)
            RC_ASSERT(row.upper == rows[index + 1].lower);
        RC_ASSERT(static_cast<std::ptrdiff_t>(row.count) == std::ranges::count_if(values, [&](double value) {
                      return value >= row.lower && (value < row.upper || (isLast && value == row.upper));
                  }));
        counted += row.count;
    }
    RC_ASSERT(counted == values.size());
}

RC_GTEST_PROP(TraceStatisticsOf, AnyValuesAreValuesThatSoManyDoNotExceed, ())
{
    const std::vector<double> values = anyValues();
    const TraceStatistics statistics = traceStatistics(values);
    for (const auto& [percentile, percent] :
         {std::pair{statistics.median, 50}, {statistics.percentile90, 90}, {statistics.percentile99, 99}}) {
        const auto notAbove = std::ranges::count_if(values, [&](double value) { return value <= percentile; });
        const auto below = std::ranges::count_if(values, [&](double value) { return value < percentile; });
        RC_ASSERT(std::ranges::binary_search(values, percentile));
        RC_ASSERT(notAbove * 100 >= percent * std::ssize(values));
        RC_ASSERT(below * 100 < percent * std::ssize(values));
    }
    RC_ASSERT(statistics.minimum == values.front() && statistics.maximum == values.back());
}

} // namespace
