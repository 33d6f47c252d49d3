// SPDX-License-Identifier: Apache-2.0
// Real servers of a test's own, on loopback, in directories of their own: nats-server and ClickHouse, alone or as
// members of a cluster, and ZooKeeper. Each keeps its ports while it is away, and ends with the test, even if that is
// killed.
#pragma once

#include "sdk/Process.h"
#include "support/KeptPort.h"
#include "support/TemporaryDirectory.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace kesto_ingest {

// The body of the answer; "no answer: " and the reason if there is none. A question with a body is a POST.
[[nodiscard]] std::string ask(const std::string& address, const std::string& body = {});

// Throws if the condition does not hold in time.
void waitUntil(const std::string& what, const std::function<bool()>& holds);

class NatsServer {
public:
    // The accounts are those of packaging/fleet, unless others are given.
    explicit NatsServer(const std::filesystem::path& directory);
    // One of a cluster: its port for the others, and the ports of all. It is ready when a client is served.
    NatsServer(std::filesystem::path directory, std::filesystem::path accounts, std::uint16_t clusterPort = 0,
               std::vector<std::uint16_t> routes = {});

    void start(); // again
    void end(); // at once
    [[nodiscard]] std::string address() const { return "nats://127.0.0.1:" + std::to_string(port_.number()); }
    [[nodiscard]] std::string name() const { return "nats-" + std::to_string(port_.number()); } // in the cluster

private:
    const std::filesystem::path directory_;
    const std::filesystem::path accounts_;
    const std::uint16_t clusterPort_;
    const std::vector<std::uint16_t> routes_;
    const support::KeptPort port_;
    std::unique_ptr<sdk_test::Process> process_;
};

class ZooKeeperServer {
public:
    explicit ZooKeeperServer(const std::filesystem::path& directory);

    [[nodiscard]] std::string address() const { return "127.0.0.1:" + std::to_string(port_.number()); }

private:
    const support::KeptPort port_;
    std::unique_ptr<sdk_test::Process> process_;
};

class ClickHouseServer {
public:
    // Where a server stands in a cluster, as start-clickhouse takes it.
    struct Membership {
        std::string zookeeper;
        int shard = 1;
        int replica = 1;
        std::string cluster; // the TCP ports of all
    };

    explicit ClickHouseServer(std::filesystem::path directory); // alone
    ClickHouseServer(std::filesystem::path directory, std::uint16_t tcpPort, const Membership& membership);

    void start(); // again
    void end(); // at once, without a chance to finish
    void makeTables(const std::string& cluster = {}) const;
    [[nodiscard]] std::string address() const { return "http://127.0.0.1:" + std::to_string(port()); }
    [[nodiscard]] std::uint16_t port() const { return port_.number(); }
    // Without the end of the last line.
    [[nodiscard]] std::string select(const std::string& query) const;
    [[nodiscard]] pid_t process() const { return process_->identifier(); }

private:
    [[nodiscard]] bool isReady() const;

    const std::filesystem::path directory_;
    const support::KeptPort port_;
    const support::KeptPort ownTCPPort_;
    const support::KeptPort interserverPort_;
    sdk_test::Process::Arguments arguments_;
    std::unique_ptr<sdk_test::Process> process_;
};

} // namespace kesto_ingest
