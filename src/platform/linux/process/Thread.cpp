// SPDX-License-Identifier: Apache-2.0
// Nice values, since real-time priorities would let a busy service starve the audio that it reports about. And slices
// of time: a thread with a short one, which does not use more than its share of the processor, runs as soon as it
// wakes, even if another's slice is not over. With the kernel's own slice of 3 ms it would wait for that.
#include "platform/linux/process/Thread.h"

#include <cstdint>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::size_t longestThreadName = 15;

// Added to the nice value of the process.
constexpr int niceness(QualityOfService quality) noexcept
{
    switch (quality) {
    case QualityOfService::UserInteractive: return -10;
    case QualityOfService::Default: return 0;
    case QualityOfService::Background: return 10;
    }
    return 0;
}

// In nanoseconds; 0: the kernel's own. The shortest that the kernel grants is 0.1 ms.
constexpr std::uint64_t slice(QualityOfService quality) noexcept
{
    return quality == QualityOfService::UserInteractive ? 100'000 : 0;
}

// sched_attr(2), which no header has that fits beside those of the C library.
struct SchedulingAttributes {
    std::uint32_t size;
    std::uint32_t policy;
    std::uint64_t flags;
    std::int32_t nice;
    std::uint32_t priority;
    std::uint64_t runtime; // of a thread without a real-time policy: its slice, from Linux 6.12 on
    std::uint64_t deadline;
    std::uint64_t period;
};

void setSliceOfThisThread(std::uint64_t nanoseconds)
{
    constexpr int thisThread = 0;
    constexpr int noFlags = 0;
    SchedulingAttributes attributes = {};
    if (syscall(SYS_sched_getattr, thisThread, &attributes, sizeof attributes, noFlags) != 0)
        return;
    attributes.runtime = nanoseconds;
    syscall(SYS_sched_setattr, thisThread, &attributes, noFlags);
}

} // namespace

// Linux sets priorities by thread. The first thread's priority counts as the process's, until this function changes it.
void setQualityOfThisThread(QualityOfService quality)
{
    static const int ofTheProcess = getpriority(PRIO_PROCESS, static_cast<id_t>(getpid()));
    setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), ofTheProcess + niceness(quality));
    setSliceOfThisThread(slice(quality));
}

std::string threadName(std::string_view name)
{
    while (name.size() > longestThreadName) {
        const auto dot = name.find('.');
        if (dot == std::string_view::npos)
            break;
        name.remove_prefix(dot + 1);
    }
    return std::string(name.substr(0, longestThreadName));
}

std::thread startThread(std::string_view name, QualityOfService quality, WorkItem body)
{
    return std::thread([name = threadName(name), quality, body = std::move(body)]() mutable {
        setQualityOfThisThread(quality);
        pthread_setname_np(pthread_self(), name.c_str()); // last: a thread with its name has its priority
        body();
    });
}

} // namespace platform
