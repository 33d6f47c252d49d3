// SPDX-License-Identifier: Apache-2.0
// Clients that send as fast as they get answers, through every fault: when the service goes, they come back.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <thread>
#include <vector>

namespace soak {

// What all clients together know for certain.
struct Known {
    std::atomic<std::uint64_t> sent = 0; // messages, each to one started session
    std::atomic<std::uint64_t> answered = 0;
};

// The clients' threads end with this object.
class Load {
public:
    Load(std::filesystem::path socket, Known& known, int clients);
    ~Load() = default;
    Load(const Load&) = delete;
    Load& operator=(const Load&) = delete;

private:
    std::vector<std::jthread> threads_;
};

} // namespace soak
