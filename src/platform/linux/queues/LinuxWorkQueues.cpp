// SPDX-License-Identifier: Apache-2.0
// Only the turns of turn queues have an end handler: items of other queues get no turn in which to gather.
#include "platform/linux/queues/LinuxWorkQueues.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

// Not std::counting_semaphore: that of GCC 12 may sleep through a signal.
class LinuxSemaphore final : public Semaphore {
public:
    explicit LinuxSemaphore(unsigned count) : count_(count) { }

    void signal() override
    {
        const foundation::Lock lock(lock_);
        ++count_;
        raised_.notifyOne();
    }

    void wait() override
    {
        const foundation::Lock lock(lock_);
        while (count_ == 0)
            raised_.wait(lock_);
        --count_;
    }

private:
    foundation::Mutex lock_;
    foundation::Condition raised_;
    unsigned count_ KESTO_GUARDED_BY(lock_);
};

} // namespace

std::shared_ptr<WorkQueue> LinuxWorkQueues::makeSerialQueue(std::string_view name, SerialQueueOptions options)
{
    return std::make_shared<SerialQueue>(name, options, SerialQueue::TurnEnd(), longestTurn_);
}

std::shared_ptr<TurnQueue> LinuxWorkQueues::makeTurnQueue(std::string_view name, SerialQueueOptions options)
{
    auto queue = std::make_shared<SerialQueue>(name, options, turnEnd_, longestTurn_);
    const foundation::Lock lock(lock_);
    std::erase_if(turnQueues_, [](const auto& known) { return known.expired(); });
    turnQueues_.push_back(queue);
    return queue;
}

std::vector<std::shared_ptr<SerialQueue>> LinuxWorkQueues::livingTurnQueues() const
{
    std::vector<std::shared_ptr<SerialQueue>> living;
    const foundation::Lock lock(lock_);
    for (const auto& known : turnQueues_)
        if (auto queue = known.lock())
            living.push_back(std::move(queue));
    return living;
}

LinuxWorkQueues::Unfinished LinuxWorkQueues::unfinished() const
{
    Unfinished unfinished{.ofBackgroundQueue = backgroundQueue_.unfinishedItems()};
    for (const auto& queue : livingTurnQueues())
        unfinished.ofTurnQueues += queue->unfinishedItems();
    return unfinished;
}

void LinuxWorkQueues::finish()
{
    for (const auto& queue : livingTurnQueues())
        queue->finish();
    backgroundQueue_.finish();
}

void LinuxWorkQueues::submitAfter(std::chrono::nanoseconds delay, WorkQueue& queue, WorkItem item)
{
    using Clock = DelayedWork::Clock;
    const Clock::time_point now = Clock::now();
    const auto longest = Clock::time_point::max() - now;
    delayedWork_.add(now + std::min<Clock::duration>(delay, longest), queue, std::move(item));
}

std::unique_ptr<Semaphore> LinuxWorkQueues::makeSemaphore(unsigned initialCount)
{
    return std::make_unique<LinuxSemaphore>(initialCount);
}

} // namespace platform
