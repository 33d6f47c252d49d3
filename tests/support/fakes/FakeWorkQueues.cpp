// SPDX-License-Identifier: Apache-2.0
// Items wait until a test runs them, in the order of submission over all queues; a serial queue never runs two items at
// once, and the background queue at most as many as it has threads.
#include "support/fakes/FakeWorkQueues.h"

#include "platform/Platform.h"
#include "platform/Turn.h"

#include <algorithm>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace support {

namespace {
constexpr std::ptrdiff_t mostBackgroundThreads = 4;
}

class FakeWorkQueues::Queue final : public platform::TurnQueue, public std::enable_shared_from_this<Queue> {
public:
    Queue(FakeWorkQueues& queues, std::ptrdiff_t mostAtOnce) : queues_(queues), mostAtOnce_(mostAtOnce) { }

    void submit(platform::WorkItem item) override
    {
        submit([item = std::move(item)](platform::Turn&) mutable { item(); });
    }
    void submit(platform::TurnItem item) override
    {
        queues_.items_.push_back({shared_from_this(), nullptr, std::move(item)});
    }
    [[nodiscard]] std::shared_ptr<platform::Lane> makeLane(const platform::Submitter& submitter) override;

    [[nodiscard]] bool isCurrent() const override
    {
        return !queues_.running_.empty() && queues_.running_.back() == this;
    }

    [[nodiscard]] bool mayRun() const { return std::ranges::count(queues_.running_, this) < mostAtOnce_; }

private:
    FakeWorkQueues& queues_;
    const std::ptrdiff_t mostAtOnce_;
};

// The order of submission is fair, because all items take equally long here; and a lane is never full.
class FakeWorkQueues::QueueLane final : public platform::Lane, public std::enable_shared_from_this<QueueLane> {
public:
    QueueLane(FakeWorkQueues& queues, std::shared_ptr<Queue> queue) : queues_(queues), queue_(std::move(queue)) { }

    void submit(platform::WorkItem item) override
    {
        submit([item = std::move(item)](platform::Turn&) mutable { item(); });
    }
    void submit(platform::TurnItem item) override
    {
        queues_.items_.push_back({queue_, shared_from_this(), std::move(item)});
    }
    [[nodiscard]] std::shared_ptr<Lane> makeLane(const platform::Submitter& submitter) override
    {
        return queue_->makeLane(submitter);
    }
    [[nodiscard]] bool isCurrent() const override { return queue_->isCurrent(); }
    [[nodiscard]] bool isFull(std::size_t heldBytes) override
    {
        if (heldBytes != 0)
            submit([this, heldBytes](platform::Turn&) { releaseHandler_(heldBytes); });
        return false;
    }
    void setRoomHandler(std::function<void()>) override { }
    void setReleaseHandler(std::function<void(std::size_t bytes)> handler) override
    {
        releaseHandler_ = std::move(handler);
    }
    void setWorkload(std::shared_ptr<ledger::Workload>) override { } // its items take no time
    void setLogShare(std::shared_ptr<platform::LogShare>) override { }
    [[nodiscard]] Resume pause() override
    {
        isPausing_ = true;
        return [self = shared_from_this()](platform::TurnItem item) {
            self->isPausing_ = false;
            auto& items = self->queues_.items_;
            const auto held = std::ranges::stable_partition(items, [&](const Item& each) { return each.lane != self; });
            items.insert(held.begin(), {self->queue_, self, std::move(item)}); // the others' turn comes first
        };
    }

    [[nodiscard]] bool isPausing() const { return isPausing_; }

private:
    FakeWorkQueues& queues_;
    const std::shared_ptr<Queue> queue_;
    std::function<void(std::size_t bytes)> releaseHandler_ = [](std::size_t) { };
    bool isPausing_ = false;
};

std::shared_ptr<platform::Lane> FakeWorkQueues::Queue::makeLane(const platform::Submitter&)
{
    return std::make_shared<QueueLane>(queues_, shared_from_this());
}

// While it lives, an item of the queue runs, and perhaps others inside it.
class FakeWorkQueues::Run {
public:
    Run(FakeWorkQueues& queues, Queue& queue) : queues_(queues) { queues_.running_.push_back(&queue); }
    ~Run() { queues_.running_.pop_back(); }
    Run(const Run&) = delete;
    Run& operator=(const Run&) = delete;

private:
    FakeWorkQueues& queues_;
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
      background_(std::make_shared<Queue>(*this, mostBackgroundThreads))
{
}

FakeWorkQueues::~FakeWorkQueues() = default;

void FakeWorkQueues::runAll()
{
    while (runOne()) { }
}

bool FakeWorkQueues::runOne()
{
    const auto next = std::ranges::find_if(items_, [](const Item& item) {
        return item.queue->mayRun() && (item.lane == nullptr || !item.lane->isPausing());
    });
    if (next == items_.end())
        return false;
    Item item = std::move(*next);
    items_.erase(next);
    platform::Turn turn;
    {
        const Run run(*this, *item.queue);
        item.work(turn);
        item.work = nullptr; // released on its queue
    }
    if (platform::isInstalled())
        platform::current().ledger.post(turn.tally);
    if (auto send = turn.letters.take())
        send();
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
        items_.pop_front(); // one by one, because releasing an item may submit another
}

std::vector<const platform::WorkQueue*> FakeWorkQueues::delayed() const
{
    std::vector<const platform::WorkQueue*> queues;
    for (const DelayedItem& item : delayed_)
        queues.push_back(item.queue);
    return queues;
}

std::shared_ptr<FakeWorkQueues::Queue> FakeWorkQueues::make(const MadeQueue& queue)
{
    if (!hasThreads)
        throw std::system_error(std::make_error_code(std::errc::resource_unavailable_try_again));
    made_.push_back(queue);
    return std::make_shared<Queue>(*this, 1);
}

std::shared_ptr<platform::WorkQueue> FakeWorkQueues::makeSerialQueue(std::string_view name,
                                                                     platform::SerialQueueOptions options)
{
    return make({std::string(name), options, false});
}

std::shared_ptr<platform::TurnQueue> FakeWorkQueues::makeTurnQueue(std::string_view name,
                                                                   platform::SerialQueueOptions options)
{
    return make({std::string(name), options, true});
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
