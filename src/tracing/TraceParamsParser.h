// SPDX-License-Identifier: Apache-2.0
// Reads the trace-parameters file that a session's configuration names.
//
// A client names the file, so it may be missing, a pipe, a gigabyte large, not a property list, or one of the wrong
// structure. The parser logs each error, treats the wrong part as empty, and reads the rest.
#pragma once

#include "foundation/values/Value.h"
#include "tracing/TraceParams.h"

#include <cstddef>
#include <memory>
#include <string>
#include <utility>

// One thread at a time.
class TraceParamsParser {
public:
    // A relative path starts at the process's current directory.
    explicit TraceParamsParser(std::string fileName) : traceParamsFile_(std::move(fileName)) { }

    [[nodiscard]] const std::string& traceParamsFile() const { return traceParamsFile_; }

    // The content of the file, never null: without name and points if it holds none. Does not wait for a pipe or
    // device, and takes no more memory than a file within the limits of property lists.
    [[nodiscard]] std::unique_ptr<TraceParams> loadTraceParams() const;
    // The content of a property list that was read before. Any thread. Works without a platform, but then does not log.
    [[nodiscard]] static std::unique_ptr<TraceParams> paramsOf(const foundation::Value& root);

    // The limit of traces and points together. Further ones are left out, and a log line gives their number.
    static constexpr std::size_t mostTracesAndPoints = 1024;

private:
    const std::string traceParamsFile_;
};
