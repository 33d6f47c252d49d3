// SPDX-License-Identifier: Apache-2.0
// New kinds and holders get numbers far above those that are saved: a message that is copied later may refer to one
// that could not be read. Until the end a row without meaning holds that place.
//
// A reader that knows the damaged database by its epoch learns from `earlier_store` which rows it has read before.
#include "platform/linux/store/tables/SalvagedTables.h"

#include "platform/linux/store/tables/StoreSchema.h"

#include <fmt/format.h>

namespace platform {
namespace {

constexpr const char* prepareTables = "DROP TABLE IF EXISTS saved_store;"
                                      "CREATE TABLE saved_store AS SELECT * FROM store LIMIT 0;";

// {0}: the last number of an event; {1}: how many more there may be without a count of the database's own. Stretches
// that ran are left: a row that was removed long ago may be readable again, and would have become far too long.
constexpr std::string_view goOn =
    "BEGIN IMMEDIATE;"
    "UPDATE store SET"
    " next_event = max(next_event, coalesce((SELECT next_event FROM saved_store WHERE next_event > {0}),"
    "   {0} + 2 + {1})),"
    " next_source = max(next_source, coalesce((SELECT next_source FROM saved_store),"
    "   1000000 + (SELECT coalesce(max(id), 0) FROM sources))),"
    " next_session = max(next_session, coalesce((SELECT next_session FROM saved_store),"
    "   1000000 + (SELECT coalesce(max(id), 0) FROM sessions))),"
    " kept = max(kept, coalesce((SELECT kept FROM saved_store), 0));"
    "UPDATE store SET (age_time, wall_time, away, trial, away_below) ="
    " (SELECT age_time, wall_time, away, trial, away_below FROM saved_store)"
    " WHERE age_time < (SELECT age_time FROM saved_store);"
    "UPDATE store SET age_time = max(age_time, (SELECT coalesce(max(kept), 0) FROM ages));"
    "CREATE TABLE IF NOT EXISTS earlier_store("
    "row INTEGER PRIMARY KEY CHECK (row = 1), epoch TEXT NOT NULL, next_event INTEGER NOT NULL"
    ") STRICT;"
    "INSERT OR IGNORE INTO earlier_store SELECT 1, epoch, (SELECT next_event FROM store) FROM saved_store;"
    "DROP TABLE saved_store;"
    "DELETE FROM open_stretches;"
    "INSERT INTO kinds(id, name) SELECT 1000000 + coalesce(max(id), 0), '' FROM kinds"
    " HAVING NOT EXISTS (SELECT * FROM kinds WHERE name = '');"
    "INSERT INTO holders(id, process, application, bytes, oldest)"
    " SELECT 1000000 + coalesce(max(id), 0), '', 'place of holders', 0, 0 FROM holders"
    " HAVING NOT EXISTS (SELECT * FROM holders WHERE application = 'place of holders' AND process = '');"
    "COMMIT";

// The used kinds are looked up in the index, one after the other.
constexpr const char* complete =
    "BEGIN IMMEDIATE;"
    "WITH RECURSIVE used(kind) AS (SELECT min(kind) FROM messages UNION ALL"
    " SELECT (SELECT min(kind) FROM messages WHERE kind > used.kind) FROM used WHERE used.kind IS NOT NULL)"
    " INSERT OR IGNORE INTO kinds(id, name) SELECT kind, 'unknown' FROM used WHERE kind IS NOT NULL;"
    "INSERT OR IGNORE INTO holders(id, process, application, bytes, oldest)"
    " SELECT holder, 'unknown ' || holder, '', sum(bytes + 64), min(id) FROM"
    " (SELECT id, holder, length(CAST(payload AS BLOB)) AS bytes FROM messages"
    " WHERE holder NOT IN (SELECT id FROM holders) UNION ALL"
    " SELECT id, holder, coalesce(length(CAST(device AS BLOB)), 0) + coalesce(length(CAST(format AS BLOB)), 0)"
    " FROM stretches WHERE holder NOT IN (SELECT id FROM holders)) GROUP BY holder;"
    "DELETE FROM kinds WHERE name = '';"
    "DELETE FROM holders WHERE application = 'place of holders' AND process = '';"
    "UPDATE store SET removed = (SELECT coalesce(sum(n * (1 + (second_name IS NOT NULL))), 0)"
    " FROM (SELECT kind, count(*) AS n FROM messages GROUP BY kind) JOIN kinds ON id = kind);"
    "{}" // the first edition counts as StoreSchema counts it
    "UPDATE store SET kept = max(kept, removed);"
    "UPDATE store SET removed = kept - removed;"
    "COMMIT";

constexpr std::string_view countFirstEdition =
    "UPDATE store SET removed = removed + coalesce((SELECT max(seq) FROM sqlite_sequence WHERE name = 'first_edition')"
    " - (SELECT min(id) FROM first_edition) + 1, 0);";

StoreExpected<bool> hasFirstEdition(SqliteConnection& connection)
{
    const auto tables = connection.number("SELECT count(*) FROM sqlite_schema WHERE name = 'first_edition'");
    if (!tables)
        return std::unexpected(tables.error());
    return *tables != 0;
}

StoreExpected<> inTransaction(SqliteConnection& connection, const std::string& sql)
{
    const auto done = connection.execute(sql.c_str());
    if (!done)
        connection.rollBack();
    return done;
}

} // namespace

StoreExpected<> SalvagedTables::prepare(SqliteConnection& connection)
{
    const auto isThere = hasFirstEdition(connection);
    if (!isThere)
        return std::unexpected(isThere.error());
    if (!*isThere)
        if (const auto done = StoreSchema::makeFirstEdition(connection); !done)
            return done;
    return connection.execute(prepareTables);
}

StoreExpected<> SalvagedTables::begin(SqliteConnection& connection, std::int64_t last, std::int64_t mayHaveMore)
{
    return inTransaction(connection, fmt::format(goOn, last, mayHaveMore));
}

StoreExpected<bool> SalvagedTables::isBegun(SqliteConnection& connection)
{
    const auto places = connection.number("SELECT count(*) FROM kinds WHERE name = ''");
    if (!places)
        return std::unexpected(places.error());
    return *places != 0;
}

StoreExpected<> SalvagedTables::finish(SqliteConnection& connection)
{
    const auto events = connection.number("SELECT count(*) FROM (SELECT id FROM first_edition LIMIT 1)");
    const bool isThere = events && *events != 0;
    if (!isThere)
        if (const auto done = StoreSchema::dropFirstEdition(connection); !done)
            return done;
    return inTransaction(connection, fmt::format(complete, isThere ? countFirstEdition : std::string_view()));
}

} // namespace platform
