// SPDX-License-Identifier: Apache-2.0
// The destructor says the rest, so that the lines add up to what the ledger counts.
#include "platform/linux/store/RemovalReport.h"

namespace platform {

RemovalReport::~RemovalReport()
{
    if (removed_.sum() != 0)
        say();
}

void RemovalReport::report()
{
    const double now = clock_.systemUptime();
    if (removed_.sum() == 0 || (saidAt_ && now - *saidAt_ < secondsBetweenLines))
        return;
    say();
    saidAt_ = now;
}

void RemovalReport::say()
{
    log_.note(
        "{} analytics events were removed: {} were too old, {} were the oldest of too many, {} were the oldest of "
        "who holds most; maximum_age_days and maximum_size_mb in analytics.toml set the limits",
        removed_.sum(), removed_.forAge, removed_.forSize, removed_.forShare);
    removed_ = {};
}

} // namespace platform
