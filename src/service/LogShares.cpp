// SPDX-License-Identifier: Apache-2.0
// Shares that are full and belong to no connection are removed when a new one makes the table twice as large as the
// last time; so the look costs each connection the same on average.
#include "service/LogShares.h"

#include "foundation/text/Format.h"

namespace service {

std::shared_ptr<platform::LogShare> LogShares::ofProcess(const platform::Submitter& process, Clock::time_point now)
{
    auto& known = shares_[{process.user, process.process}];
    if (known != nullptr)
        return known;
    const auto share = known =
        std::make_shared<platform::LogShare>(foundation::format("process {}", process.process), now);
    if (shares_.size() > mostShares_) {
        std::erase_if(shares_,
                      [&](const auto& entry) { return entry.second.use_count() == 1 && entry.second->isFull(now); });
        mostShares_ = 2 * shares_.size();
    }
    return share;
}

} // namespace service
