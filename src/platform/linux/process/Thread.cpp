// SPDX-License-Identifier: Apache-2.0
// Nice values, since real-time priorities would let a busy service starve the audio that it reports about.
#include "platform/linux/process/Thread.h"

#include <pthread.h>
#include <sys/resource.h>
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

} // namespace

// Linux sets priorities by thread. The first thread's priority counts as the process's, until this function changes it.
void setQualityOfThisThread(QualityOfService quality)
{
    static const int ofTheProcess = getpriority(PRIO_PROCESS, static_cast<id_t>(getpid()));
    setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), ofTheProcess + niceness(quality));
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
