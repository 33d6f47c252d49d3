// SPDX-License-Identifier: Apache-2.0
// A parameters file of a trace, for the tool: it finds the points that will not be measured before the program runs,
// and makes a copy for a service that cannot read the file.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "tracing/TraceParams.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

struct TraceParametersFile {
    std::filesystem::path path; // absolute, because the service has another current directory
    std::string text;
    TraceParams params; // as the service reads it
};

// Throws std::runtime_error if the file cannot be read, is not a property list, or asks for a kind of trace that the
// service does not support.
[[nodiscard]] TraceParametersFile readTraceParameters(const std::filesystem::path& path);

// A line for each point that will be measured differently from the file, or not at all.
[[nodiscard]] std::vector<std::string> warningsOf(const TraceParams& params);

// A copy that the service can read, even if it cannot read the file itself. It is in the service's folder of results:
// the service can reach it, and all users who may read the results may write there. The copy lasts as long as this
// object; a killed process leaves it.
class TraceParametersCopy {
public:
    // Makes the copy in the folder, which is at or below the root. Below the root it does not follow links, because
    // other users may write there, too. Throws std::runtime_error on failure.
    TraceParametersCopy(const std::filesystem::path& root, const std::filesystem::path& folder, std::string_view text);
    ~TraceParametersCopy();
    TraceParametersCopy(const TraceParametersCopy&) = delete;
    TraceParametersCopy& operator=(const TraceParametersCopy&) = delete;

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }

private:
    const std::string name_;
    const std::filesystem::path path_;
    platform::FileDescriptor folder_;
    platform::FileDescriptor file_; // locked as long as the copy is needed
};

// Removes this user's copies that belong to ended processes. All other files stay, and so do copies that cannot be
// removed.
void removeLeftTraceParametersCopies(const std::filesystem::path& root, const std::filesystem::path& folder);
