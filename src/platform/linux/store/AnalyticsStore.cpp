// SPDX-License-Identifier: Apache-2.0
// Batches of events between the threads that send them and the thread that writes them.
#include "platform/linux/store/AnalyticsStore.h"

#include "platform/linux/process/Thread.h"
#include "platform/linux/settings/CheckedSettings.h"

#include <future>
#include <utility>

namespace platform {

using ledger::Counter;

namespace {
constexpr std::size_t mostRoomKept = 1024; // in waiting turns; further room of a burst is freed
}

// --- Batches

void AnalyticsStore::Batch::clear()
{
    events.clear();
    tally.clear();
    whenKept.clear();
    if (whenKept.capacity() > mostRoomKept)
        whenKept = std::vector<WhenKept>();
}

bool AnalyticsStore::isRoomBeside(const EventBatch& events, std::size_t waiters) const noexcept
{
    return events.size() + waiters < limits_.mostEvents && events.bytes() < limits_.mostBytes;
}

// --- For callers

namespace {

EventBatch::PayloadFilter filterBy(const ApplicationRules* rules)
{
    if (rules == nullptr)
        return {};
    return [rules](const foundation::Dictionary& payload) { return rules->shown(payload); };
}

} // namespace

AnalyticsStore::AnalyticsStore(std::unique_ptr<EventKeeper> keeper, ConfigurationWatcher& watcher, const Clock& clock,
                               ledger::Ledger& ledger, ProviderLog log, Limits limits,
                               std::unique_ptr<const ApplicationRules> rules)
    : clock_(clock),
      ledger_(ledger),
      log_(log),
      limits_(limits),
      rules_(std::move(rules)),
      filter_(filterBy(rules_.get())),
      storedByLedger_(ledger.account().stored()),
      keeper_(std::move(keeper)),
      configurationFile_(watcher, "analytics.toml", log, [this] { applyConfiguration(); })
{
    keeper_->setWaker([this] {
        const foundation::Lock lock(lock_);
        isKeeperAwake_ = true;
        wakeKeeper();
    });
    applyConfiguration();
    // Of the priority of the server queue: a client's answer waits for both.
    thread_ = startThread("analytics", QualityOfService::UserInteractive, [this] { run(); });
}

AnalyticsStore::~AnalyticsStore()
{
    {
        const foundation::Lock lock(lock_);
        isEnding_ = true;
        wakeKeeper();
    }
    thread_.join();
}

void AnalyticsStore::sendAnalyticsEventLazy(Turn& turn, const Origin& origin, std::string_view eventName,
                                            PayloadBuilder payloadBuilder)
{
    turn.tally.add(Counter::Events);
    if (!isAnalyticsEventUsed(eventName)) // most callers have asked already, and then this costs little
        return turn.tally.add(Counter::Unwanted);
    const double time = clock_.secondsSince1970();
    if (!turn.events.add(time, origin, eventName, payloadBuilder(), filter_))
        return turn.tally.add(Counter::Unwanted);
    if (isRoomBeside(turn.events, 0))
        return;
    const foundation::Lock lock(lock_);
    waiting_.events.takeFrom(turn.events); // a turn that is too large is written in parts
    waiting_.tally.takeFrom(turn.tally);
    wakeKeeper();
    waitForRoom();
}

void AnalyticsStore::sendAnalyticsEventLazy(OutsideTurn, const SourceBegin& source, std::string_view eventName,
                                            PayloadBuilder payloadBuilder)
{
    ledger::Tally tally;
    tally.add(Counter::Events);
    if (!isAnalyticsEventUsed(eventName)) {
        tally.add(Counter::Unwanted);
        return ledger_.post(tally);
    }
    const double time = clock_.secondsSince1970();
    const foundation::Dictionary payload = payloadBuilder();
    const foundation::Lock lock(lock_);
    if (source.number != 0)
        waiting_.events.announce(source);
    if (!waiting_.events.add(time, {.source = source.number, .session = 0}, eventName, payload, filter_))
        tally.add(Counter::Unwanted);
    waiting_.tally.takeFrom(tally);
    wakeKeeper();
    waitForRoom();
}

void AnalyticsStore::endTurn(Turn& turn, WhenKept whenKept)
{
    {
        const foundation::Lock lock(lock_);
        if (!turn.events.empty() || !isEverythingKept()) {
            waiting_.events.takeFrom(turn.events);
            waiting_.tally.takeFrom(turn.tally);
            if (whenKept)
                waiting_.whenKept.push_back(std::move(whenKept));
            wakeKeeper();
            waitForRoom();
            return;
        }
    }
    ledger_.post(turn.tally);
    turn.tally.clear();
    if (whenKept)
        whenKept();
}

bool AnalyticsStore::isFillingUp()
{
    const foundation::Lock lock(lock_);
    return waiting_.events.size() + waiting_.whenKept.size() > limits_.mostEvents / 2
        || waiting_.events.bytes() > limits_.mostBytes / 2;
}

void AnalyticsStore::flush()
{
    std::promise<void> kept;
    {
        const foundation::Lock lock(lock_);
        if (isEverythingKept())
            return;
        waiting_.whenKept.emplace_back([&kept] { kept.set_value(); });
        wakeKeeper();
    }
    kept.get_future().wait();
}

void AnalyticsStore::finish()
{
    std::promise<void> finished;
    {
        const foundation::Lock lock(lock_);
        waiting_.whenKept.emplace_back([this, &finished] {
            keeper_->prepareForEnd(); // on its thread
            finished.set_value();
        });
        wakeKeeper();
    }
    finished.get_future().wait();
}

std::size_t AnalyticsStore::waitingEvents()
{
    const foundation::Lock lock(lock_);
    return waiting_.events.size() + (inWriting_ == nullptr ? 0 : inWriting_->size());
}

// The counts of what is being written are with the store's thread: these events are counted here as if they had just
// come. Should they be committed all the same, the next start finds them in the store.
std::size_t AnalyticsStore::giveUp()
{
    ledger::Tally tally;
    {
        const foundation::Lock lock(lock_);
        tally.takeFrom(waiting_.tally);
        if (inWriting_ != nullptr) {
            tally.add(Counter::Events, inWriting_->size());
            origins_.countLoss(Counter::LostToEnd, inWriting_->eventsByOrigin(), tally);
        }
        origins_.begin(waiting_.events.announcements());
        origins_.countLoss(Counter::LostToEnd, waiting_.events.eventsByOrigin(), tally);
    }
    ledger_.post(tally);
    return tally[Counter::LostToEnd];
}

// --- Between callers and the store's thread

// Reads the current values, so that of several calls the last applies the last values.
void AnalyticsStore::applyConfiguration()
{
    std::vector<std::string> problems;
    {
        const foundation::Lock lock(lock_);
        auto checked = readAnalyticsConfiguration(configurationFile_.values());
        names_.setPatterns(checked.configuration.enabled ? checked.configuration.used : std::vector<std::string>());
        isEnabled_ = checked.configuration.enabled;
        keepsStretches_ = checked.configuration.stretches;
        newConfiguration_ = std::move(checked.configuration);
        problems = std::move(checked.problems);
        wakeKeeper();
    }
    logProblems(configurationFile_.path(), problems, log_);
}

bool AnalyticsStore::isEverythingKept() const
{
    return waiting_.empty() && !isWriting_;
}

void AnalyticsStore::wakeKeeper()
{
    if (std::exchange(isAsleep_, false))
        changed_.notifyOne();
}

void AnalyticsStore::waitForRoom()
{
    while (!isRoomBeside(waiting_.events, waiting_.whenKept.size()))
        room_.wait(lock_);
}

// --- The store's thread

void AnalyticsStore::run()
{
    Batch batch;
    for (bool isFirst = true; take(batch); isFirst = false) {
        if (isFirst)
            keeper_->open();
        const bool isQuiet = batch.empty();
        keeper_->keep(batch.events, batch.tally);
        eventsAreKept();
        post(batch.tally); // before the answers leave: what is acknowledged is counted
        for (WhenKept& whenKept : batch.whenKept)
            whenKept();
        endBatch();
        batch.clear();
        while (tidy(isQuiet) && isIdle()) { }
    }
}

// True if more is left to do.
bool AnalyticsStore::tidy(bool isQuiet)
{
    ledger::Tally tally;
    const bool hasMore = keeper_->tidy(isQuiet, tally);
    post(tally);
    return hasMore;
}

void AnalyticsStore::post(ledger::Tally& tally)
{
    storedByLedger_ += tally[Counter::Kept];
    for (const Counter removed :
         {Counter::RemovedForAge, Counter::RemovedForSize, Counter::RemovedForShare, Counter::RemovedByDamage})
        storedByLedger_ -= tally[removed];
    const auto state = keeper_->state();
    if (state)
        settle(tally, state->events);
    if (!tally.empty() || state != lastState_)
        ledger_.post(tally, state);
    lastState_ = state;
}

// The keeper's place may hold other events than the ledger counted: those that were committed when the service was
// killed before it counted them, those of a place that was made before there was a ledger, or fewer, if the place was
// damaged, removed or replaced.
void AnalyticsStore::settle(ledger::Tally& tally, std::uint64_t stored)
{
    if (stored > storedByLedger_) {
        tally.add(Counter::Events, stored - storedByLedger_);
        tally.add(Counter::Kept, stored - storedByLedger_);
    } else if (stored < storedByLedger_) {
        tally.add(Counter::RemovedByDamage, storedByLedger_ - stored);
        log_.error("{} analytics events are gone: {}; {}", storedByLedger_ - stored,
                   row(Counter::RemovedByDamage).reason, row(Counter::RemovedByDamage).remedy);
    }
    storedByLedger_ = stored;
}

// Waits for events, callbacks or a new configuration, or for a quiet moment, and takes all of them. False at the end.
bool AnalyticsStore::take(Batch& batch)
{
    std::optional<AnalyticsConfiguration> configuration;
    {
        const foundation::Lock lock(lock_);
        while (waiting_.empty() && !newConfiguration_ && !isKeeperAwake_) {
            if (isEnding_)
                return false;
            if (!sleep())
                break; // takes an empty batch, because the store is quiet
        }
        isKeeperAwake_ = false;
        std::swap(configuration, newConfiguration_);
        std::swap(batch, waiting_);
        if (rules_)
            rules_->hideNames(batch.events.announcements());
        isWriting_ = !batch.empty();
        inWriting_ = &batch.events;
        origins_.committed();
        origins_.begin(batch.events.announcements());
        origins_.end(batch.events.announcements());
        room_.notifyAll();
    }
    if (configuration)
        keeper_->setConfiguration(*configuration);
    return true;
}

// False if the keeper awaited a quiet moment and it came.
bool AnalyticsStore::sleep()
{
    bool isQuiet = false;
    isAsleep_ = true;
    if (!keeper_->awaitsQuiet())
        changed_.wait(lock_);
    else
        isQuiet = changed_.waitUntil(lock_, std::chrono::steady_clock::now() + quietTime) == std::cv_status::timeout;
    isAsleep_ = false;
    return !isQuiet;
}

void AnalyticsStore::eventsAreKept()
{
    const foundation::Lock lock(lock_);
    inWriting_ = nullptr;
}

void AnalyticsStore::endBatch()
{
    const foundation::Lock lock(lock_);
    isWriting_ = false;
}

bool AnalyticsStore::isIdle()
{
    const foundation::Lock lock(lock_);
    return waiting_.empty() && !newConfiguration_ && !isEnding_;
}

} // namespace platform
