// SPDX-License-Identifier: Apache-2.0
// How large a trial is. The scenarios are the same in both editions.
#pragma once

#include <cstddef>

namespace fleet {

struct Edition {
    int brokers = 1; // nats-servers, each of which keeps all streams
    int shards = 1; // of the database
    int replicas = 1; // of each shard; with two come replicated tables, and ZooKeeper
    int ingests = 1;
    std::size_t devices = 20; // made up
    std::size_t sessions = 12; // of a device's made-up weeks
    std::size_t realDevices = 1; // a kestod and a kesto-uplink each
    std::size_t workers = 8; // threads, of which each plays one device at a time
    std::size_t measuredSessions = 200; // of the device at which the uplink's memory is measured

    [[nodiscard]] bool isCluster() const { return replicas > 1; }
};

constexpr Edition smallEdition{};
constexpr Edition wholeEdition{.brokers = 3,
                               .shards = 2,
                               .replicas = 2,
                               .ingests = 2,
                               .devices = 1000,
                               .sessions = 40,
                               .realDevices = 3,
                               .workers = 32,
                               .measuredSessions = 3000};

} // namespace fleet
