// A program that runs while a trace measures it: what an engineer would do by hand with a session of the service, a
// parameters file and the results file, in one step.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

struct TraceRecordingOptions {
    std::filesystem::path parameters;
    std::filesystem::path results; // that the service writes; empty: where it usually does
    std::filesystem::path output; // a copy of it; empty: none
    std::string socket; // empty: where the service usually is
    std::vector<std::string> command; // the program and its arguments
};

// Warns of parameters that measure nothing; runs the program while the service traces, with its socket in $KESTO_SOCKET
// if one is given; then prints what was measured. Returns the program's exit status: 128 and the signal's number if one
// ended it, 127 if it could not be run; instead of 0, 1 if there are no results or no copy of them, and exitIncomplete
// if something is missing in them. Throws std::runtime_error when no trace can be had, and does not run it then.
[[nodiscard]] int recordTrace(const TraceRecordingOptions& options);
