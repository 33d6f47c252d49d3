// SPDX-License-Identifier: Apache-2.0
// The only file of the service that uses SQLite's interface for databases.
#include "platform/linux/store/SqliteConnection.h"

#include <cassert>
#include <cerrno>
#include <fmt/format.h>
#include <sqlite3.h>
#include <string>

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
    case SQLITE_CONSTRAINT: // rows of the service keep the rules of a sound database; a trigger is another program's
        return ::sqlite3_extended_errcode(connection) == SQLITE_CONSTRAINT_TRIGGER ? StoreError::Other
                                                                                   : StoreError::Corrupt;
    default: return StoreError::Other;
    }
}

int count(std::size_t length)
{
    return static_cast<int>(length);
}

void assertDone([[maybe_unused]] int result)
{
    assert(result == SQLITE_OK); // a wrong parameter, or a text beyond SQLite's limit
}

} // namespace

// --- Statements

void SqliteStatement::Finalize::operator()(sqlite3_stmt* statement) const noexcept
{
    ::sqlite3_finalize(statement);
}

void SqliteStatement::bind(int parameter, std::int64_t number) const
{
    assertDone(::sqlite3_bind_int64(statement_.get(), parameter, number));
}

void SqliteStatement::bind(int parameter, double number) const
{
    assertDone(::sqlite3_bind_double(statement_.get(), parameter, number));
}

void SqliteStatement::bind(int parameter, std::string_view text) const
{
    assertDone(::sqlite3_bind_text(statement_.get(), parameter, text.data() == nullptr ? "" : text.data(),
                                   count(text.size()), SQLITE_STATIC));
}

void SqliteStatement::bindNull(int parameter) const
{
    assertDone(::sqlite3_bind_null(statement_.get(), parameter));
}

StoreExpected<bool> SqliteStatement::step() const
{
    const int done = ::sqlite3_step(statement_.get());
    if (done == SQLITE_ROW)
        return true;
    // The error, before the statement is reset.
    const auto error = done == SQLITE_DONE ? StoreError::Other : errorOf(::sqlite3_db_handle(statement_.get()));
    reset();
    if (done == SQLITE_DONE)
        return false;
    return std::unexpected(error);
}

StoreExpected<> SqliteStatement::run() const
{
    const auto done = step();
    if (!done)
        return std::unexpected(done.error());
    if (*done)
        reset();
    return {};
}

void SqliteStatement::reset() const
{
    ::sqlite3_reset(statement_.get());
}

std::int64_t SqliteStatement::integer(int column) const
{
    return ::sqlite3_column_int64(statement_.get(), column);
}

double SqliteStatement::real(int column) const
{
    return ::sqlite3_column_double(statement_.get(), column);
}

std::string_view SqliteStatement::text(int column) const
{
    const auto* text = reinterpret_cast<const char*>(::sqlite3_column_text(statement_.get(), column));
    const int size = ::sqlite3_column_bytes(statement_.get(), column);
    return text == nullptr ? std::string_view() : std::string_view(text, static_cast<std::size_t>(size));
}

bool SqliteStatement::isNull(int column) const
{
    return ::sqlite3_column_type(statement_.get(), column) == SQLITE_NULL;
}

// --- The connection

void SqliteConnection::Close::operator()(sqlite3* connection) const noexcept
{
    ::sqlite3_close_v2(connection); // takes effect after its statements are destroyed
}

SqliteConnection::~SqliteConnection() = default;

StoreExpected<std::unique_ptr<SqliteConnection>> SqliteConnection::open(const std::filesystem::path& path)
{
    // Without its accounts of memory, SQLite takes no lock for each allocation, which saves a tenth of the time of a
    // row. It refuses this where it is in use already; nothing depends on it.
    [[maybe_unused]] static const int configured = ::sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
    sqlite3* connection = nullptr;
    const int opened = ::sqlite3_open_v2(path.c_str(), &connection,
                                         SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX, nullptr);
    std::unique_ptr<SqliteConnection> made(new SqliteConnection);
    made->connection_.reset(connection);
    if (opened != SQLITE_OK)
        return std::unexpected(errorOf(connection));
    if (::sqlite3_db_readonly(connection, "main") == 1)
        return std::unexpected(StoreError::ReadOnly);
    ::sqlite3_busy_timeout(connection, static_cast<int>(longestWaitForLock.count()));
    return made;
}

StoreExpected<> SqliteConnection::beginLog()
{
    const auto statement = prepare("PRAGMA journal_mode = WAL");
    if (!statement)
        return std::unexpected(statement.error());
    if (const auto row = statement->step(); !row)
        return std::unexpected(row.error());
    if (statement->text(0) != "wal")
        return std::unexpected(StoreError::CannotOpen); // the file system cannot share memory between processes
    // The log stays when the last connection closes: without it, users that may not write to the directory could not
    // read the database either.
    int keepLog = 1;
    ::sqlite3_file_control(connection_.get(), "main", SQLITE_FCNTL_PERSIST_WAL, &keepLog);
    const auto noteLog = [](void* connection, sqlite3*, const char*, int pages) {
        static_cast<SqliteConnection*>(connection)->logPages_ = static_cast<std::uint64_t>(pages);
        return SQLITE_OK;
    };
    ::sqlite3_wal_hook(connection_.get(), noteLog, this); // in place of SQLite's automatic checkpoints
    return execute(fmt::format("PRAGMA journal_size_limit = {}", mostLogKept).c_str());
}

bool SqliteConnection::emptyLog(std::chrono::milliseconds wait)
{
    ::sqlite3_busy_timeout(connection_.get(), static_cast<int>(wait.count()));
    const int done =
        ::sqlite3_wal_checkpoint_v2(connection_.get(), "main", SQLITE_CHECKPOINT_RESTART, nullptr, nullptr);
    ::sqlite3_busy_timeout(connection_.get(), static_cast<int>(longestWaitForLock.count()));
    if (done == SQLITE_OK)
        logPages_ = 0;
    return done == SQLITE_OK;
}

void SqliteConnection::truncateLog()
{
    ::sqlite3_busy_timeout(connection_.get(), 0);
    ::sqlite3_wal_checkpoint_v2(connection_.get(), "main", SQLITE_CHECKPOINT_TRUNCATE, nullptr, nullptr);
    ::sqlite3_busy_timeout(connection_.get(), static_cast<int>(longestWaitForLock.count()));
}

StoreExpected<> SqliteConnection::execute(const char* sql)
{
    if (::sqlite3_exec(connection_.get(), sql, nullptr, nullptr, nullptr) == SQLITE_OK)
        return {};
    return std::unexpected(errorOf(connection_.get()));
}

StoreExpected<std::int64_t> SqliteConnection::number(const char* sql)
{
    const auto statement = prepare(sql);
    if (!statement)
        return std::unexpected(statement.error());
    const auto row = statement->step();
    if (!row)
        return std::unexpected(row.error());
    return *row ? statement->integer(0) : 0;
}

StoreExpected<SqliteStatement> SqliteConnection::prepare(std::string_view sql)
{
    sqlite3_stmt* statement = nullptr;
    if (::sqlite3_prepare_v3(connection_.get(), sql.data(), count(sql.size()), SQLITE_PREPARE_PERSISTENT, &statement,
                             nullptr)
        != SQLITE_OK)
        return std::unexpected(errorOf(connection_.get()));
    return SqliteStatement(statement);
}

void SqliteConnection::rollBack()
{
    if (::sqlite3_get_autocommit(connection_.get()) == 0)
        ::sqlite3_exec(connection_.get(), "ROLLBACK", nullptr, nullptr, nullptr);
}

} // namespace platform
