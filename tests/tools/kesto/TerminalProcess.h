// SPDX-License-Identifier: Apache-2.0
// A program on a terminal of its own, whose other end is the test: it types, reads, and sees the terminal's modes.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "sdk/Process.h"

#include <optional>
#include <string>
#include <string_view>
#include <sys/types.h>

namespace kesto_tool {

// One thread. The destructor kills the program. Nobody reads the terminal except in `waitFor` and `wait`.
class TerminalProcess {
public:
    // 80 columns, 24 lines.
    TerminalProcess(const sdk_test::Process::Arguments& arguments, const sdk_test::Process::Environment& environment);
    ~TerminalProcess();
    TerminalProcess(const TerminalProcess&) = delete;
    TerminalProcess& operator=(const TerminalProcess&) = delete;

    void type(std::string_view text) const;
    void resize(unsigned short columns, unsigned short lines) const;
    void signal(int number) const;
    // The terminal is closed, as if its window was.
    void hangUp() { master_ = {}; }

    // Waits for the text, behind what was waited for before; false if it does not come in time.
    [[nodiscard]] bool waitFor(std::string_view text);
    // All that was read so far.
    [[nodiscard]] const std::string& output() const { return output_; }
    // What a shell leaves to the program: lines are read as they were typed, with echo.
    [[nodiscard]] bool hasUsualModes() const;
    // The exit status; 128 and the signal's number if a signal ended it; nothing if it does not end in time.
    [[nodiscard]] std::optional<int> wait();
    [[nodiscard]] pid_t identifier() const { return identifier_; }

private:
    // A part of what is there, after a short wait for it; false if there is nothing.
    bool read();

    platform::FileDescriptor master_;
    platform::FileDescriptor slave_; // keeps what was written for the test after the program has ended
    pid_t identifier_ = 0;
    std::string output_;
    std::size_t waitedFor_ = 0; // the place in the output
};

} // namespace kesto_tool
