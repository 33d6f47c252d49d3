// SPDX-License-Identifier: Apache-2.0
// Why the analytics store failed.
#pragma once

#include "ledger/Counter.h"

#include <cstddef>
#include <cstdint>

namespace platform {

enum class StoreError : std::uint8_t {
    DiskFull,
    ReadOnly,
    Locked, // another program locks the database for too long
    InUse, // another process keeps its events in this directory
    CannotOpen,
    InputOutput,
    Corrupt, // or not a database of events
    Newer, // made by a later version of the service
    LogHeld, // a reader kept the write-ahead log until it reached its limit
    NotJson, // the payload holds NaN or infinity
    Other
};
constexpr std::size_t storeErrorCount = static_cast<std::size_t>(StoreError::Other) + 1;

// Where events that are lost for that reason are counted, with the words for the reason and what helps.
[[nodiscard]] ledger::Counter counterOf(StoreError error) noexcept;

} // namespace platform
