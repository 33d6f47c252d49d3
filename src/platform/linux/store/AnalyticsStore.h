// The room of the store: from an event that was sent to a row on the disk. It alone touches SQLite and the state
// directory's database.
//
// The analytics service: events go to an EventKeeper, which for the service is a database that anyone can query with
// SQL.
//
// Acknowledged means kept: `endTurn` takes what a turn gathered, and calls back when all of it is committed. The turn
// itself never waits for the disk. A thread of the store takes what has gathered as one transaction while the next
// turns go on, so that the busier the service, the cheaper a commit.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Analytics.h"
#include "platform/Clock.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/WatchedTomlFile.h"
#include "platform/linux/store/EventKeeper.h"
#include "platform/linux/store/UsedEventNames.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

namespace platform {

// Any thread.
class AnalyticsStore final : public Analytics {
public:
    using WhenKept = std::move_only_function<void()>;

    // How much may wait to be written, while as much again is being written. More would make commits no cheaper
    // and the payloads leave the processor's caches before they are written.
    struct Limits {
        std::size_t mostEvents = 4096;
        std::size_t mostBytes = 4 * 1024 * 1024;
    };

    // After how long without an event it is quiet.
    static constexpr std::chrono::milliseconds quietTime{50};

    // Events go to the keeper; analytics.toml in the configuration directory says which are wanted and for how long
    // they are kept.
    AnalyticsStore(std::unique_ptr<EventKeeper> keeper, ConfigurationWatcher& watcher, const Clock& clock,
                   ProviderLog log, Limits limits);
    AnalyticsStore(std::unique_ptr<EventKeeper> keeper, ConfigurationWatcher& watcher, const Clock& clock,
                   ProviderLog log)
        : AnalyticsStore(std::move(keeper), watcher, clock, log, Limits())
    {
    }
    // Writes everything that was sent, but for turns that have not ended.
    ~AnalyticsStore() override;

    [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override { return names_.contains(eventName); }
    // Both stamp the event with the time and build its payload at once, and block only while too much waits to be
    // written. An event of a turn is written when the turn has ended, or is too large, any other at once.
    void sendAnalyticsEventLazy(Turn& turn, std::string_view eventName, PayloadBuilder payloadBuilder) override;
    void sendAnalyticsEventLazy(OutsideTurn, std::string_view eventName, PayloadBuilder payloadBuilder) override;

    // Takes the events of a turn. `whenKept`, unless it is empty, is called once everything that was taken so far is
    // committed, or counted as lost: here and now when it is, on the store's thread otherwise, one after the other in
    // the order of the turns. It must not use the store. Blocks only while too much waits to be written.
    void endTurn(Turn& turn, WhenKept whenKept);

    // Returns when everything that was taken so far is committed, or counted as lost.
    void flush();

    // Since the start.
    [[nodiscard]] std::uint64_t keptEvents() const noexcept { return keeper_->keptEvents(); }
    [[nodiscard]] std::uint64_t lostEvents(StoreError reason) const noexcept { return keeper_->lostEvents(reason); }

private:
    // Events, and who waits for them.
    struct Batch {
        EventBatch events;
        std::vector<WhenKept> whenKept;

        [[nodiscard]] bool empty() const noexcept { return events.size() == 0 && whenKept.empty(); }
        void clear();
    };

    void applyConfiguration();
    [[nodiscard]] bool isRoomBeside(const EventBatch& events, std::size_t waiters) const noexcept;
    [[nodiscard]] bool isEverythingKept() const KESTO_REQUIRES(lock_);
    void wakeKeeper() KESTO_REQUIRES(lock_);
    void waitForRoom() KESTO_REQUIRES(lock_);

    // The store's thread.
    void run();
    [[nodiscard]] bool take(Batch& batch);
    [[nodiscard]] bool sleep() KESTO_REQUIRES(lock_);
    void finish();
    [[nodiscard]] bool isIdle();

    const Clock& clock_;
    const ProviderLog log_;
    const Limits limits_;
    UsedEventNames names_;
    const std::unique_ptr<EventKeeper> keeper_; // the store's thread's

    foundation::Mutex lock_;
    foundation::Condition changed_; // something waits to be written
    foundation::Condition room_; // what waited is being written
    Batch waiting_ KESTO_GUARDED_BY(lock_);
    std::optional<AnalyticsConfiguration> newConfiguration_ KESTO_GUARDED_BY(lock_);
    bool isWriting_ KESTO_GUARDED_BY(lock_) = false; // until those who wait have been told
    bool isAsleep_ KESTO_GUARDED_BY(lock_) = false; // so that only who finds the thread asleep pays for waking it
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;

    WatchedTomlFile configurationFile_;
    std::thread thread_;
};

} // namespace platform
