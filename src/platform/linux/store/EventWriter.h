// Keeps events in an SQLite database, come what may: a damaged database is set aside and a new one begun, what cannot
// be kept is counted and told, and what is too old or too much goes.
#pragma once

#include "platform/Clock.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/store/EventDatabase.h"
#include "platform/linux/store/EventKeeper.h"
#include "platform/linux/store/EventLosses.h"

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <span>
#include <string_view>

namespace platform {

// One thread, but for the counts.
class EventWriter final : public EventKeeper {
public:
    static constexpr std::string_view fileName = "analytics.sqlite3";
    static constexpr std::size_t mostDamagedKept = 3; // databases set aside; older ones are removed
    static constexpr double secondsBetweenOpenings = 1; // of a database that could not be opened
    // How long the write-ahead log gets before it is moved to the database in a quiet moment, and before it is moved
    // come what may, unless a quarter of the bound of size is less. The next commit waits until it is moved, which
    // takes about as long as writing the log did.
    static constexpr std::uint64_t logBytesBetweenCheckpoints = 8 * 1024 * 1024;
    static constexpr std::uint64_t mostLogBytesBetweenCheckpoints = 4 * logBytesBetweenCheckpoints;
    // When the log is longer than half the bound of size, because readers keep it from beginning anew, the writer
    // waits for them so long; when that was in vain, not again for a while. A log as long as the bound takes no more.
    static constexpr std::chrono::milliseconds waitForReaders{200};
    static constexpr double secondsBetweenWaits = 2;
    // The bounds of age and size are looked after when so much was kept, or so much time went by. What goes then,
    // goes in transactions of so many events.
    static constexpr std::uint64_t bytesBetweenChecks = 1024 * 1024;
    static constexpr double secondsBetweenChecks = 60;
    static constexpr std::uint64_t eventsDeletedAtOnce = 512;

    EventWriter(const std::filesystem::path& directory, const Clock& clock, ProviderLog log);

    void setConfiguration(const AnalyticsConfiguration& configuration) override;

    void open() override;
    void keep(EventBatch& events) override; // in one transaction
    [[nodiscard]] bool awaitsQuiet() const override;
    bool tidy(bool isQuiet) override;

    [[nodiscard]] std::uint64_t keptEvents() const noexcept override { return kept_; }
    [[nodiscard]] std::uint64_t lostEvents(StoreError reason) const noexcept override { return losses_.count(reason); }

private:
    template <typename Result = void> using Expected = EventDatabase::Expected<Result>;

    [[nodiscard]] Expected<> ensureOpen();
    [[nodiscard]] Expected<> openAnew();
    bool setAside(StoreError reason);
    void removeOldestDamaged();
    [[nodiscard]] Expected<> write(std::span<const EventRow> rows);
    void handleFailure(StoreError error);
    [[nodiscard]] bool isLogLongerBy(std::uint64_t bytes) const;
    bool emptyLog();
    [[nodiscard]] bool makeRoom();
    [[nodiscard]] Expected<bool> makeSomeRoom(const EventDatabase::Size& size);
    [[nodiscard]] std::uint64_t maximumBytes() const noexcept;

    const std::filesystem::path path_;
    const Clock& clock_;
    const ProviderLog log_;
    AnalyticsConfiguration configuration_;
    EventLosses losses_;
    std::atomic<std::uint64_t> kept_ = 0;

    std::unique_ptr<EventDatabase> database_; // null: could not be opened
    StoreError openError_ = StoreError::Other;
    double openAgainAt_ = 0; // here and below: uptime, in seconds
    std::uint64_t logBytesAtCheckpoint_ = 0;
    double waitForReadersAt_ = 0;
    double checkedAt_ = 0; // the bounds of age and size
    std::uint64_t bytesSinceCheck_ = 0;
    bool hasMoreToTidy_ = true;
};

} // namespace platform
