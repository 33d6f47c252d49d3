// SPDX-License-Identifier: Apache-2.0
// Log categories and the statements that write to them.
//
// A disabled statement costs a load and a branch: its arguments are not evaluated. The line of an enabled statement
// starts with a name for the source file, right-aligned, and the line number, so that a reader finds the statement; the
// platform's log decides where the line goes.
#pragma once

#include "platform/LogShare.h"

#include <atomic>
#include <cstdint>
#include <fmt/core.h>
#include <string>
#include <string_view>

namespace platform {

// From the most to the least important. A threshold enables its own level and all levels before it.
enum class LogLevel : std::uint8_t { Error, Default, Info, Debug };

[[nodiscard]] std::string_view name(LogLevel level) noexcept;

// One tag of the subsystem. Constant-initialised, so that it can be a global that costs nothing at start;
// lives as long as the process. Any thread.
class LogCategory {
public:
    constexpr LogCategory(std::string_view subsystem, std::string_view tag) noexcept : subsystem_(subsystem), tag_(tag)
    {
    }
    LogCategory(const LogCategory&) = delete;
    LogCategory& operator=(const LogCategory&) = delete;

    [[nodiscard]] std::string_view subsystem() const noexcept { return subsystem_; }
    [[nodiscard]] std::string_view tag() const noexcept { return tag_; }

    [[nodiscard]] bool isEnabled(LogLevel level) noexcept
    {
        const std::uint8_t threshold = threshold_.load(std::memory_order_relaxed);
        return static_cast<std::uint8_t>(level) <= threshold
            && (threshold != unresolved || isEnabledOnceResolved(level));
    }

    // Forgets the threshold, so that the next statement asks the current platform's log. `platform::install` calls it.
    void forgetThreshold() noexcept { threshold_.store(unresolved, std::memory_order_relaxed); }

private:
    bool isEnabledOnceResolved(LogLevel level) noexcept;

    static constexpr std::uint8_t unresolved = 255; // sends every statement to the slow path

    std::string_view subsystem_;
    std::string_view tag_;
    std::atomic<std::uint8_t> threshold_{unresolved};
};

// The place of a log statement in the source.
struct LogLocation {
    // Of a path such as __FILE__. The prefix shows the file's name without its extension, unless it is given another.
    consteval LogLocation(std::string_view path, int lineNumber, std::string_view shownName = {})
        : file(path.substr(path.rfind('/') + 1)),
          line(lineNumber),
          name(shownName.empty() ? file.substr(0, file.rfind('.')) : shownName)
    {
    }

    std::string_view file; // "KestoReportingSessionVolume.cpp"
    int line;
    std::string_view name; // "KestoReportingSession"
};

struct LogRecord {
    const LogCategory& category;
    LogLevel level;
    LogLocation location;
    std::string_view message; // without the prefix
};

// The platform's log. Its functions are called from any thread, also at the same time. The lines of one thread keep
// their order.
class Log {
public:
    virtual ~Log() = default;
    [[nodiscard]] virtual LogLevel threshold(const LogCategory& category) const = 0;
    // Writes the line in any case: callers check the threshold first.
    virtual void write(const LogRecord& record) = 0;
    // For the end of the process: returns when all lines so far are where the log goes, or after a second.
    virtual void flush() = 0;
};

// The prefix that every line starts with: the name right-aligned in 25 columns, the line left-aligned in 5.
[[nodiscard]] std::string logPrefix(const LogLocation& location);

// Writes how many lines of the share were left out since the last report, if it has a line left for that. For the end
// of a client.
void reportLeftOutLines(LogShare& share);

// Formats the message and hands it to the current platform's log, unless the calling thread writes for a share that has
// no line left.
void writeFormattedLog(const LogCategory& category, LogLevel level, LogLocation location, fmt::string_view format,
                       fmt::format_args arguments);

// The same; the compiler checks the arguments against the format.
template <typename... Arguments>
void writeLog(const LogCategory& category, LogLevel level, LogLocation location,
              fmt::format_string<Arguments...> format, Arguments&&... arguments)
{
    writeFormattedLog(category, level, location, format, fmt::make_format_args(arguments...));
}

} // namespace platform

// The name that the prefix shows in place of the file's: the files of the session and of the trace runner define it
// before their includes, because programs search for their lines by that name.
#ifndef KESTO_LOG_NAME
#define KESTO_LOG_NAME ""
#endif

// KESTO_LOG(category, level, "format of {fmt}", arguments...)
#define KESTO_LOG(logCategory, logLevel, ...)                                                                      \
    do {                                                                                                           \
        ::platform::LogCategory& kestoLogCategory = (logCategory);                                                 \
        if (kestoLogCategory.isEnabled(::platform::LogLevel::logLevel)) [[unlikely]] {                             \
            constexpr ::platform::LogLocation kestoLogLocation(__FILE__, __LINE__, KESTO_LOG_NAME);                \
            ::platform::writeLog(kestoLogCategory, ::platform::LogLevel::logLevel, kestoLogLocation, __VA_ARGS__); \
        }                                                                                                          \
    } while (false)
