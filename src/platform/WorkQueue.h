// SPDX-License-Identifier: Apache-2.0
// Work queues: named serial queues, the background concurrent queue, and work that starts later.
//
// Order: a serial queue runs one item at a time, in the order in which they were submitted; only those of its lanes
// take turns. It releases an item, on the queue, before it runs the next. The concurrent queue promises no order.
//
// Memory: an item sees everything that its submitter did before submitting it. An item of a serial queue also sees
// everything that all earlier items did, on any thread. So data that only the items of one serial queue use needs no
// lock.
//
// Threads: items belong to their queue, not to a thread. If a queue may be helped, its items run on its own thread or
// on a thread that submitted some and offers its help; that thread then also runs items of other submitters. So nothing
// that an item needs may be thread-local. A thread that helps must hold no lock while it submits to such a queue or
// when it helps, because an item that takes the same lock might run on that very thread. Debug builds end the process
// if it holds a `foundation::Lock`; other locks are not counted.
//
// No queue polls. An empty queue has a sleeping thread, or none.
#pragma once

#include "ledger/Workload.h"
#include "platform/LogShare.h"
#include "platform/Turn.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <utility>

namespace platform {

using WorkItem = std::move_only_function<void()>;
using TurnItem = std::move_only_function<void(Turn& turn)>;

// The priority of a queue's thread.
enum class QualityOfService : std::uint8_t {
    UserInteractive, // before the others: clients wait for its work
    Default,
    Background // after the others: only the results of its work matter, not when they come
};

// A queue that is destroyed, even by one of its own items, still runs what was submitted before. Any thread may submit.
class WorkQueue {
public:
    virtual ~WorkQueue() = default;
    virtual void submit(WorkItem item) = 0;
    // Whether the calling thread is running an item of this queue.
    [[nodiscard]] virtual bool isCurrent() const = 0;
};

// Who submits to a lane: a process of a user, as the kernel tells.
struct Submitter {
    std::uint32_t user = 0;
    std::int32_t process = 0; // 0 where the kernel does not tell
};

// The service itself: no user has this number.
inline constexpr Submitter theService{.user = ~0U, .process = 0};

class Lane;

// A serial queue that works in turns: it runs what waits, but not for long, and then hands what the items gathered to
// the platform, as a whole. Each item gets the turn that it runs in; items that gather nothing go without.
class TurnQueue : public WorkQueue {
public:
    using WorkQueue::submit;
    virtual void submit(TurnItem item) = 0;
    // The same for an item that may take longer than a millisecond: no helper runs it, because a helper has other
    // things to do, too.
    virtual void submitLong(TurnItem item) { submit(std::move(item)); }
    // A lane of that submitter. The queue must outlive the items of its lanes.
    [[nodiscard]] virtual std::shared_ptr<Lane> makeLane(const Submitter& submitter) = 0;
};

// A part of a turn queue for one of many submitters, such as a client. Its items run on that queue, in their own order,
// and take turns with those of the other lanes: the users share the queue's time equally, each user's processes the
// user's, and each process's lanes the process's. What is submitted to the queue itself is a lane, too, of a user of
// its own. Items of different lanes have no order.
class Lane : public TurnQueue {
public:
    // Whether so many items wait that the submitter should pause. After it returned true, the room handler is called
    // once when few are left. What was submitted since the last call holds so many bytes: the release handler gets them
    // once, when all of it has run. An item that pauses the lane has run when the one that continues it has.
    [[nodiscard]] virtual bool isFull(std::size_t heldBytes) = 0;
    // The thread that runs the items calls the handlers; the release handler also the one that calls `isFull`, and
    // under the queue's lock, so that it must not use the queue. Set both before `isFull` is called.
    virtual void setRoomHandler(std::function<void()> handler) = 0;
    virtual void setReleaseHandler(std::function<void(std::size_t bytes)> handler) = 0;

    // From now on the time that the lane's items take counts there. Any thread.
    virtual void setWorkload(std::shared_ptr<ledger::Workload> workload) = 0;

    // From now on the lane's items write to the log for that share. Set it before the first item.
    virtual void setLogShare(std::shared_ptr<LogShare> share) = 0;

    // Continues a lane that pauses: its next item is this one, as by `submitLong`. Any thread.
    using Resume = std::move_only_function<void(TurnItem item)>;
    // For an item that needs something that takes long and is made elsewhere: until the result is called, no item of
    // this lane runs, while those of other lanes do. Only an item of this lane may call it, submitted by `submitLong`,
    // and once. The result must be called: a queue that ends waits for it.
    [[nodiscard]] virtual Resume pause() = 0;
};

// How a serial queue is run.
struct SerialQueueOptions {
    QualityOfService quality = QualityOfService::Default;
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
    // Both throw std::system_error if the system refuses a thread for the queue.
    [[nodiscard]] virtual std::shared_ptr<WorkQueue> makeSerialQueue(std::string_view name,
                                                                     SerialQueueOptions options) = 0;
    [[nodiscard]] virtual std::shared_ptr<TurnQueue> makeTurnQueue(std::string_view name,
                                                                   SerialQueueOptions options) = 0;
    // The process's concurrent queue of background priority. It runs a few items side by side; so an item that waits
    // for another may wait for ever.
    [[nodiscard]] virtual WorkQueue& backgroundQueue() = 0;
    // Submits the item to the queue after the delay, or immediately if the delay is not positive. Items for the same
    // moment keep the order in which they came. The queue must outlive that moment.
    //
    // If neither this nor the background queue can get a thread, items are not lost: they wait until a later item gets
    // one.
    virtual void submitAfter(std::chrono::nanoseconds delay, WorkQueue& queue, WorkItem item) = 0;
    [[nodiscard]] virtual std::unique_ptr<Semaphore> makeSemaphore(unsigned initialCount) = 0;
};

} // namespace platform
