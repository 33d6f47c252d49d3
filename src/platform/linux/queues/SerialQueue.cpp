// SPDX-License-Identifier: Apache-2.0
// The queue's thread and helpers alike take a turn, run it, and give it back; a helper may leave the rest of it to the
// queue's thread. Four flags under one lock coordinate them. The thread that has the turn takes the items a few at a
// time, so that the lock costs little and the order stays fair while others submit.
#include "platform/linux/queues/SerialQueue.h"

#include "foundation/Mutex.h"
#include "platform/Turn.h"
#include "platform/linux/process/Thread.h"
#include "platform/linux/queues/FairOrder.h"
#include "platform/linux/queues/ThreadHeap.h"

#include <cassert>
#include <ctime>
#include <utility>
#include <vector>

namespace platform {

namespace {

constexpr int partIfContested = 4; // of the longest turn

// Says how long items take. While lanes compete, it counts processor time: a lane that paid for the thread's wait for a
// processor would then wait until every other lane has used as much time. A look at that clock takes 0.5 us. So it
// counts the time that passes while one lane is alone. Used by the thread that runs the items.
class Stopwatch {
public:
    // Before the items run.
    void start(bool isContested)
    {
        if (isContested && !isContested_)
            used_ = usedTime();
        isContested_ = isContested;
    }
    // The time since the last lap.
    [[nodiscard]] std::chrono::nanoseconds lap()
    {
        const auto now = Clock::now();
        const auto passed = now - std::exchange(passed_, now);
        if (!isContested_)
            return passed;
        const auto used = usedTime();
        return used - std::exchange(used_, used);
    }

private:
    using Clock = std::chrono::steady_clock;

    static std::chrono::nanoseconds usedTime()
    {
        timespec time = {};
        ::clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
        return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
    }

    Clock::time_point passed_ = Clock::now();
    bool isContested_ = false;
    std::chrono::nanoseconds used_{}; // while lanes compete
};

} // namespace

class SerialQueue::Work : public std::enable_shared_from_this<Work> {
public:
    Work(TurnEnd turnEnd, bool mayBeHelped, std::chrono::nanoseconds turnFor)
        : turnEnd_(std::move(turnEnd)),
          mayBeHelped_(mayBeHelped),
          longestTurn_(turnFor)
    {
    }

    [[nodiscard]] std::shared_ptr<FairOrder::Lane> makeLane(const Submitter& submitter)
    {
        const foundation::Lock lock(lock_);
        return order_.makeLane(submitter);
    }

    [[nodiscard]] bool isFull(FairOrder::Lane& lane, std::size_t heldBytes)
    {
        const foundation::Lock lock(lock_);
        return FairOrder::isFull(lane, heldBytes);
    }

    void setReleaseHandler(FairOrder::Lane& lane, FairOrder::ReleaseHandler handler)
    {
        const foundation::Lock lock(lock_);
        FairOrder::setReleaseHandler(lane, std::move(handler));
    }

    void setRoomHandler(FairOrder::Lane& lane, std::function<void()> handler)
    {
        const foundation::Lock lock(lock_);
        FairOrder::setRoomHandler(lane, std::make_shared<const FairOrder::RoomHandler>(std::move(handler)));
    }

    void setWorkload(FairOrder::Lane& lane, std::shared_ptr<ledger::Workload> workload)
    {
        const foundation::Lock lock(lock_);
        FairOrder::setWorkload(lane, std::move(workload));
    }

    void setLogShare(FairOrder::Lane& lane, std::shared_ptr<LogShare> share)
    {
        const foundation::Lock lock(lock_);
        FairOrder::setLogShare(lane, std::move(share));
    }

    void pause(FairOrder::Lane& lane)
    {
        assert(isCurrent());
        const foundation::Lock lock(lock_);
        order_.pause(lane);
    }

    void resume(const std::shared_ptr<FairOrder::Lane>& lane, TurnItem item)
    {
        constexpr bool mayTakeLong = true;
        const foundation::Lock lock(lock_);
        order_.resume(lane, {std::move(item), mayTakeLong});
        if (isTurnTaken_)
            return;
        isLeftToHelper_ = false; // a helper would leave this item anyway
        wakeThread();
    }

    void add(const std::shared_ptr<FairOrder::Lane>& lane, TurnItem item, bool mayTakeLong = false)
    {
        assert(!mayBeHelped_ || !thisThread.isHelper || !foundation::Lock::isAnyHeld());
        const bool mayHelp = mayBeHelped_ && thisThread.mayHelp(this);
        if (mayHelp && thisThread.toHelp == nullptr)
            thisThread.toHelp = shared_from_this();
        const foundation::Lock lock(lock_);
        order_.add(lane, {std::move(item), mayTakeLong});
        if (isTurnTaken_)
            return;
        isLeftToHelper_ = mayHelp && order_.waiting() <= mostItemsHelpedWith && !mayTakeLong;
        if (!isLeftToHelper_)
            wakeThread(); // under the lock: after it, the item may destroy the queue
    }

    // From now on only items add items.
    void end()
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        isLeftToHelper_ = false;
        wakeThread();
    }

    // The life of the queue's thread.
    void run()
    {
        ThreadHeap heap([this] {
            const foundation::Lock lock(lock_);
            wakeThread();
        });
        for (Duty duty = waitForDuty(heap); duty != Duty::End; duty = waitForDuty(heap)) {
            if (duty == Duty::Turn)
                runTurn(Runner::OwnThread);
            heap.tidyIfAsked();
        }
    }

    // Runs one turn on the calling thread, unless the queue's thread does or the turn is too long.
    void help()
    {
        {
            const foundation::Lock lock(lock_);
            isLeftToHelper_ = false;
            if (isTurnTaken_ || order_.waiting() == 0 || order_.waiting() > mostItemsHelpedWith)
                return;
            takeTurn();
        }
        runTurn(Runner::Helper);
    }

    [[nodiscard]] bool isCurrent() const noexcept { return thisThread.runs == this; }

    void finish()
    {
        const foundation::Lock lock(lock_);
        while (isTurnTaken_ || order_.waiting() != 0 || order_.pausing() != 0)
            finished_.wait(lock_);
    }

    [[nodiscard]] std::size_t unfinishedItems()
    {
        const foundation::Lock lock(lock_);
        return order_.waiting() + order_.pausing() + order_.heldBack() + takenInTurn_;
    }

    // The calling thread's part in serial queues.
    struct ThisThread {
        const Work* runs = nullptr;
        bool isHelper = false;
        std::shared_ptr<Work> toHelp;

        [[nodiscard]] bool mayHelp(const Work* work) const noexcept
        {
            return isHelper && runs == nullptr && (toHelp == nullptr || toHelp.get() == work);
        }
    };
    static thread_local ThisThread thisThread;

private:
    enum class Runner : std::uint8_t { OwnThread, Helper };

    // What the queue's thread does next.
    enum class Duty : std::uint8_t { Turn, Heap, End };
    // What the thread with the turn does next.
    enum class Next : std::uint8_t { Run, Leave, End };

    Duty waitForDuty(const ThreadHeap& heap)
    {
        const foundation::Lock lock(lock_);
        while (order_.waiting() == 0 || isTurnTaken_ || isLeftToHelper_) {
            if (std::exchange(isTurnLeft_, false))
                return Duty::Turn;
            if (isEnding_ && !isTurnTaken_ && order_.pausing() == 0)
                return Duty::End;
            if (heap.isAsked())
                return Duty::Heap;
            isAsleep_ = true;
            changed_.wait(lock_);
        }
        takeTurn();
        return Duty::Turn;
    }

    void wakeThread() KESTO_REQUIRES(lock_)
    {
        if (std::exchange(isAsleep_, false))
            changed_.notifyOne();
    }

    void takeTurn() KESTO_REQUIRES(lock_)
    {
        isTurnTaken_ = true;
        leftInTurn_ = order_.waiting();
        turnTime_ = {};
    }

    // Runs the turn, or what is left of it, to its end, unless a helper has to leave it.
    void runTurn(Runner runner)
    {
        thisThread.runs = this;
        Stopwatch stopwatch;
        for (Next next = takeItems(runner); next != Next::End; next = takeItems(runner)) {
            if (next == Next::Leave)
                return leaveTurn();
            if (const auto tellOfRoom = std::exchange(roomHandler_, nullptr))
                (*tellOfRoom)();
            stopwatch.start(isContested_);
            runItems();
            itemsTime_ = stopwatch.lap();
        }
        if (runner == Runner::Helper && turnEnd_.wouldWait && turnEnd_.wouldWait())
            return leaveTurn();
        endTurn();
    }

    void runItems()
    {
        const LogShare::Writing writing(logShare_);
        for (FairOrder::Item& item : items_) {
            item.run(turn_);
            item.run = nullptr; // what it holds is released before the next one runs
        }
    }

    // Takes the items that run next.
    Next takeItems(Runner runner)
    {
        const foundation::Lock lock(lock_);
        if (!items_.empty()) {
            order_.charge(itemsTime_);
            turnTime_ += itemsTime_;
            items_.clear();
        }
        isContested_ = order_.isContested();
        if (leftInTurn_ == 0 || order_.waiting() == 0
            || turnTime_ > (isContested_ ? longestTurn_ / partIfContested : longestTurn_))
            return Next::End;
        if (runner == Runner::Helper && order_.front().mayTakeLong)
            return Next::Leave;
        roomHandler_ = order_.take(items_, leftInTurn_);
        logShare_ = order_.logShare();
        leftInTurn_ -= items_.size();
        takenInTurn_ += items_.size();
        return Next::Run;
    }

    void endTurn()
    {
        if (turnEnd_.handler)
            turnEnd_.handler(turn_);
        thisThread.runs = nullptr;
        giveTurnBack();
    }

    void leaveTurn()
    {
        thisThread.runs = nullptr;
        const foundation::Lock lock(lock_);
        isTurnLeft_ = true;
        wakeThread();
    }

    void giveTurnBack()
    {
        const foundation::Lock lock(lock_);
        isTurnTaken_ = false;
        takenInTurn_ = 0;
        if (isEnding_ || order_.waiting() != 0)
            wakeThread();
        if (order_.waiting() == 0)
            finished_.notifyAll();
    }

    const TurnEnd turnEnd_;
    const bool mayBeHelped_;
    const std::chrono::nanoseconds longestTurn_;
    foundation::Mutex lock_;
    foundation::Condition changed_;
    foundation::Condition finished_; // nothing waits or runs
    FairOrder order_ KESTO_GUARDED_BY(lock_);
    // These belong to the thread that has taken the turn.
    Turn turn_;
    std::vector<FairOrder::Item> items_; // that run now
    std::shared_ptr<const FairOrder::RoomHandler> roomHandler_; // of their lane, if it has room again
    LogShare* logShare_ = nullptr; // of their lane
    bool isContested_ = false; // several lanes compete
    std::chrono::nanoseconds itemsTime_{};
    std::chrono::nanoseconds turnTime_{};
    std::size_t leftInTurn_ = 0; // items that waited when it began, and may run in it

    std::size_t takenInTurn_ KESTO_GUARDED_BY(lock_) = 0;
    bool isTurnTaken_ KESTO_GUARDED_BY(lock_) = false; // a thread is running one
    bool isLeftToHelper_ KESTO_GUARDED_BY(lock_) = false; // what waits: a helper is about to come
    bool isTurnLeft_ KESTO_GUARDED_BY(lock_) = false; // by a helper, for the queue's thread
    bool isAsleep_ KESTO_GUARDED_BY(lock_) = false; // the queue's thread sleeps, and has not been woken yet
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
};

thread_local SerialQueue::Work::ThisThread SerialQueue::Work::thisThread;

// Items that run on the queue in turns with those of its other lanes.
class SerialQueue::QueueLane final : public Lane {
public:
    QueueLane(std::shared_ptr<Work> work, const Submitter& submitter)
        : work_(std::move(work)),
          lane_(work_->makeLane(submitter))
    {
    }

    void submit(WorkItem item) override
    {
        work_->add(lane_, [item = std::move(item)](Turn&) mutable { item(); });
    }
    void submit(TurnItem item) override { work_->add(lane_, std::move(item)); }
    void submitLong(TurnItem item) override
    {
        constexpr bool mayTakeLong = true;
        work_->add(lane_, std::move(item), mayTakeLong);
    }
    [[nodiscard]] bool isCurrent() const override { return work_->isCurrent(); }
    [[nodiscard]] std::shared_ptr<Lane> makeLane(const Submitter& submitter) override
    {
        return std::make_shared<QueueLane>(work_, submitter);
    }
    [[nodiscard]] bool isFull(std::size_t heldBytes) override { return work_->isFull(*lane_, heldBytes); }
    void setReleaseHandler(std::function<void(std::size_t bytes)> handler) override
    {
        work_->setReleaseHandler(*lane_, std::move(handler));
    }
    void setRoomHandler(std::function<void()> handler) override { work_->setRoomHandler(*lane_, std::move(handler)); }
    void setWorkload(std::shared_ptr<ledger::Workload> workload) override
    {
        work_->setWorkload(*lane_, std::move(workload));
    }
    void setLogShare(std::shared_ptr<LogShare> share) override { work_->setLogShare(*lane_, std::move(share)); }
    [[nodiscard]] Resume pause() override
    {
        work_->pause(*lane_);
        return [work = work_, lane = lane_](TurnItem item) { work->resume(lane, std::move(item)); };
    }

private:
    const std::shared_ptr<Work> work_;
    const std::shared_ptr<FairOrder::Lane> lane_;
};

SerialQueue::SerialQueue(std::string_view name, SerialQueueOptions options, TurnEnd turnEnd,
                         std::chrono::nanoseconds turnFor)
    : work_(std::make_shared<Work>(std::move(turnEnd), options.mayBeHelped, turnFor)),
      lane_(std::make_unique<QueueLane>(work_, theService)),
      thread_(startThread(name, options.quality, [work = work_] { work->run(); }))
{
}

SerialQueue::~SerialQueue()
{
    work_->end();
    if (isCurrent())
        thread_.detach();
    else
        thread_.join();
}

void SerialQueue::submit(WorkItem item)
{
    lane_->submit(std::move(item));
}

void SerialQueue::submit(TurnItem item)
{
    lane_->submit(std::move(item));
}

void SerialQueue::submitLong(TurnItem item)
{
    lane_->submitLong(std::move(item));
}

std::shared_ptr<Lane> SerialQueue::makeLane(const Submitter& submitter)
{
    return lane_->makeLane(submitter);
}

bool SerialQueue::isCurrent() const
{
    return work_->isCurrent();
}

void SerialQueue::finish()
{
    assert(!isCurrent());
    work_->finish();
}

std::size_t SerialQueue::unfinishedItems() const
{
    return work_->unfinishedItems();
}

SerialQueue::Helper::Helper()
{
    assert(!Work::thisThread.isHelper);
    Work::thisThread.isHelper = true;
    setQualityOfThisThread(QualityOfService::UserInteractive);
}

SerialQueue::Helper::~Helper()
{
    help();
    Work::thisThread.isHelper = false;
    setQualityOfThisThread(QualityOfService::Default);
}

void SerialQueue::Helper::help()
{
    assert(!foundation::Lock::isAnyHeld());
    if (const auto work = std::exchange(Work::thisThread.toHelp, nullptr))
        work->help();
}

} // namespace platform
