// SPDX-License-Identifier: Apache-2.0
// The view `events` shows each message as its one or two events. While events of the first edition are left, it shows
// them, too.
//
// Queries of the view take their rows from indexes, by name, by time and by ID. SQLite does this under three
// conditions: the second event's ID is cast, since both halves of the view must have columns of the same kind to be
// merged in their order; it has an index of its own; and SQLite knows that kinds are few and messages many, from
// figures that need not be exact.
#include "platform/linux/store/tables/StoreSchema.h"

#include <fmt/format.h>
#include <string>
#include <string_view>

namespace platform {
namespace {

// A page of this size holds some twenty messages: SQLite wastes less room than in smaller pages, and one message alone
// does not cost much more to write.
constexpr std::string_view beforeTheFirstPage = "PRAGMA page_size = 8192; PRAGMA auto_vacuum = INCREMENTAL";

constexpr std::string_view tables =
    "CREATE TABLE kinds("
    "id INTEGER PRIMARY KEY, name TEXT NOT NULL, second_name TEXT"
    ") STRICT;"
    "CREATE INDEX kinds_by_name ON kinds(name, second_name);"
    "CREATE INDEX kinds_by_second_name ON kinds(second_name) WHERE second_name IS NOT NULL;"
    "CREATE TABLE messages("
    "id INTEGER PRIMARY KEY, time REAL NOT NULL, kind INTEGER NOT NULL, session INTEGER, source INTEGER,"
    " happened REAL, holder INTEGER NOT NULL, payload TEXT NOT NULL"
    ") STRICT;"
    "CREATE INDEX messages_by_kind ON messages(kind, time);"
    "CREATE INDEX messages_by_second_id ON messages(CAST(id + 1 AS INTEGER));"
    "ANALYZE;"
    "INSERT INTO sqlite_stat1(tbl, idx, stat) VALUES"
    " ('kinds', 'kinds_by_name', '30 1 1'), ('kinds', 'kinds_by_second_name', '30 1'),"
    " ('messages', 'messages_by_kind', '1000000 33334 1'), ('messages', 'messages_by_second_id', '1000000 1');"
    "CREATE TABLE sources("
    "id INTEGER PRIMARY KEY, boot TEXT NOT NULL, user INTEGER NOT NULL, process INTEGER NOT NULL, name TEXT,"
    " began REAL NOT NULL, ended REAL, past INTEGER"
    ") STRICT;"
    "CREATE TABLE sessions("
    "id INTEGER PRIMARY KEY, source INTEGER, reporter INTEGER NOT NULL, service TEXT, application TEXT NOT NULL,"
    " began REAL NOT NULL, ended REAL, past INTEGER"
    ") STRICT;"
    "CREATE INDEX sources_by_past ON sources(past) WHERE past IS NOT NULL;"
    "CREATE INDEX sessions_by_past ON sessions(past) WHERE past IS NOT NULL;"
    "CREATE TABLE store("
    "row INTEGER PRIMARY KEY CHECK (row = 1), epoch TEXT NOT NULL,"
    " next_event INTEGER NOT NULL, next_source INTEGER NOT NULL, next_session INTEGER NOT NULL,"
    " kept INTEGER NOT NULL, removed INTEGER NOT NULL,"
    " age_time REAL NOT NULL, wall_time REAL, away REAL NOT NULL, trial REAL NOT NULL, away_below INTEGER NOT NULL"
    ") STRICT;"
    "INSERT INTO store VALUES (1, lower(hex(randomblob(16))), 1, 1, 1, 0, 0, 0, NULL, 0, 0, 0);"
    "CREATE TABLE holders("
    "id INTEGER PRIMARY KEY, user INTEGER, process TEXT NOT NULL, application TEXT NOT NULL,"
    " bytes INTEGER NOT NULL, oldest INTEGER NOT NULL"
    ") STRICT;"
    "CREATE TABLE ages(below INTEGER PRIMARY KEY, kept REAL NOT NULL) STRICT;";

// Versions of this edition that do not know them leave them alone.
constexpr std::string_view laterTables =
    "CREATE TABLE IF NOT EXISTS stretches("
    "id INTEGER PRIMARY KEY, holder INTEGER NOT NULL, session INTEGER, recording INTEGER NOT NULL,"
    " began REAL NOT NULL, seconds REAL NOT NULL, device TEXT, format TEXT, channels INTEGER, volume REAL,"
    " ending TEXT NOT NULL"
    ") STRICT;"
    "CREATE TABLE IF NOT EXISTS open_stretches("
    "id INTEGER PRIMARY KEY, holder INTEGER NOT NULL, session INTEGER, recording INTEGER NOT NULL,"
    " began REAL NOT NULL, arrived REAL NOT NULL, device TEXT, format TEXT, channels INTEGER, volume REAL"
    ") STRICT;"
    "CREATE TABLE IF NOT EXISTS earlier_epochs("
    "below INTEGER PRIMARY KEY, epoch TEXT NOT NULL"
    ") STRICT;"
    "CREATE TABLE IF NOT EXISTS open_run("
    "row INTEGER PRIMARY KEY CHECK (row = 1), boot TEXT NOT NULL, began REAL NOT NULL"
    ") STRICT;";

constexpr std::string_view view =
    "CREATE VIEW events(id, time, name, payload, session, source, happened) AS "
    "SELECT m.id, m.time, k.name, m.payload, m.session, m.source, m.happened"
    " FROM messages m JOIN kinds k ON k.id = m.kind "
    "UNION ALL "
    "SELECT CAST(m.id + 1 AS INTEGER), m.time, k.second_name, m.payload, m.session, m.source, m.happened"
    " FROM messages m JOIN kinds k ON k.id = m.kind WHERE k.second_name IS NOT NULL";

constexpr std::string_view withFirstEdition =
    " UNION ALL SELECT id, time, name, payload, NULL, NULL, NULL FROM first_edition";

// Until it is moved, the first edition counts as if none of its events were missing; see FirstEdition.
constexpr std::string_view takeOverFirstEdition =
    "UPDATE store SET"
    " kept = (SELECT coalesce(max(seq), 0) FROM sqlite_sequence WHERE name = 'first_edition'),"
    " next_event = (SELECT coalesce(max(seq), 0) + 1 FROM sqlite_sequence WHERE name = 'first_edition');"
    "UPDATE store SET removed = (SELECT coalesce(min(id), store.next_event) - 1 FROM first_edition)";

std::string transaction(std::string_view statements)
{
    return fmt::format("BEGIN IMMEDIATE; {}; PRAGMA user_version = {}; COMMIT", statements, StoreSchema::edition);
}

StoreExpected<> takeOver(SqliteConnection& connection)
{
    if (!connection.prepare("SELECT id, time, name, payload FROM events"))
        return std::unexpected(StoreError::Corrupt);
    const auto done =
        connection.execute(transaction(fmt::format("ALTER TABLE events RENAME TO first_edition; {}{} {}; {}{}", tables,
                                                   laterTables, takeOverFirstEdition, view, withFirstEdition))
                               .c_str());
    if (!done)
        connection.rollBack();
    return done;
}

} // namespace

StoreExpected<> StoreSchema::make(SqliteConnection& connection)
{
    const auto version = connection.number("PRAGMA user_version");
    const auto objects = version ? connection.number("SELECT count(*) FROM sqlite_schema") : version;
    if (!objects)
        return std::unexpected(objects.error());
    if (*version == edition)
        return connection.execute(std::string(laterTables).c_str());
    if (*version > edition)
        return std::unexpected(StoreError::Newer);
    if (*version == 1)
        return takeOver(connection);
    if (*version != 0 || *objects != 0)
        return std::unexpected(StoreError::Corrupt);
    // Both take effect only before the first page is written.
    if (const auto done = connection.execute(std::string(beforeTheFirstPage).c_str()); !done)
        return done;
    return connection.execute(transaction(fmt::format("{}{} {}", tables, laterTables, view)).c_str());
}

StoreExpected<> StoreSchema::makeFirstEdition(SqliteConnection& connection)
{
    return connection.execute(
        fmt::format("BEGIN IMMEDIATE; CREATE TABLE first_edition(id INTEGER PRIMARY KEY AUTOINCREMENT,"
                    " time REAL NOT NULL, name TEXT NOT NULL, payload TEXT NOT NULL) STRICT;"
                    " DROP VIEW events; {}{}; COMMIT",
                    view, withFirstEdition)
            .c_str());
}

StoreExpected<> StoreSchema::dropFirstEdition(SqliteConnection& connection)
{
    return connection.execute(
        fmt::format("BEGIN IMMEDIATE; DROP VIEW IF EXISTS events; DROP TABLE IF EXISTS first_edition; {}; COMMIT", view)
            .c_str());
}

StoreExpected<StoreCountsRow> StoreCountsRow::open(SqliteConnection& connection, double wall)
{
    StoreCountsRow row;
    const auto select = connection.prepare("SELECT next_event, next_source, next_session, kept, removed, epoch,"
                                           " age_time, coalesce(wall_time, ?), away, trial, away_below FROM store");
    auto update = connection.prepare(
        "UPDATE store SET next_event = ?, next_source = ?, next_session = ?, kept = ?,"
        " removed = ?, age_time = ?, wall_time = ?, away = ?, trial = ?, away_below = ? WHERE row = 1");
    if (!select || !update)
        return std::unexpected(select ? update.error() : select.error());
    select->bind(1, wall);
    const auto isThere = select->step();
    if (!isThere)
        return std::unexpected(isThere.error());
    if (!*isThere)
        return std::unexpected(StoreError::Corrupt);
    row.counts_ = {.nextEvent = select->integer(0),
                   .nextSource = select->integer(1),
                   .nextSession = select->integer(2),
                   .kept = select->integer(3),
                   .removed = select->integer(4),
                   .clock = {.time = select->real(6),
                             .wall = select->real(7),
                             .away = select->real(8),
                             .trial = select->real(9),
                             .awayBelow = select->integer(10)}};
    row.committed_ = row.counts_;
    row.epoch_ = select->text(5);
    row.update_ = std::move(*update);
    return row;
}

StoreExpected<> StoreCountsRow::write()
{
    if (counts_ == committed_)
        return {};
    const auto& [nextEvent, nextSource, nextSession, kept, removed, clock] = counts_;
    int parameter = 0;
    for (const std::int64_t count : {nextEvent, nextSource, nextSession, kept, removed})
        update_.bind(++parameter, count);
    for (const double seconds : {clock.time, clock.wall, clock.away, clock.trial})
        update_.bind(++parameter, seconds);
    update_.bind(++parameter, clock.awayBelow);
    return update_.run();
}

} // namespace platform
