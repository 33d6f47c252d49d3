// SPDX-License-Identifier: Apache-2.0
// All sessions of some clients, in the order of the clients and then in that of their maps.
//
// There may be a hundred thousand. So the walk may pause: clients and sessions may come and go meanwhile.
#pragma once

#include "client/SessionMap.h"

#include <cstddef>
#include <functional>
#include <memory>
#include <utility>
#include <vector>

class KestoReportingClientServerInstance;

namespace client {

// Server queue.
class SessionWalk {
public:
    using Clients = std::vector<std::shared_ptr<KestoReportingClientServerInstance>>;
    using Visit = std::function<void(const SessionMap::Entry& entry)>;

    explicit SessionWalk(Clients clients) : clients_(std::move(clients)) { }

    // Visits the next few sessions; false if none was left.
    bool visitNext(const Visit& visit);

private:
    Clients clients_;
    std::size_t client_ = 0; // the next one
    SessionMap::Place place_ = 0; // in its map
};

} // namespace client
