// The destructor reports the losses that are not reported yet, so that none is forgotten when the service ends.
#include "platform/linux/store/EventLosses.h"

namespace platform {

EventLosses::~EventLosses()
{
    for (std::size_t reason = 0; reason < storeErrorCount; ++reason)
        if (losses_[reason].reported < losses_[reason].events)
            log(static_cast<StoreError>(reason), losses_[reason]);
}

void EventLosses::add(StoreError reason, std::uint64_t events)
{
    losses_[static_cast<std::size_t>(reason)].events += events;
}

void EventLosses::report()
{
    const double now = clock_.systemUptime();
    for (std::size_t reason = 0; reason < storeErrorCount; ++reason) {
        Loss& loss = losses_[reason];
        const bool isDue = loss.reported == 0 || now - loss.reportedAt >= secondsBetweenLines;
        if (loss.reported < loss.events && isDue)
            log(static_cast<StoreError>(reason), loss);
    }
}

void EventLosses::log(StoreError reason, Loss& loss)
{
    const auto& [counter, path, meaning, problem, remedy] = row(counterOf(reason));
    const std::uint64_t events = loss.events;
    log_.error("{} analytics events were lost ({} since the start): {}: {}; {}", events - loss.reported, events,
               path_.native(), problem, remedy);
    loss.reported = events;
    loss.reportedAt = clock_.systemUptime();
}

} // namespace platform
