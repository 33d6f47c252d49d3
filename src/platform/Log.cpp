// SPDX-License-Identifier: Apache-2.0
// Makes a record of an enabled statement: the message is formatted here for all statements, so that each statement is a
// small call.
#include "platform/Log.h"

#include "platform/Platform.h"

#include <fmt/format.h>

namespace platform {

std::string_view name(LogLevel level) noexcept
{
    switch (level) {
    case LogLevel::Error: return "error";
    case LogLevel::Default: return "default";
    case LogLevel::Info: return "info";
    case LogLevel::Debug: return "debug";
    }
    return "unknown";
}

std::string logPrefix(const LogLocation& location)
{
    return fmt::format("{:>25}:{:<5} ", location.name, location.line);
}

namespace {

void report(const LogShare& share, std::uint64_t leftOut)
{
    static LogCategory category("com.quarn.kesto", "log");
    const LogShare::Writing forNoShare(nullptr);
    KESTO_LOG(category, Error, "{} made too many log lines: {} were left out; it may have {} at once and {} a second",
              share.who(), leftOut, LogShare::mostAtOnce, LogShare::perSecond);
}

LogShare::Part partFor(LogLevel level)
{
    using enum LogShare::Part;
    if (LogShare::aboutOfThisThread() == LogShare::About::Connections)
        return Connections;
    return level == LogLevel::Error ? Errors : Others;
}

// Whether the line is within the share for which the thread writes.
bool isAdmitted(LogLevel level)
{
    LogShare* const share = LogShare::ofThisThread();
    if (share == nullptr)
        return true;
    const auto now = LogShare::Clock::now();
    if (!share->take(partFor(level), now)) {
        current().ledger.count(ledger::Counter::LogLinesLeftOut);
        return false;
    }
    if (const std::uint64_t leftOut = share->takeLeftOut(now); leftOut != 0)
        report(*share, leftOut);
    return true;
}

} // namespace

void reportLeftOutLines(LogShare& share)
{
    if (const std::uint64_t leftOut = share.takeLeftOutAtEnd(LogShare::Clock::now()); leftOut != 0)
        report(share, leftOut);
}

void writeFormattedLog(const LogCategory& category, LogLevel level, LogLocation location, fmt::string_view format,
                       fmt::format_args arguments)
{
    if (!isAdmitted(level))
        return;
    const std::string message = fmt::vformat(format, arguments);
    current().log.write({category, level, location, message});
}

} // namespace platform
