// A list of the heaps there are, and what the service's allocator has to be told so that it gives back all that it can.
#include "platform/linux/queues/ThreadHeap.h"

#include "foundation/Mutex.h"

#include <array>
#include <memory>
#include <mimalloc.h>
#include <utility>
#include <vector>

// Only the service is linked with mimalloc: in other programs these are null.
#pragma weak mi_collect
#pragma weak mi_option_get
#pragma weak mi_option_set

namespace platform {
namespace {

struct Heaps {
    foundation::Mutex lock;
    std::vector<ThreadHeap*> all KESTO_GUARDED_BY(lock);
};

// For ever: threads may outlive what is static.
Heaps& heaps()
{
    static auto& heaps = *new Heaps;
    return heaps;
}

// mimalloc takes memory from the system in segments of 32 MiB and divides them into pages. `mi_collect` returns the
// segments in which nothing is left. Of the others, it returns only the pages that it frees itself, and those at once
// only if there is no delay; pages that were freed before wait for the next page to be taken from their segment. So a
// few pages are taken and freed, which touches next to nothing. Without that, 35 MB stay after three sessions of
// 200,000 volume changes each; with it, 1 MB.
void tidyHeapOfThisThread()
{
    static foundation::Mutex delayLock; // the delay is that of all threads
    constexpr std::size_t bytesOfAPage = std::size_t{1} << 20;
    constexpr std::size_t pages = 64;
    if (mi_collect == nullptr)
        return;
    const foundation::Lock lock(delayLock);
    const long delay = mi_option_get(mi_option_decommit_delay);
    mi_option_set(mi_option_decommit_delay, 0);
    mi_collect(true);
    std::array<std::unique_ptr<char[]>, pages> taken;
    for (auto& page : taken)
        page = std::make_unique_for_overwrite<char[]>(bytesOfAPage);
    taken = {};
    mi_option_set(mi_option_decommit_delay, delay);
}

} // namespace

ThreadHeap::ThreadHeap(std::function<void()> wake) : wake_(std::move(wake))
{
    const foundation::Lock lock(heaps().lock);
    heaps().all.push_back(this);
}

ThreadHeap::~ThreadHeap()
{
    const foundation::Lock lock(heaps().lock);
    std::erase(heaps().all, this);
}

bool ThreadHeap::tidyIfAsked()
{
    if (!isAsked_.load(std::memory_order_relaxed) || !isAsked_.exchange(false))
        return false;
    tidyHeapOfThisThread();
    return true;
}

void ThreadHeap::askAll()
{
    const foundation::Lock lock(heaps().lock);
    for (ThreadHeap* heap : heaps().all) {
        heap->isAsked_ = true;
        heap->wake_();
    }
}

} // namespace platform
