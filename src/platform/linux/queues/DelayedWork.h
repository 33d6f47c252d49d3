// SPDX-License-Identifier: Apache-2.0
// Work that starts later. The first item starts a thread, which sleeps until the next item is due and then submits it
// to its queue.
#pragma once

#include "foundation/Mutex.h"
#include "platform/WorkQueue.h"

#include <chrono>
#include <map>
#include <thread>

namespace platform {

// Any thread.
class DelayedWork {
public:
    using Clock = std::chrono::steady_clock;

    DelayedWork() = default;
    // Drops the items that are not due yet.
    ~DelayedWork();
    DelayedWork(const DelayedWork&) = delete;
    DelayedWork& operator=(const DelayedWork&) = delete;

    // Submits the item to the queue at that time or soon after. The queue must still exist then. If the system has no
    // thread to spare, the item waits at least until a later item gets one.
    void add(Clock::time_point due, WorkQueue& queue, WorkItem item);

private:
    struct Delayed {
        WorkQueue& queue;
        WorkItem item;
    };
    using Schedule = std::multimap<Clock::time_point, Delayed>; // of equal times, the first added comes first

    [[nodiscard]] bool start() KESTO_REQUIRES(lock_);
    void run();
    [[nodiscard]] Schedule::node_type waitForDue();

    foundation::Mutex lock_;
    foundation::Condition changed_;
    Schedule schedule_ KESTO_GUARDED_BY(lock_);
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
    std::thread thread_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
