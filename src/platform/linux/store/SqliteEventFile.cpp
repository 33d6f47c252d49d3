// SPDX-License-Identifier: Apache-2.0
// What stands in memory and in the database, such as the next ID, changes with a transaction or is dropped with it.
#include "platform/linux/store/SqliteEventFile.h"

#include "platform/linux/store/tables/SkippedIDs.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <tuple>
#include <utility>
#include <vector>

namespace platform {

SqliteEventFile::~SqliteEventFile() = default;

template <typename Work> SqliteEventFile::Expected<> SqliteEventFile::inTransaction(Work work)
{
    if (const auto done = begin(); !done)
        return done;
    if (const auto done = work(); !done)
        return done;
    return commit();
}

// --- Opening

SqliteEventFile::Expected<std::unique_ptr<SqliteEventFile>> SqliteEventFile::open(const std::filesystem::path& path,
                                                                                  const Clock& clock,
                                                                                  KnownOrigins& origins,
                                                                                  Stretches& stretches)
{
    std::unique_ptr<SqliteEventFile> database(new SqliteEventFile(path, clock, origins, stretches));
    for (const auto step : {&SqliteEventFile::lockDirectory, &SqliteEventFile::connect, &SqliteEventFile::makeSchema,
                            &SqliteEventFile::configure, &SqliteEventFile::prepareStatements,
                            &SqliteEventFile::compareCounts, &SqliteEventFile::beginRun})
        if (const auto done = (*database.*step)(); !done)
            return std::unexpected(done.error());
    return database;
}

// The lock is not on the file itself: closing any descriptor of the file would release SQLite's own locks.
SqliteEventFile::Expected<> SqliteEventFile::lockDirectory()
{
    directoryLock_ = FileDescriptor(::open(path_.parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directoryLock_)
        return std::unexpected(StoreError::CannotOpen);
    if (::flock(directoryLock_.get(), LOCK_EX | LOCK_NB) != 0)
        return std::unexpected(errno == EWOULDBLOCK ? StoreError::InUse : StoreError::InputOutput);
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::connect()
{
    auto connection = SqliteConnection::open(path_);
    if (!connection)
        return std::unexpected(connection.error());
    connection_ = std::move(*connection);
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::makeSchema()
{
    return StoreSchema::make(*connection_);
}

SqliteEventFile::Expected<> SqliteEventFile::configure()
{
    const auto pageSize = connection_->number("PRAGMA page_size");
    if (!pageSize)
        return std::unexpected(pageSize.error());
    pageSize_ = static_cast<std::uint64_t>(*pageSize);
    return connection_->beginLog();
}

SqliteEventFile::Expected<> SqliteEventFile::prepareStatements()
{
    // A database with another schema fails here.
    const auto corruptIfOther = [](StoreError error) {
        return std::unexpected(error == StoreError::Other ? StoreError::Corrupt : error);
    };
    auto counts = StoreCountsRow::open(*connection_, clock_.secondsSince1970());
    if (!counts)
        return corruptIfOther(counts.error());
    counts_ = std::move(*counts);
    auto kinds = EventKinds::open(*connection_);
    if (!kinds)
        return corruptIfOther(kinds.error());
    kinds_ = std::move(*kinds);
    auto originRows = OriginRows::open(*connection_);
    if (!originRows)
        return corruptIfOther(originRows.error());
    originRows_ = std::move(*originRows);
    auto stretchRows = StretchRows::open(*connection_);
    if (!stretchRows)
        return corruptIfOther(stretchRows.error());
    stretchRows_ = std::move(*stretchRows);
    auto holders = EventHolders::open(*connection_);
    if (!holders)
        return corruptIfOther(holders.error());
    holders_ = std::move(*holders);
    auto ages = EventAges::open(*connection_);
    if (!ages)
        return corruptIfOther(ages.error());
    ages_ = std::move(*ages);
    auto firstEdition = FirstEdition::open(*connection_);
    if (!firstEdition)
        return corruptIfOther(firstEdition.error());
    firstEdition_ = std::move(*firstEdition);

    const std::initializer_list<std::pair<SqliteStatement*, std::string_view>> wanted = {
        {&begin_, "BEGIN IMMEDIATE"},
        {&commit_, "COMMIT"},
        {&insert_,
         "INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
         " VALUES (?, ?, ?, ?, ?, ?, ?, ?)"},
        {&selectBelow_, "SELECT id FROM messages WHERE id < ? ORDER BY id LIMIT ?"},
        {&selectFrom_, "SELECT id, holder FROM messages WHERE id >= ? ORDER BY id LIMIT ?"},
        {&selectOne_,
         "SELECT 1 + (k.second_name IS NOT NULL), length(CAST(m.payload AS BLOB)), m.holder"
         " FROM messages m JOIN kinds k ON k.id = m.kind WHERE m.id = ?"},
        {&delete_, "DELETE FROM messages WHERE id = ?"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection_->prepare(sql);
        if (!prepared)
            return corruptIfOther(prepared.error());
        *statement = std::move(*prepared);
    }
    return {};
}

// The ledger believes the counts, so they must not wait for the first event to contradict them.
SqliteEventFile::Expected<> SqliteEventFile::compareCounts()
{
    const auto last = connection_->number("SELECT max((SELECT coalesce(max(id), 0) FROM messages),"
                                          " (SELECT coalesce(max(id), 0) FROM stretches))");
    if (!last)
        return std::unexpected(last.error());
    if (*last >= counts_.counts().nextEvent)
        return std::unexpected(StoreError::Corrupt);
    return {};
}

// A database that this run has not seen yet has no rows of its sources and sessions. Whatever it holds was kept before.
// One that was repaired begins a new epoch, with new rows of both: so no event belongs to a session of another epoch.
SqliteEventFile::Expected<> SqliteEventFile::beginRun()
{
    StoreCounts& counts = counts_.counts();
    // A database without a past has the time of this moment there.
    const auto endOfEarlierRun = counts.nextEvent > 1 ? std::optional(counts.clock.wall) : std::nullopt;
    // The log of this transaction reaches the disk before an event can be read.
    if (const auto done = setSynchronization(StoreSynchronization::Full); !done)
        return done;
    const bool isKnown = origins_.epoch == counts_.epoch();
    const auto isLeft = OpenRun::isLeftByAnother(*connection_, origins_.bootIdentifier);
    if (!isLeft)
        return std::unexpected(isLeft.error());
    if (*isLeft || (isKnown && counts.nextEvent < origins_.nextEvent)) {
        counts.nextEvent += skippedEvents;
        counts.nextSource += skippedOrigins;
        counts.nextSession += skippedOrigins;
    }
    ageClock_.emplace(clock_, counts.clock, counts.nextEvent);
    committedAgeClock_ = ageClock_;
    if (!isKnown) {
        origins_.sources.forgetRows();
        origins_.sessions.forgetRows();
        stretches_.forgetRows();
    }
    const auto done = inTransaction([&]() -> Expected<> {
        if (const auto begun = OpenRun::begin(*connection_, origins_.bootIdentifier, clock_.secondsSince1970()); !begun)
            return begun;
        if (const auto marked = ages_.markNow(counts.nextEvent, counts.clock.time); !marked)
            return marked;
        return isKnown ? Expected<>() : closeEarlierRun(endOfEarlierRun);
    });
    if (done)
        origins_.epoch = counts_.epoch(); // else the next opening closes the earlier run
    return done;
}

// What runs in this run is in memory: rows of it come only from a database that was damaged.
SqliteEventFile::Expected<> SqliteEventFile::closeEarlierRun(std::optional<double> end)
{
    if (!stretches_.wereWritten() && end) {
        stretches_.setEarlierEnd(*end);
        const auto unfinished = stretchRows_.unfinished();
        if (!unfinished)
            return std::unexpected(unfinished.error());
        for (auto [owner, stretch] : *unfinished) {
            stretch.seconds = lengthOfTime(stretch.began, *end);
            ++(stretch.seconds > 0 ? stretchCounts_.closed : stretchCounts_.leftOut);
            if (const auto done = stretch.seconds > 0 ? insertStretch(owner, stretch) : Expected<>(); !done)
                return done;
        }
    }
    if (const auto done = stretchRows_.forgetUnfinished(); !done)
        return done;
    return originRows_.closeEarlierRun(counts_.counts());
}

void SqliteEventFile::endRun()
{
    std::ignore = OpenRun::end(*connection_);
    connection_->truncateLog(); // if a reader needs it, the next start checks the database for nothing
}

SqliteEventFile::Expected<> SqliteEventFile::setSynchronization(StoreSynchronization synchronization)
{
    return connection_->execute(synchronization == StoreSynchronization::Full ? "PRAGMA synchronous = FULL"
                                                                              : "PRAGMA synchronous = NORMAL");
}

// --- Writing

SqliteEventFile::Expected<> SqliteEventFile::begin()
{
    lastResolved_.reset();
    return begin_.run();
}

SqliteEventFile::Expected<> SqliteEventFile::insert(std::span<const EventRow> rows)
{
    StoreCounts& counts = counts_.counts();
    for (const EventRow& row : rows) {
        const auto resolved = resolve(row.origin);
        if (!resolved)
            return std::unexpected(resolved.error());
        if (const auto done = insert(counts.nextEvent, row, *resolved); !done)
            return done;
        holders_.add(resolved->holder, row.payload.size());
        const auto events = static_cast<std::int64_t>(row.events());
        counts.nextEvent += events;
        counts.kept += events;
    }
    return {};
}

// Neighbours mostly have the same origin.
SqliteEventFile::Expected<SqliteEventFile::Resolved> SqliteEventFile::resolve(const Origin& origin)
{
    if (lastResolved_ && lastResolved_->origin == origin)
        return *lastResolved_;
    EventHolder holder;
    if (auto culprit = origins_.culpritOf(origin))
        holder = {culprit->user, std::move(culprit->process), std::move(culprit->application)};
    const auto id = holders_.idOf(std::move(holder), counts_.counts().nextEvent);
    if (!id)
        return std::unexpected(id.error());
    const auto rows = originRows_.of(origin, origins_, counts_.counts());
    if (!rows)
        return std::unexpected(rows.error());
    lastResolved_ = {origin, *rows, *id};
    return *lastResolved_;
}

SqliteEventFile::Expected<> SqliteEventFile::insert(std::int64_t id, const EventRow& row, const Resolved& resolved)
{
    const auto kind = kinds_.idOf(row.name, row.secondName);
    if (!kind)
        return std::unexpected(kind.error());
    insert_.bind(1, id);
    insert_.bind(2, row.time);
    insert_.bind(3, *kind);
    insert_.bind(4, resolved.rows.session);
    insert_.bind(5, resolved.rows.source);
    insert_.bind(6, row.happened);
    insert_.bind(7, resolved.holder);
    insert_.bind(8, row.payload); // every payload is far shorter than SQLite's limit
    return insert_.run();
}

SqliteEventFile::Expected<> SqliteEventFile::insertStretches()
{
    if (!stretches_.hasChanges())
        return {};
    for (const Stretch& stretch : stretches_.ended()) {
        const auto owner = ownerOf(stretch.origin);
        if (!owner)
            return std::unexpected(owner.error());
        if (const auto done = insertStretch(*owner, stretch); !done)
            return done;
    }
    for (const Stretches::Change& change : stretches_.rowChanges()) {
        const auto owner = change.open == nullptr ? StretchRows::Owner() : ownerOf(change.open->origin);
        if (!owner)
            return std::unexpected(owner.error());
        const auto done =
            change.open == nullptr ? stretchRows_.removeOpen(change.key) : stretchRows_.insertOpen(*owner, change);
        if (!done)
            return done;
    }
    return {};
}

SqliteEventFile::Expected<StretchRows::Owner> SqliteEventFile::ownerOf(const Origin& origin)
{
    const auto resolved = resolve(origin);
    if (!resolved)
        return std::unexpected(resolved.error());
    return StretchRows::Owner{.holder = resolved->holder, .session = resolved->rows.session};
}

SqliteEventFile::Expected<> SqliteEventFile::insertStretch(const StretchRows::Owner& owner, const Stretch& stretch)
{
    holders_.add(owner.holder, StretchRows::bytesOf(stretch.state));
    return stretchRows_.insert(counts_.counts().nextEvent++, owner, stretch);
}

SqliteEventFile::Expected<> SqliteEventFile::commit()
{
    if (const auto done = originRows_.writeChanges(origins_, counts_.counts()); !done)
        return done;
    if (const auto done = holders_.writeChanges(); !done)
        return done;
    if (const auto done = keepTime(); !done)
        return done;
    if (const auto done = counts_.write(); !done)
        return done;
    if (const auto done = commit_.run(); !done)
        return done;
    counts_.noteCommit();
    origins_.nextEvent = counts_.committed().nextEvent;
    origins_.committed();
    holders_.committed();
    ages_.committed();
    committedAgeClock_ = ageClock_;
    return {};
}

// The events before this transaction were kept by the time of the last one.
SqliteEventFile::Expected<> SqliteEventFile::keepTime()
{
    const StoreCounts& before = counts_.committed();
    const auto correction = ageClock_->advance();
    counts_.counts().clock = ageClock_->state();
    if (counts_.counts().nextEvent != before.nextEvent)
        if (const auto done = ages_.mark(before.nextEvent, before.clock.time, ageClock_->state().time); !done)
            return done;
    return correction ? ages_.apply(*correction) : Expected<>();
}

void SqliteEventFile::rollBack()
{
    connection_->rollBack();
    counts_.rolledBack();
    kinds_.rolledBack();
    origins_.rolledBack();
    holders_.rolledBack();
    ages_.rolledBack();
    ageClock_ = committedAgeClock_;
}

// --- The first edition

SqliteEventFile::Expected<> SqliteEventFile::moveFirstEdition()
{
    const auto messages = firstEdition_->next();
    if (!messages)
        return std::unexpected(messages.error());
    if (messages->empty()) {
        firstEdition_.reset();
        return StoreSchema::dropFirstEdition(*connection_);
    }
    return inTransaction([&]() -> Expected<> {
        const auto resolved = resolve({});
        if (!resolved)
            return std::unexpected(resolved.error());
        for (const auto& [id, time, happened, name, secondName, payload] : *messages) {
            if (const auto done = markFirstEdition(id, time); !done)
                return done;
            if (const auto done = insert(id, {time, happened, {}, name, secondName, payload}, *resolved); !done)
                return done;
            holders_.add(resolved->holder, payload.size(), id);
        }
        return firstEdition_->remove(*messages, counts_.counts());
    });
}

// The first edition knew only when the service sent an event, by a clock that may have been wrong: what lies in the
// future or before an earlier event says nothing.
SqliteEventFile::Expected<> SqliteEventFile::markFirstEdition(std::int64_t id, double time)
{
    const double wall = clock_.secondsSince1970();
    if (time > wall || time < latestOfFirstEdition_ + EventAges::secondsBetweenMarks)
        return {};
    latestOfFirstEdition_ = time;
    return ages_.markEarlier(id, ageClock_->state().time - (wall - time));
}

// --- Limits

SqliteEventFile::Expected<double> SqliteEventFile::oldest()
{
    const auto statement = connection_->prepare("SELECT time FROM messages ORDER BY id LIMIT 1");
    if (!statement)
        return std::unexpected(statement.error());
    const auto row = statement->step();
    if (!row)
        return std::unexpected(row.error());
    return *row ? statement->real(0) : 0;
}

SqliteEventFile::Expected<SqliteEventFile::Size> SqliteEventFile::size()
{
    const auto pages = connection_->number("PRAGMA page_count");
    const auto free = pages ? connection_->number("PRAGMA freelist_count") : pages;
    if (!free)
        return std::unexpected(free.error());
    return Size{.usedBytes = static_cast<std::uint64_t>(*pages - *free) * pageSize_,
                .freeBytes = static_cast<std::uint64_t>(*free) * pageSize_};
}

SqliteEventFile::Expected<SqliteEventFile::EventsByHolder> SqliteEventFile::deleteOlderThan(double seconds,
                                                                                            std::uint64_t most)
{
    AgeClock now = *ageClock_;
    if (now.advance()) // events are older than it seemed
        if (const auto done = inTransaction([]() -> Expected<> { return {}; }); !done)
            return std::unexpected(done.error());
    const double until = now.state().time - seconds;
    const StoreCounts& counts = counts_.committed();
    const auto below = counts.clock.time <= until ? Expected<std::int64_t>(counts.nextEvent) : ages_.keptBy(until);
    if (!below)
        return std::unexpected(below.error());
    std::vector<Doomed> doomed;
    selectBelow_.bind(1, *below);
    selectBelow_.bind(2, most);
    while (true) {
        const auto row = selectBelow_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            break;
        const auto message = look(selectBelow_.integer(0));
        if (!message)
            return std::unexpected(message.error());
        doomed.push_back(*message);
    }
    const bool areAll = doomed.size() < most;
    const auto haveStretches = doomed.empty() ? stretchRows_.areBelow(*below) : Expected<bool>(true);
    if (!haveStretches)
        return std::unexpected(haveStretches.error());
    if (!*haveStretches) {
        if (const auto done = ages_.forget(*below); *below != 0 && !done)
            return std::unexpected(done.error());
        return EventsByHolder();
    }
    EventsByHolder events = eventsByHolder(doomed); // a holder may go with its last message
    const StretchRows::Range stretches{.from = 0, .below = areAll ? *below : doomed.back().id, .holder = {}};
    if (const auto done = remove(doomed, stretches); !done)
        return std::unexpected(done.error());
    return events;
}

SqliteEventFile::Expected<SqliteEventFile::Removal> SqliteEventFile::deleteOfLargestHolder(std::uint64_t bytes,
                                                                                           std::uint64_t most)
{
    const auto largest = holders_.largest();
    if (!largest)
        return Removal{.events = 0, .holder = {}, .isOnlyHolder = true, .isDone = true};
    std::vector<Doomed> doomed;
    std::uint64_t counted = 0;
    std::uint64_t lookedAt = 0;
    std::int64_t next = largest->oldest;
    bool areAll = false;
    selectFrom_.bind(1, largest->oldest);
    selectFrom_.bind(2, mostLookedAt);
    while (doomed.size() < most && counted < bytes) {
        const auto row = selectFrom_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row) {
            areAll = lookedAt < mostLookedAt;
            break;
        }
        ++lookedAt;
        next = selectFrom_.integer(0) + 1;
        if (selectFrom_.integer(1) != largest->id)
            continue;
        const auto message = look(selectFrom_.integer(0));
        if (!message)
            return std::unexpected(message.error());
        counted += static_cast<std::uint64_t>(message->bytes + EventHolders::bytesBesidesPayload);
        doomed.push_back(*message);
    }
    selectFrom_.reset();
    holders_.setOldest(largest->id, next);
    if (doomed.empty() && areAll)
        holders_.setEmpty(largest->id);
    const StretchRows::Range stretches{
        .from = largest->oldest, .below = areAll ? counts_.counts().nextEvent : next, .holder = largest->id};
    if (const auto done = remove(doomed, stretches); !done)
        return std::unexpected(done.error());
    return Removal{
        .events = eventsOf(doomed), .holder = largest->holder, .isOnlyHolder = largest->isOnlyOne, .isDone = false};
}

SqliteEventFile::Expected<SqliteEventFile::Doomed> SqliteEventFile::look(std::int64_t id)
{
    selectOne_.bind(1, id);
    const auto row = selectOne_.step();
    if (!row)
        return std::unexpected(row.error());
    if (!*row)
        return std::unexpected(StoreError::Corrupt); // a message without its kind
    const Doomed message{id, selectOne_.integer(0), selectOne_.integer(1), selectOne_.integer(2)};
    selectOne_.reset();
    return message;
}

std::uint64_t SqliteEventFile::eventsOf(const std::vector<Doomed>& doomed)
{
    std::int64_t events = 0;
    for (const Doomed& message : doomed)
        events += message.events;
    return static_cast<std::uint64_t>(events);
}

SqliteEventFile::EventsByHolder SqliteEventFile::eventsByHolder(const std::vector<Doomed>& doomed) const
{
    std::map<std::int64_t, std::uint64_t> byId;
    for (const Doomed& message : doomed)
        byId[message.holder] += static_cast<std::uint64_t>(message.events);
    EventsByHolder events;
    for (const auto& [id, count] : byId)
        events[holders_.holderOf(id)] += count;
    return events;
}

SqliteEventFile::Expected<> SqliteEventFile::remove(const std::vector<Doomed>& doomed,
                                                    const StretchRows::Range& stretches)
{
    std::uint64_t removedStretches = 0;
    const auto all = inTransaction([&]() -> Expected<> {
        const auto removed = stretchRows_.remove(stretches);
        if (!removed)
            return std::unexpected(removed.error());
        for (const auto& [holder, bytes] : *removed)
            holders_.remove(holder, bytes);
        removedStretches = removed->size();
        for (const auto& [id, events, bytes, holder] : doomed) {
            delete_.bind(1, id);
            if (const auto done = delete_.run(); !done)
                return done;
            holders_.remove(holder, bytes);
        }
        counts_.counts().removed += static_cast<std::int64_t>(eventsOf(doomed));
        return originRows_.removeUnused();
    });
    if (all)
        stretchCounts_.removed += removedStretches;
    return all;
}

SqliteEventFile::Expected<> SqliteEventFile::shrink(std::uint64_t mostBytes)
{
    return connection_->execute(fmt::format("PRAGMA incremental_vacuum({})", mostBytes / pageSize_).c_str());
}

} // namespace platform
