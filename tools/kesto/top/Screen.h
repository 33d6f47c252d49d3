// SPDX-License-Identifier: Apache-2.0
// A terminal as a screen: it is drawn again and again, keys come one by one, and afterwards it is as it was.
//
// Signals that end or stop the program come as events, so that every way out leads through the destructor. While the
// program is stopped, or a shell has it in the background, the terminal is the shell's.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <chrono>
#include <csignal>
#include <optional>
#include <string>
#include <string_view>
#include <termios.h>
#include <vector>

// One thread; one at a time.
class Screen {
public:
    struct Events {
        std::string keys;
        bool isToDraw = false; // the size has changed, or the program goes on after a stop
        bool isReadable = false; // the descriptor
        std::optional<int> end; // the signal that ends the program; SIGHUP also if the terminal is gone
    };

    Screen();
    ~Screen();
    Screen(const Screen&) = delete;
    Screen& operator=(const Screen&) = delete;

    // False while the program is in the background.
    [[nodiscard]] bool isShown() const noexcept { return isShown_; }
    // Replaces everything by these lines. A terminal that does not read may get a part of them.
    void draw(const std::vector<std::string>& lines);
    // Sleeps until something happens, the descriptor (-1: none) can be read, or the limit has passed.
    [[nodiscard]] Events wait(int descriptor, std::optional<std::chrono::milliseconds> limit);

private:
    void show();
    void hide() noexcept;
    [[nodiscard]] bool isInForeground() const noexcept;
    void stop(int signal) const noexcept;
    void takeSignals(Events& events);
    void takeKeys(Events& events);
    bool write(std::string_view text, int longestWait) const noexcept;

    sigset_t maskBefore_{};
    platform::FileDescriptor signals_;
    platform::FileDescriptor output_; // of its own, so that it can be told not to block
    std::optional<termios> modesBefore_; // none: standard input is no terminal
    bool hasKeys_ = true; // until the end of standard input
    bool isShown_ = false;
    bool isGone_ = false; // the terminal
};
