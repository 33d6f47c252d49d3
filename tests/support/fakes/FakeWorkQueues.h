// SPDX-License-Identifier: Apache-2.0
// Work queues without threads: everything runs on the test's own thread when the test says so. Items run in the order
// in which they were submitted, and delayed work when virtual time reaches it.
//
// The promises of a real serial queue hold here too: while one of its items waits for a semaphore, other queues go on
// and this one does not. Each item is a turn of its own; what it sent leaves after it, when its counts are in the
// ledger of the installed platform.
#pragma once

#include "platform/WorkQueue.h"
#include "support/fakes/FakeClock.h"

#include <cstddef>
#include <deque>
#include <string>
#include <vector>

namespace support {

// One thread.
class FakeWorkQueues final : public platform::WorkQueues {
public:
    struct MadeQueue {
        std::string name;
        platform::SerialQueueOptions options;
        bool hasTurns = false;
        friend bool operator==(const MadeQueue&, const MadeQueue&) = default;
    };

    // Whether the system has threads for more serial queues.
    bool hasThreads = true;

    explicit FakeWorkQueues(FakeClock& clock);
    ~FakeWorkQueues() override;
    FakeWorkQueues(const FakeWorkQueues&) = delete;
    FakeWorkQueues& operator=(const FakeWorkQueues&) = delete;

    // Runs all items, and the items that these submit, until none is left.
    void runAll();
    // Runs the oldest item that may run; false without one.
    bool runOne();
    // Moves the clock on, and runs all delayed work that falls due on the way, at its time.
    void advance(std::chrono::nanoseconds duration);
    // Drops all waiting items.
    void discardAll();

    // How many items wait to be run.
    [[nodiscard]] std::size_t pending() const { return items_.size(); }
    // The queues of the items that wait for their time, in the order of time.
    [[nodiscard]] std::vector<const platform::WorkQueue*> delayed() const;
    // The serial queues that were made, in order.
    [[nodiscard]] const std::vector<MadeQueue>& made() const { return made_; }

    // Throws as the system would if it refused a thread.
    std::shared_ptr<platform::WorkQueue> makeSerialQueue(std::string_view name,
                                                         platform::SerialQueueOptions options) override;
    std::shared_ptr<platform::TurnQueue> makeTurnQueue(std::string_view name,
                                                       platform::SerialQueueOptions options) override;
    platform::WorkQueue& backgroundQueue() override;
    void submitAfter(std::chrono::nanoseconds delay, platform::WorkQueue& queue, platform::WorkItem item) override;
    // Waiting for it runs other work, and throws std::logic_error if no work is left.
    std::unique_ptr<platform::Semaphore> makeSemaphore(unsigned initialCount) override;

private:
    class Queue;
    class QueueLane;
    class Run;
    struct Item {
        std::shared_ptr<Queue> queue;
        std::shared_ptr<QueueLane> lane; // null: submitted to the queue itself
        platform::TurnItem work;
    };
    struct DelayedItem {
        std::chrono::nanoseconds due;
        platform::WorkQueue* queue;
        platform::WorkItem work;
    };
    std::shared_ptr<Queue> make(const MadeQueue& queue);
    void moveTo(std::chrono::nanoseconds moment);

    FakeClock& clock_;
    std::chrono::nanoseconds now_{0};
    std::deque<Item> items_;
    std::vector<DelayedItem> delayed_; // by time, then by submission
    std::vector<Queue*> running_; // innermost last
    std::vector<MadeQueue> made_;
    std::shared_ptr<Queue> background_;
};

} // namespace support
