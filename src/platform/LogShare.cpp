// SPDX-License-Identifier: Apache-2.0
// A bucket of lines that fills up as time passes.
#include "platform/LogShare.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

thread_local LogShare* shareOfThisThread = nullptr;
thread_local auto subjectOfThisThread = LogShare::About::Calls;

} // namespace

void LogShare::fill(Clock::time_point now)
{
    const double seconds = std::chrono::duration<double>(now - std::exchange(at_, now)).count();
    for (double& lines : lines_)
        lines = std::min(mostAtOnce, lines + perSecond * seconds);
}

bool LogShare::takeFrom(Part part)
{
    double& lines = lines_[static_cast<std::size_t>(part)];
    if (lines < 1)
        return false;
    --lines;
    return true;
}

bool LogShare::take(Part part, Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    fill(now);
    const bool isTaken = takeFrom(part);
    if (!isTaken)
        ++leftOut_;
    return isTaken;
}

std::uint64_t LogShare::takeLeftOut(Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    if (leftOut_ == 0 || now - reportedAt_ < betweenReports)
        return 0;
    reportedAt_ = now;
    return std::exchange(leftOut_, 0);
}

std::uint64_t LogShare::takeLeftOutAtEnd(Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    fill(now);
    return leftOut_ != 0 && takeFrom(Part::Connections) ? std::exchange(leftOut_, 0) : 0;
}

bool LogShare::isFull(Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    fill(now);
    return std::ranges::all_of(lines_, [](double lines) { return lines >= mostAtOnce; });
}

LogShare::Writing::Writing(LogShare* share, About about) noexcept
    : shareBefore_(std::exchange(shareOfThisThread, share)),
      aboutBefore_(std::exchange(subjectOfThisThread, about))
{
}

LogShare::Writing::~Writing()
{
    shareOfThisThread = shareBefore_;
    subjectOfThisThread = aboutBefore_;
}

LogShare* LogShare::ofThisThread() noexcept
{
    return shareOfThisThread;
}

LogShare::About LogShare::aboutOfThisThread() noexcept
{
    return subjectOfThisThread;
}

} // namespace platform
