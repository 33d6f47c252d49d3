// SPDX-License-Identifier: Apache-2.0
// The room of the store: from a sent event to a row on the disk. No other part uses SQLite or the database in the state
// directory.
//
// The analytics service hands events to an EventKeeper. In the service the keeper is a database that every program may
// query with SQL.
//
// Acknowledged means kept: `endTurn` takes what a turn gathered, and calls back when all of it is committed. The turn
// itself never waits for the disk. While the next turns run, the store's thread commits all gathered events in one
// transaction; so a commit becomes cheaper for each event as the service gets busier.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/Ledger.h"
#include "platform/Analytics.h"
#include "platform/Clock.h"
#include "platform/linux/settings/ConfigurationWatcher.h"
#include "platform/linux/settings/WatchedTomlFile.h"
#include "platform/linux/store/EventKeeper.h"
#include "platform/linux/store/UsedEventNames.h"
#include "platform/linux/store/applications/ApplicationRules.h"
#include "platform/linux/store/tables/KnownOrigins.h"

#include <atomic>
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

    // The most that may wait for the store's thread; the batch that it is writing may be as large again. More would not
    // make commits cheaper, and the payloads would leave the processor's caches before they are written.
    struct Limits {
        std::size_t mostEvents = 4096;
        std::size_t mostBytes = 4 * 1024 * 1024;
    };

    // The store is quiet after this time without an event.
    static constexpr std::chrono::milliseconds quietTime{50};

    // Hands events to the keeper. analytics.toml in the configuration directory says which events the store keeps, and
    // for how long.
    AnalyticsStore(std::unique_ptr<EventKeeper> keeper, ConfigurationWatcher& watcher, const Clock& clock,
                   ledger::Ledger& ledger, ProviderLog log, Limits limits,
                   std::unique_ptr<const ApplicationRules> rules = nullptr);
    AnalyticsStore(std::unique_ptr<EventKeeper> keeper, ConfigurationWatcher& watcher, const Clock& clock,
                   ledger::Ledger& ledger, ProviderLog log, std::unique_ptr<const ApplicationRules> rules = nullptr)
        : AnalyticsStore(std::move(keeper), watcher, clock, ledger, log, Limits(), std::move(rules))
    {
    }
    // Writes everything that was sent, except for turns that have not ended.
    ~AnalyticsStore() override;

    [[nodiscard]] bool isEnabled() const override { return isEnabled_.load(std::memory_order_relaxed); }
    // Whether it keeps who played what for how long.
    [[nodiscard]] bool keepsStretches() const { return isEnabled() && keepsStretches_.load(std::memory_order_relaxed); }
    [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override { return names_.contains(eventName); }
    // Both stamp the event with the time and build its payload before they return. They block only while too much waits
    // to be written. An event of a turn is written when the turn has ended or is too large, any other event as soon as
    // possible.
    void sendAnalyticsEventLazy(Turn& turn, const Origin& origin, std::string_view eventName,
                                PayloadBuilder payloadBuilder) override;
    void sendAnalyticsEventLazy(OutsideTurn, const SourceBegin& source, std::string_view eventName,
                                PayloadBuilder payloadBuilder) override;

    // Takes the events and the counts of a turn. Calls `whenKept`, unless it is empty, once everything taken so far is
    // committed or counted as lost: before it returns if that is so already, otherwise later on the store's thread. The
    // calls come in the order of the turns, one at a time. `whenKept` must not use the store. Blocks only while too
    // much waits to be written.
    void endTurn(Turn& turn, WhenKept whenKept);

    // Whether more than half of what may wait for the store's thread does, so that the end of a turn may block soon.
    [[nodiscard]] bool isFillingUp();

    // The events that were taken and are neither committed nor counted as lost. Never waits for the disk.
    [[nodiscard]] std::size_t waitingEvents();

    // The service begins to end: what connections leave behind from now on ends with it.
    void beginEnd() { keeper_->beginEnd(); }
    // Returns when everything taken so far is committed or counted as lost.
    void flush();
    // The same, and leaves the keeper's place as a service does that ends in order: the process ends soon without
    // destroying the store.
    void finish();
    // For a process that ends now: counts the events taken that are neither as lost, and returns their number. Never
    // waits for the disk.
    std::size_t giveUp();
    void reportLosses() override { keeper_->reportLosses(); }

private:
    // Events, their counts, and the callbacks that wait for them.
    struct Batch {
        EventBatch events;
        ledger::Tally tally;
        std::vector<WhenKept> whenKept;

        [[nodiscard]] bool empty() const noexcept { return events.empty() && tally.empty() && whenKept.empty(); }
        void clear();
    };

    void applyConfiguration();
    [[nodiscard]] bool isRoomBeside(const EventBatch& events, std::size_t waiters) const noexcept;
    [[nodiscard]] bool isEverythingKept() const KESTO_REQUIRES(lock_);
    void wakeKeeper() KESTO_REQUIRES(lock_);
    void waitForRoom() KESTO_REQUIRES(lock_);

    // Only for the store's thread.
    void run();
    [[nodiscard]] bool take(Batch& batch);
    [[nodiscard]] bool tidy(bool isQuiet);
    void post(ledger::Tally& tally);
    void settle(ledger::Tally& tally, std::uint64_t stored);
    [[nodiscard]] bool sleep() KESTO_REQUIRES(lock_);
    void eventsAreKept();
    void endBatch();
    [[nodiscard]] bool isIdle();

    const Clock& clock_;
    ledger::Ledger& ledger_;
    const ProviderLog log_;
    const Limits limits_;
    const std::unique_ptr<const ApplicationRules> rules_; // null: none apply
    const EventBatch::PayloadFilter filter_; // by the rules; empty: none apply
    UsedEventNames names_;
    std::atomic<bool> isEnabled_ = true;
    std::atomic<bool> keepsStretches_ = true;
    // Only for the store's thread.
    std::optional<ledger::StoreState> lastState_;
    std::uint64_t storedByLedger_; // the events that are in the store according to the ledger

    foundation::Mutex lock_;
    foundation::Condition changed_; // the store's thread has work
    foundation::Condition room_; // the waiting batch was taken
    Batch waiting_ KESTO_GUARDED_BY(lock_);
    std::optional<AnalyticsConfiguration> newConfiguration_ KESTO_GUARDED_BY(lock_);
    const EventBatch* inWriting_ KESTO_GUARDED_BY(lock_) = nullptr; // until its events are kept or lost
    // By the batches that were taken: for the end, which cannot ask a keeper whose disk hangs.
    KnownOrigins origins_ KESTO_GUARDED_BY(lock_);
    bool isWriting_ KESTO_GUARDED_BY(lock_) = false; // until the callbacks of the batch have returned
    bool isAsleep_ KESTO_GUARDED_BY(lock_) = false; // so that only a caller that finds it asleep pays for waking it
    bool isKeeperAwake_ KESTO_GUARDED_BY(lock_) = false; // it wants an empty batch
    bool isEnding_ KESTO_GUARDED_BY(lock_) = false;
    // For the store's thread, except what any thread may call. Its own threads use what stands above.
    const std::unique_ptr<EventKeeper> keeper_;

    WatchedTomlFile configurationFile_;
    std::thread thread_;
};

} // namespace platform
