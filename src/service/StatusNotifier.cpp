// SPDX-License-Identifier: Apache-2.0
// The ledger keeps the notifier while it awaits a change, and the queue while a renewal is due.
#include "service/StatusNotifier.h"

#include <utility>

namespace service {

void StatusNotifier::start(ledger::Ledger& ledger, const platform::Clock& clock, platform::WorkQueues& queues,
                           const ledger::ServiceProcess& process, Notify notify)
{
    const std::shared_ptr<StatusNotifier> notifier(
        new StatusNotifier(ledger, clock, queues, process, std::move(notify)));
    notifier->awaitChange();
}

void StatusNotifier::awaitChange()
{
    ledger_.callAtNextChange([self = shared_from_this()] {
        self->queues_.submitAfter(interval, self->queues_.backgroundQueue(), [self] { self->renew(); });
    });
}

// Awaits the next change first, so that none between the report and the waiting is missed.
void StatusNotifier::renew()
{
    awaitChange();
    notify_(ledger::statusLine(ledger::report(ledger_, process_, false), clock_.secondsSince1970()));
}

} // namespace service
