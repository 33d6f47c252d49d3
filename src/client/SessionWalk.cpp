// SPDX-License-Identifier: Apache-2.0
// A few sessions at a time, so that finding the place again and reading the clock cost next to nothing.
#include "client/SessionWalk.h"

#include "client/KestoReportingClientServerInstance.h"

namespace client {

bool SessionWalk::visitNext(const Visit& visit)
{
    constexpr std::size_t few = 32;
    if (client_ == clients_.size())
        return false;
    const auto last = clients_[client_]->clientReportingSessionMap().visitBehind(place_, few, visit);
    place_ = last.value_or(0);
    client_ += last ? 0 : 1;
    return true;
}

} // namespace client
