// SPDX-License-Identifier: Apache-2.0
// Changes of the database's files are noticed by inotify.
#include "kesto/results/EventStore.h"

#include <array>
#include <cerrno>
#include <climits>
#include <fmt/format.h>
#include <poll.h>
#include <sys/inotify.h>
#include <system_error>
#include <unistd.h>

namespace fs = std::filesystem;

std::optional<std::string> EventStore::epoch()
{
    if (database_.number("SELECT count(*) FROM sqlite_schema WHERE type = 'table' AND name = 'store'") == 0)
        return std::nullopt;
    std::optional<std::string> epoch;
    database_.forEachRow(database_.prepare("SELECT epoch FROM store"),
                         [&epoch](const platform::SqliteStatement& row) { epoch = row.text(0); });
    return epoch;
}

void EventStore::forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit)
{
    // With a second pattern SQLite does not use its index of names, so it is there only where it can match more.
    const bool isShort = !filter.namePattern.starts_with('*') && !filter.namePattern.starts_with(namePrefix);
    const std::string shortPattern = std::string(namePrefix) + filter.namePattern;
    const auto statement =
        database_.prepare(fmt::format("SELECT id, time, name, payload FROM ("
                                      " SELECT * FROM events WHERE id > ?1 AND time >= ?2 AND (name GLOB ?3{})"
                                      " ORDER BY id {} LIMIT ?4) ORDER BY id",
                                      isShort ? " OR name GLOB ?5" : "", filter.areOldest ? "ASC" : "DESC"));
    statement.bind(1, filter.afterID);
    statement.bind(2, filter.since);
    statement.bind(3, std::string_view(filter.namePattern));
    statement.bind(4, filter.most.value_or(-1));
    if (isShort)
        statement.bind(5, std::string_view(shortPattern));
    database_.forEachRow(statement, [&visit](const platform::SqliteStatement& row) {
        visit({row.integer(0), row.real(1), std::string(row.text(2)), std::string(row.text(3))});
    });
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
    return ::read(inotify_, events.data(), events.size()) > 0;
}
