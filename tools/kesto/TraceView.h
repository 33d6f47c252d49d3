// The results of a trace on standard output: a table with a histogram of each name for people, or JSON for programs.
#pragma once

#include <filesystem>

// Throws std::runtime_error, which says what is wrong with the file, before anything is printed.
void showTraceResults(const std::filesystem::path& path, bool isJson);
