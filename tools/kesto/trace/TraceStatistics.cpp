// SPDX-License-Identifier: Apache-2.0
// Computes percentiles by rank in the sorted values, and boundaries with round numbers.
#include "kesto/trace/TraceStatistics.h"

#include <algorithm>
#include <cmath>
#include <iterator>

namespace {

constexpr std::size_t wantedRows = 10;

double percentile(std::span<const double> values, std::size_t percent)
{
    return values[(values.size() * percent + 99) / 100 - 1];
}

// The least of 1, 2 and 5 times a power of ten that is not below the number.
double roundedUp(double number)
{
    const double power = std::pow(10, std::floor(std::log10(number)));
    for (const double factor : {1.0, 2.0, 5.0})
        if (factor * power >= number)
            return factor * power;
    return 10 * power;
}

} // namespace

TraceStatistics traceStatistics(std::span<const double> values)
{
    return {.minimum = values.front(),
            .median = percentile(values, 50),
            .percentile90 = percentile(values, 90),
            .percentile99 = percentile(values, 99),
            .maximum = values.back()};
}

std::vector<HistogramRow> traceHistogram(std::span<const double> values)
{
    const double least = values.front();
    const double most = values.back();
    const double fence = percentile(values, 90) + (percentile(values, 90) - least);
    // If nearly all values are equal, the rows must reach to the others.
    const double end = fence > least ? *std::prev(std::ranges::upper_bound(values, fence)) : most;
    const double width = roundedUp((end - least) / wantedRows);
    const double first = std::floor(least / width) * width;
    const double farthest = std::max(std::abs(first), std::abs(end));
    if (!std::isnormal(width) || !std::isfinite(farthest) || farthest + width == farthest) // rows cannot differ
        return {{.lower = least, .upper = most, .count = values.size()}};

    std::vector<HistogramRow> rows;
    auto from = values.begin();
    const auto addRow = [&](double lower, double upper, std::span<const double>::iterator to) {
        rows.push_back({.lower = lower, .upper = upper, .count = static_cast<std::size_t>(to - from)});
        from = to;
    };
    for (std::size_t row = 0; from != values.end() && *from <= end; ++row) {
        const double upper = first + static_cast<double>(row + 1) * width;
        addRow(first + static_cast<double>(row) * width, upper, std::lower_bound(from, values.end(), upper));
    }
    if (from != values.end())
        addRow(rows.back().upper, most, values.end());
    return rows;
}
