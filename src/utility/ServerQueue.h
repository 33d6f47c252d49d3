// SPDX-License-Identifier: Apache-2.0
// The server queue: the one serial queue for everything that touches clients and sessions, so that none of it needs a
// lock.
#pragma once

#include "platform/WorkQueue.h"

#include <cassert>
#include <memory>
#include <string_view>

constexpr std::string_view gReportingQueueName = "com.quarn.kesto.reporting.server";

namespace utility {

// Makes the queue, in place of an earlier one. Call it before the first client is accepted.
void createServerQueue();

// The queue. Any thread.
[[nodiscard]] const std::shared_ptr<platform::TurnQueue>& serverQueue();

// In debug builds, ends the process if it is called outside the server queue. Without a server queue, as in a program
// that drives sessions directly, one thread may take its place.
inline void assertServerQueue()
{
    assert(serverQueue() == nullptr || serverQueue()->isCurrent());
}

} // namespace utility
