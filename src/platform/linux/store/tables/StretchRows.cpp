// SPDX-License-Identifier: Apache-2.0
// Both tables have the columns of the state in the same order.
#include "platform/linux/store/tables/StretchRows.h"

#include <initializer_list>
#include <string_view>
#include <utility>

namespace platform {
namespace {

void bindState(const SqliteStatement& statement, int first, const PlayingState& state)
{
    const auto view = [](const std::optional<std::string>& text) {
        return text ? std::optional<std::string_view>(*text) : std::nullopt;
    };
    statement.bind(first, view(state.devices));
    statement.bind(first + 1, view(state.format));
    statement.bind(first + 2, state.channels);
    statement.bind(first + 3, state.volume);
}

PlayingState readState(const SqliteStatement& row, int first)
{
    const auto text = [&row](int column) {
        return row.isNull(column) ? std::nullopt : std::optional(std::string(row.text(column)));
    };
    return {.devices = text(first),
            .format = text(first + 1),
            .channels = row.isNull(first + 2) ? std::nullopt : std::optional(row.integer(first + 2)),
            .volume = row.isNull(first + 3) ? std::nullopt : std::optional(row.real(first + 3))};
}

} // namespace

StoreExpected<StretchRows> StretchRows::open(SqliteConnection& connection)
{
    StretchRows rows;
    const std::initializer_list<std::pair<SqliteStatement*, std::string_view>> wanted = {
        {&rows.insert_,
         "INSERT INTO stretches(id, holder, session, recording, began, seconds, device, format, channels, volume,"
         " ending) VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?8, ?9, ?10, ?11, ?7)"},
        {&rows.insertOpen_,
         "INSERT OR REPLACE INTO open_stretches(id, holder, session, recording, began, arrived, device, format,"
         " channels, volume) VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?, ?)"},
        {&rows.removeOpen_, "DELETE FROM open_stretches WHERE id = ?"},
        {&rows.selectOpen_,
         "SELECT holder, session, recording, arrived, device, format, channels, volume FROM open_stretches"
         " ORDER BY id"},
        {&rows.forgetOpen_, "DELETE FROM open_stretches"},
        {&rows.areBelow_, "SELECT 1 FROM stretches WHERE id < ? LIMIT 1"},
        {&rows.remove_,
         "DELETE FROM stretches WHERE id >= ?1 AND id < ?2 AND holder = coalesce(?3, holder) RETURNING holder,"
         " coalesce(length(CAST(device AS BLOB)), 0) + coalesce(length(CAST(format AS BLOB)), 0)"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection.prepare(sql);
        if (!prepared)
            return std::unexpected(prepared.error());
        *statement = std::move(*prepared);
    }
    return rows;
}

std::size_t StretchRows::bytesOf(const PlayingState& state) noexcept
{
    return (state.devices ? state.devices->size() : 0) + (state.format ? state.format->size() : 0);
}

StoreExpected<> StretchRows::insert(std::int64_t id, const Owner& owner, const Stretch& stretch) const
{
    insert_.bind(1, id);
    insert_.bind(2, owner.holder);
    insert_.bind(3, owner.session);
    insert_.bind(4, std::int64_t{stretch.isRecording});
    insert_.bind(5, stretch.began);
    insert_.bind(6, stretch.seconds);
    insert_.bind(7, name(stretch.ending));
    bindState(insert_, 8, stretch.state);
    return insert_.run();
}

StoreExpected<> StretchRows::insertOpen(const Owner& owner, const Stretches::Change& change) const
{
    insertOpen_.bind(1, change.key);
    insertOpen_.bind(2, owner.holder);
    insertOpen_.bind(3, owner.session);
    insertOpen_.bind(4, std::int64_t{change.isRecording});
    insertOpen_.bind(5, change.open->began.time());
    insertOpen_.bind(6, change.open->began.arrived);
    bindState(insertOpen_, 7, *change.state);
    return insertOpen_.run();
}

StoreExpected<> StretchRows::removeOpen(Stretches::Key key) const
{
    removeOpen_.bind(1, key);
    return removeOpen_.run();
}

StoreExpected<std::vector<StretchRows::Unfinished>> StretchRows::unfinished() const
{
    std::vector<Unfinished> found;
    while (true) {
        const auto row = selectOpen_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            return found;
        found.push_back({.owner = {.holder = selectOpen_.integer(0), .session = {}},
                         .stretch = {.origin = {},
                                     .isRecording = selectOpen_.integer(2) != 0,
                                     .began = selectOpen_.real(3),
                                     .seconds = 0,
                                     .state = readState(selectOpen_, 4),
                                     .ending = StretchEnding::ServiceEnded}});
        if (!selectOpen_.isNull(1))
            found.back().owner.session = selectOpen_.integer(1);
    }
}

StoreExpected<> StretchRows::forgetUnfinished() const
{
    return forgetOpen_.run();
}

StoreExpected<bool> StretchRows::areBelow(std::int64_t id) const
{
    areBelow_.bind(1, id);
    const auto row = areBelow_.step();
    areBelow_.reset();
    return row;
}

StoreExpected<std::vector<StretchRows::Removed>> StretchRows::remove(const Range& range) const
{
    remove_.bind(1, range.from);
    remove_.bind(2, range.below);
    remove_.bind(3, range.holder);
    std::vector<Removed> removed;
    while (true) {
        const auto row = remove_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            return removed;
        removed.push_back({remove_.integer(0), remove_.integer(1)});
    }
}

} // namespace platform
