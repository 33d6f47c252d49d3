// SPDX-License-Identifier: Apache-2.0
// The share of each process in the log. The connections of a process have one together, and it outlives them until it
// is full again: so a process gains no lines by new connections.
#pragma once

#include "platform/LogShare.h"
#include "platform/WorkQueue.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <utility>

namespace service {

// One thread at a time.
class LogShares {
public:
    using Clock = platform::LogShare::Clock;

    [[nodiscard]] std::shared_ptr<platform::LogShare> ofProcess(const platform::Submitter& process,
                                                                Clock::time_point now = Clock::now());
    // How many it holds.
    [[nodiscard]] std::size_t size() const noexcept { return shares_.size(); }

private:
    std::map<std::pair<std::uint32_t, std::int32_t>, std::shared_ptr<platform::LogShare>>
        shares_; // by user and process
    std::size_t mostShares_ = 0; // then those that nobody needs are removed
};

} // namespace service
