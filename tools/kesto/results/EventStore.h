// The service's event store, for reading: strictly read-only, beside the service while it writes.
//
// SQLite shares the write-ahead log through files of its own, which even a reader makes when they are not there: the
// reader must be allowed to, and leaves them behind. A store without a log is one that nobody writes, so it is
// opened as one that does not change, which needs no files.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
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

// A line for a person.
class EventStoreError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// One thread. Throws EventStoreError.
class EventStore {
public:
    explicit EventStore(std::filesystem::path database);

    // Opens the store again if it could not be read, if somebody has begun to write it, or has put another in its
    // place: true in this last case, in which events are counted anew.
    bool refresh();

    // Calls `visit` with each event that passes the filter, oldest first.
    void forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit);

private:
    struct Close {
        void operator()(sqlite3* database) const;
    };
    void open();
    [[nodiscard]] bool isWritten() const;
    [[nodiscard]] EventStoreError unreadable();

    const std::filesystem::path path_;
    std::unique_ptr<sqlite3, Close> database_;
    bool isUnchanging_ = false;
    std::uint64_t file_ = 0; // its number in the file system, no other's as long as it is open
};

// Sleeps until the files of a database may have changed.
class DatabaseWatch {
public:
    explicit DatabaseWatch(const std::filesystem::path& database);
    ~DatabaseWatch();
    DatabaseWatch(const DatabaseWatch&) = delete;
    DatabaseWatch& operator=(const DatabaseWatch&) = delete;
    // False when nothing happened for so long; without a limit it waits for ever.
    [[nodiscard]] bool wait(std::optional<std::chrono::milliseconds> limit) const;

private:
    int inotify_;
};
