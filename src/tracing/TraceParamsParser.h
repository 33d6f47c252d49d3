// Reads the trace-parameters file that a session's configuration names.
//
// A client names the file, so that it may be anything: missing, a pipe, a gigabyte, no property list, or one of the
// wrong shape. Nothing of that ends the reading: what is wrong is logged and counts as empty, and the rest is read.
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
    // The path; one that does not begin with "/" is taken from the process's current directory.
    explicit TraceParamsParser(std::string fileName) : traceParamsFile_(std::move(fileName)) { }

    [[nodiscard]] const std::string& traceParamsFile() const { return traceParamsFile_; }

    // What the file says, never null: without name and points when it says nothing. Does not wait for whatever stands
    // at the path, and takes no more memory than a file within the limits of property lists.
    [[nodiscard]] std::unique_ptr<TraceParams> loadTraceParams() const;
    // What a property list says that was read already. Any thread; needs no platform, without which it logs nothing.
    [[nodiscard]] static std::unique_ptr<TraceParams> paramsOf(const foundation::Value& root);

    // Traces and points of a file, taken together. Those beyond are left out, with a line that says how many.
    static constexpr std::size_t mostTracesAndPoints = 1024;

private:
    const std::string traceParamsFile_;
};
