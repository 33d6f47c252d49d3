// SPDX-License-Identifier: Apache-2.0
// The first request submits an item, which serves all that came before it runs; those that come while it reads wait
// for the next.
#include "driver/ChannelMoments.h"

#include "platform/Platform.h"
#include "platform/WorkQueue.h"
#include "utility/KestoReportingUtility.h"

#include <system_error>
#include <utility>

namespace driver {

ChannelMoments::ChannelMoments(Read read) : shared_(std::make_shared<Shared>())
{
    shared_->read = std::move(read);
    try {
        queue_ = platform::current().workQueues.makeSerialQueue("com.quarn.kesto.reporting.channels", {});
    } catch (const std::system_error& refusal) { // calls that come late are better than a service that does not start
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Error,
                  "no thread reads the channels of drivers ({}): all calls wait while a session starts or stops",
                  refusal.code().message());
    }
}

void ChannelMoments::next(Take take)
{
    bool isFirst = false;
    {
        const foundation::Lock lock(shared_->lock);
        isFirst = shared_->waiting.empty();
        shared_->waiting.push_back(std::move(take));
    }
    if (queue_ == nullptr)
        serve(*shared_);
    else if (isFirst)
        queue_->submit([shared = shared_] { serve(*shared); });
}

void ChannelMoments::serve(Shared& shared)
{
    std::vector<Take> taking;
    {
        const foundation::Lock lock(shared.lock);
        taking.swap(shared.waiting);
    }
    const session::DriverMoment moment = shared.read();
    for (Take& take : taking)
        take(moment);
}

} // namespace driver
