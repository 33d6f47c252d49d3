// SPDX-License-Identifier: Apache-2.0
// The kernel's process table.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace platform {

// One process as the kernel lists it.
struct ProcessTableEntry {
    std::int32_t processIdentifier = 0;
    std::string commandName; // the kernel's short name, cut at 15 bytes; "?" for each byte that is not UTF-8
};

// Any thread.
class ProcessTable {
public:
    virtual ~ProcessTable() = default;
    [[nodiscard]] virtual std::int32_t ownProcessIdentifier() const = 0;
    [[nodiscard]] virtual std::string ownProcessName() const = 0;
    // The entry of that process, which may be this one, or nothing if it does not exist. May be a moment old.
    [[nodiscard]] virtual std::optional<ProcessTableEntry> entry(std::int32_t processIdentifier) const = 0;
    // Drops the cached entry of that process, so that the next `entry` reads it again.
    virtual void forget(std::int32_t /*processIdentifier*/) { }
};

} // namespace platform
