// What stands in memory and in the database, such as the next ID, changes with a transaction or is dropped with it.
#include "platform/linux/store/SqliteEventFile.h"

#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
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

SqliteEventFile::Expected<std::unique_ptr<SqliteEventFile>>
SqliteEventFile::open(const std::filesystem::path& path, const Clock& clock, KnownOrigins& origins)
{
    std::unique_ptr<SqliteEventFile> database(new SqliteEventFile(path, clock, origins));
    for (const auto step :
         {&SqliteEventFile::lockDirectory, &SqliteEventFile::connect, &SqliteEventFile::makeSchema,
          &SqliteEventFile::configure, &SqliteEventFile::prepareStatements, &SqliteEventFile::beginRun})
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

    struct stat status = {};
    if (::stat(path_.c_str(), &status) != 0)
        return std::unexpected(StoreError::CannotOpen);
    device_ = status.st_dev;
    inode_ = status.st_ino;
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
    auto ages = EventAges::open(*connection_);
    if (!ages)
        return corruptIfOther(ages.error());
    ages_ = std::move(*ages);
    auto firstEdition = FirstEdition::open(*connection_);
    if (!firstEdition)
        return corruptIfOther(firstEdition.error());
    firstEdition_ = std::move(*firstEdition);

    constexpr std::string_view columns = "SELECT m.id, 1 + (k.second_name IS NOT NULL), length(CAST(m.payload AS BLOB))"
                                         " FROM messages m JOIN kinds k ON k.id = m.kind";
    const std::initializer_list<std::pair<SqliteStatement*, std::string>> wanted = {
        {&begin_, "BEGIN IMMEDIATE"},
        {&commit_, "COMMIT"},
        {&insert_,
         "INSERT INTO messages(id, time, kind, session, source, happened, payload) VALUES (?, ?, ?, ?, ?, ?, ?)"},
        {&selectBelow_, fmt::format("{} WHERE m.id < ?2 ORDER BY m.id LIMIT ?1", columns)},
        {&selectOldest_, fmt::format("{} ORDER BY m.id LIMIT ?1", columns)},
        {&delete_, "DELETE FROM messages WHERE id = ?"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection_->prepare(sql);
        if (!prepared)
            return corruptIfOther(prepared.error());
        *statement = std::move(*prepared);
    }
    return {};
}

// A database that this run has not seen yet has no rows of its sources and sessions. Whatever it holds was kept before.
SqliteEventFile::Expected<> SqliteEventFile::beginRun()
{
    StoreCounts& counts = counts_.counts();
    ageClock_.emplace(clock_, counts.clock, counts.nextEvent);
    committedAgeClock_ = ageClock_;
    const bool isKnown = origins_.epoch == counts_.epoch();
    if (!isKnown) {
        origins_.epoch = counts_.epoch();
        origins_.sources.forgetRows();
        origins_.sessions.forgetRows();
    }
    return inTransaction([&]() -> Expected<> {
        if (const auto done = ages_.markNow(counts.nextEvent, counts.clock.time); !done)
            return done;
        return isKnown ? Expected<>() : originRows_.closeEarlierRun(counts);
    });
}

bool SqliteEventFile::wasReplaced() const
{
    struct stat status = {};
    return ::stat(path_.c_str(), &status) != 0 || status.st_dev != device_ || status.st_ino != inode_;
}

SqliteEventFile::Expected<> SqliteEventFile::setSynchronization(StoreSynchronization synchronization)
{
    return connection_->execute(synchronization == StoreSynchronization::Full ? "PRAGMA synchronous = FULL"
                                                                              : "PRAGMA synchronous = NORMAL");
}

// --- Writing

SqliteEventFile::Expected<> SqliteEventFile::begin()
{
    return begin_.run();
}

SqliteEventFile::Expected<> SqliteEventFile::insert(std::span<const EventRow> rows)
{
    StoreCounts& counts = counts_.counts();
    for (const EventRow& row : rows) {
        if (const auto done = insert(counts.nextEvent, row); !done)
            return done;
        const auto events = static_cast<std::int64_t>(row.events());
        counts.nextEvent += events;
        counts.kept += events;
    }
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::insert(std::int64_t id, const EventRow& row)
{
    const auto kind = kinds_.idOf(row.name, row.secondName);
    if (!kind)
        return std::unexpected(kind.error());
    insert_.bind(1, id);
    insert_.bind(2, row.time);
    insert_.bind(3, *kind);
    const auto rows = originRows_.of(row.origin, origins_, counts_.counts());
    if (!rows)
        return std::unexpected(rows.error());
    insert_.bind(4, rows->session);
    insert_.bind(5, rows->source);
    insert_.bind(6, row.happened);
    insert_.bind(7, row.payload); // every payload is far shorter than SQLite's limit
    return insert_.run();
}

SqliteEventFile::Expected<> SqliteEventFile::commit()
{
    if (const auto done = originRows_.writeChanges(origins_, counts_.counts()); !done)
        return done;
    if (const auto done = keepTime(); !done)
        return done;
    if (const auto done = counts_.write(); !done)
        return done;
    if (const auto done = commit_.run(); !done)
        return done;
    counts_.noteCommit();
    origins_.committed();
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
        for (const auto& [id, time, happened, name, secondName, payload] : *messages) {
            if (const auto done = markFirstEdition(id, time); !done)
                return done;
            if (const auto done = insert(id, {time, happened, {}, name, secondName, payload}); !done)
                return done;
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

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteOlderThan(double seconds, std::uint64_t most)
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
    selectBelow_.bind(1, most);
    selectBelow_.bind(2, *below);
    const auto deleted = deleteSelected(selectBelow_, UINT64_MAX);
    if (deleted && *deleted == 0 && *below != 0)
        if (const auto done = ages_.forget(*below); !done)
            return std::unexpected(done.error());
    return deleted;
}

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteOldest(std::uint64_t bytes, std::uint64_t most)
{
    selectOldest_.bind(1, most);
    return deleteSelected(selectOldest_, bytes);
}

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteSelected(const SqliteStatement& select,
                                                                         std::uint64_t bytes)
{
    std::vector<std::int64_t> ids;
    std::int64_t events = 0;
    for (std::uint64_t counted = 0; counted < bytes;) {
        const auto row = select.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            break;
        ids.push_back(select.integer(0));
        events += select.integer(1);
        counted += static_cast<std::uint64_t>(select.integer(2));
    }
    select.reset();
    if (ids.empty())
        return 0;
    const auto done = inTransaction([&]() -> Expected<> {
        for (const std::int64_t id : ids) {
            delete_.bind(1, id);
            if (const auto deleted = delete_.run(); !deleted)
                return deleted;
        }
        counts_.counts().removed += events;
        return {};
    });
    if (!done)
        return std::unexpected(done.error());
    return static_cast<std::uint64_t>(events);
}

SqliteEventFile::Expected<> SqliteEventFile::shrink(std::uint64_t mostBytes)
{
    return connection_->execute(fmt::format("PRAGMA incremental_vacuum({})", mostBytes / pageSize_).c_str());
}

} // namespace platform
