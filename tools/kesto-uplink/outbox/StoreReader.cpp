// SPDX-License-Identifier: Apache-2.0
// Rows are found by ID, which all indexes of the store support; a slice ends where its limits or the store end.
#include "kesto-uplink/outbox/StoreReader.h"

#include <algorithm>
#include <fmt/format.h>
#include <iterator>
#include <set>
#include <string_view>
#include <system_error>
#include <utility>

namespace kesto_uplink {

using platform::SqliteStatement;

namespace {

std::optional<std::string> textIn(const SqliteStatement& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(std::string(row.text(column)));
}

std::optional<std::int64_t> integerIn(const SqliteStatement& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(row.integer(column));
}

std::optional<double> realIn(const SqliteStatement& row, int column)
{
    return row.isNull(column) ? std::nullopt : std::optional(row.real(column));
}

} // namespace

// --- Access

bool StoreReader::open()
{
    if (database_) {
        database_->refresh();
        return true;
    }
    std::error_code error;
    if (!std::filesystem::exists(file_, error) && !error)
        return false;
    database_.emplace(file_);
    database_->execute("PRAGMA cache_size = -256"); // KiB, of 2 MB: rows are read once
    return true;
}

void StoreReader::inTransaction(const std::function<void()>& work)
{
    try {
        if (!open())
            return;
        database_->execute("BEGIN");
        work();
        database_->execute("COMMIT");
    } catch (...) {
        database_.reset(); // and with it the transaction
        throw;
    }
}

// A store of the first edition has no epoch until the service runs. While the service saves the rows of a damaged
// store, they may come in any order.
bool StoreReader::isReady()
{
    bool isReady = false;
    database_->forEachRow(
        database_->prepare("SELECT count(*) FILTER (WHERE name = 'store'), count(*) FILTER (WHERE name = 'stretches'),"
                           " count(*) FILTER (WHERE name = 'saved_store') FROM sqlite_schema WHERE type = 'table'"),
        [&](const SqliteStatement& row) {
            isReady = row.integer(0) == 1 && row.integer(2) == 0;
            hasStretches_ = row.integer(1) == 1;
        });
    return isReady && database_->number("SELECT count(*) FROM kinds WHERE name = ''") == 0;
}

std::optional<std::int64_t> StoreReader::idOf(const std::string& sql)
{
    std::optional<std::int64_t> id;
    database_->forEachRow(database_->prepare(sql), [&id](const SqliteStatement& row) { id = integerIn(row, 0); });
    return id;
}

Cursor StoreReader::newestNow()
{
    Cursor cursor;
    database_->forEachRow(database_->prepare("SELECT epoch, next_event - 1 FROM store"),
                          [&](const SqliteStatement& row) { cursor = {std::string(row.text(0)), row.integer(1)}; });
    return cursor;
}

std::optional<std::int64_t> StoreReader::oldestID()
{
    const auto event = idOf("SELECT id FROM events ORDER BY id LIMIT 1");
    const auto stretch = hasStretches_ ? idOf("SELECT min(id) FROM stretches") : std::nullopt;
    return event && stretch ? std::min(event, stretch) : event ? event : stretch;
}

// The cursor's ID in this database. One that was made to save the rows of a damaged one has these under the same IDs,
// so the reader goes on where it was. 0: the cursor says nothing here.
std::int64_t StoreReader::placeHere(const Cursor& after, const std::string& epoch)
{
    if (after.epoch == epoch)
        return after.id;
    if (idOf("SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = 'earlier_epochs'") != 1)
        return 0;
    const auto statement = database_->prepare("SELECT below - 1 FROM earlier_epochs WHERE epoch = ?");
    statement.bind(1, std::string_view(after.epoch));
    return database_->step(statement) ? std::min(after.id, statement.integer(0)) : 0;
}

// --- Slices

std::optional<Slice> StoreReader::read(const Cursor& after, const Limits& limits)
{
    std::optional<Slice> result;
    inTransaction([&] {
        const auto oldest = isReady() ? oldestID() : std::nullopt;
        if (!oldest)
            return;
        const Cursor newest = newestNow();
        const std::int64_t before = placeHere(after, newest.epoch);
        Slice slice{.after = {newest.epoch, before > 0 ? before : *oldest - 1}, .last = newest.id};
        if (slice.last <= slice.after.id)
            return;
        readEvents(slice, limits);
        if (hasStretches_)
            readStretches(slice, limits);
        std::erase_if(slice.events, [&slice](const StoredEvent& event) { return event.id > slice.last; });
        readApplications(slice);
        result = std::move(slice);
    });
    return result;
}

void StoreReader::readEvents(Slice& slice, const Limits& limits)
{
    const auto statement = database_->prepare("SELECT id, time, name, payload, session, happened FROM events"
                                              " WHERE id > ?1 AND id <= ?2 ORDER BY id");
    statement.bind(1, slice.after.id);
    statement.bind(2, slice.last);
    std::int64_t bytes = 0;
    while (database_->step(statement)) {
        bytes += static_cast<std::int64_t>(statement.text(3).size());
        if (!slice.events.empty() && (std::ssize(slice.events) == limits.rows || bytes > limits.payloadBytes)) {
            slice.last = slice.events.back().id;
            return;
        }
        slice.events.push_back({.id = statement.integer(0),
                                .time = statement.real(1),
                                .name = std::string(statement.text(2)),
                                .payload = std::string(statement.text(3)),
                                .session = integerIn(statement, 4),
                                .happened = realIn(statement, 5)});
    }
}

void StoreReader::readStretches(Slice& slice, const Limits& limits)
{
    const auto statement =
        database_->prepare("SELECT id, recording, began, seconds, device, format, channels, volume, ending, session"
                           " FROM stretches WHERE id > ?1 AND id <= ?2 ORDER BY id");
    statement.bind(1, slice.after.id);
    statement.bind(2, slice.last);
    while (database_->step(statement)) {
        if (std::ssize(slice.stretches) == limits.rows) {
            slice.last = slice.stretches.back().id;
            return;
        }
        slice.stretches.push_back({.id = statement.integer(0),
                                   .isRecording = statement.integer(1) != 0,
                                   .began = statement.real(2),
                                   .seconds = statement.real(3),
                                   .device = textIn(statement, 4),
                                   .format = textIn(statement, 5),
                                   .channels = integerIn(statement, 6),
                                   .volume = realIn(statement, 7),
                                   .ending = std::string(statement.text(8)),
                                   .session = integerIn(statement, 9)});
    }
}

void StoreReader::readApplications(Slice& slice)
{
    std::set<std::int64_t> sessions;
    const auto note = [&sessions](const auto& row) {
        if (row.session)
            sessions.insert(*row.session);
    };
    std::ranges::for_each(slice.events, note);
    std::ranges::for_each(slice.stretches, note);
    const auto statement = database_->prepare("SELECT application FROM sessions WHERE id = ?");
    for (const std::int64_t session : sessions) {
        statement.bind(1, session);
        database_->forEachRow(statement,
                              [&](const SqliteStatement& row) { slice.applications.emplace(session, row.text(0)); });
    }
}

// --- Sessions and places

std::vector<StoredSession> StoreReader::sessions(const std::set<std::int64_t>& wanted, const std::string& epoch)
{
    std::vector<StoredSession> sessions;
    inTransaction([&] {
        if (!isReady() || newestNow().epoch != epoch)
            return;
        const auto statement = database_->prepare(
            "SELECT s.id, s.reporter, s.service, s.application, c.name, s.began, s.ended, s.past FROM sessions s"
            " LEFT JOIN sources c ON c.id = s.source WHERE s.id = ?");
        for (const std::int64_t id : wanted) {
            statement.bind(1, id);
            database_->forEachRow(statement, [&sessions](const SqliteStatement& row) {
                sessions.push_back({.id = row.integer(0),
                                    .reporter = row.integer(1),
                                    .service = textIn(row, 2),
                                    .application = std::string(row.text(3)),
                                    .process = textIn(row, 4),
                                    .began = row.real(5),
                                    .ended = realIn(row, 6),
                                    .past = integerIn(row, 7)});
            });
        }
    });
    return sessions;
}

Cursor StoreReader::newest()
{
    Cursor cursor;
    inTransaction([&] {
        if (!isReady())
            throw EventStoreError(fmt::format("the event store {} is being made or repaired: try again when kestod "
                                              "has run for some seconds",
                                              file_.native()));
        cursor = newestNow();
    });
    return cursor;
}

Cursor StoreReader::beforeNewest(std::int64_t events)
{
    Cursor cursor;
    inTransaction([&] {
        if (!isReady())
            return;
        cursor = newestNow();
        cursor.id = idOf(fmt::format("SELECT id FROM events ORDER BY id DESC LIMIT 1 OFFSET {}", events)).value_or(0);
    });
    return cursor;
}

Cursor StoreReader::before(double time)
{
    Cursor cursor;
    inTransaction([&] {
        if (!isReady())
            return;
        cursor = newestNow();
        const auto statement = database_->prepare("SELECT min(id) FROM events WHERE time >= ?");
        statement.bind(1, time);
        database_->forEachRow(statement, [&cursor](const SqliteStatement& row) {
            if (!row.isNull(0))
                cursor.id = std::min(cursor.id, row.integer(0) - 1);
        });
    });
    return cursor;
}

} // namespace kesto_uplink
