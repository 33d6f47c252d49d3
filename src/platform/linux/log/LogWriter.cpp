// SPDX-License-Identifier: Apache-2.0
// The thread takes all lines that wait, under one lock, and writes them without it.
#include "platform/linux/log/LogWriter.h"

#include "platform/linux/process/Thread.h"

#include <utility>

namespace platform {

void LogLines::add(const LogRecord& record, std::string_view line)
{
    text_.append(line).push_back('\n');
    lines_.push_back({&record.category, record.level, record.location, line.size() + 1});
}

LogWriter::LogWriter(std::function<void(const LogLines& lines)> write)
    : write_(std::move(write)),
      // Of the priority of those that log: else they would fill the room while it waits for a processor.
      thread_(startThread("log", QualityOfService::UserInteractive, [this] { run(); }))
{
}

LogWriter::~LogWriter()
{
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        changed_.notifyOne();
    }
    thread_.join();
}

bool LogWriter::add(const LogRecord& record, std::string_view line)
{
    const bool isError = record.level == LogLevel::Error;
    const foundation::Lock lock(lock_);
    if (waiting_.bytes() + line.size() >= (isError ? mostBytes : mostBytesWithoutErrors))
        return false;
    const bool isFirst = waiting_.empty();
    waiting_.add(record, line);
    ++added_;
    const bool becomesUrgent = !isUrgent_ && (isError || waiting_.bytes() > mostBytes / 4);
    isUrgent_ = isUrgent_ || becomesUrgent;
    if (isFirst || becomesUrgent)
        changed_.notifyOne();
    return true;
}

void LogWriter::flush()
{
    const auto deadline = std::chrono::steady_clock::now() + longestFlush;
    const foundation::Lock lock(lock_);
    const std::uint64_t wanted = added_;
    isUrgent_ = isUrgent_ || !waiting_.empty();
    changed_.notifyOne();
    while (written_ < wanted && progressed_.waitUntil(lock_, deadline) == std::cv_status::no_timeout) { }
}

bool LogWriter::isEnding() const
{
    const foundation::Lock lock(lock_);
    return isEnding_;
}

void LogWriter::run()
{
    for (LogLines lines = next(); !lines.empty(); lines = next()) {
        write_(lines);
        const foundation::Lock lock(lock_);
        written_ += lines.count();
        progressed_.notifyAll();
    }
}

// Empty at the end.
LogLines LogWriter::next()
{
    const foundation::Lock lock(lock_);
    while (waiting_.empty() && !isEnding_)
        changed_.wait(lock_);
    const auto deadline = std::chrono::steady_clock::now() + gatheringTime;
    while (!isUrgent_ && !isEnding_ && changed_.waitUntil(lock_, deadline) == std::cv_status::no_timeout) { }
    isUrgent_ = false;
    return std::exchange(waiting_, {});
}

} // namespace platform
