// Why the analytics store could not do something, in words that help its owner.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace platform {

enum class StoreError : std::uint8_t {
    DiskFull,
    ReadOnly,
    Locked, // another program writes to the database, and did not end in time
    InUse, // another process keeps its events in this directory
    CannotOpen,
    InputOutput,
    Corrupt, // or no database, or a database of something else
    Newer, // made by a later version of the service
    LogHeld, // somebody reads for so long that the write-ahead log met its limit
    NotJson, // the payload holds NaN or infinity
    Other
};
constexpr std::size_t storeErrorCount = static_cast<std::size_t>(StoreError::Other) + 1;

struct StoreErrorWords {
    std::string_view problem;
    std::string_view remedy;
};

[[nodiscard]] StoreErrorWords words(StoreError error) noexcept;

} // namespace platform
