// Work queues: a serial queue a name, the background concurrent queue, and work that starts later.
//
// No queue polls; one that is empty has a sleeping thread, or none.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

namespace platform {

using WorkItem = std::move_only_function<void()>;

enum class QualityOfService : std::uint8_t { UserInteractive, Default, Background };

// Runs its items; a serial queue one at a time, in the order in which they were submitted. What an item holds is let go
// of on the queue, on a serial one before the next item runs. A queue that is let go, be it by one of its own items,
// still runs what was submitted before. Any thread may submit.
class WorkQueue {
public:
    virtual ~WorkQueue() = default;
    virtual void submit(WorkItem item) = 0;
    // Whether the calling thread is running an item of this queue.
    [[nodiscard]] virtual bool isCurrent() const = 0;
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
    // Throws std::system_error when there is no thread left for it.
    [[nodiscard]] virtual std::shared_ptr<WorkQueue> makeSerialQueue(std::string_view name,
                                                                     QualityOfService quality) = 0;
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
