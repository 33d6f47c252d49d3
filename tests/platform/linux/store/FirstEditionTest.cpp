// SPDX-License-Identifier: Apache-2.0
// Databases of the first edition: new events are kept at once, and the old ones move into the new tables with nothing
// lost and nothing twice, even if the service is killed at any point in between.
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <csignal>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace platform {
namespace {

using foundation::Dictionary;
using support::StoreReader;
using testing::ElementsAre;
using testing::IsEmpty;

namespace fs = std::filesystem;

class FirstEditionTest : public testing::Test {
protected:
    // Makes a database as the first edition left it, with what the statements put into it.
    void makeFirstEdition(const std::string& statements) const
    {
        sqlite3* connection = nullptr;
        ASSERT_EQ(::sqlite3_open(file.c_str(), &connection), SQLITE_OK);
        const std::string sql =
            "PRAGMA page_size = 4096; PRAGMA auto_vacuum = INCREMENTAL; PRAGMA journal_mode = WAL; BEGIN;"
            "CREATE TABLE events(id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL NOT NULL, name TEXT NOT NULL, "
            "payload TEXT NOT NULL) STRICT; PRAGMA user_version = 1; "
            + statements + "; COMMIT";
        ASSERT_EQ(::sqlite3_exec(connection, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK)
            << ::sqlite3_errmsg(connection);
        ::sqlite3_close(connection);
    }
    // So many messages, each as two events; every hundredth ID is missing.
    void makeLargeFirstEdition(int messages) const
    {
        makeFirstEdition(
            fmt::format("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < {}) "
                        "INSERT INTO events SELECT i, 1700000000 + i / 2, iif(i % 2, 'a', 'b'), "
                        "json_object('n', (i + 1) / 2, 'text', '{}') FROM n; DELETE FROM events WHERE id % 100 = 0",
                        2 * messages, std::string(200, 'x')));
    }
    std::unique_ptr<SqliteKeeper> makeKeeper()
    {
        auto keeper = std::make_unique<SqliteKeeper>(temporary.path(), clock, ProviderLog(log));
        keeper->setConfiguration({.maximumAgeDays = 36'500, .maximumSizeMegabytes = 1024});
        keeper->open();
        return keeper;
    }
    void keep(SqliteKeeper& keeper, double time, const Dictionary& payload)
    {
        EventBatch batch;
        batch.add(time, "a", payload);
        batch.add(time, "b", payload);
        keeper.keep(batch, tally);
    }
    void moveAll(SqliteKeeper& keeper)
    {
        while (keeper.tidy(true, tally)) { }
    }
    std::vector<std::string> events() const
    {
        return StoreReader(file).texts("SELECT id || ' ' || time || ' ' || name || payload FROM events ORDER BY id");
    }
    bool isMoved() const
    {
        return StoreReader(file).number("SELECT count(*) FROM sqlite_schema WHERE name = 'first_edition'") == 0;
    }

    support::TemporaryDirectory temporary;
    const fs::path file = temporary.path() / "analytics.sqlite3";
    support::ManualClock clock;
    support::FakeLog log;
    ledger::Tally tally;
};

constexpr const char* fourEvents = "INSERT INTO events VALUES"
                                   " (3, 1.5, 'com.quarn.kesto.x', '{\"n\":1}'),"
                                   " (4, 1.50001, 'com.quarn.media.x', '{\"n\":1}'),"
                                   " (6, 2, 'com.quarn.kesto.y', '{\"kestoreporting_timestamp\":1.25}'),"
                                   " (7, 3, 'com.quarn.kesto.y', '{\"kestoreporting_timestamp\":\"text\"}')";

TEST_F(FirstEditionTest, ItsEventsAreThereAtOnceAndStayWithTheirNumbers)
{
    makeFirstEdition(fourEvents);
    const auto keeper = makeKeeper();
    EXPECT_THAT(events(),
                ElementsAre("3 1.5 com.quarn.kesto.x{\"n\":1}", "4 1.50001 com.quarn.media.x{\"n\":1}",
                            "6 2.0 com.quarn.kesto.y{\"kestoreporting_timestamp\":1.25}",
                            "7 3.0 com.quarn.kesto.y{\"kestoreporting_timestamp\":\"text\"}"));
    moveAll(*keeper);
    EXPECT_TRUE(isMoved());
    EXPECT_THAT(events(),
                ElementsAre("3 1.5 com.quarn.kesto.x{\"n\":1}", "4 1.5 com.quarn.media.x{\"n\":1}",
                            "6 2.0 com.quarn.kesto.y{\"kestoreporting_timestamp\":1.25}",
                            "7 3.0 com.quarn.kesto.y{\"kestoreporting_timestamp\":\"text\"}"));
    StoreReader reader(file);
    EXPECT_EQ(reader.number("SELECT count(*) FROM messages"), 3) << "two events were one message";
    EXPECT_THAT(reader.texts("SELECT happened FROM events ORDER BY id"), ElementsAre("NULL", "NULL", "1.25", "NULL"));
    EXPECT_EQ(reader.number("PRAGMA user_version"), 2);
    EXPECT_EQ(reader.text("PRAGMA integrity_check"), "ok");
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(FirstEditionTest, NewEventsAreKeptBeforeTheOldOnesHaveMoved)
{
    makeLargeFirstEdition(20'000);
    const auto keeper = makeKeeper();
    keep(*keeper, 1'800'000'000, {{"n", 20'001}});
    StoreReader reader(file);
    EXPECT_EQ(tally[ledger::Counter::Kept], 2U);
    EXPECT_EQ(reader.number("SELECT count(*) FROM first_edition"), 39'600) << "nothing has moved";
    EXPECT_THAT(reader.texts("SELECT id || name FROM events WHERE payload ->> 'n' = 20001 ORDER BY id"),
                ElementsAre("40001a", "40002b"));
    EXPECT_EQ(reader.eventCount(), 39'602);
}

TEST_F(FirstEditionTest, EachStepMovesAFew)
{
    makeLargeFirstEdition(20'000);
    const auto keeper = makeKeeper();
    std::int64_t before = 39'600;
    for (int step = 0; step < 10; ++step) {
        ASSERT_TRUE(keeper->tidy(false, tally));
        StoreReader reader(file);
        const std::int64_t left = reader.number("SELECT count(*) FROM first_edition");
        EXPECT_LT(left, before);
        EXPECT_LE(before - left, 1024);
        EXPECT_EQ(reader.eventCount(), 39'600);
        before = left;
    }
}

TEST_F(FirstEditionTest, LargeEventsMoveOneMegabyteAtATime)
{
    makeFirstEdition("WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 40) "
                     "INSERT INTO events SELECT i, 1700000000, 'a', json_object('n', i, 'text', "
                     "hex(zeroblob(250000))) FROM n");
    const auto keeper = makeKeeper();
    ASSERT_TRUE(keeper->tidy(false, tally));
    const std::int64_t left = StoreReader(file).number("SELECT count(*) FROM first_edition");
    EXPECT_LT(left, 40);
    EXPECT_GE(left, 36);
    moveAll(*keeper);
    EXPECT_EQ(StoreReader(file).number("SELECT count(DISTINCT payload) FROM events"), 40);
}

TEST_F(FirstEditionTest, ItsEventsCountAsKeptAndThoseThatAreMissingAsRemoved)
{
    makeLargeFirstEdition(5000);
    const auto keeper = makeKeeper();
    keep(*keeper, 1'800'000'000, {{"n", 5001}});
    moveAll(*keeper);
    StoreReader reader(file);
    EXPECT_EQ(reader.number("SELECT kept FROM store"), 10'002);
    EXPECT_EQ(reader.number("SELECT removed FROM store"), 100);
    EXPECT_EQ(keeper->state()->events, 9902U);
    EXPECT_EQ(tally[ledger::Counter::RemovedForAge], 100U);
    EXPECT_EQ(reader.eventCount(), 9902);
    EXPECT_EQ(reader.number("SELECT count(*) FROM messages"), 5001);
}

TEST_F(FirstEditionTest, WithoutEventsOnlyItsLastNumberIsRemembered)
{
    makeFirstEdition(std::string(fourEvents) + "; DELETE FROM events");
    const auto keeper = makeKeeper();
    moveAll(*keeper);
    EXPECT_TRUE(isMoved());
    keep(*keeper, 1, {{"n", 1}});
    StoreReader reader(file);
    EXPECT_EQ(reader.number("SELECT min(id) FROM events"), 8);
    EXPECT_EQ(reader.number("SELECT kept - removed FROM store"), 2);
}

TEST_F(FirstEditionTest, ItsEventsAreAsOldAsTheirStampsSayWhereTheseMakeSense)
{
    constexpr double aDay = 86400;
    clock.set(100 * aDay);
    makeFirstEdition("INSERT INTO events VALUES (1, 9000 * 86400, 'future', '{}'), (2, 50 * 86400, 'old', '{}'), "
                     "(3, 0, '1970', '{}'), (4, 70 * 86400, 'young', '{}')");
    const auto keeper = makeKeeper();
    moveAll(*keeper);
    keeper->setConfiguration({.maximumAgeDays = 40, .maximumSizeMegabytes = 1024});
    moveAll(*keeper);
    EXPECT_THAT(StoreReader(file).texts("SELECT name FROM events ORDER BY id"), ElementsAre("old", "1970", "young"));
    keeper->setConfiguration({.maximumAgeDays = 29, .maximumSizeMegabytes = 1024});
    moveAll(*keeper);
    EXPECT_THAT(StoreReader(file).texts("SELECT name FROM events ORDER BY id"), ElementsAre("young"));
    clock.advance(aDay);
    keeper->setConfiguration({.maximumAgeDays = 30, .maximumSizeMegabytes = 1024});
    moveAll(*keeper);
    EXPECT_EQ(StoreReader(file).eventCount(), 1) << "what came last counts as kept when it was opened";
}

// The child is killed after a number of steps, in the middle of whatever it does then.
TEST_F(FirstEditionTest, KillingTheServiceInTheMiddleLosesNothingAndDoublesNothing)
{
    makeLargeFirstEdition(10'000);
    constexpr int rounds = 25;
    for (int round = 0; round < rounds; ++round) {
        int channel[2] = {};
        ASSERT_EQ(::pipe(channel), 0);
        const pid_t service = ::fork();
        if (service == 0) {
            const auto keeper = makeKeeper();
            while (true) {
                const bool hasMore = keeper->tidy(false, tally);
                const char done = hasMore ? 'm' : 'e';
                if (::write(channel[1], &done, 1) != 1)
                    ::_exit(1);
                if (!hasMore)
                    ::pause();
            }
        }
        ::close(channel[1]);
        char done = 0;
        ASSERT_EQ(::read(channel[0], &done, 1), 1);
        ::usleep(static_cast<useconds_t>(round * 97)); // somewhere in the next steps
        ::kill(service, SIGKILL);
        ::waitpid(service, nullptr, 0);
        ::close(channel[0]);
        StoreReader reader(file);
        ASSERT_EQ(reader.eventCount(), 19'800) << "round " << round;
        ASSERT_EQ(reader.number("SELECT count(DISTINCT id) FROM events"), 19'800);
    }
    const auto keeper = makeKeeper();
    moveAll(*keeper);
    StoreReader reader(file);
    EXPECT_TRUE(isMoved());
    EXPECT_EQ(reader.eventCount(), 19'800);
    EXPECT_EQ(reader.number("SELECT sum(payload ->> 'n') FROM events"), 99'005'000);
    EXPECT_EQ(reader.number("SELECT kept - removed FROM store"), 19'800);
    EXPECT_EQ(reader.text("PRAGMA integrity_check"), "ok");
}

} // namespace
} // namespace platform
