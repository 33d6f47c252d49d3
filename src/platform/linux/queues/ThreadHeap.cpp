// SPDX-License-Identifier: Apache-2.0
// The list of all heaps, and how the service's allocator returns all the memory that it can.
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

// Never destroyed: threads may outlive static objects.
Heaps& heaps()
{
    static auto& heaps = *new Heaps;
    return heaps;
}

// mimalloc takes memory from the system in segments of 32 MiB and divides them into pages. `mi_collect` returns empty
// segments. From other segments it returns only the pages that it frees itself, and immediately only if the delay is 0.
// Pages that were freed earlier return when the next page is taken from their segment. So this function takes and frees
// a few pages, which costs next to nothing. Without it, 35 MB stay after three sessions of 200,000 volume changes each;
// with it, 1 MB.
void tidyHeapOfThisThread()
{
    static foundation::Mutex delayLock; // all threads share the delay
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
