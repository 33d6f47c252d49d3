// The results file of a trace, as the service writes it, put together by what was measured.
#pragma once

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>
#include <vector>

// What was measured under one name, in the order of the file.
struct TraceSeries {
    std::string name;
    std::string unit; // "ns" in all that the service writes
    std::vector<double> values;
};

struct TraceResultsFile {
    std::string project;
    double version = 0;
    std::vector<TraceSeries> series; // in the order in which their names appear; values of two units are two series
    std::size_t withoutValue = 0; // records that hold no number, since JSON cannot say every one

    // What is missing: how many, and why nothing or not all could be measured.
    double lostEvents = 0; // at most; intervals may span those
    double lostIntervals = 0; // points of the parameters that were not measured
    double lostPoints = 0; // traces and points of the parameters that were not read
    double lostValues = 0; // that were measured and not written
    std::string problem;
};

// The error says why the text is no results file.
[[nodiscard]] std::expected<TraceResultsFile, std::string> parseTraceResults(std::string_view text);
