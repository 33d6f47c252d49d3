// SPDX-License-Identifier: Apache-2.0
// The database is opened through SQLite's URI, the only way to declare that it does not change; another file in its
// place is noticed by its inode number.
#include "kesto/store/EventDatabase.h"

#include <cerrno>
#include <fmt/format.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace fs = std::filesystem;

namespace {

// 0 if the file does not exist.
std::uint64_t fileNumber(const fs::path& path)
{
    struct stat status{};
    return ::stat(path.c_str(), &status) == 0 ? status.st_ino : 0;
}

// The path as SQLite's URIs have it.
std::string uriOf(const fs::path& path)
{
    std::string uri = "file:";
    for (const char character : fs::absolute(path).string())
        if (character == '%' || character == '?' || character == '#')
            uri += fmt::format("%{:02X}", character);
        else
            uri += character;
    return uri;
}

} // namespace

void EventDatabase::Close::operator()(sqlite3* database) const
{
    sqlite3_close_v2(database); // takes effect after its statements are destroyed
}

EventDatabase::EventDatabase(fs::path database) : path_(std::move(database))
{
    std::error_code error;
    if (!fs::exists(path_, error) && !error)
        throw EventStoreError(fmt::format(
            "the event store {} does not exist: has kestod run? Name another with --database", path_.native()));
    open();
}

bool EventDatabase::isWritten() const
{
    std::error_code error;
    return fs::exists(path_.native() + "-wal", error);
}

void EventDatabase::open()
{
    isUnchanging_ = !isWritten();
    const std::uint64_t file = fileNumber(path_);
    sqlite3* opened = nullptr;
    const std::string uri = uriOf(path_) + (isUnchanging_ ? "?immutable=1" : "");
    const int status =
        sqlite3_open_v2(uri.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_URI | SQLITE_OPEN_NOMUTEX, nullptr);
    database_.reset(opened);
    if (status != SQLITE_OK)
        throw unreadable();
    file_ = file;
    constexpr int longestWait = 2000; // milliseconds, while a writer restarts
    sqlite3_busy_timeout(opened, longestWait);
}

// Returns the error of the open database and closes it.
EventStoreError EventDatabase::unreadable()
{
    const bool isForbidden = ::access(path_.c_str(), R_OK) != 0 && errno == EACCES;
    EventStoreError error(fmt::format("cannot read the event store {}: {}", path_.native(),
                                      isForbidden     ? "permission denied: members of the group kesto may read it"
                                          : database_ ? sqlite3_errmsg(database_.get())
                                                      : "out of memory"));
    database_.reset();
    return error;
}

bool EventDatabase::refresh()
{
    const std::uint64_t now = fileNumber(path_);
    const bool isReplaced = now != 0 && now != file_;
    if (isReplaced || !database_ || (isUnchanging_ && isWritten()))
        open();
    return isReplaced;
}

platform::SqliteStatement EventDatabase::prepare(std::string_view sql)
{
    sqlite3_stmt* prepared = nullptr;
    if (sqlite3_prepare_v2(database_.get(), sql.data(), static_cast<int>(sql.size()), &prepared, nullptr) != SQLITE_OK)
        throw unreadable();
    return platform::SqliteStatement(prepared);
}

bool EventDatabase::step(const platform::SqliteStatement& statement)
{
    const auto row = statement.step();
    if (!row)
        throw unreadable();
    return *row;
}

void EventDatabase::forEachRow(const platform::SqliteStatement& statement,
                               const std::function<void(const platform::SqliteStatement&)>& visit)
{
    while (step(statement))
        visit(statement);
}

void EventDatabase::execute(std::string_view sql)
{
    if (!prepare(sql).run())
        throw unreadable();
}

std::int64_t EventDatabase::number(std::string_view sql)
{
    const auto statement = prepare(sql);
    const auto row = statement.step();
    if (!row)
        throw unreadable();
    return *row ? statement.integer(0) : 0;
}

bool matches(const std::string& text, const std::string& pattern)
{
    return pattern == "*" || sqlite3_strglob(pattern.c_str(), text.c_str()) == 0;
}
