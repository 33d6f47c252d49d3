// SPDX-License-Identifier: Apache-2.0
// A real nats-server and a real ClickHouse of a test's own, on loopback, in a directory of their own.
#pragma once

#include "sdk/Process.h"
#include "support/TemporaryDirectory.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

namespace kesto_ingest {

// The body of the answer; "no answer: " and the reason if there is none. A question with a body is a POST.
[[nodiscard]] std::string ask(const std::string& address, const std::string& body = {});

// Throws if the condition does not hold in time.
void waitUntil(const std::string& what, const std::function<bool()>& holds);

// Ends with the test, even if that is killed.
class NatsServer {
public:
    explicit NatsServer(const std::filesystem::path& directory);

    void end(); // at once
    [[nodiscard]] std::string address() const { return "nats://127.0.0.1:" + std::to_string(port_); }

private:
    std::unique_ptr<sdk_test::Process> process_;
    std::uint16_t port_ = 0;
};

class ClickHouseServer {
public:
    explicit ClickHouseServer(std::filesystem::path directory);

    void start(); // perhaps on another port than before
    void end(); // at once, without a chance to finish
    void makeTables() const;
    [[nodiscard]] std::string address() const { return "http://127.0.0.1:" + std::to_string(port_); }
    [[nodiscard]] std::uint16_t port() const { return port_; }
    // Without the end of the last line.
    [[nodiscard]] std::string select(const std::string& query) const;

private:
    [[nodiscard]] bool isReady() const;

    std::filesystem::path directory_;
    std::uint16_t port_ = 0;
    std::unique_ptr<sdk_test::Process> process_;
};

} // namespace kesto_ingest
