// SPDX-License-Identifier: Apache-2.0
// The broker of the trial: one nats-server, or a cluster in which each keeps all streams.
#pragma once

#include "support/KeptPort.h"
#include "tools/kesto-ingest/FleetServers.h"

#include <nats/nats.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace fleet {

// Of the stream of batches, for its consumer. The leader's name is that of NatsServer.
struct StreamState {
    std::uint64_t waiting = 0; // messages that are not acknowledged
    std::uint64_t bytes = 0;
    std::string leader = {}; // empty: none, for now
    bool isComplete = false; // each member has all
};

// One thread.
class Broker {
public:
    // `credentials` are names, each with itself as its password.
    Broker(const std::filesystem::path& directory, int servers, const std::vector<std::string>& credentials);

    [[nodiscard]] std::vector<std::string> addresses() const;
    [[nodiscard]] std::string configuredAddresses() const; // as a list of TOML

    // A server that was killed may keep messages that an ingest has acknowledged. They do not count as waiting.
    [[nodiscard]] StreamState stream();
    void awaitWhole(); // a leader, and all members have all
    // The numbers of servers. With one server, both are that one.
    [[nodiscard]] std::size_t leader();
    [[nodiscard]] std::size_t follower();
    [[nodiscard]] kesto_ingest::NatsServer& server(std::size_t number) { return *servers_[number]; }

    // Batches of this credential that are put aside, with this word in their reason.
    [[nodiscard]] std::size_t deadLetters(const std::string& credential, const std::string& word);

private:
    void asAdministrator(const std::function<void(jsCtx*)>& work);

    std::filesystem::path accounts_;
    std::vector<support::KeptPort> clusterPorts_;
    std::vector<std::unique_ptr<kesto_ingest::NatsServer>> servers_;
};

} // namespace fleet
