// SPDX-License-Identifier: Apache-2.0
// Distributes the events of the one trace: every session gets the events of its codes and its time on its own queue,
// and then its completion.
//
// It has no thread, clock or file of its own: its owner says how far the trace has come.
#pragma once

#include "platform/KernelTrace.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/trace/CollectedEvent.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <limits>
#include <memory>
#include <span>
#include <vector>

namespace platform {

// One session. It is filled in before it is added; its times change under the lock of the fan-out's owner. The queue
// shares it and may use it after the session itself was destroyed.
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
    bool hasWallTimes = false; // events carry the wall-clock time
    std::uint64_t startTime = never; // the first moment of the session
    std::uint64_t endTime = never; // the last one
    std::uint64_t lost = 0; // events, including those of other sessions
    std::atomic<bool> isDestroyed = false; // nothing more may be delivered

    [[nodiscard]] bool hasStarted() const noexcept { return startTime != never; }
    [[nodiscard]] bool hasEnded() const noexcept { return endTime != never; }
};

// One thread at a time.
class TraceFanOut {
public:
    // The greatest numbers of sessions and of events on their way to slow queues (each copy counts); further events are
    // lost.
    static constexpr std::size_t mostSessions = 256;
    static constexpr std::size_t mostOnTheirWay = 1'000'000;

    explicit TraceFanOut(ProviderLog log) : log_(log) { }

    // False if there are too many.
    [[nodiscard]] bool add(std::shared_ptr<TraceSubscription> subscription);
    void remove(const TraceSubscription& subscription);

    [[nodiscard]] bool isEmpty() const noexcept { return subscriptions_.empty(); }
    // Whether a session still needs events from now on.
    [[nodiscard]] bool isWanted() const noexcept;
    // The earliest end of the sessions that have ended and are not completed; TraceSubscription::never without one.
    [[nodiscard]] std::uint64_t nextEnd() const noexcept;

    // By how many nanoseconds the wall clock is ahead of the trace's clock, for events that are delivered from now on.
    void setWallClock(std::int64_t ahead) noexcept { wallClockAhead_ = ahead; }
    // Delivers events, which are in the order of time. No further events up to `doneUpTo` will come: sessions that
    // ended by then are completed and removed. `lost` events count for all sessions.
    void deliver(std::span<const CollectedEvent> events, std::uint64_t doneUpTo, std::uint64_t lost);
    // Calls a session's completion on its queue. `deliver` does this for all added sessions.
    void complete(const std::shared_ptr<TraceSubscription>& subscription) const;

private:
    using Subscription = std::shared_ptr<TraceSubscription>;

    void submit(const Subscription& subscription, std::span<const CollectedEvent> events);
    [[nodiscard]] KernelTraceEvent eventFor(const TraceSubscription& subscription, const CollectedEvent& event) const;
    [[nodiscard]] KernelTraceWallTime wallTime(std::uint64_t timestamp) const;

    const ProviderLog log_;
    std::vector<Subscription> subscriptions_;
    std::int64_t wallClockAhead_ = 0;
    const std::shared_ptr<std::atomic<std::size_t>> onTheirWay_ = std::make_shared<std::atomic<std::size_t>>(0);
};

} // namespace platform
