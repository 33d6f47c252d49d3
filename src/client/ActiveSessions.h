// SPDX-License-Identifier: Apache-2.0
// The started sessions of all clients, in the order in which the clients registered, and then in that of their maps.
//
// There may be a hundred thousand. So this is not a list but a walk, which may pause: clients and sessions may come and
// go meanwhile, and a session that starts meanwhile does not count.
#pragma once

#include "client/ListAllowance.h"
#include "client/SessionWalk.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>

namespace client {

// Server queue.
class ActiveSessions {
public:
    using Clients = SessionWalk::Clients;

    // Logs all sessions of a client, started or not.
    using LogClient = std::function<void(const KestoReportingClientServerInstance& client, ListAllowance& allowance)>;

    ActiveSessions(Clients clients, LogClient logClient)
        : clients_(std::move(clients)),
          logClient_(std::move(logClient))
    {
    }

    // First: logs the sessions of the next client. False if no client is left; then the walk over the started sessions
    // begins.
    bool logNextClient(ListAllowance& allowance);
    // How many were started when it began.
    [[nodiscard]] std::size_t count() const { return count_; }
    // Those that are started now, for the log.
    [[nodiscard]] std::string describe(ListAllowance& allowance) const;
    // One step: the next of them, or null if the one that came next has been started since then. Nothing at the end.
    [[nodiscard]] std::optional<std::shared_ptr<KestoReportingSession>> step();

private:
    void begin();
    [[nodiscard]] std::shared_ptr<KestoReportingSession> next(); // null at the end

    Clients clients_;
    LogClient logClient_;
    std::size_t client_ = 0; // the next one
    SessionMap::Place place_ = 0; // in its map
    std::size_t count_ = 0;
    std::uint64_t lastRun_ = 0;
};

} // namespace client
