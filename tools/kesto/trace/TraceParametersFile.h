// A parameters file of a trace, seen by the person who wants to measure: what of it will not be measured is said before
// anything is run, and a service that cannot read it is given a copy.
#pragma once

#include "tracing/TraceParams.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

struct TraceParametersFile {
    std::filesystem::path path; // absolute, for the service has another directory
    std::string text;
    TraceParams params; // as the service understands it
};

// Throws std::runtime_error when it cannot be read, is no property list, or asks for what this service never measures.
[[nodiscard]] TraceParametersFile readTraceParameters(const std::filesystem::path& path);

// What will be measured otherwise than the file says, or not at all: a line each.
[[nodiscard]] std::vector<std::string> warningsOf(const TraceParams& params);

// A copy that the service can read, whatever it may see of the file itself. It lies where the service writes its
// results: that it can reach, and everybody may write there who may read the results. It lasts as long as this object.
class TraceParametersCopy {
public:
    // In the folder, which is at or below the root; from there on no link is followed, for others write there, too.
    // Throws std::runtime_error when it cannot be made.
    TraceParametersCopy(const std::filesystem::path& root, const std::filesystem::path& folder, std::string_view text);
    ~TraceParametersCopy();
    TraceParametersCopy(const TraceParametersCopy&) = delete;
    TraceParametersCopy& operator=(const TraceParametersCopy&) = delete;

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }

private:
    const std::filesystem::path path_;
};
