// SPDX-License-Identifier: Apache-2.0
// A bucket of lines that fills up as time passes.
#include "platform/LogShare.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

thread_local LogShare* shareOfThisThread = nullptr;

} // namespace

bool LogShare::take(Part part, Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    const double seconds = std::chrono::duration<double>(now - std::exchange(at_, now)).count();
    for (double& lines : lines_)
        lines = std::min(mostAtOnce, lines + perSecond * seconds);
    double& lines = lines_[static_cast<std::size_t>(part)];
    if (lines < 1) {
        ++leftOut_;
        return false;
    }
    --lines;
    return true;
}

std::uint64_t LogShare::takeLeftOut(Clock::time_point now)
{
    const foundation::Lock lock(lock_);
    if (leftOut_ == 0 || now - reportedAt_ < betweenReports)
        return 0;
    reportedAt_ = now;
    return std::exchange(leftOut_, 0);
}

std::uint64_t LogShare::takeLeftOut()
{
    const foundation::Lock lock(lock_);
    return std::exchange(leftOut_, 0);
}

LogShare::Writing::Writing(LogShare* share) noexcept : before_(std::exchange(shareOfThisThread, share)) { }

LogShare::Writing::~Writing()
{
    shareOfThisThread = before_;
}

LogShare* LogShare::ofThisThread() noexcept
{
    return shareOfThisThread;
}

} // namespace platform
