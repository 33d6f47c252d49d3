// SPDX-License-Identifier: Apache-2.0
// A row's text has its ID, and what the rules of the trial keep of it. The equation makes the same text in the
// database.
#include "fleet/Truth.h"

#include <cmath>
#include <fmt/format.h>
#include <gcrypt.h>
#include <memory>
#include <sqlite3.h>
#include <stdexcept>
#include <string_view>

namespace fleet {

namespace {

struct CloseDatabase {
    void operator()(sqlite3* database) const { sqlite3_close(database); }
};
struct Finalize {
    void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};
using Database = std::unique_ptr<sqlite3, CloseDatabase>;

Database open(const std::filesystem::path& file)
{
    constexpr int patience = 60'000; // milliseconds
    sqlite3* opened = nullptr;
    const int status = sqlite3_open_v2(file.c_str(), &opened, SQLITE_OPEN_READONLY, nullptr);
    Database database(opened);
    sqlite3_busy_timeout(opened, patience);
    if (status != SQLITE_OK)
        throw std::runtime_error("the store cannot be read: " + file.native());
    return database;
}

// Binds the numbers to ?1, ?2 ...
void select(sqlite3& database, const std::string& sql, std::initializer_list<std::int64_t> numbers,
            const std::function<void(sqlite3_stmt*)>& read)
{
    sqlite3_stmt* prepared = nullptr;
    int status = sqlite3_prepare_v2(&database, sql.c_str(), -1, &prepared, nullptr);
    const std::unique_ptr<sqlite3_stmt, Finalize> statement(prepared);
    int place = 0;
    for (const std::int64_t number : numbers)
        sqlite3_bind_int64(prepared, ++place, number);
    while (status == SQLITE_OK && (status = sqlite3_step(prepared)) == SQLITE_ROW) {
        read(prepared);
        status = SQLITE_OK;
    }
    if (status != SQLITE_DONE)
        throw std::runtime_error(fmt::format("the store cannot be read: {}", sqlite3_errmsg(&database)));
}

std::string text(sqlite3_stmt* row, int column)
{
    const auto* const bytes = sqlite3_column_text(row, column);
    return bytes == nullptr ? std::string() : reinterpret_cast<const char*>(bytes);
}

std::int64_t whole(sqlite3_stmt* row, int column)
{
    return static_cast<std::int64_t>(std::nearbyint(sqlite3_column_double(row, column)));
}

// Events that the rules let leave, each with an ID in the range.
constexpr std::string_view leavingEvents = "name GLOB 'com.quarn.kesto.*' AND id > ?1 AND id <= ?2";

std::string queryOf(Kind kind)
{
    switch (kind) {
    case Kind::Event:
        return fmt::format(
            "SELECT id, id || '|' || ifnull(session, 0) || '|' || name"
            " || '|' || ifnull(payload ->> '$.active_devices', '') || '|' || CASE"
            " WHEN payload ->> '$.late_cycles' < 10 THEN '<10' WHEN payload ->> '$.late_cycles' < 100 THEN '10-100'"
            " WHEN payload ->> '$.late_cycles' >= 100 THEN '>=100' ELSE '' END,"
            " 1000000 * ifnull(payload ->> '$.PomoSessionVolume', 0), 1000000 * ifnull(happened, time) FROM events "
            "WHERE {} ORDER BY id",
            leavingEvents);
    case Kind::Stretch:
        return "SELECT id, id || '|' || ifnull(session, 0) || '|' || recording || '|' || ifnull(device, '') || '|'"
               " || ifnull(format, '') || '|' || ending || '|' || ifnull(channels, '') || '|'"
               " || ifnull(CAST(round(1000000 * volume) AS INTEGER), ''), 1000000 * seconds, 1000000 * began FROM "
               "stretches WHERE id > ?1 AND id <= ?2 ORDER BY id";
    case Kind::Session:
        return fmt::format("SELECT id, id || '|' || application || '|' || ifnull(service, ''), ended IS NOT NULL"
                           " FROM sessions WHERE id IN (SELECT session FROM events WHERE {} UNION"
                           " SELECT session FROM stretches WHERE id > ?1 AND id <= ?2) ORDER BY id",
                           leavingEvents);
    }
    return {};
}

std::int64_t endOf(const Chapter& chapter)
{
    return chapter.upTo == 0 ? INT64_MAX : chapter.upTo;
}

} // namespace

const char* nameOf(Kind kind)
{
    switch (kind) {
    case Kind::Event: return "events";
    case Kind::Stretch: return "stretches";
    case Kind::Session: break;
    }
    return "sessions";
}

Sums& Sums::operator+=(const Sums& other)
{
    rows += other.rows;
    prints += other.prints;
    amounts += other.amounts;
    return *this;
}

void forEachRow(const Chapter& chapter, Kind kind, const std::function<void(const TrueRow&)>& read)
{
    const Database database = open(chapter.store);
    select(*database, queryOf(kind), {chapter.after, endOf(chapter)}, [&](sqlite3_stmt* row) {
        read({.id = sqlite3_column_int64(row, 0),
              .text = text(row, 1) + (kind == Kind::Session ? "" : fmt::format("|{}", whole(row, 3))),
              .amount = whole(row, 2)});
    });
}

std::string epochOf(const Chapter& chapter)
{
    std::string epoch;
    select(*open(chapter.store), "SELECT epoch FROM store", {}, [&](sqlite3_stmt* row) { epoch = text(row, 0); });
    return epoch;
}

std::uint64_t printOf(const std::string& text)
{
    unsigned char digest[16];
    gcry_md_hash_buffer(GCRY_MD_MD5, digest, text.data(), text.size());
    std::uint64_t half = 0;
    for (std::size_t place = 0; place < sizeof half; ++place)
        half = half << 8 | digest[place];
    return half;
}

SumsOfRows Truth::sums(const Chapters& chapters)
{
    SumsOfRows all;
    for (const Chapter& chapter : chapters) {
        std::int64_t newest = 0;
        std::string epoch; // names the database: another one may come to the same place
        select(*open(chapter.store), "SELECT next_event, epoch FROM store", {}, [&](sqlite3_stmt* row) {
            newest = sqlite3_column_int64(row, 0);
            epoch = text(row, 1);
        });
        Known& known = known_[fmt::format("{} {} {} {}", epoch, chapter.pseudonym, chapter.after, chapter.upTo)];
        if (known.newest != newest) {
            known = {.newest = newest, .sums = {}};
            for (const Kind kind : allKinds) {
                Sums sums;
                forEachRow(chapter, kind, [&sums](const TrueRow& row) {
                    sums += {.rows = 1, .prints = printOf(row.text), .amounts = static_cast<std::uint64_t>(row.amount)};
                });
                if (sums.rows > 0)
                    known.sums.emplace(RowsOf{chapter.pseudonym, epoch, kind}, sums);
            }
        }
        for (const auto& [of, sums] : known.sums)
            all[of] += sums;
    }
    return all;
}

} // namespace fleet
