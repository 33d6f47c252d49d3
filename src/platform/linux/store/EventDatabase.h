// The SQLite file of the analytics store: writing to it, and keeping it within its bounds.
//
// Exactly one connection writes and checkpoints, and it is this one: SQLite 3.40 can damage a database when two
// connections do so at once. A lock on the directory keeps a second service away; everybody else opens the file
// read-only. The log is written ahead (WAL), so that readers and the writer do not hold each other up and what
// was committed outlives the process.
#pragma once

#include "platform/EventBatch.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/store/AnalyticsConfiguration.h"
#include "platform/linux/store/StoreError.h"

#include <chrono>
#include <cstdint>
#include <expected>
#include <filesystem>
#include <memory>
#include <span>
#include <string_view>

struct sqlite3;
struct sqlite3_stmt;

namespace platform {

// One thread at a time.
class EventDatabase {
public:
    template <typename Result = void> using Expected = std::expected<Result, StoreError>;

    static constexpr int schemaVersion = 1;
    // One statement for many rows: AUTOINCREMENT keeps its books once a statement, which costs as much as a row.
    static constexpr std::size_t rowsAtOnce = 16;
    // For how long a program that locks the database may hold up the store.
    static constexpr std::chrono::milliseconds longestWaitForLock{2000};

    // Opens the file, or makes it. One that is corrupt or newer is left as it is.
    [[nodiscard]] static Expected<std::unique_ptr<EventDatabase>> open(const std::filesystem::path& path);
    EventDatabase(const EventDatabase&) = delete;
    EventDatabase& operator=(const EventDatabase&) = delete;
    ~EventDatabase();

    // Whether another file, or none, now stands at the path, so that what is written here reaches nobody.
    [[nodiscard]] bool wasReplaced() const;

    [[nodiscard]] Expected<> setSynchronization(StoreSynchronization synchronization);

    // What is inserted between `begin` and `commit` is kept whole or not at all; `rollBack` drops it.
    [[nodiscard]] Expected<> begin();
    [[nodiscard]] Expected<> insert(std::span<const EventRow> rows);
    [[nodiscard]] Expected<> commit();
    void rollBack();

    // The write-ahead log as it was after the last commit.
    [[nodiscard]] std::uint64_t logBytes() const noexcept { return logPages_ * pageSize_; }
    // Moves what the log holds to the database, as far as readers let it; with a wait it holds up the writer, but
    // no reader, until those are done that are in the way now. True when nothing is left to move and no reader
    // needs the log, so that it begins anew. False with an error of the disk too: a log can be moved later.
    [[nodiscard]] bool emptyLog(std::chrono::milliseconds wait = {});

    struct Size {
        std::uint64_t usedBytes = 0;
        std::uint64_t freeBytes = 0; // within the file
    };
    [[nodiscard]] Expected<Size> size();
    // Deletes, of the `most` oldest events, those from before that time. Returns how many.
    [[nodiscard]] Expected<std::uint64_t> deleteBefore(double time, std::uint64_t most);
    // Deletes the oldest events, as many as take so many bytes, but at most so many. Returns how many.
    [[nodiscard]] Expected<std::uint64_t> deleteOldest(std::uint64_t bytes, std::uint64_t most);
    // Gives free room of the file back to the file system, at most so much.
    [[nodiscard]] Expected<> shrink(std::uint64_t mostBytes);

private:
    struct CloseConnection {
        void operator()(sqlite3* connection) const noexcept;
    };
    struct FinalizeStatement {
        void operator()(sqlite3_stmt* statement) const noexcept;
    };
    using Statement = std::unique_ptr<sqlite3_stmt, FinalizeStatement>;

    explicit EventDatabase(std::filesystem::path path) : path_(std::move(path)) { }
    [[nodiscard]] Expected<> lockDirectory();
    [[nodiscard]] Expected<> connect();
    [[nodiscard]] Expected<> checkOrMakeSchema();
    [[nodiscard]] Expected<> configure();
    [[nodiscard]] Expected<> beginLog();
    [[nodiscard]] Expected<> prepareStatements();

    [[nodiscard]] StoreError lastError() const;
    [[nodiscard]] Expected<> execute(const char* sql);
    [[nodiscard]] Expected<std::int64_t> number(const char* sql);
    [[nodiscard]] Expected<Statement> prepare(std::string_view sql);
    // Runs the statement to its first row, or to its end; it is then ready for the next time.
    [[nodiscard]] Expected<> run(const Statement& statement);
    [[nodiscard]] Expected<std::uint64_t> runAndCountChanges(const Statement& statement);
    static void bind(const Statement& statement, int firstParameter, const EventRow& row);

    const std::filesystem::path path_;
    FileDescriptor directoryLock_;
    std::unique_ptr<sqlite3, CloseConnection> connection_;
    std::uint64_t device_ = 0; // which file it is, whatever it is called
    std::uint64_t inode_ = 0;
    std::uint64_t pageSize_ = 0;
    std::uint64_t logPages_ = 0;
    Statement begin_;
    Statement commit_;
    Statement insertMany_;
    Statement insertOne_;
    Statement deleteBefore_;
    Statement sizesOfOldest_;
    Statement deleteUpTo_;
};

} // namespace platform
