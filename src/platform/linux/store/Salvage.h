// SPDX-License-Identifier: Apache-2.0
// Copies what can be read in a damaged database into the new one, a little at a time, so that new events wait for none
// of it.
//
// It knows no table by its columns: a row belongs to the table of the new database whose declared types its values
// have. Rows keep their numbers, so copying a row again changes nothing, and a salvage that was cut short is simply
// begun again.
//
// Messages are copied little by little, unless they are few. The other tables, to which they refer, are small, and are
// copied before the new database takes events.
#pragma once

#include "platform/linux/damage/DatabaseRows.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/SqliteEventFile.h"

#include <cstdint>
#include <filesystem>
#include <limits>
#include <memory>
#include <string>
#include <vector>

namespace platform {

// One thread at a time.
class Salvage {
public:
    static constexpr std::uint64_t bytesAtOnce = 256 * 1024;
    static constexpr std::uint32_t pagesAtOnce = 64; // so many pages of messages are few

    // Looks at every page of the damaged database, copies the small tables, and gives later events of the new database
    // higher numbers. The new database must be opened again afterwards.
    [[nodiscard]] static StoreExpected<std::unique_ptr<Salvage>> begin(std::filesystem::path damaged,
                                                                       SqliteConnection& into);

    [[nodiscard]] bool hasMore() const noexcept { return next_ < tableOfPage_.size(); }
    // Copies some messages, in one transaction. After an error, when that is dropped, the same ones are next.
    [[nodiscard]] StoreExpected<> copySome(SqliteEventFile& into);

    // How many messages could be read and were copied.
    [[nodiscard]] std::uint64_t messages() const noexcept { return copiedMessages_; }
    [[nodiscard]] const std::filesystem::path& damaged() const noexcept { return damaged_; }

private:
    struct Column {
        std::string name;
        std::string type; // as declared
        bool mayBeNull = false;
        bool isRowid = false; // an alias of the row's number
    };
    struct Table {
        std::string name;
        std::vector<Column> columns;
        std::uint32_t pages = 0;
        std::int64_t lastNumber = 0; // of its rows
    };
    class Inserter;

    static constexpr std::uint8_t noTable = std::numeric_limits<std::uint8_t>::max();

    explicit Salvage(std::filesystem::path damaged);
    [[nodiscard]] StoreExpected<> readTables(SqliteConnection& from);
    [[nodiscard]] static StoreExpected<> readColumns(SqliteConnection& from, Table& table);
    void lookAtPages();
    void lookAtPage(std::uint32_t page);
    void goToNext(std::size_t page);
    [[nodiscard]] StoreExpected<> copySmallTables(SqliteConnection& into);
    [[nodiscard]] StoreExpected<> copyBatch(SqliteEventFile& into);
    [[nodiscard]] Table* tableOf(const StoredRow& row);
    [[nodiscard]] static bool fits(const StoredRow& row, const Table& table);
    [[nodiscard]] static std::string insertionInto(const Table& table);

    const std::filesystem::path damaged_;
    DatabaseRows rows_;
    std::vector<Table> tables_;
    std::vector<std::uint8_t> tableOfPage_; // by page, its place in `tables_`
    std::uint8_t large_ = noTable; // the table that is copied little by little
    std::int64_t sequence_ = 0; // the last number that was given out, by SQLite's own count; 0: it keeps none
    std::int64_t lastNumber_ = 0; // of an event
    std::int64_t mayHaveMore_ = 0; // numbers that were given out beyond
    std::size_t next_ = 0; // the page to copy next
    std::uint64_t copiedMessages_ = 0;
};

} // namespace platform
