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

SqliteEventFile::Expected<std::unique_ptr<SqliteEventFile>> SqliteEventFile::open(const std::filesystem::path& path,
                                                                                  KnownOrigins& origins)
{
    std::unique_ptr<SqliteEventFile> database(new SqliteEventFile(path, origins));
    for (const auto step :
         {&SqliteEventFile::lockDirectory, &SqliteEventFile::connect, &SqliteEventFile::makeSchema,
          &SqliteEventFile::configure, &SqliteEventFile::prepareStatements, &SqliteEventFile::recogniseOrigins})
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
    auto counts = StoreCountsRow::open(*connection_);
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
        {&selectBefore_, fmt::format("{} WHERE m.kind IN (SELECT id FROM kinds) AND m.time < ?2 LIMIT ?1", columns)},
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

// A database that this run has not seen yet has no rows of its sources and sessions.
SqliteEventFile::Expected<> SqliteEventFile::recogniseOrigins()
{
    if (origins_.epoch == counts_.epoch())
        return {};
    origins_.epoch = counts_.epoch();
    origins_.sources.forgetRows();
    origins_.sessions.forgetRows();
    return inTransaction([this] { return originRows_.closeEarlierRun(counts_.counts()); });
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
    if (const auto done = counts_.write(); !done)
        return done;
    if (const auto done = commit_.run(); !done)
        return done;
    counts_.noteCommit();
    origins_.committed();
    return {};
}

void SqliteEventFile::rollBack()
{
    connection_->rollBack();
    counts_.rolledBack();
    kinds_.rolledBack();
    origins_.rolledBack();
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
        for (const auto& [id, time, happened, name, secondName, payload] : *messages)
            if (const auto done = insert(id, {time, happened, {}, name, secondName, payload}); !done)
                return done;
        return firstEdition_->remove(*messages, counts_.counts());
    });
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

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteBefore(double time, std::uint64_t most)
{
    selectBefore_.bind(1, most);
    selectBefore_.bind(2, time);
    return deleteSelected(selectBefore_, UINT64_MAX);
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
