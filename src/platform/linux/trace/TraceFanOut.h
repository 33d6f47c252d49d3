// Who wants which events of the one trace: every session gets those of its codes and its time, on its own queue, and is
// told when it has got them all.
//
// No thread, no clock and no file here: whoever has the trace says how far it has come.
#pragma once

#include "platform/KernelTrace.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/trace/TracedMarker.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <span>
#include <vector>

namespace platform {

// One session. Filled in before it is added; its times are changed under the lock of whoever has the fan-out. It is
// shared with the queue, on which it may be met when the session itself is gone.
struct TraceSubscription {
    static constexpr std::uint64_t never = std::numeric_limits<std::uint64_t>::max();

    struct Filter {
        std::uint32_t firstCode;
        std::uint32_t lastCode;
        std::function<void(const KernelTraceEvent&)> handler;
        [[nodiscard]] bool accepts(std::uint32_t code) const noexcept { return code >= firstCode && code <= lastCode; }
    };

    std::vector<Filter> filters;
    std::function<void()> completion;
    std::shared_ptr<WorkQueue> queue;
    bool hasWallTimes = false; // wants them
    std::uint64_t startTime = never; // the first moment that belongs to it
    std::uint64_t endTime = never; // the last one
    std::uint64_t lost = 0; // events; perhaps none of them its own
    std::atomic<bool> isDestroyed = false; // nothing more is to be delivered

    [[nodiscard]] bool hasStarted() const noexcept { return startTime != never; }
    [[nodiscard]] bool hasEnded() const noexcept { return endTime != never; }
};

// One thread at a time.
class TraceFanOut {
public:
    // How many sessions there are at most, and how many events, copies counted, may be on their way to queues that are
    // behind; those beyond are lost.
    static constexpr std::size_t mostSessions = 256;
    static constexpr std::size_t mostOnTheirWay = 1'000'000;

    explicit TraceFanOut(ProviderLog log) : log_(log) { }

    // False when there are too many.
    [[nodiscard]] bool add(std::shared_ptr<TraceSubscription> subscription);
    void remove(const TraceSubscription& subscription);

    [[nodiscard]] bool isEmpty() const noexcept { return subscriptions_.empty(); }
    // Whether somebody still wants what happens from now on.
    [[nodiscard]] bool isWanted() const noexcept;
    // The earliest end of those that have ended and are not completed; TraceSubscription::never without one.
    [[nodiscard]] std::uint64_t nextEnd() const noexcept;

    // How many nanoseconds the wall clock is ahead of the trace's, for what is delivered from now on.
    void setWallClock(std::int64_t ahead) noexcept { wallClockAhead_ = ahead; }
    // Delivers events, which are in the order of time. Up to `doneUpTo` there will not be any more: sessions that ended
    // by then are completed, and leave. What was lost meanwhile counts for all.
    void deliver(std::span<const TracedMarker> events, std::uint64_t doneUpTo, std::uint64_t lost);
    // Has a session told that it is complete. `deliver` does it for all that were added.
    void complete(const std::shared_ptr<TraceSubscription>& subscription) const;

private:
    using Subscription = std::shared_ptr<TraceSubscription>;

    void submit(const Subscription& subscription, std::span<const TracedMarker> events);
    [[nodiscard]] KernelTraceEvent eventFor(const TraceSubscription& subscription, const TracedMarker& event) const;
    [[nodiscard]] KernelTraceWallTime wallTime(std::uint64_t timestamp) const;

    const ProviderLog log_;
    std::vector<Subscription> subscriptions_;
    std::int64_t wallClockAhead_ = 0;
    const std::shared_ptr<std::atomic<std::size_t>> onTheirWay_ = std::make_shared<std::atomic<std::size_t>>(0);
};

} // namespace platform
