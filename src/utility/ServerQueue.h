// The server queue: the one serial queue on which everything runs that touches clients and sessions, so that
// none of it needs a lock.
#pragma once

#include "platform/WorkQueue.h"

#include <cassert>
#include <memory>
#include <string_view>

constexpr std::string_view gReportingQueueName = "com.quarn.kesto.reporting.server";

namespace utility {

// Makes the queue, in place of the one before. Before any client is accepted.
void createServerQueue();

// The queue. Any thread.
[[nodiscard]] const std::shared_ptr<platform::TurnQueue>& serverQueue();

// In debug builds, ends the process when what belongs on the server queue is called from elsewhere. Where there is no
// server queue, as in a program that drives sessions by itself, one thread may stand for it.
inline void assertServerQueue()
{
    assert(serverQueue() == nullptr || serverQueue()->isCurrent());
}

} // namespace utility
