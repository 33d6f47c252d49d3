// SPDX-License-Identifier: Apache-2.0
// The concurrent queue of background priority: a few threads. Each is started when an item waits and no other thread is
// free.
//
// The threads are few on purpose: background work must never crowd out the rest. So an item that waits for another item
// of the queue may wait for ever. If the system has no thread to spare, items wait for the existing threads, or for a
// thread that the next item gets. `submit` does not report this, because its callers could do nothing about it.
#pragma once

#include "foundation/Mutex.h"
#include "platform/WorkQueue.h"

#include <deque>
#include <thread>
#include <vector>

namespace platform {

// Any thread.
class BackgroundQueue final : public WorkQueue {
public:
    static constexpr std::size_t mostThreads = 4;

    BackgroundQueue() = default;
    // Waits until all submitted items have run. An item of the queue must not call it.
    ~BackgroundQueue() override;
    BackgroundQueue(const BackgroundQueue&) = delete;
    BackgroundQueue& operator=(const BackgroundQueue&) = delete;

    void submit(WorkItem item) override;
    [[nodiscard]] bool isCurrent() const override;

    // Returns when no item waits or runs. Not for the queue's items.
    void finish();
    // The number of items that wait or run.
    [[nodiscard]] std::size_t unfinishedItems() const;

private:
    [[nodiscard]] bool addThread() KESTO_REQUIRES(lock_);
    void run();
    [[nodiscard]] WorkItem take();
    void countFinished();

    mutable foundation::Mutex lock_;
    foundation::Condition changed_;
    foundation::Condition finished_; // no item waits or runs
    std::deque<WorkItem> waiting_ KESTO_GUARDED_BY(lock_);
    std::size_t unfinished_ KESTO_GUARDED_BY(lock_) = 0; // items that wait or run
    std::size_t freeThreads_ KESTO_GUARDED_BY(lock_) = 0;
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
    std::vector<std::thread> threads_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
