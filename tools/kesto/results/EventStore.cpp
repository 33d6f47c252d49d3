// The database is opened through SQLite's URI, the only way to declare that it does not change; changes of its files
// are noticed by their inode numbers and by inotify.
#include "kesto/results/EventStore.h"

#include <array>
#include <cerrno>
#include <climits>
#include <fmt/format.h>
#include <poll.h>
#include <sqlite3.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace fs = std::filesystem;

namespace {

struct Finalize {
    void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};

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

std::string columnText(sqlite3_stmt* statement, int column)
{
    const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement, column));
    return text == nullptr ? std::string() : text;
}

} // namespace

void EventStore::Close::operator()(sqlite3* database) const
{
    sqlite3_close_v2(database); // takes effect after its statements are destroyed
}

EventStore::EventStore(fs::path database) : path_(std::move(database))
{
    std::error_code error;
    if (!fs::exists(path_, error) && !error)
        throw EventStoreError(fmt::format(
            "the event store {} does not exist: has kestod run? Name another with --database", path_.native()));
    open();
}

bool EventStore::isWritten() const
{
    std::error_code error;
    return fs::exists(path_.native() + "-wal", error);
}

void EventStore::open()
{
    isUnchanging_ = !isWritten();
    const std::uint64_t file = fileNumber(path_);
    sqlite3* opened = nullptr;
    const std::string uri = uriOf(path_) + (isUnchanging_ ? "?immutable=1" : "");
    const int status = sqlite3_open_v2(uri.c_str(), &opened, SQLITE_OPEN_READONLY | SQLITE_OPEN_URI, nullptr);
    database_.reset(opened);
    if (status != SQLITE_OK)
        throw unreadable();
    file_ = file;
    constexpr int longestWait = 2000; // milliseconds, while a writer restarts
    sqlite3_busy_timeout(opened, longestWait);
}

// Returns the error of the open database and closes it.
EventStoreError EventStore::unreadable()
{
    const bool isForbidden = ::access(path_.c_str(), R_OK) != 0 && errno == EACCES;
    EventStoreError error(fmt::format("cannot read the event store {}: {}", path_.native(),
                                      isForbidden     ? "permission denied: members of the group kesto may read it"
                                          : database_ ? sqlite3_errmsg(database_.get())
                                                      : "out of memory"));
    database_.reset();
    return error;
}

bool EventStore::refresh()
{
    const std::uint64_t now = fileNumber(path_);
    const bool isReplaced = now != 0 && now != file_;
    if (isReplaced || !database_ || (isUnchanging_ && isWritten()))
        open();
    return isReplaced;
}

void EventStore::forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit)
{
    constexpr std::string_view query = "SELECT id, time, name, payload FROM ("
                                       " SELECT * FROM events WHERE id > ?1 AND time >= ?2 AND name GLOB ?3"
                                       " ORDER BY id DESC LIMIT ?4) ORDER BY id";
    sqlite3_stmt* prepared = nullptr;
    const int status =
        sqlite3_prepare_v2(database_.get(), query.data(), static_cast<int>(query.size()), &prepared, nullptr);
    const std::unique_ptr<sqlite3_stmt, Finalize> statement(prepared);
    if (status != SQLITE_OK)
        throw unreadable();
    sqlite3_bind_int64(prepared, 1, filter.afterID);
    sqlite3_bind_double(prepared, 2, filter.since);
    sqlite3_bind_text(prepared, 3, filter.namePattern.data(), static_cast<int>(filter.namePattern.size()),
                      SQLITE_STATIC);
    sqlite3_bind_int64(prepared, 4, filter.mostRecent.value_or(-1));
    int step = SQLITE_ROW;
    while ((step = sqlite3_step(prepared)) == SQLITE_ROW)
        visit({sqlite3_column_int64(prepared, 0), sqlite3_column_double(prepared, 1), columnText(prepared, 2),
               columnText(prepared, 3)});
    if (step != SQLITE_DONE)
        throw unreadable();
}

// Every commit changes the write-ahead log, which may not exist yet: so the directory is watched.
DatabaseWatch::DatabaseWatch(const fs::path& database) : inotify_(::inotify_init1(IN_CLOEXEC))
{
    const fs::path directory = fs::absolute(database).parent_path();
    if (inotify_ < 0 || ::inotify_add_watch(inotify_, directory.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO) < 0)
        throw EventStoreError(
            fmt::format("cannot follow {}: {}", directory.native(), std::generic_category().message(errno)));
}

DatabaseWatch::~DatabaseWatch()
{
    ::close(inotify_);
}

bool DatabaseWatch::wait(std::optional<std::chrono::milliseconds> limit) const
{
    pollfd watched{inotify_, POLLIN, 0};
    if (::poll(&watched, 1, limit ? static_cast<int>(limit->count()) : -1) <= 0)
        return false;
    alignas(inotify_event) std::array<char, 16 * (sizeof(inotify_event) + NAME_MAX + 1)> events;
    static_cast<void>(::read(inotify_, events.data(), events.size()));
    return true;
}
