// SPDX-License-Identifier: Apache-2.0
// The room of queues: which thread runs which items, and in which order. It uses threads, their heaps and clocks, and
// does not know what the items do.
//
// The work queues of the process have threads of their own.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/queues/BackgroundQueue.h"
#include "platform/linux/queues/DelayedWork.h"
#include "platform/linux/queues/SerialQueue.h"

#include <chrono>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

namespace platform {

// Any thread. A serial queue lives as long as its owner keeps it, even longer than this.
class LinuxWorkQueues final : public WorkQueues {
public:
    // A turn of its queues begins no further items after so long.
    explicit LinuxWorkQueues(std::chrono::nanoseconds longestTurn = SerialQueue::longestTurn)
        : longestTurn_(longestTurn)
    {
    }

    // The handler takes what each turn of a turn queue has gathered (see SerialQueue). Set it before the first turn
    // queue is made.
    void setTurnEndHandler(SerialQueue::TurnEndHandler handler, std::function<bool()> wouldWait = nullptr)
    {
        turnEnd_ = {.handler = std::move(handler), .wouldWait = std::move(wouldWait)};
    }

    [[nodiscard]] std::shared_ptr<WorkQueue> makeSerialQueue(std::string_view name,
                                                             SerialQueueOptions options) override;
    [[nodiscard]] std::shared_ptr<TurnQueue> makeTurnQueue(std::string_view name, SerialQueueOptions options) override;
    [[nodiscard]] WorkQueue& backgroundQueue() override { return backgroundQueue_; }
    void submitAfter(std::chrono::nanoseconds delay, WorkQueue& queue, WorkItem item) override;
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(unsigned initialCount) override;

    // Submitted items that have not run, or whose turn is not over; delayed items do not count.
    struct Unfinished {
        std::size_t ofTurnQueues = 0;
        std::size_t ofBackgroundQueue = 0;
    };
    [[nodiscard]] Unfinished unfinished() const;
    // Returns when the turn queues have run everything, and then the background queue. Not for items and helpers.
    void finish();

private:
    [[nodiscard]] std::vector<std::shared_ptr<SerialQueue>> livingTurnQueues() const;

    const std::chrono::nanoseconds longestTurn_;
    SerialQueue::TurnEnd turnEnd_;
    mutable foundation::Mutex lock_;
    std::vector<std::weak_ptr<SerialQueue>> turnQueues_ KESTO_GUARDED_BY(lock_);
    BackgroundQueue backgroundQueue_;
    DelayedWork delayedWork_; // ends first, because it submits to the other
};

} // namespace platform
