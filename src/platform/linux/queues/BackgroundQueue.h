// The concurrent queue of background priority: a few threads, each started when there is work for it and no
// other is free.
//
// They are few on purpose, as background work must never crowd out the rest. An item that waits for
// another item of the queue may therefore wait for ever. When the system has no thread to spare, items wait for those
// that there are, or for one that it has when the next item comes: who submits is in the middle of something else, and
// could do nothing about it.
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
    // Waits until everything submitted has been run. Not from one of its own items.
    ~BackgroundQueue() override;
    BackgroundQueue(const BackgroundQueue&) = delete;
    BackgroundQueue& operator=(const BackgroundQueue&) = delete;

    void submit(WorkItem item) override;
    [[nodiscard]] bool isCurrent() const override;

private:
    [[nodiscard]] bool addThread() KESTO_REQUIRES(lock_);
    void run();
    [[nodiscard]] WorkItem take();

    foundation::Mutex lock_;
    foundation::Condition changed_;
    std::deque<WorkItem> waiting_ KESTO_GUARDED_BY(lock_);
    std::size_t freeThreads_ KESTO_GUARDED_BY(lock_) = 0;
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
    std::vector<std::thread> threads_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
