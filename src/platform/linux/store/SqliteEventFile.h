// The SQLite file of the analytics store: it writes events and keeps the file within its limits.
//
// Only this connection writes and checkpoints, because SQLite 3.40 can damage a database when two connections do so at
// the same time. A lock on the directory keeps a second service away; all other programs open the file read-only. The
// log is written ahead (WAL): readers and the writer do not delay each other, and committed events survive the end of
// the process.
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
class SqliteEventFile {
public:
    template <typename Result = void> using Expected = std::expected<Result, StoreError>;

    static constexpr int schemaVersion = 1;
    // One statement inserts many rows: AUTOINCREMENT does its accounting once for each statement, which costs as much
    // as a row.
    static constexpr std::size_t rowsAtOnce = 16;
    // How long a program that locks the database may delay the store.
    static constexpr std::chrono::milliseconds longestWaitForLock{2000};

    // Opens the file, or makes it. A file that is corrupt or of a later version stays as it is.
    [[nodiscard]] static Expected<std::unique_ptr<SqliteEventFile>> open(const std::filesystem::path& path);
    SqliteEventFile(const SqliteEventFile&) = delete;
    SqliteEventFile& operator=(const SqliteEventFile&) = delete;
    ~SqliteEventFile();

    // Whether the path now leads to another file or to none, so that no reader finds what is written here.
    [[nodiscard]] bool wasReplaced() const;

    [[nodiscard]] Expected<> setSynchronization(StoreSynchronization synchronization);

    // Inserts between `begin` and `commit` are kept together or not at all; `rollBack` drops them.
    [[nodiscard]] Expected<> begin();
    [[nodiscard]] Expected<> insert(std::span<const EventRow> rows);
    [[nodiscard]] Expected<> commit();
    void rollBack();

    // The size of the write-ahead log after the last commit.
    [[nodiscard]] std::uint64_t logBytes() const noexcept { return logPages_ * pageSize_; }
    // Moves the log to the database, as far as readers allow. With a wait it blocks the writer, but no reader, until
    // the readers in its way have finished. True if all was moved and no reader needs the log, so that the next commit
    // starts it again. False also after an error of the disk: a log can be moved later.
    [[nodiscard]] bool emptyLog(std::chrono::milliseconds wait = {});

    // The events that were in the file when it was opened.
    [[nodiscard]] std::uint64_t eventsAtOpening() const noexcept { return eventsAtOpening_; }
    // The time of the first event; 0 without events.
    [[nodiscard]] Expected<double> oldest();
    struct Size {
        std::uint64_t usedBytes = 0;
        std::uint64_t freeBytes = 0; // room in the file that no event uses
    };
    [[nodiscard]] Expected<Size> size();
    // Of the `most` oldest events, deletes those before that time. Returns their number.
    [[nodiscard]] Expected<std::uint64_t> deleteBefore(double time, std::uint64_t most);
    // Deletes the oldest events until they have freed so many bytes, but at most `most` of them. Returns their number.
    [[nodiscard]] Expected<std::uint64_t> deleteOldest(std::uint64_t bytes, std::uint64_t most);
    // Returns free room of the file to the file system, at most so many bytes.
    [[nodiscard]] Expected<> shrink(std::uint64_t mostBytes);

private:
    struct CloseConnection {
        void operator()(sqlite3* connection) const noexcept;
    };
    struct FinalizeStatement {
        void operator()(sqlite3_stmt* statement) const noexcept;
    };
    using Statement = std::unique_ptr<sqlite3_stmt, FinalizeStatement>;

    explicit SqliteEventFile(std::filesystem::path path) : path_(std::move(path)) { }
    [[nodiscard]] Expected<> lockDirectory();
    [[nodiscard]] Expected<> connect();
    [[nodiscard]] Expected<> checkOrMakeSchema();
    [[nodiscard]] Expected<> configure();
    [[nodiscard]] Expected<> beginLog();
    [[nodiscard]] Expected<> prepareStatements();
    [[nodiscard]] Expected<> countEvents();

    [[nodiscard]] StoreError lastError() const;
    [[nodiscard]] Expected<> execute(const char* sql);
    [[nodiscard]] Expected<std::int64_t> number(const char* sql);
    [[nodiscard]] Expected<Statement> prepare(std::string_view sql);
    // Runs the statement to its first row or to its end, and resets it.
    [[nodiscard]] Expected<> run(const Statement& statement);
    [[nodiscard]] Expected<std::uint64_t> runAndCountChanges(const Statement& statement);
    static void bind(const Statement& statement, int firstParameter, const EventRow& row);

    const std::filesystem::path path_;
    FileDescriptor directoryLock_;
    std::unique_ptr<sqlite3, CloseConnection> connection_;
    std::uint64_t device_ = 0; // with the inode, identifies the file under any name
    std::uint64_t inode_ = 0;
    std::uint64_t pageSize_ = 0;
    std::uint64_t eventsAtOpening_ = 0;
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
