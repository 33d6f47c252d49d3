// SPDX-License-Identifier: Apache-2.0
// The thread that writes the log. Callers leave their lines with it and go on, so that a disk or a journal that does
// not keep up delays no client.
//
// To wake the thread costs more than a line. So it waits a few milliseconds for further lines before it writes them
// all. A crash takes the lines of these milliseconds with it; an end in order asks for them (`flush`).
#pragma once

#include "foundation/Mutex.h"
#include "platform/Log.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace platform {

// Lines in their order, in one text.
class LogLines {
public:
    struct Line {
        const LogCategory* category;
        LogLevel level;
        LogLocation location;
        std::size_t size; // in the text, with the line's end
    };

    void add(const LogRecord& record, std::string_view line);
    [[nodiscard]] bool empty() const noexcept { return lines_.empty(); }
    [[nodiscard]] std::size_t count() const noexcept { return lines_.size(); }
    [[nodiscard]] std::size_t bytes() const noexcept { return text_.size() + lines_.size() * sizeof(Line); }

    // All lines, each with its end.
    [[nodiscard]] const std::string& text() const noexcept { return text_; }
    // Calls `visit` with each line and its text without the end.
    template <typename Visit> void forEach(Visit visit) const
    {
        std::string_view rest = text_;
        for (const Line& line : lines_) {
            visit(line, rest.substr(0, line.size - 1));
            rest.remove_prefix(line.size);
        }
    }

private:
    std::string text_;
    std::vector<Line> lines_;
};

// Any thread.
class LogWriter {
public:
    // What may wait. The last part is for errors, so that no client's flood of other lines displaces them.
    static constexpr std::size_t mostBytes = std::size_t{1} << 20;
    static constexpr std::size_t mostBytesWithoutErrors = mostBytes * 3 / 4;
    static constexpr std::chrono::milliseconds gatheringTime{10};
    static constexpr std::chrono::seconds longestFlush{1};

    // `write` is called on the thread. Throws std::system_error if the system refuses the thread.
    explicit LogWriter(std::function<void(const LogLines& lines)> write);
    // Returns when all lines have been written.
    ~LogWriter();
    LogWriter(const LogWriter&) = delete;
    LogWriter& operator=(const LogWriter&) = delete;

    // False if there is no room; the line is not written then. Never waits for a line to be written.
    [[nodiscard]] bool add(const LogRecord& record, std::string_view line);
    // Returns when the lines so far have been written, or when the time is over.
    void flush();
    // Whether the lines that wait are the last ones, and the process waits for them.
    [[nodiscard]] bool isEnding() const;

private:
    void run();
    [[nodiscard]] LogLines next();

    const std::function<void(const LogLines& lines)> write_;
    mutable foundation::Mutex lock_;
    foundation::Condition changed_; // for the thread
    foundation::Condition progressed_; // for those that flush
    LogLines waiting_ KESTO_GUARDED_BY(lock_);
    bool isUrgent_ KESTO_GUARDED_BY(lock_) = false;
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
    std::uint64_t added_ KESTO_GUARDED_BY(lock_) = 0; // lines since the start
    std::uint64_t written_ KESTO_GUARDED_BY(lock_) = 0;
    std::thread thread_; // last: it uses the others
};

} // namespace platform
