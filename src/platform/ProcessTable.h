// The kernel's process table.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace platform {

// One process as the kernel lists it.
struct ProcessTableEntry {
    std::int32_t processIdentifier = 0;
    std::string commandName; // the kernel's short name, cut at 15 bytes; "?" stands for each that is not UTF-8
};

// Any thread.
class ProcessTable {
public:
    virtual ~ProcessTable() = default;
    [[nodiscard]] virtual std::int32_t ownProcessIdentifier() const = 0;
    [[nodiscard]] virtual std::string ownProcessName() const = 0;
    // The entry of that process, the own one too, or nothing when there is none. May be a moment old.
    [[nodiscard]] virtual std::optional<ProcessTableEntry> entry(std::int32_t processIdentifier) const = 0;
    // Whatever is remembered of that process is not believed any more: what `entry` tells next is as it is then.
    virtual void forget(std::int32_t /*processIdentifier*/) { }
};

} // namespace platform
