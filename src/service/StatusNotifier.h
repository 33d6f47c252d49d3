// SPDX-License-Identifier: Apache-2.0
// The one line about the service that the service manager shows: renewed when something was counted, but at most every
// five seconds. While nothing is counted, nothing runs.
#pragma once

#include "ledger/Ledger.h"
#include "ledger/Report.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>

namespace service {

class StatusNotifier : public std::enable_shared_from_this<StatusNotifier> {
public:
    static constexpr std::chrono::seconds interval{5};
    using Notify = std::function<void(const std::string& line)>;

    // Notifies from now on, on the background queue. The ledger, the clock and the queues must outlive that queue's
    // work. Any thread.
    static void start(ledger::Ledger& ledger, const platform::Clock& clock, platform::WorkQueues& queues,
                      const ledger::ServiceProcess& process, Notify notify);

private:
    StatusNotifier(ledger::Ledger& ledger, const platform::Clock& clock, platform::WorkQueues& queues,
                   const ledger::ServiceProcess& process, Notify notify)
        : ledger_(ledger),
          clock_(clock),
          queues_(queues),
          process_(process),
          notify_(std::move(notify))
    {
    }
    void awaitChange();
    void renew();

    ledger::Ledger& ledger_;
    const platform::Clock& clock_;
    platform::WorkQueues& queues_;
    const ledger::ServiceProcess process_;
    const Notify notify_;
};

} // namespace service
