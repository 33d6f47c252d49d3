// The queue's thread and helpers alike take a turn, run it, and give it back; a helper may leave the rest of it to the
// queue's thread. Four flags under one lock coordinate them.
#include "platform/linux/queues/SerialQueue.h"

#include "foundation/Mutex.h"
#include "platform/Turn.h"
#include "platform/linux/process/Thread.h"
#include "platform/linux/queues/ThreadHeap.h"

#include <cassert>
#include <utility>
#include <vector>

namespace platform {

class SerialQueue::Work : public std::enable_shared_from_this<Work> {
public:
    Work(TurnEnd turnEnd, bool mayBeHelped, std::chrono::nanoseconds helpFor)
        : turnEnd_(std::move(turnEnd)),
          mayBeHelped_(mayBeHelped),
          longestHelp_(helpFor)
    {
    }

    void add(TurnItem item, bool mayTakeLong = false)
    {
        assert(!mayBeHelped_ || !thisThread.isHelper || !foundation::Lock::isAnyHeld());
        const bool mayHelp = mayBeHelped_ && thisThread.mayHelp(this);
        if (mayHelp && thisThread.toHelp == nullptr)
            thisThread.toHelp = shared_from_this();
        const foundation::Lock lock(lock_);
        waiting_.push_back({std::move(item), mayTakeLong});
        const bool isLeftToHelper = mayHelp && waiting_.size() <= mostItemsHelpedWith && !mayTakeLong;
        if (!isTurnTaken_ && !isLeftToHelper)
            wakeThread(); // under the lock: after it, the item may destroy the queue
    }

    // From now on only items add items.
    void end()
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        wakeThread();
    }

    // The life of the queue's thread.
    void run()
    {
        ThreadHeap heap([this] {
            const foundation::Lock lock(lock_);
            wakeThread();
        });
        for (Next next = waitForNext(heap); next != Next::End; next = waitForNext(heap)) {
            if (next == Next::Turn)
                runTurn();
            heap.tidyIfAsked();
        }
    }

    // Runs one turn on the calling thread, unless the queue's thread does or the turn is too long.
    void help()
    {
        {
            const foundation::Lock lock(lock_);
            if (isTurnTaken_ || waiting_.empty() || waiting_.size() > mostItemsHelpedWith)
                return;
            takeTurn();
        }
        runTurnAsHelper();
    }

    [[nodiscard]] bool isCurrent() const noexcept { return thisThread.runs == this; }

    void finish()
    {
        const foundation::Lock lock(lock_);
        while (isTurnTaken_ || !waiting_.empty())
            finished_.wait(lock_);
    }

    [[nodiscard]] std::size_t unfinishedItems()
    {
        const foundation::Lock lock(lock_);
        return waiting_.size() + itemsOfTurn_;
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
    using Clock = std::chrono::steady_clock;

    static constexpr std::size_t mostRoomKept = 1024; // in items; further room of a burst is freed

    struct Item {
        TurnItem run;
        bool mayTakeLong = false;
    };

    // What the queue's thread does next.
    enum class Next : std::uint8_t { Turn, Heap, End };

    Next waitForNext(const ThreadHeap& heap)
    {
        const foundation::Lock lock(lock_);
        while (waiting_.empty() || isTurnTaken_) {
            if (std::exchange(isTurnLeft_, false))
                return Next::Turn;
            if (isEnding_ && !isTurnTaken_)
                return Next::End;
            if (heap.isAsked())
                return Next::Heap;
            isAsleep_ = true;
            changed_.wait(lock_);
        }
        takeTurn();
        return Next::Turn;
    }

    void wakeThread() KESTO_REQUIRES(lock_)
    {
        if (std::exchange(isAsleep_, false))
            changed_.notifyOne();
    }

    void takeTurn() KESTO_REQUIRES(lock_)
    {
        isTurnTaken_ = true;
        items_.swap(waiting_);
        itemsOfTurn_ = items_.size();
    }

    // Runs what is left of the turn.
    void runTurn()
    {
        thisThread.runs = this;
        while (ran_ < items_.size())
            runNext();
        endTurn();
    }

    // Whether to read the clock, which costs some hundredths of what an item does: not before the first item, which
    // begins at once, and not before each of the others.
    [[nodiscard]] static bool isTimeToLook(std::size_t ran) noexcept
    {
        constexpr std::size_t itemsBetween = 8;
        return ran % itemsBetween == 1;
    }

    void runTurnAsHelper()
    {
        thisThread.runs = this;
        const auto end = items_.size() > 1 ? Clock::now() + longestHelp_ : Clock::time_point::max();
        while (ran_ < items_.size()) {
            if (items_[ran_].mayTakeLong || (isTimeToLook(ran_) && Clock::now() >= end))
                return leaveTurn();
            runNext();
        }
        if (turnEnd_.wouldWait && turnEnd_.wouldWait())
            return leaveTurn();
        endTurn();
    }

    void runNext()
    {
        TurnItem& item = items_[ran_++].run;
        item(turn_);
        item = nullptr; // what it holds is released before the next one runs
    }

    void endTurn()
    {
        items_.clear();
        ran_ = 0;
        if (items_.capacity() > mostRoomKept)
            items_ = std::vector<Item>();
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
        itemsOfTurn_ = 0;
        if (isEnding_ || !waiting_.empty())
            wakeThread();
        if (waiting_.empty())
            finished_.notifyAll();
    }

    const TurnEnd turnEnd_;
    const bool mayBeHelped_;
    const std::chrono::nanoseconds longestHelp_;
    foundation::Mutex lock_;
    foundation::Condition changed_;
    foundation::Condition finished_; // nothing waits or runs
    std::vector<Item> waiting_ KESTO_GUARDED_BY(lock_);
    std::vector<Item> items_; // this, `ran_` and `turn_` belong to the thread that has taken the turn
    std::size_t ran_ = 0; // of the items
    Turn turn_;
    std::size_t itemsOfTurn_ KESTO_GUARDED_BY(lock_) = 0;
    bool isTurnTaken_ KESTO_GUARDED_BY(lock_) = false; // a thread is running one
    bool isTurnLeft_ KESTO_GUARDED_BY(lock_) = false; // by a helper, for the queue's thread
    bool isAsleep_ KESTO_GUARDED_BY(lock_) = false; // the queue's thread sleeps, and has not been woken yet
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
};

thread_local SerialQueue::Work::ThisThread SerialQueue::Work::thisThread;

SerialQueue::SerialQueue(std::string_view name, SerialQueueOptions options, TurnEnd turnEnd,
                         std::chrono::nanoseconds helpFor)
    : work_(std::make_shared<Work>(std::move(turnEnd), options.mayBeHelped, helpFor)),
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
    work_->add([item = std::move(item)](Turn&) mutable { item(); });
}

void SerialQueue::submit(TurnItem item)
{
    work_->add(std::move(item));
}

void SerialQueue::submitLong(TurnItem item)
{
    constexpr bool mayTakeLong = true;
    work_->add(std::move(item), mayTakeLong);
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
