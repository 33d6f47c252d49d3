#include "EventStore.h"

#include <array>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <fmt/format.h>
#include <sqlite3.h>
#include <stdexcept>
#include <sys/inotify.h>
#include <system_error>
#include <unistd.h>

namespace fs = std::filesystem;

namespace {

constexpr std::string_view databaseName = "analytics.sqlite3";

struct Finalize {
    void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};

std::string columnText(sqlite3_stmt* statement, int column)
{
    const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement, column));
    return text == nullptr ? std::string() : text;
}

} // namespace

void EventStore::Close::operator()(sqlite3* database) const
{
    sqlite3_close(database);
}

EventStore::EventStore(const fs::path& database)
{
    if (std::error_code error; !fs::exists(database, error))
        throw std::runtime_error(fmt::format(
            "there is no event store at {}: has kestod run? Name another with --database", database.string()));
    sqlite3* opened = nullptr;
    const int status = sqlite3_open_v2(database.c_str(), &opened, SQLITE_OPEN_READONLY, nullptr);
    database_.reset(opened);
    if (status != SQLITE_OK)
        throw std::runtime_error(fmt::format("cannot open {}: {}", database.string(), sqlite3_errmsg(opened)));
    constexpr int longestWait = 2000; // milliseconds, for a writer that is restarting
    sqlite3_busy_timeout(opened, longestWait);
}

void EventStore::forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit) const
{
    constexpr std::string_view query = "SELECT id, time, name, payload FROM ("
                                       " SELECT * FROM events WHERE id > ?1 AND time >= ?2 AND name GLOB ?3"
                                       " ORDER BY id DESC LIMIT ?4) ORDER BY id";
    sqlite3_stmt* prepared = nullptr;
    const int status =
        sqlite3_prepare_v2(database_.get(), query.data(), static_cast<int>(query.size()), &prepared, nullptr);
    const std::unique_ptr<sqlite3_stmt, Finalize> statement(prepared);
    if (status != SQLITE_OK)
        throw std::runtime_error(fmt::format("cannot read the event store: {}", sqlite3_errmsg(database_.get())));
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
        throw std::runtime_error(fmt::format("cannot read the event store: {}", sqlite3_errmsg(database_.get())));
}

fs::path EventStore::usualPath()
{
    const auto environment = [](const char* name) {
        const char* value = std::getenv(name);
        return fs::path(value == nullptr ? "" : value);
    };
    const fs::path system = fs::path("/var/lib/kesto") / databaseName;
    const fs::path home = environment("HOME");
    for (const fs::path& directory : {environment("STATE_DIRECTORY"), environment("XDG_STATE_HOME") / "kesto",
                                      home / ".local/state/kesto", home / ".config/kesto"})
        if (std::error_code error; directory.is_absolute() && fs::exists(directory / databaseName, error))
            return directory / databaseName;
    return system;
}

// The write-ahead log is what changes with every commit, and it may not be there yet: so the directory is watched.
DatabaseWatch::DatabaseWatch(const fs::path& database) : inotify_(::inotify_init1(IN_CLOEXEC))
{
    const fs::path directory = fs::absolute(database).parent_path();
    if (inotify_ < 0 || ::inotify_add_watch(inotify_, directory.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO) < 0)
        throw std::runtime_error(
            fmt::format("cannot follow {}: {}", directory.string(), std::generic_category().message(errno)));
}

DatabaseWatch::~DatabaseWatch()
{
    ::close(inotify_);
}

void DatabaseWatch::wait() const
{
    alignas(inotify_event) std::array<char, sizeof(inotify_event) + NAME_MAX + 1> events;
    static_cast<void>(::read(inotify_, events.data(), events.size()));
}
