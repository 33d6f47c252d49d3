// SPDX-License-Identifier: Apache-2.0
// The room of the store: the service's event store as a database for reading, strictly read-only, beside the service
// while it writes.
//
// SQLite shares the write-ahead log through files of its own, which even a reader makes if they are missing; it needs
// the right to make them, and leaves them behind. A store without a log has no writer, so it is opened as unchanging,
// which needs no such files.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>

struct sqlite3;

// A line for a person.
class EventStoreError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// One thread. Throws EventStoreError.
class EventDatabase {
public:
    explicit EventDatabase(std::filesystem::path database);

    // Opens the store again if it could not be read, if it now has a writer, or if it was replaced. Returns true if it
    // was replaced: event IDs then start at 1 again.
    bool refresh();

    [[nodiscard]] platform::SqliteStatement prepare(std::string_view sql);
    // Goes to the statement's next row; false behind the last.
    [[nodiscard]] bool step(const platform::SqliteStatement& statement);
    // Runs the statement to its end.
    void forEachRow(const platform::SqliteStatement& statement,
                    const std::function<void(const platform::SqliteStatement&)>& visit);
    void execute(std::string_view sql);
    // The first column of the first row; 0 if there is none.
    [[nodiscard]] std::int64_t number(std::string_view sql);

    [[nodiscard]] const std::filesystem::path& path() const noexcept { return path_; }

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

// Whether the text matches the pattern, as SQLite's GLOB has it.
[[nodiscard]] bool matches(const std::string& text, const std::string& pattern);
