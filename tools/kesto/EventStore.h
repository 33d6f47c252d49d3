// The service's event store, for reading: strictly read-only, beside the service while it writes.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>

struct sqlite3;

struct StoredEvent {
    std::int64_t id = 0;
    double time = 0; // seconds since 1970
    std::string name;
    std::string payload; // JSON
};

struct EventFilter {
    std::string namePattern = "*"; // GLOB
    double since = 0; // seconds since 1970
    std::int64_t afterID = 0;
    std::optional<std::int64_t> mostRecent; // at most so many, the most recent ones
};

// One thread. Throws std::runtime_error with a line for a person.
class EventStore {
public:
    explicit EventStore(const std::filesystem::path& database);

    // Calls `visit` with each event that passes the filter, oldest first.
    void forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit) const;

    // Where the store is, if nobody says otherwise: in $STATE_DIRECTORY, in the user's own state, or in the system's.
    [[nodiscard]] static std::filesystem::path usualPath();

private:
    struct Close {
        void operator()(sqlite3* database) const;
    };
    std::unique_ptr<sqlite3, Close> database_;
};

// Sleeps until the files of a database may have changed.
class DatabaseWatch {
public:
    explicit DatabaseWatch(const std::filesystem::path& database);
    ~DatabaseWatch();
    DatabaseWatch(const DatabaseWatch&) = delete;
    DatabaseWatch& operator=(const DatabaseWatch&) = delete;
    void wait() const;

private:
    int inotify_;
};
