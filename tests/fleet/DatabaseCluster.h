// SPDX-License-Identifier: Apache-2.0
// The database of the trial: one ClickHouse, or shards of replicas with ZooKeeper, with the tables that kesto-ingest
// prints.
#pragma once

#include "tools/kesto-ingest/FleetServers.h"

#include <cstddef>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace fleet {

// One thread.
class DatabaseCluster {
public:
    DatabaseCluster(const std::filesystem::path& directory, int shards, int replicas);

    [[nodiscard]] std::string configuredAddresses() const; // as a list of TOML
    [[nodiscard]] kesto_ingest::ClickHouseServer& server(int shard, int replica);
    [[nodiscard]] int replicas() const { return replicas_; }

    // Until each replica has what the others have.
    void awaitReplicas();
    // The lines of the answers of all shards, each from its replica of that number. "{}" in the query stands for the
    // end of a table's name.
    [[nodiscard]] std::string selectFrom(int replica, const std::string& query);

private:
    [[nodiscard]] bool isCluster() const { return replicas_ > 1; }

    int shards_;
    int replicas_;
    std::vector<support::KeptPort> tcpPorts_; // of a cluster
    std::unique_ptr<kesto_ingest::ZooKeeperServer> zookeeper_;
    std::vector<std::unique_ptr<kesto_ingest::ClickHouseServer>> servers_; // by shard, then by replica
};

} // namespace fleet
