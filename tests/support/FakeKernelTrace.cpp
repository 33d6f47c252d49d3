// What a session was told is written down; events come, and sessions complete, when a test has them do so.
#include "support/FakeKernelTrace.h"

#include <utility>

namespace support {

class FakeKernelTrace::Handle final : public platform::KernelTraceSession {
public:
    Handle(const FakeKernelTrace& service, std::shared_ptr<Session> session)
        : service_(service),
          session_(std::move(session))
    {
    }
    ~Handle() override { session_->destroyed = true; }
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;

    void setCompletionHandler(std::function<void()> handler) override { session_->completion = std::move(handler); }
    void enableWallTimes(bool enabled) override { session_->wallTimes = enabled; }
    int filterEventRange(std::uint32_t firstCode, std::uint32_t lastCode,
                         std::function<void(const platform::KernelTraceEvent&)> handler) override
    {
        session_->filters.push_back({firstCode, lastCode, std::move(handler)});
        return service_.filterError;
    }
    int start(std::shared_ptr<platform::WorkQueue> queue) override
    {
        session_->queue = std::move(queue);
        session_->started = service_.startError == 0;
        return service_.startError;
    }
    void end() override
    {
        session_->ended = true;
        if (session_->queue && session_->completion && service_.completes)
            session_->queue->submit(session_->completion);
    }
    [[nodiscard]] std::uint64_t lostEvents() const override { return service_.lost; }
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
    const platform::KernelTraceWallTime wallTime = event.wallTime;
    for (const auto& session : sessions_) {
        event.wallTime = session->wallTimes ? wallTime : platform::KernelTraceWallTime();
        for (const auto& [firstCode, lastCode, handler] : session->filters)
            if (session->started && !session->ended && !session->destroyed && event.eventCode >= firstCode
                && event.eventCode <= lastCode)
                session->queue->submit([handler, event] { handler(event); });
    }
}

std::unique_ptr<platform::KernelTraceSession> FakeKernelTrace::createTraceSession()
{
    if (!available)
        return nullptr;
    return std::make_unique<Handle>(*this, sessions_.emplace_back(std::make_shared<Session>()));
}

} // namespace support
