// SPDX-License-Identifier: Apache-2.0
// Describes a list of measured values by a few numbers and a histogram.
#pragma once

#include <cstddef>
#include <span>
#include <vector>

// Each is a measured value. A percentile is the least value that this percentage of all values does not exceed.
struct TraceStatistics {
    double minimum = 0;
    double median = 0;
    double percentile90 = 0;
    double percentile99 = 0;
    double maximum = 0;
};

// The number of values from `lower` up to, but not including, `upper`; the last row includes `upper`.
struct HistogramRow {
    double lower = 0;
    double upper = 0;
    std::size_t count = 0;
};

// For at least one value, in ascending order, without infinity and NaN.
[[nodiscard]] TraceStatistics traceStatistics(std::span<const double> values);

// Rows of one width, which is a round number (1, 2 or 5 and zeros), from the least value on. Values that are farther
// above the 90th percentile than the least value is below it are in one more row.
[[nodiscard]] std::vector<HistogramRow> traceHistogram(std::span<const double> values);
constexpr std::size_t mostHistogramRows = 13;
