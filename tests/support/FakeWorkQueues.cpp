// Items wait until a test runs them, in the order of all queues together; a serial queue never runs two at once.
#include "support/FakeWorkQueues.h"

#include <algorithm>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace support {

class FakeWorkQueues::Queue final : public platform::WorkQueue, public std::enable_shared_from_this<Queue> {
public:
    Queue(FakeWorkQueues& queues, bool isSerial) : queues_(queues), isSerial_(isSerial) { }

    void submit(platform::WorkItem item) override { queues_.items_.push_back({shared_from_this(), std::move(item)}); }

    [[nodiscard]] bool isCurrent() const override
    {
        return !queues_.running_.empty() && queues_.running_.back() == this;
    }

    [[nodiscard]] bool mayRun() const
    {
        return !isSerial_ || std::ranges::find(queues_.running_, this) == queues_.running_.end();
    }

private:
    FakeWorkQueues& queues_;
    const bool isSerial_;
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

FakeWorkQueues::FakeWorkQueues(FakeClock& clock) : clock_(clock), background_(std::make_shared<Queue>(*this, false)) { }

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
    running_.push_back(item.queue.get());
    item.work();
    item.work = nullptr; // what it holds is let go of on its queue
    running_.pop_back();
    return true;
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
    return std::make_shared<Queue>(*this, true);
}

platform::WorkQueue& FakeWorkQueues::backgroundQueue()
{
    return *background_;
}

void FakeWorkQueues::submitAfter(std::chrono::nanoseconds delay, platform::WorkQueue& queue, platform::WorkItem item)
{
    const auto due = now_ + delay;
    const auto place = std::ranges::upper_bound(delayed_, due, {}, &DelayedItem::due);
    delayed_.insert(place, {due, &queue, std::move(item)});
}

std::unique_ptr<platform::Semaphore> FakeWorkQueues::makeSemaphore(unsigned initialCount)
{
    return std::make_unique<FakeSemaphore>(*this, initialCount);
}

} // namespace support
