// SPDX-License-Identifier: Apache-2.0
// Keeps events in an SQLite database in spite of all failures: it looks for damage, sets a damaged database
// aside and saves what can be read in it, counts and logs the events that it cannot keep, and removes those that are
// too old or too many.
#pragma once

#include "platform/Clock.h"
#include "platform/linux/damage/DamageCheck.h"
#include "platform/linux/damage/FilesInPlace.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/store/EventKeeper.h"
#include "platform/linux/store/EventLosses.h"
#include "platform/linux/store/RemovalReport.h"
#include "platform/linux/store/Repair.h"
#include "platform/linux/store/SqliteEventFile.h"

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string_view>

namespace platform {

// One thread.
class SqliteKeeper final : public EventKeeper {
public:
    static constexpr std::string_view fileName = "analytics.sqlite3";
    static constexpr double secondsBetweenOpenings = 1; // of a database that could not be opened
    // The length at which the write-ahead log is moved to the database in a quiet moment, and the length at which it is
    // moved in any case; a quarter of the size limit if that is less. The next commit waits meanwhile, about as long as
    // writing the log took.
    static constexpr std::uint64_t logBytesBetweenCheckpoints = 8 * 1024 * 1024;
    static constexpr std::uint64_t mostLogBytesBetweenCheckpoints = 4 * logBytesBetweenCheckpoints;
    // If readers keep the log from starting again and it is longer than half the size limit, the writer waits for them
    // for this time; after a wait in vain, it does not wait again for a while. A log longer than the size limit gets no
    // more events.
    static constexpr std::chrono::milliseconds waitForReaders{200};
    static constexpr double secondsBetweenWaits = 2;
    // The limits of age and size are checked after so many bytes or so much time. Events are then deleted in
    // transactions of so many.
    static constexpr std::uint64_t bytesBetweenChecks = 1024 * 1024;
    static constexpr double secondsBetweenChecks = 60;
    static constexpr std::uint64_t eventsDeletedAtOnce = 512;

    SqliteKeeper(const std::filesystem::path& directory, const Clock& clock, ProviderLog log);

    void setConfiguration(const AnalyticsConfiguration& configuration) override;

    void setWaker(std::function<void()> wake) override { wake_ = std::move(wake); }
    void open() override;
    void keep(EventBatch& events, ledger::Tally& tally) override; // in one transaction
    [[nodiscard]] bool awaitsQuiet() const override;
    bool tidy(bool isQuiet, ledger::Tally& tally) override;
    void beginEnd() override { isServiceEnding_ = true; }
    void prepareForEnd() override;
    [[nodiscard]] std::optional<ledger::StoreState> state() const override;
    void reportLosses() override { losses_.reportAll(); }

private:
    template <typename Result = void> using Expected = SqliteEventFile::Expected<Result>;

    [[nodiscard]] Expected<> ensureOpen();
    [[nodiscard]] Expected<> openAnew();
    [[nodiscard]] Expected<> connectAndRepair();
    [[nodiscard]] Expected<> connect();
    void close();
    [[nodiscard]] bool areFilesInPlace();
    void replaceLog();
    void heedCheck();
    [[nodiscard]] bool salvageSome();
    [[nodiscard]] bool tidySome(bool isQuiet, ledger::Tally& tally);
    [[nodiscard]] Expected<> write(std::span<const EventRow> rows, const OriginAnnouncements& announced);
    [[nodiscard]] bool endsRows(const OriginAnnouncements& announced);
    void handleFailure(StoreError error);
    void followStretches(std::span<const EventRow> rows, const OriginAnnouncements& announced);
    void countStretches(ledger::Tally& tally);
    void lose(StoreError reason, std::span<const EventRow> rows, ledger::Tally& tally);
    [[nodiscard]] bool isLogLongerBy(std::uint64_t bytes) const;
    [[nodiscard]] bool isLogFull();
    bool emptyLog();
    static void count(ledger::Counter reason, const EventHolder& holder, std::uint64_t events, ledger::Tally& tally);
    [[nodiscard]] bool moveFirstEdition(ledger::Tally& tally);
    [[nodiscard]] bool makeRoom(ledger::Tally& tally);
    [[nodiscard]] Expected<bool> makeSomeRoom(const SqliteEventFile::Size& size, ledger::Tally& tally);
    [[nodiscard]] std::uint64_t maximumBytes() const noexcept;

    const std::filesystem::path path_;
    const Clock& clock_;
    const ProviderLog log_;
    AnalyticsConfiguration configuration_;
    EventLosses losses_;
    RemovalReport removals_;
    KnownOrigins origins_;
    Stretches stretches_;
    std::atomic<bool> isServiceEnding_ = false;

    std::function<void()> wake_;

    std::unique_ptr<SqliteEventFile> database_; // null: could not be opened
    std::optional<FilesInPlace> files_; // of the database
    Repair repair_;
    std::uint64_t bytes_ = 0; // of the database, as of the last check, as the next
    double oldest_ = 0; // the time of its first event; 0 without events
    StoreError openError_ = StoreError::Other;
    double openAgainAt_ = 0; // here and below: uptime, in seconds
    std::uint64_t logBytesAtCheckpoint_ = 0;
    double waitForReadersAt_ = 0;
    double checkedAt_ = 0; // the last check of age and size
    std::uint64_t bytesSinceCheck_ = 0;
    bool hasMoreToTidy_ = true;
    bool hasBegunAnew_ = false; // a new database, because the old one was damaged

    DamageCheck check_; // last: its thread ends first
};

} // namespace platform
