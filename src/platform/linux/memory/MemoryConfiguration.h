// SPDX-License-Identifier: Apache-2.0
// The device owner's limits for what clients send, in limits.toml: how much memory it may take in all, and which parts
// of that one user and one client may have.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Memory.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace platform {

// What holds for a missing or wrong value.
struct DefaultMemory {
    static constexpr std::size_t partOfTheMachine = 16; // a sixteenth of its memory, between these
    static constexpr std::size_t least = std::size_t{16} << 20;
    static constexpr std::size_t most = std::size_t{256} << 20;
    static constexpr double partOfAUser = 0.75;
    static constexpr double partOfAClient = 0.5;
};

// The limits, and what was wrong with the values: one line each, for a person.
struct CheckedMemoryLimits {
    MemoryLimits limits;
    std::vector<std::string> problems;
};

// For a machine with so many bytes of memory, which may be more than this process has addresses. Any thread.
[[nodiscard]] CheckedMemoryLimits readMemoryLimits(const foundation::Dictionary& values,
                                                   std::uint64_t bytesOfTheMachine);

} // namespace platform
