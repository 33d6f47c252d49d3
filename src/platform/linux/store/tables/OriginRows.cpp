// SPDX-License-Identifier: Apache-2.0
// `past` is the ID from which on a source or a session that ended has no events.
#include "platform/linux/store/tables/OriginRows.h"

#include <initializer_list>
#include <string_view>
#include <utility>

namespace platform {

StoreExpected<OriginRows> OriginRows::open(SqliteConnection& connection)
{
    OriginRows rows;
    const std::initializer_list<std::pair<SqliteStatement*, std::string_view>> wanted = {
        {&rows.writeSource_,
         "INSERT OR REPLACE INTO sources(id, boot, user, process, name, began, ended, past)"
         " VALUES (?, ?, ?, ?, ?, ?, ?, ?)"},
        {&rows.writeSession_,
         "INSERT OR REPLACE INTO sessions(id, source, reporter, service, application, began, ended, past)"
         " VALUES (?, ?, ?, ?, ?, ?, ?, ?)"},
        {&rows.closeSources_, "UPDATE sources SET past = ? WHERE past IS NULL"},
        {&rows.closeSessions_, "UPDATE sessions SET past = ? WHERE past IS NULL"},
        {&rows.removeSources_,
         "DELETE FROM sources WHERE past <= (SELECT min(id) FROM messages)"
         " AND past <= (SELECT coalesce(min(id), past) FROM stretches)"},
        {&rows.removeSessions_,
         "DELETE FROM sessions WHERE past <= (SELECT min(id) FROM messages)"
         " AND past <= (SELECT coalesce(min(id), past) FROM stretches)"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection.prepare(sql);
        if (!prepared)
            return std::unexpected(prepared.error());
        *statement = std::move(*prepared);
    }
    return rows;
}

StoreExpected<> OriginRows::closeEarlierRun(const StoreCounts& counts)
{
    for (const SqliteStatement* statement : {&closeSources_, &closeSessions_}) {
        statement->bind(1, counts.nextEvent);
        if (const auto done = statement->run(); !done)
            return done;
    }
    return {};
}

StoreExpected<OriginRows::Rows> OriginRows::of(const Origin& origin, KnownOrigins& known, StoreCounts& counts)
{
    const auto source = sourceRow(origin.source, known, counts);
    if (!source)
        return std::unexpected(source.error());
    const auto session = sessionRow(origin.session, known, counts);
    if (!session)
        return std::unexpected(session.error());
    return Rows{*source, *session};
}

StoreExpected<std::optional<std::int64_t>> OriginRows::sourceRow(std::uint64_t number, KnownOrigins& known,
                                                                 StoreCounts& counts)
{
    KnownOrigin<SourceBegin>* const source = number == 0 ? nullptr : known.sources.find(number);
    if (source == nullptr)
        return std::nullopt;
    if (source->row == 0) {
        known.sources.setRow(number, counts.nextSource++);
        if (const auto done = write(*source, known, counts.nextEvent); !done)
            return std::unexpected(done.error());
    }
    if (source->ended) // the event came late
        known.sources.change(number);
    return source->row;
}

// A session's row comes with that of its owner.
StoreExpected<std::optional<std::int64_t>> OriginRows::sessionRow(std::uint64_t number, KnownOrigins& known,
                                                                  StoreCounts& counts)
{
    KnownOrigin<SessionBegin>* const session = number == 0 ? nullptr : known.sessions.find(number);
    if (session == nullptr)
        return std::nullopt;
    if (session->row == 0) {
        const auto source = sourceRow(session->begin.source, known, counts);
        if (!source)
            return std::unexpected(source.error());
        known.sessions.setRow(number, counts.nextSession++);
        if (const auto done = write(*session, *source, counts.nextEvent); !done)
            return std::unexpected(done.error());
    }
    if (session->ended)
        known.sessions.change(number);
    return session->row;
}

StoreExpected<> OriginRows::write(const KnownOrigin<SourceBegin>& source, const KnownOrigins& known,
                                  std::int64_t nextEvent)
{
    const SourceBegin& begin = source.begin;
    writeSource_.bind(1, source.row);
    writeSource_.bind(2, std::string_view(known.bootIdentifier));
    writeSource_.bind(3, static_cast<std::int64_t>(begin.userIdentifier));
    writeSource_.bind(4, static_cast<std::int64_t>(begin.processIdentifier));
    writeSource_.bind(5, begin.processName.empty() ? std::nullopt : std::optional<std::string_view>(begin.processName));
    writeSource_.bind(6, begin.time);
    writeSource_.bind(7, source.ended);
    writeSource_.bind(8, source.ended ? std::optional(nextEvent) : std::nullopt);
    return writeSource_.run();
}

StoreExpected<> OriginRows::write(const KnownOrigin<SessionBegin>& session, std::optional<std::int64_t> source,
                                  std::int64_t nextEvent)
{
    const SessionBegin& begin = session.begin;
    writeSession_.bind(1, session.row);
    writeSession_.bind(2, source);
    writeSession_.bind(3, begin.reporterID);
    writeSession_.bind(4,
                       begin.serviceType.empty() ? std::nullopt : std::optional<std::string_view>(begin.serviceType));
    writeSession_.bind(5, std::string_view(begin.application));
    writeSession_.bind(6, begin.time);
    writeSession_.bind(7, session.ended);
    writeSession_.bind(8, session.ended ? std::optional(nextEvent) : std::nullopt);
    return writeSession_.run();
}

StoreExpected<> OriginRows::writeChanges(KnownOrigins& known, const StoreCounts& counts)
{
    for (const std::uint64_t number : known.sources.changed())
        if (const auto* source = known.sources.find(number); source != nullptr && source->row != 0)
            if (const auto done = write(*source, known, counts.nextEvent); !done)
                return done;
    for (const std::uint64_t number : known.sessions.changed()) {
        const auto* session = known.sessions.find(number);
        if (session == nullptr || session->row == 0)
            continue;
        const auto* owner = known.sources.find(session->begin.source);
        const auto source = owner == nullptr || owner->row == 0 ? std::nullopt : std::optional(owner->row);
        if (const auto done = write(*session, source, counts.nextEvent); !done)
            return done;
    }
    return {};
}

StoreExpected<> OriginRows::removeUnused()
{
    for (const SqliteStatement* statement : {&removeSources_, &removeSessions_})
        if (const auto done = statement->run(); !done)
            return done;
    return {};
}

} // namespace platform
