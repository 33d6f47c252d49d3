// SPDX-License-Identifier: Apache-2.0
// The results file of a trace, as the service writes it, grouped by measurement.
#pragma once

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>
#include <vector>

// The values of one name, in the order of the file.
struct TraceSeries {
    std::string name;
    std::string unit; // "ns" in the service's own files
    std::vector<double> values;
};

struct TraceResultsFile {
    std::string project;
    double version = 0;
    std::vector<TraceSeries> series; // in the order in which names first appear; values of two units are two series
    std::size_t withoutValue = 0; // records without a number, because JSON cannot express all numbers

    // The numbers of missing items, and the reason if the measurement is incomplete or failed.
    double lostEvents = 0; // at most; intervals may span lost events
    double lostIntervals = 0; // points of the parameters that were not measured
    double lostPoints = 0; // traces and points of the parameters that were not read
    double lostValues = 0; // values that were measured but not written
    std::string problem;
};

// The error gives the reason why the text is not a results file.
[[nodiscard]] std::expected<TraceResultsFile, std::string> parseTraceResults(std::string_view text);
