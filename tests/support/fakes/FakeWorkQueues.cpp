// Items wait until a test runs them, in the order of all queues together; a serial queue never runs two at once, and
// the background queue no more than the few that its threads could.
#include "support/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace support {

namespace {

constexpr std::ptrdiff_t mostBackgroundThreads = 4;

// What waits for the end of the turn that this thread runs; null while it runs none.
thread_local std::vector<platform::WorkItem>* afterThisTurn = nullptr;

} // namespace

class FakeWorkQueues::Queue final : public platform::WorkQueue, public std::enable_shared_from_this<Queue> {
public:
    Queue(FakeWorkQueues& queues, std::ptrdiff_t mostAtOnce, bool hasTurns)
        : queues_(queues),
          mostAtOnce_(mostAtOnce),
          hasTurns_(hasTurns)
    {
    }

    void submit(platform::WorkItem item) override { queues_.items_.push_back({shared_from_this(), std::move(item)}); }

    [[nodiscard]] bool isCurrent() const override
    {
        return !queues_.running_.empty() && queues_.running_.back() == this;
    }

    [[nodiscard]] bool mayRun() const { return std::ranges::count(queues_.running_, this) < mostAtOnce_; }
    [[nodiscard]] bool hasTurns() const { return hasTurns_; }

private:
    FakeWorkQueues& queues_;
    const std::ptrdiff_t mostAtOnce_;
    const bool hasTurns_;
};

// While it lives, an item of the queue runs, and inside of it perhaps others.
class FakeWorkQueues::Run {
public:
    Run(FakeWorkQueues& queues, Queue& queue, std::vector<platform::WorkItem>& whenOver)
        : queues_(queues),
          outerTurn_(std::exchange(afterThisTurn, queue.hasTurns() ? &whenOver : nullptr))
    {
        queues_.running_.push_back(&queue);
    }
    ~Run()
    {
        queues_.running_.pop_back();
        afterThisTurn = outerTurn_;
    }
    Run(const Run&) = delete;
    Run& operator=(const Run&) = delete;

private:
    FakeWorkQueues& queues_;
    std::vector<platform::WorkItem>* const outerTurn_;
};

namespace {

class FakeSemaphore final : public platform::Semaphore {
public:
    FakeSemaphore(FakeWorkQueues& queues, unsigned count) : queues_(queues), count_(count) { }

    void signal() override { ++count_; }
    void wait() override
    {
        while (count_ == 0)
            if (!queues_.runOne())
                throw std::logic_error("nothing is left that could signal this semaphore");
        --count_;
    }

private:
    FakeWorkQueues& queues_;
    unsigned count_;
};

} // namespace

FakeWorkQueues::FakeWorkQueues(FakeClock& clock)
    : clock_(clock),
      background_(std::make_shared<Queue>(*this, mostBackgroundThreads, false))
{
}

FakeWorkQueues::~FakeWorkQueues() = default;

void FakeWorkQueues::runAll()
{
    while (runOne()) { }
}

bool FakeWorkQueues::runOne()
{
    const auto next = std::ranges::find_if(items_, [](const Item& item) { return item.queue->mayRun(); });
    if (next == items_.end())
        return false;
    Item item = std::move(*next);
    items_.erase(next);
    std::vector<platform::WorkItem> whenOver;
    {
        const Run run(*this, *item.queue, whenOver);
        item.work();
        item.work = nullptr; // what it holds is let go of on its queue
    }
    for (platform::WorkItem& each : whenOver)
        each();
    return true;
}

void FakeWorkQueues::afterTurn(platform::WorkItem item)
{
    if (afterThisTurn != nullptr)
        afterThisTurn->push_back(std::move(item));
    else
        item();
}

void FakeWorkQueues::advance(std::chrono::nanoseconds duration)
{
    const auto end = now_ + duration;
    while (!delayed_.empty() && delayed_.front().due <= end) {
        DelayedItem item = std::move(delayed_.front());
        delayed_.erase(delayed_.begin());
        moveTo(item.due);
        item.queue->submit(std::move(item.work));
        runAll();
    }
    moveTo(end);
}

void FakeWorkQueues::moveTo(std::chrono::nanoseconds moment)
{
    clock_.advance(std::chrono::duration<double>(moment - now_).count());
    now_ = moment;
}

void FakeWorkQueues::discardAll()
{
    delayed_.clear();
    while (!items_.empty())
        items_.pop_front(); // one by one: letting go of an item may submit another
}

std::vector<const platform::WorkQueue*> FakeWorkQueues::delayed() const
{
    std::vector<const platform::WorkQueue*> queues;
    for (const DelayedItem& item : delayed_)
        queues.push_back(item.queue);
    return queues;
}

std::shared_ptr<platform::WorkQueue> FakeWorkQueues::makeSerialQueue(std::string_view name,
                                                                     platform::QualityOfService quality)
{
    if (!hasThreads)
        throw std::system_error(std::make_error_code(std::errc::resource_unavailable_try_again));
    made_.push_back({std::string(name), quality});
    return std::make_shared<Queue>(*this, 1, quality == platform::QualityOfService::UserInteractive);
}

platform::WorkQueue& FakeWorkQueues::backgroundQueue()
{
    return *background_;
}

void FakeWorkQueues::submitAfter(std::chrono::nanoseconds delay, platform::WorkQueue& queue, platform::WorkItem item)
{
    const auto due = now_ + std::min(delay, std::chrono::nanoseconds::max() - now_);
    const auto place = std::ranges::upper_bound(delayed_, due, {}, &DelayedItem::due);
    delayed_.insert(place, {due, &queue, std::move(item)});
}

std::unique_ptr<platform::Semaphore> FakeWorkQueues::makeSemaphore(unsigned initialCount)
{
    return std::make_unique<FakeSemaphore>(*this, initialCount);
}

} // namespace support
