// SPDX-License-Identifier: Apache-2.0
// The kernel event trace service: sessions that deliver the kernel's trace events of a range of codes.
#pragma once

#include "platform/WorkQueue.h"

#include <array>
#include <cstdint>
#include <functional>
#include <memory>

namespace platform {

// A time of day, since the beginning of 1970.
struct KernelTraceWallTime {
    std::int64_t seconds = 0;
    std::int32_t microseconds = 0;

    friend bool operator==(const KernelTraceWallTime&, const KernelTraceWallTime&) = default;
};

// One event as the kernel recorded it. Plain data of a fixed layout, copied whole.
struct KernelTraceEvent {
    std::uint64_t timestamp = 0; // in the session's own unit; `timestampToNanoseconds` converts
    std::array<std::uint64_t, 4> arguments{};
    std::uint64_t threadID = 0;
    std::uint32_t eventCode = 0;
    std::uint32_t cpu = 0;
    KernelTraceWallTime wallTime{}; // 0 in sessions that did not enable it
    std::array<const char*, 2> texts{}; // for systems that add texts and a number to the arguments
    std::int32_t value = 0;
};
static_assert(sizeof(void*) != 8 || sizeof(KernelTraceEvent) == 96);

// One trace session. Its handlers run on the queue of `start`, in the order of time. Its own completion handler may
// destroy it. If it is destroyed before it is complete, its completion handler does not run; events that are already on
// their way to the queue may still be delivered. Afterwards its handlers are released.
//
// One thread at a time until `start` has returned. After that, `end` and `timestampToNanoseconds` may be called on any
// thread.
class KernelTraceSession {
public:
    virtual ~KernelTraceSession() = default;
    // The handler runs once, after the session ended and all events were delivered; not if the session never got a
    // queue. Call this before `start`.
    virtual void setCompletionHandler(std::function<void()> handler) = 0;
    // Whether events carry their wall-clock time; by default they do not. Call this before `start`.
    virtual void enableWallTimes(bool enabled) = 0;
    // Every handler gets the events with codes in its range, which includes both codes. Returns 0, or an error number
    // for an empty range, for an empty handler, and after `start`.
    virtual int filterEventRange(std::uint32_t firstCode, std::uint32_t lastCode,
                                 std::function<void(const KernelTraceEvent&)> handler) = 0;
    // Returns 0, or an error number without a queue, for a session that was started before, and if the system refuses.
    // A session that the system refused is ended and completed like any other.
    virtual int start(std::shared_ptr<WorkQueue> queue) = 0;
    // Ends the session; further calls have no effect.
    virtual void end() = 0;
    // How many events were lost while it ran, including events of other sessions. Known when the session is complete,
    // so call it in the completion handler.
    [[nodiscard]] virtual std::uint64_t lostEvents() const = 0;
    [[nodiscard]] virtual std::uint64_t timestampToNanoseconds(std::uint64_t timestamp) const = 0;
};

// Any thread.
class KernelTrace {
public:
    virtual ~KernelTrace() = default;
    // Whether this system can trace. Where it cannot, the "Tracing" feature counts as off.
    [[nodiscard]] virtual bool isAvailable() = 0;
    // Null on a system that cannot trace.
    [[nodiscard]] virtual std::unique_ptr<KernelTraceSession> createTraceSession() = 0;
};

} // namespace platform
