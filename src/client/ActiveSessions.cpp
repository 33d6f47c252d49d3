// SPDX-License-Identifier: Apache-2.0
// A session is left out by the number of its run: one that began later is not part of the walk. Many may have
// begun meanwhile, so each costs a step.
#include "client/ActiveSessions.h"

#include "client/KestoReportingClientServerInstance.h"

namespace client {

bool ActiveSessions::logNextClient(ListAllowance& allowance)
{
    if (client_ == clients_.size()) {
        begin();
        return false;
    }
    logClient_(*clients_[client_++], allowance);
    return true;
}

void ActiveSessions::begin()
{
    client_ = 0;
    lastRun_ = KestoReportingSession::lastRunOfAll();
    for (const auto& client : clients_)
        count_ += client->clientReportingSessionMap().startedCount();
}

std::string ActiveSessions::describe(ListAllowance& allowance) const
{
    return allowance.describe(count_, [walk = *this]() mutable { return walk.next(); });
}

std::shared_ptr<KestoReportingSession> ActiveSessions::next()
{
    auto session = step();
    while (session && *session == nullptr)
        session = step();
    return session.value_or(nullptr);
}

std::optional<std::shared_ptr<KestoReportingSession>> ActiveSessions::step()
{
    if (client_ == clients_.size())
        return std::nullopt;
    const auto session = clients_[client_]->clientReportingSessionMap().startedBehind(place_);
    if (session == nullptr) {
        ++client_;
        place_ = 0;
        return nullptr;
    }
    return session->lastRun() <= lastRun_ ? session : nullptr;
}

} // namespace client
