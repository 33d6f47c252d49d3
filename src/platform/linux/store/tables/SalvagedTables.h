// SPDX-License-Identifier: Apache-2.0
// What the tables of a new database need besides rows that were saved from a damaged one: numbers that go on, and rows
// in the place of those that could not be read, so that everything that refers to them still has something.
//
// All of it may be done again after a kill, with the same result.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <string_view>

namespace platform {

class SalvagedTables {
public:
    // The one row of `store` is saved into another table, because the new database has such a row itself.
    [[nodiscard]] static std::string_view targetOf(std::string_view table) noexcept
    {
        return table == "store" ? savedStore : table;
    }

    [[nodiscard]] static bool isTarget(std::string_view table) noexcept { return table == savedStore; }
    [[nodiscard]] static bool holdsEvents(std::string_view table) noexcept
    {
        return table == "messages" || table == "first_edition" || table == "events"; // the first edition's name for it
    }

    // Whether its rows have numbers of the same sequence as events.
    [[nodiscard]] static bool isNumberedAsEvents(std::string_view table) noexcept
    {
        return holdsEvents(table) || table == "stretches";
    }

    // Makes the tables that the rows may need.
    [[nodiscard]] static StoreExpected<> prepare(SqliteConnection& connection);
    // When the small tables are copied and before new events come, which get numbers above `last`. Also above what the
    // damaged database may have given out: it `mayHaveMore` if its own count could not be read.
    [[nodiscard]] static StoreExpected<> begin(SqliteConnection& connection, std::int64_t last,
                                               std::int64_t mayHaveMore);
    // Whether that was begun and not finished.
    [[nodiscard]] static StoreExpected<bool> isBegun(SqliteConnection& connection);
    // When everything is copied: counts the events and begins a new epoch. The database must be opened again then.
    [[nodiscard]] static StoreExpected<> finish(SqliteConnection& connection);

private:
    static constexpr std::string_view savedStore = "saved_store";
};

} // namespace platform
