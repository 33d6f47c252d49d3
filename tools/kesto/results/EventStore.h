// The room of results: the commands that show what the service wrote or what drivers publish. They change nothing of
// it.
//
// The service's event store, for reading: strictly read-only, beside the service while it writes.
//
// SQLite shares the write-ahead log through files of its own, which even a reader makes if they are missing; it needs
// the right to make them, and leaves them behind. A store without a log has no writer, so it is opened as unchanging,
// which needs no such files.
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
    std::optional<std::int64_t> mostRecent; // at most this many, the most recent ones
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

    // Opens the store again if it could not be read, if it now has a writer, or if it was replaced. Returns true if it
    // was replaced: event IDs then start at 1 again.
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
    std::uint64_t file_ = 0; // its inode number, which is unique as long as it is open
};

// Sleeps until the files of a database may have changed.
class DatabaseWatch {
public:
    explicit DatabaseWatch(const std::filesystem::path& database);
    ~DatabaseWatch();
    DatabaseWatch(const DatabaseWatch&) = delete;
    DatabaseWatch& operator=(const DatabaseWatch&) = delete;
    // False if the limit passed without a change; without a limit it waits for ever.
    [[nodiscard]] bool wait(std::optional<std::chrono::milliseconds> limit) const;

private:
    int inotify_;
};
