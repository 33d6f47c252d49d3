#include "platform/linux/SerialQueue.h"

#include "foundation/Mutex.h"
#include "platform/linux/Thread.h"

#include <utility>
#include <vector>

namespace platform {
namespace {

constexpr std::size_t mostRoomKept = 1024; // in items; what a burst needed beyond that is given back

thread_local bool turnIsRunning = false;

} // namespace

class SerialQueue::Work {
public:
    explicit Work(std::function<void()> turnEndHandler) : turnEndHandler_(std::move(turnEndHandler)) { }

    void add(WorkItem item)
    {
        bool wake = false;
        {
            const foundation::Lock lock(lock_);
            waiting_.push_back(std::move(item));
            wake = std::exchange(isAsleep_, false);
        }
        if (wake) // not under the lock, which the woken thread wants first of all
            changed_.notifyOne();
    }

    // No items are added any more, except by items.
    void end()
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        changed_.notifyOne();
    }

    // The thread's life.
    void run()
    {
        ofThisThread_ = this;
        std::vector<WorkItem> items;
        while (take(items)) {
            turnIsRunning = static_cast<bool>(turnEndHandler_);
            for (WorkItem& item : items) {
                item();
                item = nullptr; // what it holds is released before the next one runs
            }
            turnIsRunning = false;
            items.clear();
            if (items.capacity() > mostRoomKept)
                items = std::vector<WorkItem>();
            if (turnEndHandler_)
                turnEndHandler_();
        }
    }

    [[nodiscard]] bool isOfThisThread() const noexcept { return ofThisThread_ == this; }

private:
    // Waits for items and takes them all; false when there will be none.
    bool take(std::vector<WorkItem>& items)
    {
        const foundation::Lock lock(lock_);
        while (waiting_.empty()) {
            if (isEnding_)
                return false;
            isAsleep_ = true;
            changed_.wait(lock_);
        }
        isAsleep_ = false;
        items.swap(waiting_);
        return true;
    }

    static thread_local const Work* ofThisThread_;

    const std::function<void()> turnEndHandler_;
    foundation::Mutex lock_;
    foundation::Condition changed_;
    std::vector<WorkItem> waiting_ KESTO_GUARDED_BY(lock_);
    bool isAsleep_ KESTO_GUARDED_BY(lock_) = false; // so that only who finds it asleep pays for waking it
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
};

thread_local const SerialQueue::Work* SerialQueue::Work::ofThisThread_ = nullptr;

SerialQueue::SerialQueue(std::string_view name, QualityOfService quality, std::function<void()> turnEndHandler)
    : work_(std::make_shared<Work>(std::move(turnEndHandler)))
    , thread_(startThread(name, quality, [work = work_] { work->run(); }))
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
    work_->add(std::move(item));
}

bool SerialQueue::isCurrent() const
{
    return work_->isOfThisThread();
}

bool SerialQueue::isTurnRunning() noexcept
{
    return turnIsRunning;
}

} // namespace platform
