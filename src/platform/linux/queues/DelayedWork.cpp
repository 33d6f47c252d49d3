// SPDX-License-Identifier: Apache-2.0
// The schedule is ordered by time. The thread sleeps until its first item is due; only an earlier item wakes the
// thread.
#include "platform/linux/queues/DelayedWork.h"

#include "platform/linux/process/Thread.h"
#include "platform/linux/queues/ThreadHeap.h"

#include <system_error>
#include <utility>

namespace platform {

DelayedWork::~DelayedWork()
{
    std::thread thread;
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        thread.swap(thread_);
        changed_.notifyOne();
    }
    if (thread.joinable())
        thread.join();
}

void DelayedWork::add(Clock::time_point due, WorkQueue& queue, WorkItem item)
{
    const foundation::Lock lock(lock_);
    const auto added = schedule_.emplace(due, Delayed{queue, std::move(item)});
    if (!thread_.joinable())
        static_cast<void>(start()); // if the system refuses a thread, the next item tries again
    else if (added == schedule_.begin())
        changed_.notifyOne();
}

bool DelayedWork::start()
{
    try {
        thread_ = startThread("delayed work", QualityOfService::Default, [this] { run(); });
        return true;
    } catch (const std::system_error&) {
        return false;
    }
}

// A new thread may get memory that another has used, so this one tidies its heap, too. It needs no waking: an item that
// is due soon after the request wakes it (LinuxMemory).
void DelayedWork::run()
{
    ThreadHeap heap([] { });
    while (Schedule::node_type due = waitForDue()) {
        heap.tidyIfAsked();
        due.mapped().queue.submit(std::move(due.mapped().item));
    }
}

// Waits for the next item that is due; empty at the end.
DelayedWork::Schedule::node_type DelayedWork::waitForDue()
{
    const foundation::Lock lock(lock_);
    while (!isEnding_) {
        if (schedule_.empty())
            changed_.wait(lock_);
        else if (const auto next = schedule_.begin(); next->first <= Clock::now())
            return schedule_.extract(next);
        else
            changed_.waitUntil(lock_, next->first);
    }
    return {};
}

} // namespace platform
