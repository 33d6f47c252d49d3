// SPDX-License-Identifier: Apache-2.0
// The end of the service reports the losses that are not reported yet, so that none is forgotten.
#include "platform/linux/store/EventLosses.h"

namespace platform {

void EventLosses::add(StoreError reason, std::uint64_t events)
{
    const foundation::Lock lock(lock_);
    losses_[static_cast<std::size_t>(reason)].events += events;
}

void EventLosses::report()
{
    const double now = clock_.systemUptime();
    reportIf([now](const Loss& loss) { return loss.reported == 0 || now - loss.reportedAt >= secondsBetweenLines; });
}

void EventLosses::reportAll()
{
    reportIf([](const Loss&) { return true; });
}

template <typename IsDue> void EventLosses::reportIf(IsDue isDue)
{
    const foundation::Lock lock(lock_);
    for (std::size_t reason = 0; reason < storeErrorCount; ++reason)
        if (Loss& loss = losses_[reason]; loss.reported < loss.events && isDue(loss))
            log(static_cast<StoreError>(reason), loss);
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
