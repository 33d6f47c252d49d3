// SPDX-License-Identifier: Apache-2.0
// Acknowledged events are kept: with turns and without, from many threads, beyond the backlog, and if the service is
// killed. The tests read the database as any program would.
#include "platform/linux/store/AnalyticsStore.h"

#include "platform/linux/queues/LinuxWorkQueues.h"
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/MemoryKeeper.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/Sanitizers.h"
#include "support/TemporaryDirectory.h"
#include "support/WatchedThread.h"
#include "support/fakes/FakeLog.h"

#include <atomic>
#include <chrono>
#include <csignal>
#include <fmt/format.h>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace platform {
namespace {

using foundation::Dictionary;
using ledger::Counter;
using support::StoreReader;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;

namespace fs = std::filesystem;
using namespace std::chrono_literals;

constexpr const char* eventName = "com.quarn.kesto.Playback.Start";

class AnalyticsStoreTest : public testing::Test {
protected:
    AnalyticsStore& store()
    {
        if (!store_)
            store_ = std::make_unique<AnalyticsStore>(
                std::make_unique<SqliteKeeper>(temporary.path(), clock, ProviderLog(log)), watcher, clock, ledger,
                ProviderLog(log), limits);
        return *store_;
    }
    void closeStore() { store_.reset(); }

    void send(std::int64_t number, const char* name = eventName)
    {
        store().sendAnalyticsEventLazy(outsideTurn, {}, name, [number] { return Dictionary{{"n", number}}; });
    }
    void sendIn(Turn& turn, std::int64_t number)
    {
        store().sendAnalyticsEventLazy(turn, {}, eventName, [number] { return Dictionary{{"n", number}}; });
    }
    // Sends in a turn, and ends the turn as the service does.
    void runTurn(std::function<void(Turn&)> items, AnalyticsStore::WhenKept whenKept)
    {
        std::promise<void> ended;
        LinuxWorkQueues queues;
        queues.setTurnEndHandler([&](Turn& turn) {
            store().endTurn(turn, std::move(whenKept));
            ended.set_value();
        });
        const auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {});
        queue->submit(std::move(items));
        ended.get_future().wait();
    }
    // 120 events, large enough that the log is due to be moved to the database.
    void sendALongLog()
    {
        for (int number = 0; number < 120; ++number)
            store().sendAnalyticsEventLazy(outsideTurn, {}, eventName,
                                           [] { return Dictionary{{"text", std::string(100'000, 'x')}}; });
        store().flush();
    }
    [[nodiscard]] std::uint64_t kept() const { return ledger.account()[ledger::Counter::Kept]; }
    [[nodiscard]] std::int64_t storedEvents() { return StoreReader(file).eventCount(); }

    // Keeps the store's thread busy as long as this object exists; the thread writes nothing meanwhile.
    class Hold {
    public:
        explicit Hold(AnalyticsStore& store)
        {
            std::promise<void> held;
            Turn turn; // with an event, so that its end waits for the store's thread in any case
            store.sendAnalyticsEventLazy(turn, {}, "com.quarn.hold", [] { return Dictionary(); });
            store.endTurn(turn, [&held, released = released_.get_future()] {
                held.set_value();
                released.wait();
            });
            held.get_future().wait();
        }
        ~Hold() { release(); }
        Hold(const Hold&) = delete;
        Hold& operator=(const Hold&) = delete;
        void release()
        {
            if (!std::exchange(isReleased_, true))
                released_.set_value();
        }

    private:
        std::promise<void> released_;
        bool isReleased_ = false;
    };

    support::TemporaryDirectory temporary;
    const fs::path file = temporary.path() / "analytics.sqlite3";
    support::ManualClock clock;
    support::FakeLog log;
    ledger::Ledger ledger;
    ConfigurationWatcher watcher{temporary.path(), ProviderLog(log)};
    AnalyticsStore::Limits limits;

private:
    std::unique_ptr<AnalyticsStore> store_; // uses all others
};

TEST_F(AnalyticsStoreTest, StampsAnEventWithTheTimeAtWhichItWasSent)
{
    Hold hold(store());
    clock.set(1'800'000'000.5);
    send(1);
    clock.set(1'900'000'000);
    hold.release();
    store().flush();
    EXPECT_EQ(StoreReader(file).texts("SELECT time FROM events WHERE name LIKE '%Start'"),
              std::vector<std::string>{"1800000000.5"});
}

TEST_F(AnalyticsStoreTest, BuildsThePayloadOnceAndWhenTheEventIsSent)
{
    int built = 0;
    const auto sender = std::this_thread::get_id();
    store().sendAnalyticsEventLazy(outsideTurn, {}, eventName, [&] {
        ++built;
        EXPECT_EQ(std::this_thread::get_id(), sender);
        return Dictionary{{"key", "value"}};
    });
    EXPECT_EQ(built, 1);
    store().flush();
    EXPECT_EQ(built, 1);
    EXPECT_EQ(StoreReader(file).text("SELECT payload FROM events"), "{\"key\":\"value\"}");
}

TEST_F(AnalyticsStoreTest, TheDatabaseIsThereBeforeTheFirstEvent)
{
    store();
    closeStore();
    EXPECT_EQ(storedEvents(), 0);
}

TEST_F(AnalyticsStoreTest, DestroyingTheStoreKeepsWhatWasSent)
{
    for (int number = 0; number < 1000; ++number)
        send(number);
    closeStore();
    EXPECT_EQ(storedEvents(), 1000);
}

TEST_F(AnalyticsStoreTest, AnEventOutsideATurnIsKeptWithoutAnybodyAsking)
{
    send(1);
    const auto deadline = std::chrono::steady_clock::now() + 20s;
    while (kept() == 0 && std::chrono::steady_clock::now() < deadline)
        std::this_thread::yield();
    EXPECT_EQ(storedEvents(), 1);
}

TEST_F(AnalyticsStoreTest, AnEventOutsideATurnHasItsSourceBeforeTheTurnThatAnnouncesItEnds)
{
    const SourceBegin player{.number = 7, .userIdentifier = 1000, .processIdentifier = 77, .processName = "player"};
    Turn turn;
    turn.events.announce(player);
    store().sendAnalyticsEventLazy(outsideTurn, player, eventName, [] { return Dictionary(); });
    store().flush();
    EXPECT_EQ(StoreReader(file).text("SELECT e.name || ' ' || s.name FROM events e JOIN sources s ON s.id = e.source"),
              "com.quarn.kesto.Playback.Start player");
    store().endTurn(turn, nullptr);
    closeStore();
    EXPECT_EQ(StoreReader(file).text("SELECT count(*) FROM sources"), "1");
}

// Keeps the first events only when it may go on.
class SlowKeeper final : public support::MemoryKeeper {
public:
    using MemoryKeeper::MemoryKeeper;
    void keep(EventBatch& events, ledger::Tally& tally) override
    {
        if (events.size() != 0 && !std::exchange(wasSlow_, true)) {
            isKeeping.set_value();
            goesOn.get_future().wait();
        }
        MemoryKeeper::keep(events, tally);
    }
    std::promise<void> isKeeping;
    std::promise<void> goesOn;

private:
    bool wasSlow_ = false;
};

TEST_F(AnalyticsStoreTest, CountsTheEventsThatItGivesUp)
{
    auto slow = std::make_unique<SlowKeeper>(std::make_shared<support::KeptEvents>(), clock);
    SlowKeeper& keeper = *slow;
    AnalyticsStore tested(std::move(slow), watcher, clock, ledger, ProviderLog(log), limits);
    const auto sendOne = [&] {
        tested.sendAnalyticsEventLazy(outsideTurn, {}, eventName, [] { return Dictionary(); });
    };
    EXPECT_EQ(tested.giveUp(), 0U);
    sendOne();
    keeper.isKeeping.get_future().wait();
    sendOne();
    sendOne();
    EXPECT_EQ(tested.waitingEvents(), 3U);
    EXPECT_EQ(tested.giveUp(), 3U) << "one is being kept, and two wait";
    EXPECT_EQ(ledger.account()[Counter::Events], 3U);
    EXPECT_EQ(ledger.account()[Counter::LostToEnd], 3U);
    keeper.goesOn.set_value();
    tested.flush();
    EXPECT_EQ(tested.waitingEvents(), 0U);
    EXPECT_EQ(tested.giveUp(), 0U);
}

TEST_F(AnalyticsStoreTest, ChargesWhatItGivesUpAlsoToThoseWhoCameSinceItsThreadHangs)
{
    auto slow = std::make_unique<SlowKeeper>(std::make_shared<support::KeptEvents>(), clock);
    SlowKeeper& keeper = *slow;
    AnalyticsStore tested(std::move(slow), watcher, clock, ledger, ProviderLog(log), limits);
    const auto sendFrom = [&](const SourceBegin& source) {
        tested.sendAnalyticsEventLazy(outsideTurn, source, eventName, [] { return Dictionary(); });
    };
    const auto sendInTurn = [&](const SourceBegin& source) {
        Turn turn;
        turn.events.announce(source);
        tested.sendAnalyticsEventLazy(turn, {.source = source.number, .session = 0}, eventName,
                                      [] { return Dictionary(); });
        tested.endTurn(turn, nullptr);
    };
    const SourceBegin player{.number = 7, .userIdentifier = 1000, .processName = "player"};
    sendFrom(player);
    keeper.isKeeping.get_future().wait();
    sendFrom(player);
    sendInTurn({.number = 8, .userIdentifier = 1000, .processName = "recorder"});
    sendFrom({});
    EXPECT_EQ(tested.giveUp(), 4U) << "one of them of no known source";
    keeper.goesOn.set_value();
    const auto lost = ledger.account().culprits[static_cast<std::size_t>(ledger::Charge::Lost)];
    ASSERT_EQ(lost.size(), 2U);
    EXPECT_EQ(lost[0].culprit, (ledger::Culprit{.user = 1000, .process = "player", .application = {}}));
    EXPECT_EQ(lost[0].count, 2U) << "one is being kept, and one waits";
    EXPECT_EQ(lost[1].culprit, (ledger::Culprit{.user = 1000, .process = "recorder", .application = {}}));
    EXPECT_EQ(lost[1].count, 1U);
}

TEST_F(AnalyticsStoreTest, ForgetsWhoEndedLongAgo)
{
    auto slow = std::make_unique<SlowKeeper>(std::make_shared<support::KeptEvents>(), clock);
    SlowKeeper& keeper = *slow;
    AnalyticsStore tested(std::move(slow), watcher, clock, ledger, ProviderLog(log), limits);
    Turn turn;
    for (std::uint64_t source = 1; source <= 1025; ++source) {
        turn.events.announce(SourceBegin{.number = source, .userIdentifier = 1000, .processName = "player"});
        turn.events.announceSourceEnd({.number = source, .time = 2});
    }
    tested.endTurn(turn, nullptr);
    tested.flush();
    for (const std::uint64_t source : {1U, 2U})
        tested.sendAnalyticsEventLazy(turn, {.source = source, .session = 0}, eventName, [] { return Dictionary(); });
    tested.endTurn(turn, nullptr);
    keeper.isKeeping.get_future().wait();
    EXPECT_EQ(tested.giveUp(), 2U);
    keeper.goesOn.set_value();
    const auto lost = ledger.account().culprits[static_cast<std::size_t>(ledger::Charge::Lost)];
    ASSERT_EQ(lost.size(), 1U) << "of the second, which is still remembered";
    EXPECT_EQ(lost[0].count, 1U);
}

TEST_F(AnalyticsStoreTest, ReportsItsLossesWithoutItsThread)
{
    const auto loseAnEvent = [this] {
        store().sendAnalyticsEventLazy(outsideTurn, {}, eventName,
                                       [] { return Dictionary{{"n", std::numeric_limits<double>::quiet_NaN()}}; });
        store().flush();
    };
    loseAnEvent();
    ASSERT_THAT(log.take(), testing::SizeIs(1)) << "the first loss is reported at once";
    loseAnEvent();
    EXPECT_THAT(log.take(), IsEmpty());
    const Hold hold(store());
    store().reportLosses();
    EXPECT_THAT(log.take(),
                ElementsAre(Field(&support::LogLine::message, HasSubstr("1 analytics events were lost (2 since"))));
}

// --- Turns

TEST_F(AnalyticsStoreTest, ATurnIsKeptBeforeItIsAcknowledged)
{
    for (std::int64_t turn = 1; turn <= 50; ++turn) {
        std::promise<std::int64_t> stored;
        runTurn([&](Turn& running) { sendIn(running, turn); }, [&] { stored.set_value(storedEvents()); });
        ASSERT_EQ(stored.get_future().get(), turn);
    }
}

TEST_F(AnalyticsStoreTest, WhatATurnSentIsNotWrittenBeforeItsEnd)
{
    store().flush();
    runTurn(
        [&](Turn& turn) {
            sendIn(turn, 1);
            sendIn(turn, 2);
            // Meanwhile another thread sends something.
            std::thread([&] {
                send(3, "com.quarn.other");
                while (kept() == 0)
                    std::this_thread::yield();
            }).join();
            EXPECT_EQ(StoreReader(file).texts("SELECT name FROM events"), std::vector<std::string>{"com.quarn.other"});
        },
        {});
    store().flush();
    EXPECT_EQ(storedEvents(), 3);
}

TEST_F(AnalyticsStoreTest, ATurnThatSentNothingIsAcknowledgedHereAndNow)
{
    std::thread::id acknowledgedOn;
    Turn turn;
    store().endTurn(turn, [&] { acknowledgedOn = std::this_thread::get_id(); });
    EXPECT_EQ(acknowledgedOn, std::this_thread::get_id());
}

TEST_F(AnalyticsStoreTest, ATurnThatSentNothingDoesNotOvertakeOneThatDid)
{
    std::vector<int> order;
    std::promise<void> last;
    Turn turn;
    {
        Hold hold(store());
        sendIn(turn, 1);
        store().endTurn(turn, [&] { order.push_back(1); });
        store().endTurn(turn, [&] { order.push_back(2); });
        sendIn(turn, 2);
        store().endTurn(turn, [&] { order.push_back(3); });
        store().endTurn(turn, [&] {
            order.push_back(4);
            last.set_value();
        });
        EXPECT_THAT(order, IsEmpty());
    }
    last.get_future().wait();
    EXPECT_THAT(order, ElementsAre(1, 2, 3, 4));
}

TEST_F(AnalyticsStoreTest, ATurnThatNobodyWaitsForIsKeptToo)
{
    runTurn([&](Turn& turn) { sendIn(turn, 1); }, {});
    store().flush();
    EXPECT_EQ(storedEvents(), 1);
}

TEST_F(AnalyticsStoreTest, TurnsThatGatherDuringACommitAreOneTransaction)
{
    // A reader sees all of the events or none.
    Hold hold(store());
    Turn turn;
    for (int number = 0; number < 10; ++number) {
        sendIn(turn, number);
        store().endTurn(turn, [this] { EXPECT_EQ(storedEvents(), 11); });
    }
    EXPECT_EQ(storedEvents(), 1);
    hold.release();
    store().flush();
}

TEST_F(AnalyticsStoreTest, ManyTurnsAndManyOtherThreadsLoseNothingAndKeepTheirOrder)
{
    constexpr int turns = 500;
    constexpr int others = 3;
    std::atomic<int> acknowledged = 0;
    store();
    {
        LinuxWorkQueues queues;
        queues.setTurnEndHandler([&](Turn& turn) {
            store().endTurn(turn, [&, expected = kept()] {
                EXPECT_GE(kept(), expected);
                ++acknowledged;
            });
        });
        const auto queue = queues.makeTurnQueue("com.quarn.kesto.test", {});
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < others; ++thread)
            threads.emplace_back([this, thread] {
                const std::string name = fmt::format("com.quarn.thread{}", thread);
                for (int number = 0; number < turns; ++number)
                    send(number, name.c_str());
            });
        for (int turn = 0; turn < turns; ++turn)
            queue->submit([this, turn](Turn& running) {
                sendIn(running, 2 * turn);
                sendIn(running, 2 * turn + 1);
            });
    }
    store().flush();
    EXPECT_GT(acknowledged, 0);
    StoreReader reader(file);
    EXPECT_EQ(reader.eventCount(), (2 + others) * turns);
    // The order of each sender.
    EXPECT_EQ(
        reader.number("SELECT count(*) FROM (SELECT payload ->> 'n' AS n, lag(payload ->> 'n') OVER (PARTITION BY "
                      "name ORDER BY id) AS before FROM events) WHERE before >= n"),
        0);
}

TEST_F(AnalyticsStoreTest, FlushMayBeCalledFromAnyThread)
{
    store();
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([this] {
            for (int number = 0; number < 20; ++number) {
                const std::uint64_t before = kept();
                send(number);
                store().flush();
                EXPECT_GT(kept(), before);
            }
        });
}

// --- The backlog

TEST_F(AnalyticsStoreTest, TooManyEventsMakeTheSenderWaitUntilThereIsRoom)
{
    limits = {.mostEvents = 10, .mostBytes = 1 << 20};
    std::atomic<int> sent = 0;
    std::jthread sender;
    {
        Hold hold(store());
        sender = std::jthread([&] {
            for (; sent < 100; ++sent)
                send(sent);
        });
        while (sent < 9)
            std::this_thread::yield();
        EXPECT_LE(sent, 10);
    }
    sender.join();
    store().flush();
    EXPECT_EQ(storedEvents(), 101);
}

TEST_F(AnalyticsStoreTest, FillsUpWhenHalfOfTheRoomIsTaken)
{
    limits = {.mostEvents = 10, .mostBytes = 1 << 20};
    {
        Hold hold(store());
        for (int number = 0; number < 5; ++number)
            send(number);
        EXPECT_FALSE(store().isFillingUp());
        send(5);
        EXPECT_TRUE(store().isFillingUp());
    }
    store().flush();
    EXPECT_FALSE(store().isFillingUp());
}

TEST_F(AnalyticsStoreTest, TooManyBytesMakeTheEndOfATurnWait)
{
    limits = {.mostEvents = 1000, .mostBytes = 100'000};
    std::promise<void> ended;
    std::jthread sender;
    {
        Hold hold(store());
        sender = std::jthread([&] {
            runTurn(
                [&](Turn& turn) {
                    store().sendAnalyticsEventLazy(turn, {}, eventName,
                                                   [] { return Dictionary{{"text", std::string(99'000, 'x')}}; });
                    store().sendAnalyticsEventLazy(turn, {}, eventName,
                                                   [] { return Dictionary{{"text", std::string(99'000, 'y')}}; });
                },
                {});
            ended.set_value();
        });
        auto waiting = ended.get_future();
        EXPECT_EQ(waiting.wait_for(50ms), std::future_status::timeout);
    }
    sender.join();
    store().flush();
    EXPECT_EQ(storedEvents(), 3);
}

TEST_F(AnalyticsStoreTest, APayloadThatTwoEventsShareCountsOnce)
{
    limits = {.mostEvents = 1000, .mostBytes = 100'000};
    Hold hold(store());
    const Dictionary payload{{"text", std::string(60'000, 'x')}};
    send(1);
    for (int number = 0; number < 2; ++number) // if both counted, the second would wait for ever
        store().sendAnalyticsEventLazy(outsideTurn, {}, eventName, [&] { return payload; });
}

TEST_F(AnalyticsStoreTest, ATurnLargerThanTheBacklogIsKeptWhole)
{
    limits = {.mostEvents = 10, .mostBytes = 1 << 20};
    std::promise<std::int64_t> stored;
    runTurn(
        [&](Turn& turn) {
            for (int number = 0; number < 1000; ++number)
                sendIn(turn, number);
        },
        [&] { stored.set_value(storedEvents()); });
    EXPECT_EQ(stored.get_future().get(), 1000);
}

TEST_F(AnalyticsStoreTest, EndsWhileItWaitsForAQuietMoment)
{
    sendALongLog();
    closeStore();
    EXPECT_EQ(storedEvents(), 120);
}

TEST_F(AnalyticsStoreTest, ALongLogIsMovedToTheDatabaseOnceItIsQuiet)
{
    constexpr std::uintmax_t megabyte = 1024 * 1024;
    int logs = 0;
    for (; logs < 2 && (logs == 0 || fs::file_size(file) < 8 * megabyte); ++logs) { // three would not wait for quiet
        sendALongLog(); // a busy machine may have been quiet in the middle of the first
        for (int tries = 0; tries < 1000 && fs::file_size(file) < 8 * megabyte; ++tries)
            std::this_thread::sleep_for(10ms);
    }
    EXPECT_GT(fs::file_size(file), 8 * megabyte);
    EXPECT_EQ(storedEvents(), 120 * logs);
}

// --- The death of the service

TEST_F(AnalyticsStoreTest, KillingTheServiceLosesNothingThatWasAcknowledged)
{
    for (int round = 0; round < 5; ++round) {
        int channel[2] = {};
        ASSERT_EQ(::pipe(channel), 0);
        const fs::path directory = temporary.path() / std::to_string(round);
        fs::create_directory(directory);
        const pid_t service = ::fork();
        if (service == 0) {
            ledger::Ledger childsLedger;
            ConfigurationWatcher childsWatcher(directory, ProviderLog(log));
            AnalyticsStore childsStore(std::make_unique<SqliteKeeper>(directory, clock, ProviderLog(log)),
                                       childsWatcher, clock, childsLedger, ProviderLog(log));
            Turn turn;
            for (std::int64_t number = 1;; ++number) {
                childsStore.sendAnalyticsEventLazy(turn, {}, eventName, [number] { return Dictionary{{"n", number}}; });
                childsStore.endTurn(turn, [number, &channel] {
                    if (::write(channel[1], &number, sizeof number) != sizeof number)
                        ::_exit(1);
                });
            }
        }
        ::close(channel[1]);
        std::int64_t acknowledged = 0;
        while (acknowledged < 50 * (round + 1))
            ASSERT_EQ(::read(channel[0], &acknowledged, sizeof acknowledged),
                      static_cast<ssize_t>(sizeof acknowledged));
        ::kill(service, SIGKILL);
        while (::read(channel[0], &acknowledged, sizeof acknowledged) == static_cast<ssize_t>(sizeof acknowledged)) { }
        ::waitpid(service, nullptr, 0);
        ::close(channel[0]);

        StoreReader reader(directory / "analytics.sqlite3");
        EXPECT_GE(reader.number("SELECT max(payload ->> 'n') FROM events"), acknowledged);
        EXPECT_EQ(reader.number("SELECT max(id) - count(*) FROM events"), 0);
        EXPECT_EQ(reader.text("PRAGMA integrity_check"), "ok");
    }
}

// --- Configuration

template <typename Condition> bool becomesTrue(Condition condition)
{
    const auto deadline = std::chrono::steady_clock::now() + 20s;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline)
            return false;
        std::this_thread::yield();
    }
    return true;
}

TEST_F(AnalyticsStoreTest, TheServicesOwnEventsAreUsedUnlessSaidOtherwise)
{
    EXPECT_TRUE(store().isAnalyticsEventUsed("com.quarn.kesto.Playback.Start"));
    EXPECT_TRUE(store().isAnalyticsEventUsed("com.quarn.telephony.IO.Error"));
    EXPECT_FALSE(store().isAnalyticsEventUsed("org.example.other"));
}

TEST_F(AnalyticsStoreTest, WhichEventsAreUsedMayChangeWhileTheServiceRuns)
{
    EXPECT_TRUE(store().isAnalyticsEventUsed(eventName));
    support::replaceFile(temporary.path() / "analytics.toml", "used = [\"com.quarn.telephony.*\"]");
    EXPECT_TRUE(becomesTrue([&] { return !store().isAnalyticsEventUsed(eventName); }));
    EXPECT_TRUE(store().isAnalyticsEventUsed("com.quarn.telephony.IO.Error"));
    support::replaceFile(temporary.path() / "analytics.toml", "used = []");
    EXPECT_TRUE(becomesTrue([&] { return !store().isAnalyticsEventUsed("com.quarn.telephony.IO.Error"); }));
    fs::remove(temporary.path() / "analytics.toml");
    EXPECT_TRUE(becomesTrue([&] { return store().isAnalyticsEventUsed(eventName); }));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(AnalyticsStoreTest, ABrokenConfigurationLeavesTheLastInForce)
{
    support::writeFile(temporary.path() / "analytics.toml", "used = [\"a.*\"]");
    EXPECT_TRUE(store().isAnalyticsEventUsed("a.x"));
    support::replaceFile(temporary.path() / "analytics.toml", "used = [");
    EXPECT_TRUE(becomesTrue([&] { return !log.lines().empty(); }));
    EXPECT_TRUE(store().isAnalyticsEventUsed("a.x"));
    EXPECT_FALSE(store().isAnalyticsEventUsed(eventName));
}

TEST_F(AnalyticsStoreTest, AWrongValueIsToldWithItsFile)
{
    support::writeFile(temporary.path() / "analytics.toml", "maximum_age_days = -1");
    store().flush();
    EXPECT_THAT(log.take(),
                ElementsAre(support::IsLine(LogLevel::Error, "kerl",
                                            (temporary.path() / "analytics.toml").string()
                                                + ": maximum_age_days = -1 should be a number of days above 0; the "
                                                  "default counts until this is corrected")));
}

TEST_F(AnalyticsStoreTest, NewBoundsAreAppliedWithoutAnotherEvent)
{
    clock.set(100 * 86400);
    send(1);
    store().flush();
    clock.advance(50 * 86400);
    support::writeFile(temporary.path() / "analytics.toml", "maximum_age_days = 10");
    EXPECT_TRUE(becomesTrue([&] { return storedEvents() == 0; }));
}

// --- The ledger

TEST_F(AnalyticsStoreTest, CountsWhatBecameOfEachEvent)
{
    support::writeFile(temporary.path() / "analytics.toml", "used = [\"com.quarn.kesto.*\"]\n");
    Turn turn;
    sendIn(turn, 1);
    sendIn(turn, 2);
    store().sendAnalyticsEventLazy(turn, {}, "com.quarn.other", [] { return Dictionary(); });
    store().sendAnalyticsEventLazy(turn, {}, eventName,
                                   [] { return Dictionary{{"n", std::numeric_limits<double>::infinity()}}; });
    turn.tally.add(Counter::Deliveries, 4);
    turn.tally.add(Counter::Recorded, 4);
    EXPECT_EQ(ledger.account()[Counter::Events], 0U) << "the turn has not ended";
    store().endTurn(turn, nullptr);
    EXPECT_TRUE(turn.tally.empty());
    send(3);
    send(4, "com.quarn.other");
    store().flush();
    const auto account = ledger.account();
    EXPECT_EQ(account[Counter::Events], 6U);
    EXPECT_EQ(account[Counter::Kept], 3U);
    EXPECT_EQ(account[Counter::Unwanted], 2U);
    EXPECT_EQ(account[Counter::LostNotJson], 1U);
    EXPECT_EQ(account[Counter::Deliveries], 4U);
    EXPECT_EQ(account[Counter::Recorded], 4U);
    EXPECT_EQ(account.store.events, 3U);
}

TEST_F(AnalyticsStoreTest, CountsATurnWithoutEventsToo)
{
    store().flush();
    Turn turn;
    turn.tally.add(Counter::Deliveries);
    turn.tally.add(Counter::Inert);
    store().endTurn(turn, nullptr);
    EXPECT_EQ(ledger.account()[Counter::Deliveries], 1U);
    EXPECT_EQ(ledger.account()[Counter::Inert], 1U);
}

TEST_F(AnalyticsStoreTest, WhatIsAcknowledgedIsCounted)
{
    for (std::uint64_t turn = 1; turn <= 50; ++turn) {
        std::promise<std::uint64_t> counted;
        runTurn([&](Turn& running) { sendIn(running, 1); }, [&] { counted.set_value(kept()); });
        ASSERT_EQ(counted.get_future().get(), turn);
    }
}

TEST_F(AnalyticsStoreTest, ALargeTurnThatIsWrittenInPartsIsCountedInWholeParts)
{
    limits.mostEvents = 10;
    Turn turn;
    for (int number = 1; number <= 25; ++number)
        sendIn(turn, number);
    const auto account = ledger.account();
    EXPECT_EQ(account[Counter::Events], account[Counter::Kept]);
    store().endTurn(turn, nullptr);
    store().flush();
    EXPECT_EQ(ledger.account()[Counter::Events], 25U);
    EXPECT_EQ(ledger.account()[Counter::Kept], 25U);
}

// As after a kill between the commit and the posting, or when the ledger's file is gone.
TEST_F(AnalyticsStoreTest, EventsInTheDatabaseThatTheLedgerDoesNotKnowAreCountedAsKept)
{
    send(1);
    send(2);
    closeStore();
    ledger::Ledger fresh;
    AnalyticsStore second(std::make_unique<SqliteKeeper>(temporary.path(), clock, ProviderLog(log)), watcher, clock,
                          fresh, ProviderLog(log));
    second.sendAnalyticsEventLazy(outsideTurn, {}, eventName, [] { return Dictionary(); });
    second.flush();
    EXPECT_EQ(fresh.account()[Counter::Events], 3U);
    EXPECT_EQ(fresh.account()[Counter::Kept], 3U);
    EXPECT_EQ(fresh.account().stored(), 3U);
}

TEST_F(AnalyticsStoreTest, EventsThatVanishWithTheirDatabaseAreCountedAsRemovedByDamage)
{
    send(1);
    send(2);
    store().flush();
    fs::remove(file);
    send(3);
    store().flush();
    EXPECT_EQ(ledger.account()[Counter::Kept], 3U);
    EXPECT_EQ(ledger.account()[Counter::RemovedByDamage], 2U);
    EXPECT_EQ(ledger.account().stored(), 1U);
    EXPECT_EQ(storedEvents(), 1);
}

// Tidies in many small steps, and says when the last of them is done.
class SlowlyTidiedKeeper final : public support::MemoryKeeper {
public:
    SlowlyTidiedKeeper(const Clock& clock, std::promise<void>& done)
        : MemoryKeeper(std::make_shared<support::KeptEvents>(), clock),
          done_(done)
    {
    }

    bool tidy(bool, ledger::Tally&) override
    {
        if (--stepsLeft_ == 0)
            done_.set_value();
        return stepsLeft_ > 0;
    }

private:
    std::promise<void>& done_;
    int stepsLeft_ = 100;
};

TEST_F(AnalyticsStoreTest, TidiesToTheEndWhileItHasNothingElseToDo)
{
    std::promise<void> done;
    const AnalyticsStore idle(std::make_unique<SlowlyTidiedKeeper>(clock, done), watcher, clock, ledger,
                              ProviderLog(log));
    EXPECT_EQ(done.get_future().wait_for(20s), std::future_status::ready);
}

TEST_F(AnalyticsStoreTest, AnIdleStoreDoesNotWake)
{
    KESTO_SKIP_WHERE_THREADS_ARE_WATCHED();
    send(1);
    store().flush();
    const auto switches = [] { // of all threads of this process except this one
        std::uint64_t sum = 0;
        for (const auto& task : fs::directory_iterator("/proc/self/task"))
            if (const pid_t thread = std::stoi(task.path().filename()); thread != ::gettid())
                sum += support::timesAsleep(thread);
        return sum;
    };
    const auto staysAsleep = [&] {
        const std::uint64_t before = switches();
        ::usleep(500'000);
        return switches() == before;
    };
    EXPECT_TRUE(becomesTrue(staysAsleep)); // on a busy machine a thread may be long in coming to its rest
    EXPECT_TRUE(staysAsleep());
}

} // namespace
} // namespace platform
