// SPDX-License-Identifier: Apache-2.0
// The place of the queue.
#include "utility/ServerQueue.h"

#include "platform/Platform.h"

namespace utility {

namespace {
std::shared_ptr<platform::TurnQueue> queue;
}

void createServerQueue()
{
    queue = platform::current().workQueues.makeTurnQueue(
        gReportingQueueName, {.quality = platform::QualityOfService::UserInteractive, .mayBeHelped = true});
}

const std::shared_ptr<platform::TurnQueue>& serverQueue()
{
    return queue;
}

} // namespace utility
