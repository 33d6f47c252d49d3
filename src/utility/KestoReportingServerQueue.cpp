// Where the queue is kept.
#include "utility/KestoReportingServerQueue.h"

#include "platform/Platform.h"

namespace {
std::shared_ptr<platform::TurnQueue> serverQueue;
}

void KestoReportingCreateServerQueue()
{
    serverQueue = platform::current().workQueues.makeTurnQueue(
        gReportingQueueName, {.quality = platform::QualityOfService::UserInteractive, .mayBeHelped = true});
}

const std::shared_ptr<platform::TurnQueue>& KestoReportingServerQueue()
{
    return serverQueue;
}
