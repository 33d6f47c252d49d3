// SPDX-License-Identifier: Apache-2.0
// A kernel trace with events that the test makes.
#pragma once

#include "platform/KernelTrace.h"

#include <string>
#include <vector>

namespace support {

// One thread.
class FakeKernelTrace final : public platform::KernelTrace {
public:
    struct Filter {
        std::uint32_t firstCode;
        std::uint32_t lastCode;
        std::function<void(const platform::KernelTraceEvent&)> handler;
    };
    // The record of one session; it stays when the session is destroyed, without the handlers.
    struct Session {
        bool wallTimes = false;
        bool started = false;
        bool ended = false;
        bool destroyed = false;
        std::uint64_t lost = 0;
        std::vector<Filter> filters;
        std::function<void()> completion;
        std::shared_ptr<platform::WorkQueue> queue;
    };

    // Whether this system can trace, and the error numbers of the two steps that can fail.
    bool available = true;
    int filterError = 0;
    int startError = 0;
    // Whether sessions, started or not, are completed after their end.
    bool completes = true;
    // The unit of time; by default a nanosecond.
    std::function<std::uint64_t(std::uint64_t)> toNanoseconds;

    // The sessions that were made, in order.
    [[nodiscard]] const std::vector<std::shared_ptr<Session>>& sessions() const { return sessions_; }
    // Delivers the event to every running session that filters for its code; with its wall-clock time to those that
    // enabled it. Events are delivered in the order of time.
    void deliver(platform::KernelTraceEvent event);
    // Every running session loses so many events.
    void lose(std::uint64_t count);

    bool isAvailable() override { return available; }
    std::unique_ptr<platform::KernelTraceSession> createTraceSession() override;

private:
    class Handle;
    [[nodiscard]] static bool isRunning(const Session& session)
    {
        return session.started && !session.ended && !session.destroyed;
    }

    std::vector<std::shared_ptr<Session>> sessions_;
    std::uint64_t lastTimestamp_ = 0;
};

} // namespace support
