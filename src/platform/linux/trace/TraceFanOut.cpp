// SPDX-License-Identifier: Apache-2.0
// For each step of the trace every session gets its events as one item of its queue; the number of events on their way
// is bounded, because that queue may be slow.
#include "platform/linux/trace/TraceFanOut.h"

#include <algorithm>
#include <chrono>
#include <utility>

namespace platform {

bool TraceFanOut::add(std::shared_ptr<TraceSubscription> subscription)
{
    if (subscriptions_.size() >= mostSessions)
        return false;
    subscriptions_.push_back(std::move(subscription));
    return true;
}

void TraceFanOut::remove(const TraceSubscription& subscription)
{
    std::erase_if(subscriptions_, [&](const Subscription& each) { return each.get() == &subscription; });
}

bool TraceFanOut::isWanted() const noexcept
{
    return std::ranges::any_of(subscriptions_, [](const Subscription& each) { return !each->hasEnded(); });
}

std::uint64_t TraceFanOut::nextEnd() const noexcept
{
    std::uint64_t end = TraceSubscription::never;
    for (const Subscription& subscription : subscriptions_)
        end = std::min(end, subscription->endTime);
    return end;
}

void TraceFanOut::deliver(std::span<const CollectedEvent> events, std::uint64_t doneUpTo, std::uint64_t lost)
{
    for (const Subscription& subscription : subscriptions_) {
        subscription->lost += lost;
        const auto begin = std::ranges::lower_bound(events, subscription->startTime, {}, &CollectedEvent::timestamp);
        const auto end =
            std::ranges::upper_bound(begin, events.end(), subscription->endTime, {}, &CollectedEvent::timestamp);
        submit(subscription, {begin, end});
        if (subscription->hasEnded() && subscription->endTime <= doneUpTo)
            complete(subscription);
    }
    std::erase_if(subscriptions_,
                  [&](const Subscription& each) { return each->hasEnded() && each->endTime <= doneUpTo; });
}

void TraceFanOut::submit(const Subscription& subscription, std::span<const CollectedEvent> events)
{
    std::vector<KernelTraceEvent> wanted;
    for (const CollectedEvent& event : events)
        if (std::ranges::any_of(subscription->filters,
                                [&](const auto& each) { return each.accepts(event.emitted.code); }))
            wanted.push_back(eventFor(*subscription, event));
    if (wanted.empty())
        return;
    if (const std::size_t before = onTheirWay_->load(); before + wanted.size() > mostOnTheirWay) {
        const std::size_t room = mostOnTheirWay - std::min(before, mostOnTheirWay);
        subscription->lost += wanted.size() - room;
        wanted.resize(room);
    }
    *onTheirWay_ += wanted.size();
    subscription->queue->submit([subscription, onTheirWay = onTheirWay_, wanted = std::move(wanted)] {
        for (const KernelTraceEvent& event : wanted)
            for (const auto& filter : subscription->filters)
                if (filter.accepts(event.eventCode) && !subscription->isDestroyed.load(std::memory_order_relaxed))
                    filter.handler(event);
        *onTheirWay -= wanted.size();
    });
}

KernelTraceEvent TraceFanOut::eventFor(const TraceSubscription& subscription, const CollectedEvent& event) const
{
    return {.timestamp = event.timestamp,
            .arguments = event.emitted.arguments,
            .threadID = event.threadID,
            .eventCode = event.emitted.code,
            .cpu = event.cpu,
            .wallTime = subscription.hasWallTimes ? wallTime(event.timestamp) : KernelTraceWallTime()};
}

KernelTraceWallTime TraceFanOut::wallTime(std::uint64_t timestamp) const
{
    using namespace std::chrono;
    const nanoseconds time(static_cast<std::int64_t>(timestamp + static_cast<std::uint64_t>(wallClockAhead_)));
    const auto second = floor<seconds>(time);
    return {.seconds = second.count(),
            .microseconds = static_cast<std::int32_t>(floor<microseconds>(time - second).count())};
}

void TraceFanOut::complete(const Subscription& subscription) const
{
    if (subscription->lost != 0)
        log_.error("a trace session of {:.3f} s lost up to {} events: they came faster than the service read them",
                   static_cast<double>(subscription->endTime - subscription->startTime) / 1e9, subscription->lost);
    if (subscription->completion)
        subscription->queue->submit([subscription] {
            if (!subscription->isDestroyed)
                std::exchange(subscription->completion, nullptr)(); // which may destroy the session
        });
}

} // namespace platform
