// SPDX-License-Identifier: Apache-2.0
// The room of results: the commands that show what the service wrote or what drivers publish. They change nothing of
// it.
//
// The stored events, read as they come.
#pragma once

#include "kesto/store/EventDatabase.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

struct StoredEvent {
    std::int64_t id = 0;
    double time = 0; // seconds since 1970
    std::string name;
    std::string payload; // JSON
};

// What all names of the system begin with; people leave it out.
constexpr std::string_view namePrefix = "com.quarn.";

struct EventFilter {
    std::string namePattern = "*"; // GLOB, also of the name behind the prefix
    double since = 0; // seconds since 1970
    std::int64_t afterID = 0;
    std::optional<std::int64_t> most; // at most this many
    bool areOldest = false; // the oldest of them, else the most recent ones
};

// One thread. Throws EventStoreError.
class EventStore {
public:
    explicit EventStore(std::filesystem::path database) : database_(std::move(database)) { }

    // What IDs belong to: random, and another one in another database. None in a store of the first edition.
    [[nodiscard]] std::optional<std::string> epoch();
    // As that of the database.
    bool refresh() { return database_.refresh(); }

    // Calls `visit` with each event that passes the filter, oldest first.
    void forEach(const EventFilter& filter, const std::function<void(const StoredEvent&)>& visit);

private:
    EventDatabase database_;
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
    // For `poll`: can be read when `wait` would return.
    [[nodiscard]] int descriptor() const noexcept { return inotify_; }

private:
    int inotify_;
};
