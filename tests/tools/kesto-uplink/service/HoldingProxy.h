// SPDX-License-Identifier: Apache-2.0
// A way to a server that can hold back the server's answer to a batch: the stream then has the batch, and the device
// does not know it.
#pragma once

#include <atomic>
#include <string>
#include <thread>

namespace uplink_test {

// The members are for one thread.
class HoldingProxy {
public:
    // Holds the first answers that come.
    explicit HoldingProxy(int serverPort);
    ~HoldingProxy();
    HoldingProxy(const HoldingProxy&) = delete;
    HoldingProxy& operator=(const HoldingProxy&) = delete;

    [[nodiscard]] std::string url() const;
    [[nodiscard]] bool isHolding() const { return isHolding_; }
    void holdNoMore() { holds_ = false; }
    [[nodiscard]] int connections() const { return connections_; } // so far

private:
    void serve();
    void pass(int client) const;

    int serverPort_;
    int listener_;
    int port_ = 0;
    std::atomic<bool> holds_ = true;
    mutable std::atomic<bool> isHolding_ = false;
    std::atomic<int> connections_ = 0;
    std::atomic<bool> ends_ = false;
    std::thread thread_;
};

} // namespace uplink_test
