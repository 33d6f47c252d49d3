// What a list of measured values is like: how they lie, as a few numbers and as a histogram.
#pragma once

#include <cstddef>
#include <span>
#include <vector>

// Each of them is a value that was measured. A percentile is the least value that so many percent of all do not exceed.
struct TraceStatistics {
    double minimum = 0;
    double median = 0;
    double percentile90 = 0;
    double percentile99 = 0;
    double maximum = 0;
};

// How many values lie from `lower` on and below `upper`; in the last row, up to `upper`.
struct HistogramRow {
    double lower = 0;
    double upper = 0;
    std::size_t count = 0;
};

// Of values in ascending order; at least one, none of them infinite or not a number.
[[nodiscard]] TraceStatistics traceStatistics(std::span<const double> values);

// Rows of one width, which is a round number (1, 2 or 5 and zeros), from the least value on. What is further above the
// 90th percentile than the least value is below it, is in one more row: it may be very far.
[[nodiscard]] std::vector<HistogramRow> traceHistogram(std::span<const double> values);
constexpr std::size_t mostHistogramRows = 13;
