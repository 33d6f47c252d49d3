// Where the queue is kept.
#include "client/KestoReportingServerQueue.h"

#include "platform/Platform.h"

namespace {
std::shared_ptr<platform::WorkQueue> serverQueue;
}

void KestoReportingCreateServerQueue()
{
    serverQueue = platform::current().workQueues.makeSerialQueue(gReportingQueueName,
                                                                 platform::QualityOfService::UserInteractive);
}

const std::shared_ptr<platform::WorkQueue>& KestoReportingServerQueue()
{
    return serverQueue;
}
