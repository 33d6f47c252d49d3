// SPDX-License-Identifier: Apache-2.0
// A serial work queue: a thread that sleeps while no item waits, and otherwise takes all waiting items under one lock.
// The items taken together are a turn.
//
// At the end of a turn, work that is expensive for each item is done once for all, such as committing to the disk and
// writing to sockets. The queue makes the Turn that gathers this work, gives it to every item, and hands it to the
// turn-end handler.
//
// Waking a sleeping thread costs many times what an item does, and one processor is slow to read what another made. So
// a thread that submits work and has nothing else to do may offer its help: if the queue may be helped, that thread
// runs the turn itself. With a client that waits for each answer, a call then takes 6 us instead of 8; one that does
// not wait makes 515,000 calls a second instead of 280,000 to 450,000. A burst still goes to the queue's thread, so
// that both threads work side by side. Only one turn runs at a time.
//
// The helper has other things to do, which must not wait for the queue. So it leaves the rest of a turn to the queue's
// thread when the next item may take long, or when the end of the turn would wait.
//
// A turn also ends after some time, because what it sends leaves at its end. What it leaves waiting belongs to the next
// turn.
#pragma once

#include "platform/WorkQueue.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <thread>

namespace platform {

// Any thread.
class SerialQueue final : public TurnQueue {
public:
    using TurnEndHandler = std::function<void(Turn& turn)>;

    // A helper runs turns only while at most so many items wait.
    static constexpr std::size_t mostItemsHelpedWith = 1024;
    // After so long, a turn begins no further items; and after a quarter of it while several lanes have some.
    static constexpr std::chrono::microseconds longestTurn{200};

    // What happens at the end of every turn, when the items and everything that they held are destroyed. Both may be
    // empty.
    struct TurnEnd {
        TurnEndHandler handler; // takes what the turn gathered, on the thread that ran the turn or its last part
        std::function<bool()> wouldWait; // whether the handler would now make its thread wait for another
    };
    SerialQueue(std::string_view name, SerialQueueOptions options, TurnEnd turnEnd = {},
                std::chrono::nanoseconds turnFor = longestTurn);
    // Waits until all submitted items have run. If one of the queue's own items destroys the queue, this does not wait,
    // and the thread ends later.
    ~SerialQueue() override;
    SerialQueue(const SerialQueue&) = delete;
    SerialQueue& operator=(const SerialQueue&) = delete;

    void submit(WorkItem item) override;
    void submit(TurnItem item) override;
    void submitLong(TurnItem item) override;
    [[nodiscard]] std::shared_ptr<Lane> makeLane(const Submitter& submitter) override;
    [[nodiscard]] bool isCurrent() const override;

    // Returns when no item waits and no turn runs. Not for the queue's items and helpers.
    void finish();
    // The number of items that wait, or whose turn is not over.
    [[nodiscard]] std::size_t unfinishedItems() const;

    // The calling thread helps as long as this object lives. Its priority is that of an interactive queue: with a lower
    // one, a client that wakes for an answer would displace the thread that is not yet done with it. One for each
    // thread.
    class Helper {
    public:
        Helper();
        ~Helper();
        Helper(const Helper&) = delete;
        Helper& operator=(const Helper&) = delete;

        // Runs the turn with the items that this thread has submitted since the last call, or its first part, unless
        // another thread runs it. Call it when the thread would otherwise sleep.
        void help();
    };

private:
    class Work;
    class QueueLane;

    std::shared_ptr<Work> work_; // shared with the thread and the lanes, which may outlive the queue
    std::unique_ptr<TurnQueue> lane_; // of what is submitted to the queue itself
    std::thread thread_;
};

} // namespace platform
