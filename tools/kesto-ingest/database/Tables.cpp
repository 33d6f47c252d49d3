// SPDX-License-Identifier: Apache-2.0
// One list of columns for each table; all statements are made of it.
#include "kesto-ingest/database/Tables.h"

#include <fmt/format.h>

#include <iterator>
#include <span>

namespace kesto_ingest {

namespace {

enum class Source : std::uint8_t { Row, Database }; // of a column's values

struct Column {
    Source source;
    std::string_view name;
    std::string_view definition;
    std::string_view meaning;
};

struct TableDefinition {
    std::string_view name;
    std::string_view meaning;
    std::string_view partition;
    std::string_view order;
    std::string_view winner; // the column that says which of several rows with one key stays; empty: any
    std::span<const Column> columns;
};

constexpr auto fromRow = Source::Row;
constexpr auto workedOut = Source::Database;

constexpr Column device = {fromRow, "device", "FixedString(32)", "the pseudonym"};
constexpr Column epoch = {fromRow, "epoch", "FixedString(32)",
                          "of the device's store: IDs mean something only with it"};
constexpr Column id = {fromRow, "id", "UInt64", ""};
constexpr Column session = {fromRow, "session", "UInt64", "an ID in sessions, or 0: it belongs to none"};
constexpr Column application = {fromRow, "application", "String", "empty: not known"};
constexpr Column model = {fromRow, "model", "String", "of the device"};
constexpr Column release = {fromRow, "version", "String", "the device's release"};
constexpr Column received = {workedOut, "received", "DateTime DEFAULT now()", "when it was stored here"};

constexpr Column batchColumns[] = {
    device,
    epoch,
    {fromRow, "first_id", "UInt64", "the IDs that the batch tells of, as far as they may leave"},
    {fromRow, "last_id", "UInt64", ""},
    {fromRow, "sent", "Float64", "by the device's clock"},
    model,
    release,
    received,
};

constexpr Column eventColumns[] = {
    device,
    epoch,
    id,
    {fromRow, "happened_us", "Int64", "microseconds since 1970 UTC: when it happened, or else `time`"},
    {fromRow, "time", "Float64", "when it was sent, by the device's clock"},
    {fromRow, "happened", "Nullable(Float64)", "when it happened, if told"},
    {fromRow, "name", "String", ""},
    session,
    application,
    model,
    release,
    {fromRow, "payload", "String", "JSON without spaces"},
    {fromRow, "audio_device", "String", "the payload's active_devices, up to 256 bytes"},
    {fromRow, "late_cycles", "Float64", "the payload's"},
    received,
};

constexpr Column stretchColumns[] = {
    device,
    epoch,
    id,
    {fromRow, "recording", "UInt8", "0: it played"},
    {fromRow, "began_us", "Int64", "microseconds since 1970 UTC. Whole numbers add up to the same in any order"},
    {fromRow, "microseconds", "Int64", "how long"},
    {workedOut, "began", "Float64 DEFAULT began_us / 1000000", "in seconds, as the next two"},
    {workedOut, "seconds", "Float64 DEFAULT microseconds / 1000000", ""},
    {workedOut, "played_seconds", "Float64 DEFAULT if(recording, 0, seconds)", ""},
    session,
    application,
    {fromRow, "audio_device", "String", "empty: not known, as in the next"},
    {fromRow, "format", "String", ""},
    {fromRow, "channels", "Nullable(UInt32)", ""},
    {fromRow, "volume_millionths", "Nullable(UInt32)", "0: muted, 1000000: all of the slider"},
    {workedOut, "volume", "Nullable(Float64) DEFAULT volume_millionths / 1000000", "from 0 to 1"},
    {fromRow, "ending", "String", ""},
    model,
    release,
    received,
};

constexpr Column sessionColumns[] = {
    device,
    epoch,
    id,
    {fromRow, "began", "Float64", ""},
    {fromRow, "ended", "Nullable(Float64)", ""},
    {workedOut, "has_ended", "UInt8 DEFAULT isNotNull(ended)", "the row that says so stays"},
    {fromRow, "reporter", "Int64", ""},
    {fromRow, "service", "String", ""},
    application,
    {fromRow, "process", "String", ""},
    model,
    release,
    received,
};

// A stretch of more than a day is apart: who looks for those that began before a moment and went on reads one day
// before it, and these few.
constexpr TableDefinition tables[] = {
    {"batches", "what each device has sent", "toMonday(toDateTime(toUInt32(sent)))", "device, epoch, last_id, first_id",
     "", batchColumns},
    {"events", "what messages told", "toMonday(toDateTime(intDiv(happened_us, 1000000)))", "device, epoch, id", "",
     eventColumns},
    {"stretches", "who played or recorded for how long",
     "(toMonday(toDateTime(intDiv(began_us, 1000000))), microseconds > 86400000000)", "device, epoch, id", "",
     stretchColumns},
    {"sessions", "of the devices' clients", "toMonday(toDateTime(toUInt32(began)))", "device, epoch, id", "has_ended",
     sessionColumns},
};

std::string columnsText(const TableDefinition& table)
{
    std::string text;
    for (const Column& column : table.columns) {
        const bool isLast = &column == &table.columns.back();
        text += fmt::format("    {} {}{}", column.name, column.definition, isLast ? "" : ",");
        text += column.meaning.empty() ? "\n" : fmt::format(" -- {}\n", column.meaning);
    }
    return text;
}

std::string replicated(std::string_view database, std::string_view table)
{
    return fmt::format("'/clickhouse/tables/{{shard}}/{}/{}', '{{replica}}'", database, table);
}

std::string tableText(const TableDefinition& table, std::string_view database, std::string_view cluster)
{
    const bool isPlain = cluster.empty();
    const std::string onCluster = isPlain ? "" : fmt::format(" ON CLUSTER {}", cluster);
    std::string arguments = isPlain ? "" : replicated(database, table.name);
    if (!table.winner.empty())
        arguments += fmt::format("{}{}", isPlain ? "" : ", ", table.winner);
    std::string text = fmt::format("-- {}\nCREATE TABLE IF NOT EXISTS {}.{}{}{} (\n{})", table.meaning, database,
                                   table.name, isPlain ? "" : "_local", onCluster, columnsText(table));
    text += fmt::format(" ENGINE = {}ReplacingMergeTree({})\nPARTITION BY {}\nORDER BY ({});\n\n",
                        isPlain ? "" : "Replicated", arguments, table.partition, table.order);
    if (!isPlain)
        text += fmt::format("CREATE TABLE IF NOT EXISTS {0}.{1}{2} AS {0}.{1}_local\n"
                            "ENGINE = Distributed({3}, {0}, {1}_local, cityHash64(device));\n\n",
                            database, table.name, onCluster, cluster);
    return text;
}

// Each server tells its own edition. The row is put there once, however often the statements run.
std::string editionText(std::string_view database, std::string_view cluster)
{
    const std::string onCluster = cluster.empty() ? "" : fmt::format(" ON CLUSTER {}", cluster);
    return fmt::format("-- A view, so that each server of a cluster has it.\nCREATE VIEW IF NOT EXISTS {}.edition{} AS "
                       "SELECT toUInt64({}) AS edition;\n",
                       database, onCluster, tablesEdition);
}

} // namespace

std::string tablesSql(std::string_view database, std::string_view cluster)
{
    std::string text = fmt::format(
        "-- The tables of a fleet, edition {}. Rows may be there more than once until the database has merged\n"
        "-- them: group by device, epoch and id, or read with FINAL.\n\n",
        tablesEdition);
    text += fmt::format("CREATE DATABASE IF NOT EXISTS {}{};\n\n", database,
                        cluster.empty() ? "" : fmt::format(" ON CLUSTER {}", cluster));
    for (const TableDefinition& table : tables)
        text += tableText(table, database, cluster);
    return text + editionText(database, cluster);
}

std::string insertStatement(std::string_view table)
{
    std::string columns;
    for (const TableDefinition& definition : tables)
        if (definition.name == table)
            for (const Column& column : definition.columns)
                if (column.source == Source::Row)
                    columns += fmt::format("{}{}", columns.empty() ? "" : ", ", column.name);
    return fmt::format("INSERT INTO {} ({}) FORMAT JSONEachRow", table, columns);
}

} // namespace kesto_ingest
