// SPDX-License-Identifier: Apache-2.0
// The SQLite file of the analytics store: it writes events and keeps the file within its limits.
//
// Only this connection writes and checkpoints. A lock on the directory keeps a second service away; all other programs
// open the file read-only. The log is written ahead (WAL): readers and the writer do not delay each other, and
// committed events survive the end of the process.
#pragma once

#include "platform/EventBatch.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/store/AnalyticsConfiguration.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/AgeClock.h"
#include "platform/linux/store/tables/EventAges.h"
#include "platform/linux/store/tables/EventHolders.h"
#include "platform/linux/store/tables/EventKinds.h"
#include "platform/linux/store/tables/FirstEdition.h"
#include "platform/linux/store/tables/OpenRun.h"
#include "platform/linux/store/tables/OriginRows.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "platform/linux/store/tables/StretchRows.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <span>
#include <utility>
#include <vector>

namespace platform {

// One thread at a time.
class SqliteEventFile {
public:
    template <typename Result = void> using Expected = StoreExpected<Result>;

    // Opens the file, or makes it. A file that is corrupt or of a later edition stays as it is. The origins and the
    // stretches, which must outlive the file, are those of this run.
    [[nodiscard]] static Expected<std::unique_ptr<SqliteEventFile>>
    open(const std::filesystem::path& path, const Clock& clock, KnownOrigins& origins, Stretches& stretches);
    SqliteEventFile(const SqliteEventFile&) = delete;
    SqliteEventFile& operator=(const SqliteEventFile&) = delete;
    ~SqliteEventFile();

    // For what is not events: the database must be opened again when its tables were changed.
    [[nodiscard]] SqliteConnection& connection() noexcept { return *connection_; }

    // In order, so that the next run goes on where this one ends. No event may follow.
    void endRun();
    [[nodiscard]] Expected<> setSynchronization(StoreSynchronization synchronization);

    // Inserts between `begin` and `commit` are kept together or not at all; `rollBack` drops them.
    [[nodiscard]] Expected<> begin();
    [[nodiscard]] Expected<> insert(std::span<const EventRow> rows);
    // Writes what waits of the stretches, behind the events that ended them.
    [[nodiscard]] Expected<> insertStretches();
    [[nodiscard]] Expected<> commit();
    void rollBack();

    // Whether events of the first edition are still to be moved.
    [[nodiscard]] bool hasFirstEdition() const noexcept { return firstEdition_.has_value(); }
    // Moves some of them, in a transaction.
    [[nodiscard]] Expected<> moveFirstEdition();

    // The size of the write-ahead log after the last commit.
    [[nodiscard]] std::uint64_t logBytes() const noexcept { return connection_->logPages() * pageSize_; }
    // Moves the log to the database, as far as readers allow. With a wait it blocks the writer, but no reader, until
    // the readers in its way have finished. True if all was moved and no reader needs the log, so that the next commit
    // starts it again. False also after an error of the disk: a log can be moved later.
    [[nodiscard]] bool emptyLog(std::chrono::milliseconds wait = {}) { return connection_->emptyLog(wait); }

    // How many events are in the file. While events of the first edition are left, those that are missing among them
    // count too.
    [[nodiscard]] std::uint64_t events() const noexcept { return counts_.committed().events(); }
    // The time of the first event; 0 without events.
    [[nodiscard]] Expected<double> oldest();
    // How many stretches were closed that an earlier run left open, and how many were removed, since the last call.
    struct StretchCounts {
        std::uint64_t closed = 0;
        std::uint64_t removed = 0;
        std::uint64_t leftOut = 0; // of an earlier run too, but without a length
    };
    [[nodiscard]] StretchCounts takeStretchCounts() noexcept { return std::exchange(stretchCounts_, {}); }
    struct Size {
        std::uint64_t usedBytes = 0;
        std::uint64_t freeBytes = 0; // room in the file that no event uses
    };
    [[nodiscard]] Expected<Size> size();
    using EventsByHolder = std::map<EventHolder, std::uint64_t>;
    // Deletes messages that were kept so many seconds ago or earlier, at most `most`, and the stretches among them.
    // Returns how many events they were, and whose.
    [[nodiscard]] Expected<EventsByHolder> deleteOlderThan(double seconds, std::uint64_t most);
    struct Removal {
        std::uint64_t events = 0;
        EventHolder holder;
        bool isOnlyHolder = false;
        bool isDone = false; // no more can be removed
    };
    // Deletes the oldest messages of the largest holder until they have freed so many bytes, but at most `most` of
    // them, and its stretches among them. It looks at so many messages that new events hardly wait, so it may find none
    // and still not be done.
    [[nodiscard]] Expected<Removal> deleteOfLargestHolder(std::uint64_t bytes, std::uint64_t most);
    // Returns free room of the file to the file system, at most so many bytes.
    [[nodiscard]] Expected<> shrink(std::uint64_t mostBytes);

private:
    struct Resolved { // who is behind an origin
        Origin origin;
        OriginRows::Rows rows;
        std::int64_t holder = 0;
    };

    SqliteEventFile(std::filesystem::path path, const Clock& clock, KnownOrigins& origins, Stretches& stretches)
        : path_(std::move(path)),
          clock_(clock),
          origins_(origins),
          stretches_(stretches)
    {
    }
    [[nodiscard]] Expected<> lockDirectory();
    [[nodiscard]] Expected<> connect();
    [[nodiscard]] Expected<> makeSchema();
    [[nodiscard]] Expected<> configure();
    [[nodiscard]] Expected<> prepareStatements();
    [[nodiscard]] Expected<> compareCounts();
    [[nodiscard]] Expected<> beginRun();
    [[nodiscard]] Expected<> closeEarlierRun(std::optional<double> end);
    [[nodiscard]] Expected<> insertStretch(const StretchRows::Owner& owner, const Stretch& stretch);
    [[nodiscard]] Expected<StretchRows::Owner> ownerOf(const Origin& origin);
    [[nodiscard]] Expected<> keepTime();
    [[nodiscard]] Expected<> markFirstEdition(std::int64_t id, double time);
    [[nodiscard]] Expected<> insert(std::int64_t id, const EventRow& row, const Resolved& resolved);
    template <typename Work> [[nodiscard]] Expected<> inTransaction(Work work);
    struct Doomed {
        std::int64_t id;
        std::int64_t events;
        std::int64_t bytes; // of the payload
        std::int64_t holder;
    };
    static constexpr std::uint64_t mostLookedAt = 8192; // messages, for those of one holder
    [[nodiscard]] Expected<Resolved> resolve(const Origin& origin);
    [[nodiscard]] Expected<Doomed> look(std::int64_t id);
    [[nodiscard]] static std::uint64_t eventsOf(const std::vector<Doomed>& doomed);
    [[nodiscard]] EventsByHolder eventsByHolder(const std::vector<Doomed>& doomed) const;
    [[nodiscard]] Expected<> remove(const std::vector<Doomed>& doomed, const StretchRows::Range& stretches);

    const std::filesystem::path path_;
    const Clock& clock_;
    KnownOrigins& origins_;
    Stretches& stretches_;
    FileDescriptor directoryLock_;
    std::unique_ptr<SqliteConnection> connection_; // outlives the statements below
    std::uint64_t pageSize_ = 0;
    StoreCountsRow counts_;
    EventKinds kinds_;
    OriginRows originRows_;
    StretchRows stretchRows_;
    StretchCounts stretchCounts_;
    EventHolders holders_;
    std::optional<Resolved> lastResolved_; // of the running transaction
    EventAges ages_;
    std::optional<AgeClock> ageClock_;
    std::optional<AgeClock> committedAgeClock_;
    double latestOfFirstEdition_ = 0; // the time of the latest event of the first edition that was moved
    std::optional<FirstEdition> firstEdition_;
    SqliteStatement begin_;
    SqliteStatement commit_;
    SqliteStatement insert_;
    SqliteStatement selectBelow_;
    SqliteStatement selectFrom_;
    SqliteStatement selectOne_;
    SqliteStatement delete_;
};

} // namespace platform
