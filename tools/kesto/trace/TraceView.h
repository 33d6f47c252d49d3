// SPDX-License-Identifier: Apache-2.0
// The results of a trace on standard output: a table with a histogram of each name for people, or JSON for programs.
#pragma once

#include "kesto/trace/TraceResultsFile.h"

#include <filesystem>

// Parses the text of a results file. Throws std::runtime_error with the path and the error.
[[nodiscard]] TraceResultsFile traceResultsOf(std::string_view text, const std::filesystem::path& path);
// The largest file that is read: twice what the service writes.
constexpr std::size_t largestTraceResults = std::size_t{512} << 20;

// Also reports missing data, beside the table or, for programs, on standard error. Returns the exit status:
// exitIncomplete if data is missing.
[[nodiscard]] int showTraceResults(const TraceResultsFile& results, bool isJson);
