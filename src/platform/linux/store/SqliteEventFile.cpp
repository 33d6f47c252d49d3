// The only file that uses SQLite's interface. It reduces SQLite's errors to the few kinds that an owner can act on.
#include "platform/linux/store/SqliteEventFile.h"

#include <cassert>
#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <sqlite3.h>
#include <string>
#include <sys/file.h>
#include <sys/stat.h>

namespace platform {
namespace {

// The size of the log file that stays when the log is empty again: a burst needs as much.
constexpr std::uint64_t mostLogKept = 32 * 1024 * 1024;

bool isForWantOfRoom(int systemError)
{
    return systemError == ENOSPC || systemError == EDQUOT || systemError == EFBIG;
}

// SQLite recognises a full disk, but not a quota or a limit of file sizes that is used up.
StoreError errorOfDisk(sqlite3* connection)
{
    for (const int which : {SQLITE_FCNTL_FILE_POINTER, SQLITE_FCNTL_JOURNAL_POINTER}) {
        sqlite3_file* file = nullptr;
        int systemError = 0;
        ::sqlite3_file_control(connection, "main", which, static_cast<void*>(&file));
        if (file != nullptr && file->pMethods != nullptr)
            file->pMethods->xFileControl(file, SQLITE_FCNTL_LAST_ERRNO, &systemError);
        if (isForWantOfRoom(systemError))
            return StoreError::DiskFull;
    }
    return isForWantOfRoom(::sqlite3_system_errno(connection)) ? StoreError::DiskFull : StoreError::InputOutput;
}

StoreError errorOf(sqlite3* connection)
{
    switch (::sqlite3_errcode(connection) & 0xFF) {
    case SQLITE_FULL: return StoreError::DiskFull;
    case SQLITE_READONLY: return StoreError::ReadOnly;
    case SQLITE_BUSY:
    case SQLITE_LOCKED: return StoreError::Locked;
    case SQLITE_CANTOPEN:
    case SQLITE_PERM:
    case SQLITE_AUTH: return StoreError::CannotOpen;
    case SQLITE_IOERR: return errorOfDisk(connection);
    case SQLITE_CORRUPT:
    case SQLITE_NOTADB: return StoreError::Corrupt;
    default: return StoreError::Other;
    }
}

int count(std::size_t length)
{
    return static_cast<int>(length);
}

} // namespace

void SqliteEventFile::CloseConnection::operator()(sqlite3* connection) const noexcept
{
    ::sqlite3_close(connection);
}

void SqliteEventFile::FinalizeStatement::operator()(sqlite3_stmt* statement) const noexcept
{
    ::sqlite3_finalize(statement);
}

SqliteEventFile::~SqliteEventFile() = default;

// --- Opening

SqliteEventFile::Expected<std::unique_ptr<SqliteEventFile>> SqliteEventFile::open(const std::filesystem::path& path)
{
    std::unique_ptr<SqliteEventFile> database(new SqliteEventFile(path));
    for (const auto step :
         {&SqliteEventFile::lockDirectory, &SqliteEventFile::connect, &SqliteEventFile::checkOrMakeSchema,
          &SqliteEventFile::configure, &SqliteEventFile::prepareStatements, &SqliteEventFile::countEvents})
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
    sqlite3* connection = nullptr;
    const int opened = ::sqlite3_open_v2(path_.c_str(), &connection,
                                         SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
    connection_.reset(connection);
    if (opened != SQLITE_OK)
        return std::unexpected(lastError());
    if (::sqlite3_db_readonly(connection, "main") == 1)
        return std::unexpected(StoreError::ReadOnly);
    ::sqlite3_busy_timeout(connection, count(longestWaitForLock.count()));

    struct stat status = {};
    if (::stat(path_.c_str(), &status) != 0)
        return std::unexpected(StoreError::CannotOpen);
    device_ = status.st_dev;
    inode_ = status.st_ino;
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::checkOrMakeSchema()
{
    const auto version = number("PRAGMA user_version");
    const auto objects = version ? number("SELECT count(*) FROM sqlite_schema") : version;
    if (!objects)
        return std::unexpected(objects.error());
    if (*version == schemaVersion)
        return {};
    if (*version > schemaVersion)
        return std::unexpected(StoreError::Newer);
    if (*version != 0 || *objects != 0)
        return std::unexpected(StoreError::Corrupt);
    // Both take effect only before the first page is written.
    if (const auto done = execute("PRAGMA page_size = 4096; PRAGMA auto_vacuum = INCREMENTAL"); !done)
        return done;
    return execute("BEGIN IMMEDIATE;"
                   "CREATE TABLE events("
                   "id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL NOT NULL, name TEXT NOT NULL, payload TEXT NOT NULL"
                   ") STRICT;"
                   "PRAGMA user_version = 1;"
                   "COMMIT");
}

SqliteEventFile::Expected<> SqliteEventFile::configure()
{
    const auto pageSize = number("PRAGMA page_size");
    if (!pageSize)
        return std::unexpected(pageSize.error());
    pageSize_ = static_cast<std::uint64_t>(*pageSize);
    if (const auto done = beginLog(); !done)
        return done;
    // The log stays when the last connection closes: without it, users that may not write to the directory could not
    // read the database either.
    int keepLog = 1;
    ::sqlite3_file_control(connection_.get(), "main", SQLITE_FCNTL_PERSIST_WAL, &keepLog);
    const auto noteLog = [](void* database, sqlite3*, const char*, int pages) {
        static_cast<SqliteEventFile*>(database)->logPages_ = static_cast<std::uint64_t>(pages);
        return SQLITE_OK;
    };
    ::sqlite3_wal_hook(connection_.get(), noteLog, this); // in place of SQLite's automatic checkpoints
    return execute(fmt::format("PRAGMA journal_size_limit = {}", mostLogKept).c_str());
}

SqliteEventFile::Expected<> SqliteEventFile::beginLog()
{
    const auto statement = prepare("PRAGMA journal_mode = WAL");
    if (!statement)
        return std::unexpected(statement.error());
    if (::sqlite3_step(statement->get()) != SQLITE_ROW)
        return std::unexpected(lastError());
    const auto* mode = reinterpret_cast<const char*>(::sqlite3_column_text(statement->get(), 0));
    if (std::string_view(mode) != "wal")
        return std::unexpected(StoreError::CannotOpen); // the file system cannot share memory between processes
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::prepareStatements()
{
    const std::string insertOne = "INSERT INTO events(time, name, payload) VALUES (?, ?, ?)";
    std::string insertMany = insertOne;
    for (std::size_t row = 1; row < rowsAtOnce; ++row)
        insertMany += ", (?, ?, ?)";
    const std::initializer_list<std::pair<Statement*, std::string_view>> wanted = {
        {&begin_, "BEGIN IMMEDIATE"},
        {&commit_, "COMMIT"},
        {&insertOne_, insertOne},
        {&insertMany_, insertMany},
        {&deleteBefore_, "DELETE FROM events WHERE time < ? AND id < (SELECT min(id) FROM events) + ?"},
        {&sizesOfOldest_, "SELECT id, length(CAST(payload AS BLOB)) FROM events ORDER BY id LIMIT ?"},
        {&deleteUpTo_, "DELETE FROM events WHERE id <= ?"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = prepare(sql);
        if (!prepared)
            return std::unexpected(prepared.error() == StoreError::Other ? StoreError::Corrupt // it has another schema
                                                                         : prepared.error());
        *statement = std::move(*prepared);
    }
    return {};
}

SqliteEventFile::Expected<> SqliteEventFile::countEvents()
{
    const auto count = number("SELECT count(*) FROM events");
    if (!count)
        return std::unexpected(count.error());
    eventsAtOpening_ = static_cast<std::uint64_t>(*count);
    return {};
}

bool SqliteEventFile::wasReplaced() const
{
    struct stat status = {};
    return ::stat(path_.c_str(), &status) != 0 || status.st_dev != device_ || status.st_ino != inode_;
}

SqliteEventFile::Expected<> SqliteEventFile::setSynchronization(StoreSynchronization synchronization)
{
    return execute(synchronization == StoreSynchronization::Full ? "PRAGMA synchronous = FULL"
                                                                 : "PRAGMA synchronous = NORMAL");
}

// --- Writing

SqliteEventFile::Expected<> SqliteEventFile::begin()
{
    return run(begin_);
}

SqliteEventFile::Expected<> SqliteEventFile::insert(std::span<const EventRow> rows)
{
    while (!rows.empty()) {
        const std::size_t number = rows.size() >= rowsAtOnce ? rowsAtOnce : 1;
        const Statement& statement = number == 1 ? insertOne_ : insertMany_;
        for (std::size_t row = 0; row < number; ++row)
            bind(statement, count(3 * row + 1), rows[row]);
        if (const auto done = run(statement); !done)
            return done;
        rows = rows.subspan(number);
    }
    return {};
}

// The statement refers to the texts, so they must stay in place until it has run.
void SqliteEventFile::bind(const Statement& statement, int firstParameter, const EventRow& row)
{
    const auto bindText = [&statement](int parameter, std::string_view text) {
        return ::sqlite3_bind_text(statement.get(), parameter, text.data(), count(text.size()), SQLITE_STATIC)
            == SQLITE_OK;
    };
    [[maybe_unused]] const bool areBound = // no copy; every event is far shorter than SQLite's limit
        ::sqlite3_bind_double(statement.get(), firstParameter, row.time) == SQLITE_OK
        && bindText(firstParameter + 1, row.name) && bindText(firstParameter + 2, row.payload);
    assert(areBound);
}

SqliteEventFile::Expected<> SqliteEventFile::commit()
{
    return run(commit_);
}

void SqliteEventFile::rollBack()
{
    if (::sqlite3_get_autocommit(connection_.get()) == 0)
        ::sqlite3_exec(connection_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
}

// --- Limits

bool SqliteEventFile::emptyLog(std::chrono::milliseconds wait)
{
    ::sqlite3_busy_timeout(connection_.get(), count(wait.count()));
    const int done =
        ::sqlite3_wal_checkpoint_v2(connection_.get(), "main", SQLITE_CHECKPOINT_RESTART, nullptr, nullptr);
    ::sqlite3_busy_timeout(connection_.get(), count(longestWaitForLock.count()));
    if (done == SQLITE_OK)
        logPages_ = 0;
    return done == SQLITE_OK;
}

SqliteEventFile::Expected<double> SqliteEventFile::oldest()
{
    const auto statement = prepare("SELECT time FROM events ORDER BY id LIMIT 1");
    if (!statement)
        return std::unexpected(statement.error());
    return ::sqlite3_step(statement->get()) == SQLITE_ROW ? ::sqlite3_column_double(statement->get(), 0) : 0;
}

SqliteEventFile::Expected<SqliteEventFile::Size> SqliteEventFile::size()
{
    const auto pages = number("PRAGMA page_count");
    const auto free = pages ? number("PRAGMA freelist_count") : pages;
    if (!free)
        return std::unexpected(free.error());
    return Size{.usedBytes = static_cast<std::uint64_t>(*pages - *free) * pageSize_,
                .freeBytes = static_cast<std::uint64_t>(*free) * pageSize_};
}

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteBefore(double time, std::uint64_t most)
{
    ::sqlite3_bind_double(deleteBefore_.get(), 1, time);
    ::sqlite3_bind_int64(deleteBefore_.get(), 2, static_cast<std::int64_t>(most));
    return runAndCountChanges(deleteBefore_);
}

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::deleteOldest(std::uint64_t bytes, std::uint64_t most)
{
    ::sqlite3_bind_int64(sizesOfOldest_.get(), 1, static_cast<std::int64_t>(most));
    std::int64_t last = 0;
    std::uint64_t counted = 0;
    int step = SQLITE_ROW;
    while (counted < bytes && (step = ::sqlite3_step(sizesOfOldest_.get())) == SQLITE_ROW) {
        last = ::sqlite3_column_int64(sizesOfOldest_.get(), 0);
        counted += static_cast<std::uint64_t>(::sqlite3_column_int64(sizesOfOldest_.get(), 1));
    }
    if (step != SQLITE_ROW && step != SQLITE_DONE) {
        const StoreError error = lastError();
        ::sqlite3_reset(sizesOfOldest_.get());
        return std::unexpected(error);
    }
    ::sqlite3_reset(sizesOfOldest_.get());
    ::sqlite3_bind_int64(deleteUpTo_.get(), 1, last);
    return runAndCountChanges(deleteUpTo_);
}

SqliteEventFile::Expected<> SqliteEventFile::shrink(std::uint64_t mostBytes)
{
    return execute(fmt::format("PRAGMA incremental_vacuum({})", mostBytes / pageSize_).c_str());
}

// --- SQLite

StoreError SqliteEventFile::lastError() const
{
    return errorOf(connection_.get());
}

SqliteEventFile::Expected<> SqliteEventFile::execute(const char* sql)
{
    if (::sqlite3_exec(connection_.get(), sql, nullptr, nullptr, nullptr) == SQLITE_OK)
        return {};
    return std::unexpected(lastError());
}

SqliteEventFile::Expected<std::int64_t> SqliteEventFile::number(const char* sql)
{
    const auto statement = prepare(sql);
    if (!statement)
        return std::unexpected(statement.error());
    if (::sqlite3_step(statement->get()) != SQLITE_ROW)
        return std::unexpected(lastError());
    return ::sqlite3_column_int64(statement->get(), 0);
}

SqliteEventFile::Expected<SqliteEventFile::Statement> SqliteEventFile::prepare(std::string_view sql)
{
    sqlite3_stmt* statement = nullptr;
    if (::sqlite3_prepare_v3(connection_.get(), sql.data(), count(sql.size()), SQLITE_PREPARE_PERSISTENT, &statement,
                             nullptr)
        != SQLITE_OK)
        return std::unexpected(lastError());
    return Statement(statement);
}

SqliteEventFile::Expected<> SqliteEventFile::run(const Statement& statement)
{
    const int done = ::sqlite3_step(statement.get());
    if (done == SQLITE_DONE || done == SQLITE_ROW) {
        ::sqlite3_reset(statement.get());
        return {};
    }
    const StoreError error = lastError(); // before the statement is reset
    ::sqlite3_reset(statement.get());
    return std::unexpected(error);
}

SqliteEventFile::Expected<std::uint64_t> SqliteEventFile::runAndCountChanges(const Statement& statement)
{
    if (const auto done = run(statement); !done)
        return std::unexpected(done.error());
    return static_cast<std::uint64_t>(::sqlite3_changes64(connection_.get()));
}

} // namespace platform
