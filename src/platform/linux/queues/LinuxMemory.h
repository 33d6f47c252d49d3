// Memory that was let go returns to the system some seconds later.
//
// An allocator keeps what it is given back for the next request, and hands it on to the system in the course of later
// requests only: a service that falls idle after a long session would keep that session's memory for ever. It returns
// seconds later, and not at once, for two reasons: the next session would pay for the first touch of every page again,
// and the threads that write what a session left are not done with it yet.
#pragma once

#include "platform/Memory.h"
#include "platform/WorkQueue.h"

#include <atomic>
#include <chrono>

namespace platform {

// Any thread. It outlives the work that the queues delay.
class LinuxMemory final : public Memory {
public:
    // Less than that is not worth waking threads for.
    static constexpr std::size_t much = std::size_t{4} << 20;
    // From the moment at which so much has been let go since the threads last tidied their heaps.
    static constexpr std::chrono::seconds delay{5};

    explicit LinuxMemory(WorkQueues& queues) : queues_(queues) { }

    void letGo(std::size_t bytes) override;

private:
    WorkQueues& queues_;
    std::atomic<std::size_t> bytes_ = 0; // since the heaps were last tidied
};

} // namespace platform
