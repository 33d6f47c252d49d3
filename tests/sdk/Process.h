// SPDX-License-Identifier: Apache-2.0
// Programs that a test runs: input, output, exit status. The destructor ends a running program.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/files/FileDescriptor.h"

#include <optional>
#include <string>
#include <sys/types.h>
#include <thread>
#include <vector>

namespace sdk_test {

class Process {
public:
    using Arguments = std::vector<std::string>; // the program, found in PATH, and its arguments
    using Environment = std::vector<std::string>; // "NAME=value", beside those of the test; "NAME" removes one

    explicit Process(const Arguments& arguments, const Environment& environment = {});
    ~Process(); // kills it if it still runs
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;

    void write(const std::string& text);
    void closeInput() { input_ = {}; }
    void signal(int number);

    // The output so far, as soon as it contains the text, the program has ended, or the wait has timed out.
    [[nodiscard]] std::string waitForOutput(const std::string& text);
    // The exit status; 128 and the signal's number if a signal ended it; nothing if it does not end in time.
    std::optional<int> wait();
    [[nodiscard]] std::string output() const;
    [[nodiscard]] std::string errors() const;
    [[nodiscard]] pid_t identifier() const { return identifier_; }

private:
    void collect();

    pid_t identifier_ = 0;
    platform::FileDescriptor process_; // readable when it has ended
    platform::FileDescriptor input_;
    platform::FileDescriptor outputPipe_;
    platform::FileDescriptor errorPipe_;
    std::optional<int> status_;
    mutable foundation::Mutex mutex_;
    foundation::Condition changed_;
    std::string output_ KESTO_GUARDED_BY(mutex_);
    std::string errors_ KESTO_GUARDED_BY(mutex_);
    bool hasEnded_ KESTO_GUARDED_BY(mutex_) = false; // the end of its output
    std::thread collector_;
};

// The test's environment with these changes.
[[nodiscard]] std::vector<std::string> mergedEnvironment(const Process::Environment& environment);
// As `exec` and `posix_spawn` take them; the texts must outlive them.
[[nodiscard]] std::vector<char*> pointersTo(std::vector<std::string>& texts);

// Runs a program to its end with this input.
struct Finished {
    std::optional<int> status;
    std::string output;
    std::string errors;
};
[[nodiscard]] Finished run(const Process::Arguments& arguments, const std::string& input = {},
                           const Process::Environment& environment = {});

} // namespace sdk_test
