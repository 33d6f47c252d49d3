// SPDX-License-Identifier: Apache-2.0
// Records the calls of each session; a test delivers events and completes sessions.
#include "support/fakes/FakeKernelTrace.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <utility>

namespace support {

class FakeKernelTrace::Handle final : public platform::KernelTraceSession {
public:
    Handle(const FakeKernelTrace& service, std::shared_ptr<Session> session)
        : service_(service),
          session_(std::move(session))
    {
    }
    ~Handle() override
    {
        session_->destroyed = true;
        session_->completion = nullptr;
        for (Filter& filter : session_->filters)
            filter.handler = nullptr;
    }
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;

    void setCompletionHandler(std::function<void()> handler) override
    {
        EXPECT_FALSE(session_->queue) << "it has started";
        session_->completion = std::move(handler);
    }
    void enableWallTimes(bool enabled) override
    {
        EXPECT_FALSE(session_->queue) << "it has started";
        session_->wallTimes = enabled;
    }
    int filterEventRange(std::uint32_t firstCode, std::uint32_t lastCode,
                         std::function<void(const platform::KernelTraceEvent&)> handler) override
    {
        if (session_->queue)
            return EBUSY;
        if (firstCode > lastCode || !handler)
            return EINVAL;
        if (service_.filterError == 0)
            session_->filters.push_back({firstCode, lastCode, std::move(handler)});
        return service_.filterError;
    }
    int start(std::shared_ptr<platform::WorkQueue> queue) override
    {
        if (session_->queue)
            return EALREADY;
        if (!queue)
            return EINVAL;
        session_->queue = std::move(queue);
        session_->started = service_.startError == 0;
        return service_.startError;
    }
    void end() override
    {
        if (session_->queue && !std::exchange(session_->ended, true) && service_.completes)
            session_->queue->submit([session = session_] {
                if (const auto completion = std::exchange(session->completion, nullptr))
                    completion(); // may destroy the session
            });
    }
    [[nodiscard]] std::uint64_t lostEvents() const override { return session_->lost; }
    [[nodiscard]] std::uint64_t timestampToNanoseconds(std::uint64_t timestamp) const override
    {
        return service_.toNanoseconds ? service_.toNanoseconds(timestamp) : timestamp;
    }

private:
    const FakeKernelTrace& service_;
    const std::shared_ptr<Session> session_;
};

void FakeKernelTrace::deliver(platform::KernelTraceEvent event)
{
    EXPECT_GE(event.timestamp, std::exchange(lastTimestamp_, event.timestamp)) << "the kernel's time goes on";
    const platform::KernelTraceWallTime wallTime = event.wallTime;
    for (const auto& session : sessions_) {
        if (!isRunning(*session))
            continue;
        event.wallTime = session->wallTimes ? wallTime : platform::KernelTraceWallTime();
        for (const auto& [firstCode, lastCode, handler] : session->filters)
            if (event.eventCode >= firstCode && event.eventCode <= lastCode)
                session->queue->submit([handler, event] { handler(event); });
    }
}

void FakeKernelTrace::lose(std::uint64_t count)
{
    for (const auto& session : sessions_)
        if (isRunning(*session))
            session->lost += count;
}

std::unique_ptr<platform::KernelTraceSession> FakeKernelTrace::createTraceSession()
{
    if (!available)
        return nullptr;
    return std::make_unique<Handle>(*this, sessions_.emplace_back(std::make_shared<Session>()));
}

} // namespace support
