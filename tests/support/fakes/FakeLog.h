// SPDX-License-Identifier: Apache-2.0
// A log that keeps its lines, so that tests can check their text, level and order.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Log.h"

#include <functional>
#include <gmock/gmock.h>
#include <iosfwd>
#include <string>
#include <string_view>
#include <vector>

namespace support {

struct LogLine {
    platform::LogLevel level;
    std::string tag;
    std::string message;
    std::string subsystem;
    std::string file; // of the statement
    int line;
    std::string name; // the file's name in the prefix
};
void PrintTo(const LogLine& line, std::ostream* out);

// Any thread.
class FakeLog final : public platform::Log {
public:
    // By default all levels are enabled; call this before the first statement.
    void setThreshold(platform::LogLevel level) { threshold_ = level; }
    // The observer gets each line immediately. For tests that cannot read the lines later, such as death tests.
    void setObserver(std::function<void(const LogLine&)> observer) { observer_ = std::move(observer); }

    [[nodiscard]] std::vector<LogLine> lines() const;
    [[nodiscard]] std::vector<LogLine> lines(std::string_view tag) const;
    // The lines since the last time.
    std::vector<LogLine> take();
    void clear() { take(); }

    [[nodiscard]] platform::LogLevel threshold(const platform::LogCategory&) const override { return threshold_; }
    void write(const platform::LogRecord& record) override;
    void flush() override { } // a line is kept at once

private:
    platform::LogLevel threshold_ = platform::LogLevel::Debug;
    std::function<void(const LogLine&)> observer_;
    mutable foundation::Mutex lock_;
    std::vector<LogLine> lines_ KESTO_GUARDED_BY(lock_);
};

// Matches a line of that level, tag and text.
MATCHER_P3(IsLine, level, tag, message,
           std::string(negation ? "is not " : "is ") + std::string(platform::name(level)) + ' ' + tag + " \"" + message
               + '"')
{
    return arg.level == level && arg.tag == tag && arg.message == message;
}

} // namespace support
