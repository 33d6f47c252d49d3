// SPDX-License-Identifier: Apache-2.0
// Questions go to the tables of each server, not to those above them: so what one replica lacks is seen.
#include "fleet/DatabaseCluster.h"

#include <fmt/format.h>

#include <stdexcept>

namespace fleet {

using kesto_ingest::ClickHouseServer;
using kesto_ingest::waitUntil;
using kesto_ingest::ZooKeeperServer;

DatabaseCluster::DatabaseCluster(const std::filesystem::path& directory, int shards, int replicas)
    : shards_(shards),
      replicas_(replicas)
{
    std::filesystem::create_directories(directory);
    if (!isCluster()) {
        servers_.push_back(std::make_unique<ClickHouseServer>(directory / "clickhouse"));
        servers_.front()->makeTables();
        return;
    }
    tcpPorts_ = std::vector<support::KeptPort>(static_cast<std::size_t>(shards * replicas));
    zookeeper_ = std::make_unique<ZooKeeperServer>(directory / "zookeeper");
    std::string cluster;
    for (std::size_t number = 0; number < tcpPorts_.size(); ++number) {
        const bool isFirstOfAShard = number % static_cast<std::size_t>(replicas) == 0;
        cluster += fmt::format("{}{}", number == 0 ? "" : isFirstOfAShard ? ":" : ",", tcpPorts_[number].number());
    }
    for (int shard = 1; shard <= shards; ++shard)
        for (int replica = 1; replica <= replicas; ++replica)
            servers_.push_back(std::make_unique<ClickHouseServer>(
                directory / fmt::format("clickhouse-{}-{}", shard, replica), tcpPorts_[servers_.size()].number(),
                ClickHouseServer::Membership{zookeeper_->address(), shard, replica, cluster}));
    servers_.front()->makeTables("fleet");
}

std::string DatabaseCluster::configuredAddresses() const
{
    std::string list;
    for (const auto& server : servers_)
        list += fmt::format("{}\"{}\"", list.empty() ? "" : ", ", server->address());
    return "[" + list + "]";
}

ClickHouseServer& DatabaseCluster::server(int shard, int replica)
{
    return *servers_[static_cast<std::size_t>((shard - 1) * replicas_ + replica - 1)];
}

void DatabaseCluster::awaitReplicas()
{
    if (!isCluster())
        return;
    for (const auto& server : servers_)
        waitUntil("all replicas have all", [&] {
            return server->select("SELECT count() FROM system.replicas WHERE database = 'kesto' AND queue_size = 0 AND"
                                  " log_pointer > log_max_index AND active_replicas = total_replicas")
                == "4";
        });
}

std::string DatabaseCluster::selectFrom(int replica, const std::string& query)
{
    std::string lines;
    for (int shard = 1; shard <= shards_; ++shard) {
        const std::string answer =
            server(shard, replica).select(fmt::format(fmt::runtime(query), isCluster() ? "_local" : ""));
        if (answer.contains("DB::Exception") || answer.starts_with("no answer: "))
            throw std::runtime_error("the database does not answer: " + answer);
        lines += answer.empty() ? "" : answer + "\n";
    }
    return lines;
}

} // namespace fleet
