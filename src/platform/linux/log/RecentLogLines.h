// SPDX-License-Identifier: Apache-2.0
// The last lines of the log, kept in memory: they are half of the evidence of a bug, and the service may lack the right
// to read the journal.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Log.h"

#include <cstddef>
#include <deque>
#include <string>
#include <string_view>

namespace platform {

// Any thread.
class RecentLogLines {
public:
    // Beyond these limits the oldest lines are dropped.
    static constexpr std::size_t mostLines = 500;
    static constexpr std::size_t mostBytes = std::size_t{64} * 1024; // of their text
    static constexpr std::size_t longestLine = 4096; // in bytes; the beginning of a longer line is kept

    // Adds a line as it was written, with its prefix, and its time in seconds since 1970.
    void add(double time, LogLevel level, std::string_view tag, std::string_view line);

    // A line each, the oldest first: local time, level, tag, and the line.
    [[nodiscard]] std::string text() const;

private:
    struct Line {
        double time;
        LogLevel level;
        std::string_view tag; // of a category, so it lives as long as the process
        std::string text;
    };

    mutable foundation::Mutex lock_;
    std::deque<Line> lines_ KESTO_GUARDED_BY(lock_);
    std::size_t bytes_ KESTO_GUARDED_BY(lock_) = 0;
};

} // namespace platform
