// SPDX-License-Identifier: Apache-2.0
// A way to a server on which a test can lose answers, or make bytes wait as a slow link does.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <list>
#include <string>
#include <thread>

namespace support {

// The members are for one thread. Many connections may be open at once.
class Relay {
public:
    // With a rate, no more bytes pass in a second in each direction of a connection. 0: as many as come.
    explicit Relay(std::uint16_t serverPort, std::size_t bytesPerSecond = 0);
    ~Relay();
    Relay(const Relay&) = delete;
    Relay& operator=(const Relay&) = delete;

    [[nodiscard]] std::uint16_t port() const { return port_; }

    // From now on what the server says in one piece with this word is lost. An empty word: all that it says.
    void loseAnswersWith(const std::string& word);
    [[nodiscard]] bool hasLostAnAnswer() const { return hasLost_; }
    void loseNothing() { loses_ = false; }
    [[nodiscard]] int connections() const { return connections_; } // so far

private:
    struct Pair {
        platform::FileDescriptor client;
        platform::FileDescriptor server;
    };

    void serve();
    void accept();
    [[nodiscard]] bool pass(int from, int to, bool isAnswer); // false: one end has closed

    const std::uint16_t serverPort_;
    const std::size_t mostInATurn_; // 0: no limit
    platform::FileDescriptor listener_;
    std::uint16_t port_ = 0;
    std::string word_; // set before `loses_`
    std::atomic<bool> loses_ = false;
    std::atomic<bool> hasLost_ = false;
    std::atomic<int> connections_ = 0;
    std::atomic<bool> ends_ = false;
    std::list<Pair> pairs_; // of the thread
    std::thread thread_;
};

} // namespace support
