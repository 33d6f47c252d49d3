// SPDX-License-Identifier: Apache-2.0
// A change of device or volume ends a stretch and begins the next one in the same transaction. So what plays began with
// the first of those that ended by a change, one after the other.
#include "kesto/top/PlayingStreams.h"

#include <algorithm>
#include <fmt/format.h>

using platform::SqliteStatement;

void PlayingStreams::forget()
{
    seen_ = 0;
    began_.clear();
    faults_.clear();
}

void PlayingStreams::refresh()
{
    if (!database_)
        database_.emplace(path_);
    else if (database_->refresh())
        forget();
}

std::vector<PlayingStream> PlayingStreams::read()
{
    refresh();
    try {
        database_->execute("BEGIN"); // one snapshot
        std::vector<PlayingStream> streams;
        if (database_->number("SELECT count(*) FROM sqlite_schema WHERE name = 'open_stretches'") == 0) {
            database_->execute("COMMIT"); // the service has not stored anything yet
            return streams;
        }
        streams = readOpen();
        readEnded();
        readFaults();
        forgetEndedSessions();
        seen_ = database_->number("SELECT next_event - 1 FROM store");
        database_->execute("COMMIT");
        for (PlayingStream& stream : streams) {
            if (const auto began = began_.find({stream.session, stream.isRecording}); began != began_.end())
                stream.since = began->second;
            if (const auto faults = faults_.find(stream.session); faults != faults_.end())
                stream.faults = faults->second;
        }
        return streams;
    } catch (const EventStoreError&) {
        forget(); // the database is closed, and may be another one next time
        throw;
    }
}

std::vector<PlayingStream> PlayingStreams::readOpen()
{
    std::vector<PlayingStream> streams;
    const auto statement = database_->prepare(
        "SELECT o.session, s.application, o.recording, o.began, o.device, o.format, o.volume FROM open_stretches o"
        " LEFT JOIN sessions s ON s.id = o.session ORDER BY o.id");
    database_->forEachRow(statement, [&streams](const SqliteStatement& row) {
        streams.push_back({.session = row.integer(0),
                           .application = std::string(row.text(1)),
                           .isRecording = row.integer(2) != 0,
                           .since = row.real(3),
                           .device = std::string(row.text(4)),
                           .format = std::string(row.text(5)),
                           .volume = row.isNull(6) ? std::nullopt : std::optional(std::clamp(row.real(6), 0.0, 1.0))});
    });
    std::erase_if(began_, [&streams](const auto& entry) {
        return std::ranges::none_of(streams, [&entry](const PlayingStream& stream) {
            return Key(stream.session, stream.isRecording) == entry.first;
        });
    });
    return streams;
}

// The last stretch of a session that is not open did not end by a change: it says nothing about the next one.
void PlayingStreams::readEnded()
{
    const auto statement =
        database_->prepare("SELECT session, recording, began, ending = 'change' FROM stretches"
                           " WHERE id > ?1 AND session IN (SELECT session FROM open_stretches) ORDER BY id");
    statement.bind(1, seen_);
    database_->forEachRow(statement, [this](const SqliteStatement& row) {
        const Key key(row.integer(0), row.integer(1) != 0);
        if (row.integer(3) != 0)
            began_.try_emplace(key, row.real(2));
        else
            began_.erase(key);
    });
}

// Each event stands in the store under two names; by this one it counts once. It is a literal, so that SQLite finds all
// events by the index of names. New ones are few: the sign before the name makes it go by their IDs.
void PlayingStreams::readFaults()
{
    const auto statement = database_->prepare(fmt::format(
        "SELECT session FROM events WHERE {}name GLOB 'com.quarn.kesto.Error.*' AND id > ?1", seen_ == 0 ? "" : "+"));
    statement.bind(1, seen_);
    database_->forEachRow(statement, [this](const SqliteStatement& row) { ++faults_[row.integer(0)]; });
}

void PlayingStreams::forgetEndedSessions()
{
    std::erase_if(faults_, [this](const auto& entry) {
        return database_->number(
                   fmt::format("SELECT count(*) FROM sessions WHERE id = {} AND ended IS NULL", entry.first))
            == 0;
    });
}
