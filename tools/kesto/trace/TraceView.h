// The results of a trace on standard output: a table with a histogram of each name for people, or JSON for programs.
#pragma once

#include "kesto/trace/TraceResultsFile.h"

#include <filesystem>

// The results in a file of that text; the path is for the line that says what is wrong with it: std::runtime_error.
[[nodiscard]] TraceResultsFile traceResultsOf(std::string_view text, const std::filesystem::path& path);
// The largest file that is read: twice what the service writes.
constexpr std::size_t largestTraceResults = std::size_t{512} << 20;

// Also says what is missing in them, beside the table or, for programs, on standard error. Returns the exit status:
// exitIncomplete if anything is.
[[nodiscard]] int showTraceResults(const TraceResultsFile& results, bool isJson);
