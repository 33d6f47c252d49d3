// SPDX-License-Identifier: Apache-2.0
// The memory of the process, as the rest of the system sees it.
#pragma once

#include <cstddef>

namespace platform {

// How many bytes the service may keep of what clients send: of all clients, of those of one user, and of one client.
struct MemoryLimits {
    std::size_t ofTheService = 0;
    std::size_t ofAUser = 0;
    std::size_t ofAClient = 0;

    friend bool operator==(const MemoryLimits&, const MemoryLimits&) = default;
};

// Any thread.
class Memory {
public:
    virtual ~Memory() = default;
    // Reports that so many bytes which had gathered for clients are free. Once the sum is large, the system gets them
    // back some seconds later; until then the next session may use them.
    virtual void letGo(std::size_t bytes) = 0;
    // Reports that a client has gone, with memory that no sum has: what its connection read, and answers that it did
    // not take. If that was much, the system gets it back as well.
    virtual void clientGone() = 0;
    // The device's owner may change them at any time. Costs next to nothing.
    [[nodiscard]] virtual MemoryLimits limits() const = 0;
};

} // namespace platform
