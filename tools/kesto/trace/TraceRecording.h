// SPDX-License-Identifier: Apache-2.0
// The room of traces: recording a program and showing the results. It starts the program, and uses the service through
// libkesto.
//
// Runs a program while a trace measures it: one step in place of a session, a parameters file and a results file that
// an engineer would handle one by one.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

struct TraceRecordingOptions {
    std::filesystem::path parameters;
    std::filesystem::path results; // that the service writes; empty: the usual place
    std::filesystem::path output; // a copy of it; empty: none
    std::string socket; // empty: the usual place
    std::vector<std::string> command; // the program and its arguments
};

// Warns of parameters that measure nothing; runs the program while the service traces, with its socket in $KESTO_SOCKET
// if one is given; then prints what was measured. Returns the program's exit status: 128 and the signal's number if one
// ended it, 127 if it could not be run; instead of 0, 1 if the results or their copy are missing, and exitIncomplete if
// the results are incomplete. Throws std::runtime_error if the service cannot trace, and then does not run the program.
[[nodiscard]] int recordTrace(const TraceRecordingOptions& options);
