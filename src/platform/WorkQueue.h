// Work queues: a serial queue a name, the background concurrent queue, and work that starts later.
//
// Order: a serial queue runs one item at a time, in the order in which they were submitted. What an item holds is let
// go of on the queue, before the next item runs. The concurrent queue promises no order.
//
// Memory: an item sees what its submitter did before it submitted it, and an item of a serial queue also what all items
// before it did, on whichever thread each of them ran. So what only the items of one serial queue touch needs no lock.
//
// Threads: items belong to their queue, not to a thread. A queue that may be helped has its items run by its own thread
// or by a thread that submitted some and offers its help, which then also runs what others submitted. So nothing that
// an item needs may be thread-local, and a thread that helps holds no lock while it submits to such a queue, nor when
// it would sleep: an item that takes the same lock might run on that very thread. Debug builds end where it holds one.
//
// No queue polls; one that is empty has a sleeping thread, or none.
#pragma once

#include "platform/Turn.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

namespace platform {

using WorkItem = std::move_only_function<void()>;
using TurnItem = std::move_only_function<void(Turn& turn)>;

enum class QualityOfService : std::uint8_t { UserInteractive, Default, Background };

// A queue that is let go, be it by one of its own items, still runs what was submitted before. Any thread may submit.
class WorkQueue {
public:
    virtual ~WorkQueue() = default;
    virtual void submit(WorkItem item) = 0;
    // Whether the calling thread is running an item of this queue.
    [[nodiscard]] virtual bool isCurrent() const = 0;
};

// A serial queue that works in turns: it takes all that waits, runs it, and then hands what the items gathered to the
// platform, as a whole. Each item gets the turn that it runs in; items that gather nothing go without.
class TurnQueue : public WorkQueue {
public:
    using WorkQueue::submit;
    virtual void submit(TurnItem item) = 0;
};

// How a serial queue is run.
struct SerialQueueOptions {
    QualityOfService quality = QualityOfService::Default; // the priority of its thread
    bool mayBeHelped = false; // by a thread that submits, which then runs items itself

    friend bool operator==(const SerialQueueOptions&, const SerialQueueOptions&) = default;
};

// A counting semaphore. Any thread.
class Semaphore {
public:
    virtual ~Semaphore() = default;
    virtual void signal() = 0;
    virtual void wait() = 0;
};

// Any thread.
class WorkQueues {
public:
    virtual ~WorkQueues() = default;
    // Both throw std::system_error when there is no thread left for the queue.
    [[nodiscard]] virtual std::shared_ptr<WorkQueue> makeSerialQueue(std::string_view name,
                                                                     SerialQueueOptions options) = 0;
    [[nodiscard]] virtual std::shared_ptr<TurnQueue> makeTurnQueue(std::string_view name,
                                                                   SerialQueueOptions options) = 0;
    // The process's concurrent queue of background priority. It runs a few items side by side: one that waits for
    // another may wait for ever.
    [[nodiscard]] virtual WorkQueue& backgroundQueue() = 0;
    // Submits the item to the queue after the delay, or at once if that is not positive; those of one moment in the
    // order in which they came. The queue must outlive that moment.
    //
    // What this or the background queue has no thread for is not lost: it waits until more comes.
    virtual void submitAfter(std::chrono::nanoseconds delay, WorkQueue& queue, WorkItem item) = 0;
    [[nodiscard]] virtual std::unique_ptr<Semaphore> makeSemaphore(unsigned initialCount) = 0;
};

} // namespace platform
