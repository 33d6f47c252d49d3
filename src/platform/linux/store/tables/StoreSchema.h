// SPDX-License-Identifier: Apache-2.0
// The room of tables: what stands in the database beside the messages, each kind in a file, with its rows in memory
// where that is needed. Everything changes with the transaction that SqliteEventFile runs, or is dropped with it.
//
// The schema, and the one row that counts. docs/store.md describes the tables for those who query them.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/AgeClock.h"

#include <cstdint>
#include <string>

namespace platform {

// The row of the table `store`, written with every transaction.
struct StoreCounts {
    // The next ID of an event, of a source, of a session. IDs are never used again.
    std::int64_t nextEvent = 1;
    std::int64_t nextSource = 1;
    std::int64_t nextSession = 1;
    // How many events were ever kept and removed: the store holds the difference.
    std::int64_t kept = 0;
    std::int64_t removed = 0;
    AgeClockState clock;

    [[nodiscard]] std::uint64_t events() const noexcept { return static_cast<std::uint64_t>(kept - removed); }
    friend bool operator==(const StoreCounts&, const StoreCounts&) = default;
};

class StoreSchema {
public:
    static constexpr std::int64_t edition = 2;

    // Makes the tables in an empty file. A file of the first edition gets them beside its events, at once, however many
    // it has: `FirstEdition` moves them later. A file of this edition gets the tables that it lacks. Newer: a later
    // edition; Corrupt: not a database of events.
    [[nodiscard]] static StoreExpected<> make(SqliteConnection& connection);
    // Makes an empty table of the first edition, and lets the view show it.
    [[nodiscard]] static StoreExpected<> makeFirstEdition(SqliteConnection& connection);
    // Ends the time of the first edition's table, which must be empty.
    [[nodiscard]] static StoreExpected<> dropFirstEdition(SqliteConnection& connection);
};

// One thread at a time.
class StoreCountsRow {
public:
    // `wall` is the time on the wall, for a database that has none yet.
    [[nodiscard]] static StoreExpected<StoreCountsRow> open(SqliteConnection& connection, double wall);

    [[nodiscard]] StoreCounts& counts() noexcept { return counts_; }
    // Random, and the same for as long as the database exists and is not repaired.
    [[nodiscard]] const std::string& epoch() const noexcept { return epoch_; }
    // Writes the counts with the running transaction, if they changed.
    [[nodiscard]] StoreExpected<> write();
    // What the database holds.
    [[nodiscard]] const StoreCounts& committed() const noexcept { return committed_; }
    void noteCommit() noexcept { committed_ = counts_; }
    void rolledBack() noexcept { counts_ = committed_; }

private:
    SqliteStatement update_;
    StoreCounts counts_;
    StoreCounts committed_;
    std::string epoch_;
};

} // namespace platform
