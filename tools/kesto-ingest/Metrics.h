// SPDX-License-Identifier: Apache-2.0
// What the program counts, and its text for Prometheus.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <string>

namespace kesto_ingest {

enum class Counter : std::uint8_t {
    BatchesTaken,
    BatchesRepeated,
    BatchesStored,
    BatchesRefusedUnreadable,
    BatchesRefusedForged,
    RowsStoredBatches,
    RowsStoredEvents,
    RowsStoredStretches,
    RowsStoredSessions,
    RowsRefusedSchema,
    RowsRefusedDatabase,
    LettersLost,
    BytesTaken,
    Inserts,
    InsertFailures,
    StreamFailures,
    Count
};

// Written by the thread that works, read by the one that answers.
class Metrics {
public:
    void add(Counter counter, std::uint64_t count = 1) noexcept
    {
        counters_[static_cast<std::size_t>(counter)] += count;
    }
    [[nodiscard]] std::uint64_t count(Counter counter) const noexcept
    {
        return counters_[static_cast<std::size_t>(counter)];
    }

    std::atomic<std::uint64_t> waitingRows = 0; // taken and not stored
    std::atomic<bool> isDatabaseUp = false; // at the last attempt, as the next
    std::atomic<bool> isStreamUp = false;
    std::atomic<std::int64_t> lastStored = 0; // seconds since 1970; 0: never

    [[nodiscard]] std::string text() const;

private:
    std::array<std::atomic<std::uint64_t>, static_cast<std::size_t>(Counter::Count)> counters_{};
};

} // namespace kesto_ingest
