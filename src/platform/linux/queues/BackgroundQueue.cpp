// SPDX-License-Identifier: Apache-2.0
// One list for all threads. A thread is added only if more items wait than threads are free; it then stays.
#include "platform/linux/queues/BackgroundQueue.h"

#include "platform/linux/process/Thread.h"
#include "platform/linux/queues/ThreadHeap.h"

#include <system_error>
#include <utility>

namespace platform {
namespace {

thread_local const BackgroundQueue* queueOfThisThread = nullptr;

} // namespace

BackgroundQueue::~BackgroundQueue()
{
    std::vector<std::thread> threads;
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        threads.swap(threads_);
        changed_.notifyAll();
    }
    for (std::thread& thread : threads)
        thread.join();
    run(); // items that never got a thread
    queueOfThisThread = nullptr;
}

void BackgroundQueue::submit(WorkItem item)
{
    const foundation::Lock lock(lock_);
    waiting_.push_back(std::move(item));
    ++unfinished_;
    const bool isThreadWanted = freeThreads_ < waiting_.size() && threads_.size() < mostThreads && !isEnding_;
    if (!isThreadWanted || !addThread())
        changed_.notifyOne();
}

bool BackgroundQueue::addThread()
{
    try {
        threads_.push_back(startThread("background", QualityOfService::Background, [this] { run(); }));
        return true;
    } catch (const std::system_error&) {
        return false;
    }
}

bool BackgroundQueue::isCurrent() const
{
    return queueOfThisThread == this;
}

void BackgroundQueue::finish()
{
    const foundation::Lock lock(lock_);
    while (unfinished_ != 0)
        finished_.wait(lock_);
}

std::size_t BackgroundQueue::unfinishedItems() const
{
    const foundation::Lock lock(lock_);
    return unfinished_;
}

// A thread of this queue is never woken to tidy its heap: it does so after its next item, and the thread that asks all
// heaps is usually one of these.
void BackgroundQueue::run()
{
    queueOfThisThread = this;
    ThreadHeap heap([] { });
    while (WorkItem item = take()) {
        item();
        item = nullptr;
        heap.tidyIfAsked();
        countFinished();
    }
}

void BackgroundQueue::countFinished()
{
    const foundation::Lock lock(lock_);
    if (--unfinished_ == 0)
        finished_.notifyAll();
}

// The next item, or an empty one at the end.
WorkItem BackgroundQueue::take()
{
    const foundation::Lock lock(lock_);
    ++freeThreads_;
    while (waiting_.empty() && !isEnding_)
        changed_.wait(lock_);
    --freeThreads_;
    if (waiting_.empty())
        return nullptr;
    WorkItem item = std::move(waiting_.front());
    waiting_.pop_front();
    return item;
}

} // namespace platform
