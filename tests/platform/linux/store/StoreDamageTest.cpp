// SPDX-License-Identifier: Apache-2.0
// Databases that are overwritten, truncated, replaced or removed, while the service runs and while it does not: what
// can be read is saved, what cannot is counted, and nothing that is acknowledged afterwards is lost.
#include "platform/linux/store/AnalyticsStore.h"

#include "platform/linux/damage/DatabaseDamage.h"
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <atomic>
#include <chrono>
#include <csignal>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <sqlite3.h>
#include <sys/wait.h>
#include <thread>
#include <tuple>
#include <unistd.h>

namespace platform {
namespace {

using foundation::Dictionary;
using ledger::Counter;
using support::LogLine;
using support::StoreReader;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

namespace fs = std::filesystem;
using namespace std::chrono_literals;

constexpr std::uint64_t pageSize = 8192;

class StoreDamageTest : public testing::Test {
protected:
    AnalyticsStore& store()
    {
        if (!store_)
            store_ = std::make_unique<AnalyticsStore>(
                std::make_unique<SqliteKeeper>(directory.path(), clock, ProviderLog(log)), watcher, clock, ledger,
                ProviderLog(log));
        return *store_;
    }
    void close() { store_.reset(); }
    // The events are acknowledged when this returns.
    void keep(std::size_t count, const char* name = "com.quarn.kept")
    {
        for (std::size_t number = 0; number < count; ++number)
            store().sendAnalyticsEventLazy(outsideTurn, {}, name,
                                           [] { return Dictionary{{"text", std::string(300, 'x')}}; });
        store().flush();
        acknowledged += count;
    }
    // Ends the service with everything in the database and nothing in the log.
    void keepAndClose(std::size_t count)
    {
        keep(count);
        close();
    }
    // Leaves a database that was damaged with so many events, and of which a part was saved.
    void beginToSave(std::size_t events)
    {
        keepAndClose(events);
        support::overwrite(file, 0, std::string(pageSize, 'x'));
        SqliteKeeper keeper(directory.path(), clock, ProviderLog(log));
        ledger::Tally tally;
        keeper.open();
        ASSERT_TRUE(keeper.tidy(true, tally));
    }
    void keepAndSettle(std::size_t count)
    {
        keep(count);
        settle();
    }
    template <typename Condition> static void waitFor(Condition condition)
    {
        const auto deadline = std::chrono::steady_clock::now() + 60s; // a check has the lowest priority
        while (!condition() && std::chrono::steady_clock::now() < deadline)
            std::this_thread::sleep_for(1ms);
        EXPECT_TRUE(condition());
    }
    // Until nothing is copied any more, and the sums of the ledger hold.
    void settle()
    {
        waitFor([this] { return isSettled(); });
    }
    // Whether a check has ended at that time.
    [[nodiscard]] bool hasStamp(double time) const
    {
        return support::readFile(file.string() + "-checked") == fmt::format("{:.0f}\n", time);
    }
    // A day later the next event makes the check due. One more is kept after what the check leads to.
    void passADay()
    {
        clock.advance(86400);
        keep(1, "com.quarn.next-day");
        waitFor([this] { return hasStamp(clock.secondsSince1970()) || !filesNamed(".corrupt-").empty(); });
        keep(1, "com.quarn.next-day");
        settle();
    }
    // Closes the service, so that everything is counted.
    void expectSumsToHold(const std::string& what)
    {
        close();
        const auto account = ledger.account();
        EXPECT_EQ(account[Counter::Kept], acknowledged) << what;
        EXPECT_EQ(account[Counter::Kept],
                  static_cast<std::uint64_t>(storedEvents()) + account[Counter::RemovedByDamage])
            << what;
        EXPECT_EQ(account[Counter::Events], account[Counter::Kept] + account[Counter::Unwanted]) << what;
        EXPECT_EQ(StoreReader(file).text("PRAGMA integrity_check"), "ok") << what;
    }
    [[nodiscard]] std::int64_t storedEvents() const { return StoreReader(file).eventCount(); }
    [[nodiscard]] std::int64_t storedEvents(const char* name) const
    {
        return StoreReader(file).number(fmt::format("SELECT count(*) FROM events WHERE name = '{}'", name));
    }
    // Each event with the epoch that its ID belongs to.
    [[nodiscard]] std::vector<std::string> eventsOfEpochs() const
    {
        return StoreReader(file).texts("SELECT coalesce((SELECT epoch FROM earlier_epochs WHERE below > e.id"
                                       " ORDER BY below LIMIT 1), (SELECT epoch FROM store)) || ':' || id"
                                       " FROM events e ORDER BY 1");
    }
    [[nodiscard]] std::string epoch() const { return StoreReader(file).text("SELECT epoch FROM store"); }
    [[nodiscard]] std::uint64_t lostToDamage() const { return ledger.account()[Counter::RemovedByDamage]; }
    [[nodiscard]] std::vector<std::string> filesNamed(std::string_view part) const
    {
        std::vector<std::string> names = support::namesIn(directory.path());
        std::erase_if(names, [&](const std::string& name) { return name.find(part) == std::string::npos; });
        return names;
    }
    const support::TemporaryDirectory directory;
    const fs::path file = directory / "analytics.sqlite3";
    support::ManualClock clock;
    support::FakeLog log;
    ConfigurationWatcher watcher{directory.path(), ProviderLog(log)};
    ledger::Ledger ledger;
    std::uint64_t acknowledged = 0;

private:
    bool isSettled()
    {
        if (!filesNamed("-unsaved").empty())
            return false;
        const auto account = ledger.account();
        try {
            return account.stored() == static_cast<std::uint64_t>(storedEvents());
        } catch (const std::runtime_error&) {
            return false; // the database is just being exchanged
        }
    }

    std::unique_ptr<AnalyticsStore> store_;
};

TEST_F(StoreDamageTest, AHealthyDatabaseIsLeftAlone)
{
    keepAndClose(1000);
    keep(100);
    passADay();
    EXPECT_EQ(storedEvents(), 1102);
    EXPECT_EQ(lostToDamage(), 0U);
    EXPECT_THAT(filesNamed(".corrupt-"), IsEmpty());
    EXPECT_THAT(log.lines(), IsEmpty());
}

// --- Random pages

constexpr unsigned seeds = 100;

// Overwrites 1 to 8 of some 90 pages.
void damagePages(const fs::path& file, unsigned seed)
{
    std::mt19937 random(seed);
    support::overwriteRandomPages(file, 1 + seed % 8, random, pageSize);
}

// What a seed leaves of 1000 events, in a directory of its own.
class OfASeed : public StoreDamageTest {
public:
    void TestBody() override { }
    std::int64_t savedIfStopped(unsigned seed)
    {
        keepAndClose(1000);
        damagePages(file, seed);
        passADay();
        EXPECT_THAT(filesNamed(".corrupt-"), Not(IsEmpty())) << seed;
        return saved(seed);
    }
    std::int64_t savedIfRunning(unsigned seed)
    {
        keep(1000);
        waitFor([this] { return hasStamp(1'800'000'000); }); // no check is due while the pages are damaged
        close();
        keep(10, "com.quarn.before");
        damagePages(file, seed);
        keep(100, "com.quarn.after");
        passADay();
        EXPECT_EQ(storedEvents("com.quarn.after"), 100) << seed;
        return saved(seed);
    }

    // Opening the database needs some pages, and not others.
    void expectNothingLostThatComesAfter(std::uint64_t damagedPage)
    {
        keepAndClose(100);
        support::overwrite(file, (damagedPage - 1) * pageSize, std::string(pageSize, '\xFF'));
        keep(10, "com.quarn.after");
        passADay();
        expectSumsToHold(fmt::format("page {}", damagedPage));
        EXPECT_EQ(storedEvents("com.quarn.after"), 10) << damagedPage;
    }

private:
    std::int64_t saved(unsigned seed)
    {
        expectSumsToHold(fmt::format("seed {}", seed));
        EXPECT_EQ(storedEvents("com.quarn.next-day"), 2) << seed;
        return StoreReader(file).number("SELECT count(*) FROM events WHERE name IN ('com.quarn.kept', 'unknown')");
    }
};

TEST(RandomPages, OfAStoppedServiceCostOnlyTheirEvents)
{
    std::int64_t saved = 0;
    for (unsigned seed = 1; seed <= seeds; ++seed)
        saved += OfASeed().savedIfStopped(seed);
    EXPECT_EQ(saved, 93'696); // of 100,000
}

TEST(RandomPages, OfARunningServiceCostOnlyTheirEvents)
{
    std::int64_t saved = 0;
    for (unsigned seed = 1; seed <= seeds; ++seed)
        saved += OfASeed().savedIfRunning(seed);
    EXPECT_GE(saved, 92'600) << "of 100,000; how much is still in the log, where damage does no harm, depends on time";
}

TEST(RandomPages, WhicheverItIsNothingIsLostThatComesAfter)
{
    for (std::uint64_t page = 1; page <= 25; ++page)
        OfASeed().expectNothingLostThatComesAfter(page);
}

// --- Other damage

TEST_F(StoreDamageTest, ATruncatedDatabaseKeepsTheEventsOfItsPages)
{
    keepAndClose(1000);
    fs::resize_file(file, 44 * pageSize + 1000);
    keep(10, "com.quarn.after");
    settle();
    expectSumsToHold("truncated while stopped");
    EXPECT_EQ(storedEvents("com.quarn.kept"), 576);
    EXPECT_EQ(storedEvents("com.quarn.after"), 10);
    EXPECT_EQ(ledger.account()[Counter::Salvaged], 576U);
    EXPECT_EQ(lostToDamage(), 424U);
}

TEST_F(StoreDamageTest, ADatabaseThatIsTruncatedUnderTheServiceKeepsTheEventsOfItsPages)
{
    keepAndClose(1000);
    keep(1);
    fs::resize_file(file, 44 * pageSize + 1000);
    keep(10, "com.quarn.after");
    passADay();
    expectSumsToHold("truncated while running");
    EXPECT_GE(storedEvents("com.quarn.kept"), 576);
    EXPECT_EQ(storedEvents("com.quarn.after"), 10);
}

TEST_F(StoreDamageTest, ADatabaseThatIsEmptiedHasLostItsEventsAndTheLedgerSaysSo)
{
    keepAndClose(1000);
    support::writeFile(file, "");
    keep(10, "com.quarn.after");
    settle();
    expectSumsToHold("emptied");
    EXPECT_EQ(lostToDamage(), 1000U);
    EXPECT_THAT(log.take(),
                ElementsAre(Field(&LogLine::message,
                                  "1000 analytics events are gone: they were in a database that was damaged, removed "
                                  "or replaced; look for errors of the disk in the kernel's log")));
}

TEST_F(StoreDamageTest, ADatabaseThatIsRemovedUnderTheServiceCostsNothingThatComesAfter)
{
    keepAndClose(1000);
    keep(1);
    fs::remove(file);
    keep(10, "com.quarn.after");
    settle();
    expectSumsToHold("removed");
    EXPECT_EQ(storedEvents("com.quarn.after"), 10);
    EXPECT_EQ(lostToDamage(), 1001U);
}

// Removes the database when a connection runs a statement with these words for the first time.
class RemovalAtStatement {
public:
    RemovalAtStatement(fs::path file, std::string_view words) : file_(std::move(file)), words_(words)
    {
        present = this;
        ::sqlite3_auto_extension(reinterpret_cast<void (*)()>(watch));
    }
    ~RemovalAtStatement()
    {
        ::sqlite3_cancel_auto_extension(reinterpret_cast<void (*)()>(watch));
        present = nullptr;
    }
    RemovalAtStatement(const RemovalAtStatement&) = delete;
    RemovalAtStatement& operator=(const RemovalAtStatement&) = delete;

    [[nodiscard]] bool hasHappened() const { return hasHappened_; }

private:
    static int watch(sqlite3* connection) { return ::sqlite3_trace_v2(connection, SQLITE_TRACE_STMT, see, nullptr); }
    static int see(unsigned, void*, void*, void* text)
    {
        if (present != nullptr && !present->hasHappened_
            && std::string_view(static_cast<const char*>(text)).contains(present->words_)) {
            present->hasHappened_ = true;
            fs::remove(present->file_);
        }
        return 0;
    }

    static inline RemovalAtStatement* present = nullptr;
    const fs::path file_;
    const std::string_view words_;
    std::atomic<bool> hasHappened_ = false;
};

TEST_F(StoreDamageTest, ADatabaseThatIsRemovedWhileItIsMadeOrOpenedCostsNothingThatComesAfter)
{
    for (const char* words : {"CREATE TABLE messages", "journal_mode", "UPDATE store"}) {
        const RemovalAtStatement removal(file, words);
        keep(10);
        EXPECT_TRUE(removal.hasHappened()) << words;
        keep(10);
        EXPECT_EQ(ledger.account().sum(ledger::Charge::Lost), 0U) << words;
        expectSumsToHold(words);
    }
}

TEST_F(StoreDamageTest, ADatabaseThatIsReplacedUnderTheServiceCostsNothingThatComesAfter)
{
    keepAndClose(300);
    fs::copy_file(file, directory / "copy");
    keepAndClose(700);
    keep(5);
    fs::rename(directory / "copy", file); // the log stays, which belongs to the other database
    keep(10, "com.quarn.after");
    settle();
    expectSumsToHold("replaced");
    EXPECT_EQ(storedEvents("com.quarn.kept"), 300);
    EXPECT_EQ(storedEvents("com.quarn.after"), 10);
    EXPECT_EQ(lostToDamage(), 705U);
}

TEST_F(StoreDamageTest, ALogThatIsRemovedUnderTheServiceCostsNothing)
{
    for (const char* suffix : {"-wal", "-shm"}) {
        keepAndClose(100);
        keep(5);
        fs::remove(file.string() + suffix);
        keep(10, "com.quarn.after");
        EXPECT_THAT(log.take(),
                    ElementsAre(Field(&LogLine::message, HasSubstr("or its index was removed or replaced"))));
        keepAndClose(1);
        expectSumsToHold(suffix);
        EXPECT_EQ(lostToDamage(), 0U);
        EXPECT_THAT(log.take(), IsEmpty());
    }
    EXPECT_EQ(storedEvents(), 232);
}

TEST_F(StoreDamageTest, ALogThatIsReplacedUnderTheServiceCostsNothingAndIsNotRead)
{
    keepAndClose(100);
    keep(5);
    fs::copy_file(file.string() + "-wal", directory / "old-log");
    keep(5);
    fs::rename(directory / "old-log", file.string() + "-wal");
    keep(10, "com.quarn.after");
    close();
    expectSumsToHold("replaced log");
    EXPECT_EQ(storedEvents(), 120);
}

TEST_F(StoreDamageTest, ALogThatIsRemovedWhileAReaderNeedsItIsReplacedLater)
{
    keepAndClose(100);
    keep(5);
    {
        StoreReader reader(file);
        reader.execute("BEGIN");
        EXPECT_EQ(reader.eventCount(), 105);
        fs::remove(file.string() + "-wal");
        clock.advance(86400); // without its log, a check would find the database damaged
        for (int number = 0; number < 30; ++number)
            keep(1, "com.quarn.after");
    }
    keep(1);
    expectSumsToHold("removed log");
    EXPECT_EQ(storedEvents(), 136);
    EXPECT_THAT(filesNamed(".corrupt-"), IsEmpty());
    EXPECT_EQ(lostToDamage(), 0U);
}

TEST_F(StoreDamageTest, ANumberThatNoEventCanHaveIsNotSaved)
{
    keepAndClose(10);
    {
        support::Writer writer(file);
        writer.execute(
            "INSERT INTO messages(id, time, kind, holder, payload) VALUES (9223372036854775800, 1, 1, 1, '{}')");
    }
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    keep(1, "com.quarn.after");
    settle();
    EXPECT_EQ(storedEvents("com.quarn.kept"), 10);
    EXPECT_EQ(storedEvents("com.quarn.after"), 1);
}

// As when only some pages of a copy are old.
TEST_F(StoreDamageTest, ADatabaseWhoseRowsContradictEachOtherIsDamaged)
{
    keepAndClose(1000);
    support::Writer(file).execute("UPDATE store SET next_event = 990, kept = 989");
    keep(20, "com.quarn.after");
    settle();
    expectSumsToHold("contradiction");
    EXPECT_EQ(storedEvents("com.quarn.kept"), 1000);
    EXPECT_EQ(storedEvents("com.quarn.after"), 20);
}

TEST_F(StoreDamageTest, CountsThatTheRowsContradictAreNotBelievedBeforeTheFirstEventEither)
{
    keepAndClose(1000);
    support::Writer(file).execute("UPDATE store SET next_event = 990, kept = 989");
    store();
    waitFor([this] { return !filesNamed(".corrupt-").empty(); });
    settle();
    EXPECT_EQ(ledger.account()[Counter::Kept], 1000U);
    EXPECT_EQ(ledger.account()[Counter::RemovedByDamage], 0U);
    expectSumsToHold("contradiction");
}

TEST_F(StoreDamageTest, EventsOfTheFirstEditionAreSavedAndMoved)
{
    {
        support::Writer writer(file);
        writer.execute("PRAGMA page_size = 4096; PRAGMA auto_vacuum = INCREMENTAL;"
                       "CREATE TABLE events(id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL NOT NULL, name TEXT NOT "
                       "NULL, payload TEXT NOT NULL) STRICT; PRAGMA user_version = 1");
        writer.execute("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 5000) "
                       "INSERT INTO events SELECT i, 1700000000, 'com.quarn.old', '{\"n\":' || i || '}' FROM n");
    }
    support::overwrite(file, 0, std::string(pageSize, 'x')); // also the table's root
    keep(1, "com.quarn.after");
    waitFor([this] {
        return filesNamed("-unsaved").empty()
            && StoreReader(file).number("SELECT count(*) FROM sqlite_schema WHERE name = 'first_edition'") == 0;
    });
    close();
    EXPECT_EQ(storedEvents("com.quarn.old"), 5000);
    EXPECT_EQ(StoreReader(file).text("SELECT id FROM events WHERE name = 'com.quarn.after'"), "5002");
    EXPECT_EQ(ledger.account().stored(), 5001U);
    EXPECT_EQ(StoreReader(file).text("PRAGMA integrity_check"), "ok");
}

TEST_F(StoreDamageTest, MessagesWhoseNamesAreLostAreKeptAsUnknownAndNewNamesAreNotTakenForThem)
{
    keepAndClose(1000);
    std::mt19937 random(1);
    const auto root = [this](const char* table) {
        return static_cast<std::uint64_t>(
            StoreReader(file).number(fmt::format("SELECT rootpage FROM sqlite_schema WHERE name = '{}'", table)));
    };
    for (const std::uint64_t page : {root("kinds"), root("holders"), root("store")})
        support::overwritePage(file, page, random, pageSize);
    keep(1, "com.quarn.after");
    settle();
    expectSumsToHold("without names");
    EXPECT_EQ(storedEvents("unknown"), 1000);
    EXPECT_EQ(storedEvents("com.quarn.after"), 1);
    EXPECT_EQ(StoreReader(file).number("SELECT max(id) > 1000 FROM events"), 1);
    EXPECT_EQ(StoreReader(file).number("SELECT count(*) FROM messages WHERE holder NOT IN (SELECT id FROM holders)"),
              0);
    EXPECT_EQ(StoreReader(file).texts("SELECT name FROM kinds ORDER BY name"),
              (std::vector<std::string>{"com.quarn.after", "unknown"}));
    EXPECT_EQ(StoreReader(file).texts("SELECT process FROM holders ORDER BY process").size(), 2U);
}

// --- When and how

TEST_F(StoreDamageTest, AnEndThatIsNotCleanIsFollowedByACheck)
{
    keep(1000);
    waitFor([this] { return hasStamp(1'800'000'000); });
    // What a killed service leaves.
    for (const char* suffix : {"", "-wal", "-shm", "-checked"})
        fs::copy_file(file.string() + suffix, directory / (std::string("copy") + suffix));
    close();
    for (const char* suffix : {"", "-wal", "-shm", "-checked"})
        fs::rename(directory / (std::string("copy") + suffix), file.string() + suffix);
    clock.advance(10);
    keep(1);
    waitFor([this] { return hasStamp(1'800'000'010); });
    EXPECT_EQ(lostToDamage(), 0U);
}

TEST_F(StoreDamageTest, AnEndInOrderLeavesAnEmptyLogAlsoIfNothingIsClosed)
{
    const auto logAfter = [this](bool isInOrder) {
        const pid_t child = ::fork();
        if (child == 0) {
            AnalyticsStore ending(std::make_unique<SqliteKeeper>(directory.path(), clock, ProviderLog(log)), watcher,
                                  clock, ledger, ProviderLog(log));
            ending.sendAnalyticsEventLazy(outsideTurn, {}, "com.quarn.kept", [] { return Dictionary(); });
            isInOrder ? ending.finish() : ending.flush();
            std::_Exit(0);
        }
        int status = 0;
        EXPECT_EQ(::waitpid(child, &status, 0), child);
        return fs::file_size(file.string() + "-wal");
    };
    EXPECT_GT(logAfter(false), 0U);
    EXPECT_EQ(logAfter(true), 0U);
    EXPECT_EQ(storedEvents(), 2);
}

TEST_F(StoreDamageTest, SavedEventsKeepTheirNumbersAndTimesAndNewOnesGetHigherNumbers)
{
    keepAndClose(1000);
    clock.advance(100);
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    keep(1, "com.quarn.after");
    settle();
    StoreReader reader(file);
    EXPECT_EQ(reader.text("SELECT min(id) || ' ' || max(id) || ' ' || min(time) || ' ' || max(time) FROM events "
                          "WHERE name = 'com.quarn.kept'"),
              "1 1000 1800000000.0 1800000000.0");
    EXPECT_EQ(reader.text("SELECT id || ' ' || time FROM events WHERE name = 'com.quarn.after'"), "1001 1800000100.0");
}

// Who read on from a cursor may have passed events that came back behind it.
TEST_F(StoreDamageTest, ARepairEndsWithANewEpochAndSaysWhichEpochEachEventHadBefore)
{
    keepAndClose(2000);
    const std::string first = epoch();
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    SqliteKeeper keeper(directory.path(), clock, ProviderLog(log));
    ledger::Tally tally;
    keeper.open();
    const std::string during = epoch();
    EXPECT_NE(during, first);
    EventBatch batch;
    batch.add(1, "com.quarn.after", Dictionary());
    keeper.keep(batch, tally);
    EXPECT_EQ(epoch(), during);
    while (keeper.tidy(true, tally)) { }
    const std::string afterwards = epoch();
    EXPECT_NE(afterwards, first);
    EXPECT_NE(afterwards, during);
    keeper.keep(batch, tally);
    EXPECT_EQ(epoch(), afterwards);
    EXPECT_THAT(StoreReader(file).texts("SELECT below || ' ' || epoch FROM earlier_epochs"),
                ElementsAre("2001 " + first, "2002 " + during));
    const auto events = eventsOfEpochs();
    EXPECT_THAT(events, testing::IsSupersetOf({first + ":1", first + ":2000", during + ":2001", afterwards + ":2002"}));
    EXPECT_THAT(events, testing::SizeIs(2002));
}

TEST_F(StoreDamageTest, SavedEventsKeepTheirAge)
{
    constexpr double aDay = 86400;
    keep(10, "com.quarn.old");
    clock.advance(60 * aDay); // of 90
    keep(10, "com.quarn.newer");
    close();
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    keep(1, "com.quarn.after");
    settle();
    EXPECT_EQ(storedEvents("com.quarn.old"), 10);
    clock.advance(40 * aDay);
    keep(1, "com.quarn.after");
    waitFor([this] { return storedEvents("com.quarn.old") == 0; });
    close();
    EXPECT_EQ(storedEvents("com.quarn.newer"), 10);
    EXPECT_EQ(storedEvents("com.quarn.after"), 2);
}

TEST_F(StoreDamageTest, AServiceThatIsKilledWhileItSavesGoesOnAtTheNextStart)
{
    keepAndClose(10'000);
    for (int steps = 0; steps < 12; ++steps) {
        const auto before = eventsOfEpochs();
        support::overwrite(file, 0, std::string(pageSize, 'x'));
        const pid_t child = ::fork();
        if (child == 0) {
            SqliteKeeper keeper(directory.path(), clock, ProviderLog(log));
            ledger::Tally tally;
            keeper.open();
            for (int step = 0; step < steps; ++step)
                if (!keeper.tidy(true, tally) || keeper.state())
                    ::_exit(1);
            ::raise(SIGKILL);
        }
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        ASSERT_TRUE(WIFSIGNALED(status)) << steps;
        if (steps > 0) {
            EXPECT_GT(storedEvents(), 0);
        }
        EXPECT_LT(storedEvents(), 10'000);
        keepAndSettle(1);
        close();
        expectSumsToHold(fmt::format("{} steps", steps));
        EXPECT_EQ(storedEvents(), 10'001 + steps);
        EXPECT_EQ(lostToDamage(), 0U);
        EXPECT_TRUE(std::ranges::includes(eventsOfEpochs(), before)) << "who has one already knows it again";
        clock.advance(1);
    }
    EXPECT_EQ(StoreReader(file).number("SELECT max(id) - min(id) + 1 - count(*) FROM events"), 0);
}

TEST_F(StoreDamageTest, ALogThatGoesWithTheServiceCostsNothingThatWasSaved)
{
    keepAndClose(10'000);
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    const pid_t child = ::fork();
    if (child == 0) {
        SqliteKeeper keeper(directory.path(), clock, ProviderLog(log));
        ledger::Tally tally;
        keeper.open();
        StoreReader reader(file); // as long as it is connected, closing does not empty the log
        std::ignore = reader.eventCount();
        while (!keeper.state())
            std::ignore = keeper.tidy(true, tally);
        ::raise(SIGKILL);
    }
    ASSERT_EQ(::waitpid(child, nullptr, 0), child);
    EXPECT_THAT(filesNamed("-unsaved"), IsEmpty());
    fs::remove(file.string() + "-wal");
    keep(1);
    expectSumsToHold("without a log");
    EXPECT_EQ(storedEvents(), 10'001);
}

class UnfinishedSavingTest : public StoreDamageTest, public testing::WithParamInterface<bool> { };

TEST_P(UnfinishedSavingTest, CountsWhatItHas)
{
    beginToSave(10'000);
    for (const std::string& mark : filesNamed("-unsaved")) // by hand, or because the database is an old copy
        fs::remove(directory / mark);
    if (GetParam())
        support::Writer(file).execute("DROP VIEW events; DROP TABLE first_edition");
    keep(1, "com.quarn.after");
    expectSumsToHold("without its mark");
    EXPECT_GT(storedEvents("com.quarn.kept"), 0);
    EXPECT_EQ(storedEvents("com.quarn.after"), 1);
    EXPECT_EQ(lostToDamage(), 10'000U - static_cast<std::uint64_t>(storedEvents("com.quarn.kept")));
}

INSTANTIATE_TEST_SUITE_P(Steps, UnfinishedSavingTest, testing::Bool(),
                         [](const auto& test) { return test.param ? "WithoutTheLastStep" : "WithoutTheLastSteps"; });

TEST_F(StoreDamageTest, NewEventsAreKeptBeforeTheOldOnesAreSaved)
{
    keepAndClose(20'000);
    support::overwrite(file, 0, std::string(pageSize, 'x'));
    SqliteKeeper keeper(directory.path(), clock, ProviderLog(log));
    ledger::Tally tally;
    keeper.open();
    EventBatch batch;
    batch.add(1, "com.quarn.after", Dictionary());
    keeper.keep(batch, tally);
    EXPECT_EQ(storedEvents("com.quarn.after"), 1);
    EXPECT_EQ(storedEvents("com.quarn.kept"), 0);
    while (keeper.tidy(true, tally)) { }
    EXPECT_EQ(storedEvents("com.quarn.kept"), 20'000);
}

TEST_F(StoreDamageTest, ADatabaseThatIsDamagedWhileItIsSavedIntoIsSavedToo)
{
    beginToSave(20'000);
    support::overwrite(file, 0, std::string(pageSize, 'y'));
    keep(1, "com.quarn.after");
    settle();
    expectSumsToHold("damaged twice");
    EXPECT_EQ(storedEvents("com.quarn.kept"), 20'000);
}

} // namespace
} // namespace platform
