// The room of queues: who runs what, in which order, on which thread. It touches threads, their heaps and clocks, and
// knows nothing of what it runs.
//
// The work queues of the process, on threads of their own.
#pragma once

#include "platform/linux/queues/BackgroundQueue.h"
#include "platform/linux/queues/DelayedWork.h"
#include "platform/linux/queues/SerialQueue.h"

namespace platform {

// Any thread. A serial queue lives as long as its owner keeps it, even longer than this.
class LinuxWorkQueues final : public WorkQueues {
public:
    // Takes what each turn of a turn queue has gathered, on the thread that ran the turn. Set before such a queue is
    // made.
    void setTurnEndHandler(SerialQueue::TurnEndHandler handler) { turnEndHandler_ = std::move(handler); }

    [[nodiscard]] std::shared_ptr<WorkQueue> makeSerialQueue(std::string_view name,
                                                             SerialQueueOptions options) override;
    [[nodiscard]] std::shared_ptr<TurnQueue> makeTurnQueue(std::string_view name, SerialQueueOptions options) override;
    [[nodiscard]] WorkQueue& backgroundQueue() override { return backgroundQueue_; }
    void submitAfter(std::chrono::nanoseconds delay, WorkQueue& queue, WorkItem item) override;
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(unsigned initialCount) override;

private:
    SerialQueue::TurnEndHandler turnEndHandler_;
    BackgroundQueue backgroundQueue_;
    DelayedWork delayedWork_; // ends first, for it feeds the other
};

} // namespace platform
