// SPDX-License-Identifier: Apache-2.0
// The room of memory: how much of it what clients send may take, and how freed memory returns to the system. It reads
// limits.toml and asks the threads' heaps to tidy up. It does not know what the memory is used for.
//
// An allocator keeps freed memory for the next request, and returns it to the system only in the course of later
// requests: a service that falls idle after a long session would keep that session's memory for ever. It returns after
// some seconds, not immediately, for two reasons: the next session would pay again for the first touch of every page,
// and the threads that write what a session left still use it. It returns while the service rests: a thread with a heap
// of thousands of clients tidies it for 50 ms, and a call that came meanwhile would wait for that thread.
#pragma once

#include "platform/Memory.h"
#include "platform/WorkQueue.h"
#include "platform/linux/settings/WatchedTomlFile.h"

#include <atomic>
#include <chrono>

namespace platform {

// Any thread. It outlives the work that the queues delay.
class LinuxMemory final : public Memory {
public:
    // Fewer bytes are not worth waking threads for.
    static constexpr std::size_t much = std::size_t{4} << 20;
    // From the moment when `much` bytes are free until the heaps are tidied, and until all threads have done that.
    static constexpr std::chrono::seconds delay{5};
    static constexpr std::chrono::seconds timeToTidy{1};
    // The service rests if it used less than this time of a processor in the last second. If it never rests, the heaps
    // are tidied a minute later.
    static constexpr std::chrono::milliseconds timeOfRest{100};
    static constexpr int mostSecondsWithoutRest = 60;

    // What the system says of a process.
    struct Process {
        std::size_t (*residentBytes)(); // of memory that it has from the system
        std::chrono::nanoseconds (*usedTime)(); // of all processors, since its start
    };
    static const Process thisProcess;

    // limits.toml in the configuration directory has the limits; the log reports wrong values in it.
    LinuxMemory(WorkQueues& queues, ConfigurationWatcher& watcher, ProviderLog log,
                const Process& process = thisProcess);

    void letGo(std::size_t bytes) override;
    void clientGone() override;
    [[nodiscard]] MemoryLimits limits() const override;

private:
    void applyLimits();
    void tidyAtRest(int secondsLeft);
    void tidy();

    WorkQueues& queues_;
    const ProviderLog log_;
    const Process process_;
    std::atomic<std::size_t> bytes_ = 0; // since the heaps were last tidied
    std::atomic<std::size_t> residentWhenTidy_; // when they were last tidied, or at the start
    std::atomic<std::size_t> mostOfTheService_ = 0;
    std::atomic<std::size_t> mostOfAUser_ = 0;
    std::atomic<std::size_t> mostOfAClient_ = 0;
    WatchedTomlFile limitsFile_; // destroyed first
};

} // namespace platform
