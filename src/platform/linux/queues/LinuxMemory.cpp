// The thread that reaches the limit submits the work, so that there is nothing to lock.
#include "platform/linux/queues/LinuxMemory.h"

#include "platform/linux/queues/ThreadHeap.h"

namespace platform {

void LinuxMemory::letGo(std::size_t bytes)
{
    const std::size_t before = bytes_.fetch_add(bytes);
    if (before >= much || bytes < much - before)
        return;
    queues_.submitAfter(delay, queues_.backgroundQueue(), [this] {
        bytes_ = 0;
        ThreadHeap::askAll();
    });
}

} // namespace platform
