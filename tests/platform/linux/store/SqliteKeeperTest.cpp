// SPDX-License-Identifier: Apache-2.0
// The database on disks that are full, read-only or damaged, beside readers and other writers, and within its limits:
// events may be lost, but are counted, and the service goes on.
#include "platform/linux/store/SqliteKeeper.h"

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/StoreReader.h"
#include "support/AnotherProcess.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {
std::atomic<int> synchronizations; // with the disk, of this process
}

// SQLite calls this function in place of the C library's.
extern "C" int fdatasync(int file)
{
    ++synchronizations;
    return static_cast<int>(::syscall(SYS_fdatasync, file));
}

namespace platform {
namespace {

using foundation::Dictionary;
using support::LogLine;
using support::StoreReader;
using testing::AllOf;
using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;
using testing::UnorderedElementsAre;

namespace fs = std::filesystem;

constexpr std::uint64_t megabyte = 1024 * 1024;
constexpr double hour = 3600; // seconds
constexpr double day = 24 * hour;

struct PlainEvent {
    double time = 0;
    std::string name;
    Dictionary payload;
};

PlainEvent event(double time, std::string name = "com.quarn.kesto.Playback.Start", Dictionary payload = {{"key", 1}})
{
    return {time, std::move(name), std::move(payload)};
}

std::vector<PlainEvent> events(std::size_t count, std::size_t payloadSize = 300, double time = 1'800'000'000)
{
    const Dictionary payload{{"text", std::string(payloadSize, 'x')}};
    return std::vector<PlainEvent>(count, event(time, "com.quarn.kesto.Playback.Start", payload));
}

class SqliteKeeperTest : public testing::Test {
protected:
    // No check is due, which would read beside the tests' readers.
    SqliteKeeperTest() { support::writeFile(file().string() + "-checked", "1800000000"); }
    SqliteKeeper& keeper()
    {
        if (!keeper_) {
            keeper_ = std::make_unique<SqliteKeeper>(directory, clock, ProviderLog(log));
            keeper_->setConfiguration(configuration);
        }
        return *keeper_;
    }
    void closeWriter() { keeper_.reset(); }
    static void keepIn(SqliteKeeper& keeper, const std::vector<PlainEvent>& given, ledger::Tally& tally)
    {
        EventBatch batch;
        for (const auto& [time, name, payload] : given)
            batch.add(time, name, payload);
        keeper.keep(batch, tally);
    }
    // As a machine that lost power while the service ran.
    void noteRunOfTheMachine(const std::string& bootIdentifier) const
    {
        sqlite3* connection = nullptr;
        ASSERT_EQ(::sqlite3_open(file().c_str(), &connection), SQLITE_OK);
        const std::string sql = fmt::format("UPDATE open_run SET boot = '{}'", bootIdentifier);
        EXPECT_EQ(::sqlite3_exec(connection, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
        EXPECT_EQ(::sqlite3_changes(connection), 1);
        ::sqlite3_close(connection);
    }
    void keep(const std::vector<PlainEvent>& given) { keepIn(keeper(), given, tally); }
    void maintain(bool isQuiet = true)
    {
        while (keeper().tidy(isQuiet, tally)) { }
    }
    std::uint64_t logBytes() const { return fs::file_size(directory / "analytics.sqlite3-wal"); }
    [[nodiscard]] std::vector<std::string> filesNamed(std::string_view part) const
    {
        std::vector<std::string> names;
        for (const auto& file : fs::directory_iterator(directory))
            if (const std::string name = file.path().filename(); name.find(part) != std::string::npos)
                names.push_back(name);
        std::ranges::sort(names);
        return names;
    }
    std::uint64_t lost(StoreError reason) { return tally[counterOf(reason)]; }

    support::TemporaryDirectory temporary;
    fs::path directory = temporary.path();
    fs::path file() const { return directory / "analytics.sqlite3"; }
    support::ManualClock clock;
    support::FakeLog log;
    AnalyticsConfiguration configuration;
    ledger::Tally tally; // of all keepers

private:
    std::unique_ptr<SqliteKeeper> keeper_;
};

// --- The database

TEST_F(SqliteKeeperTest, TheSchemaIsTheOneThatIsPromised)
{
    keeper().open();
    StoreReader reader(file());
    EXPECT_THAT(reader.texts("SELECT name FROM pragma_table_info('events')"),
                ElementsAre("id", "time", "name", "payload", "session", "source", "happened"));
    EXPECT_EQ(reader.number("PRAGMA user_version"), 2);
    EXPECT_EQ(reader.text("PRAGMA journal_mode"), "wal");
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(SqliteKeeperTest, KeepsEventsInTheirOrder)
{
    keep({event(1'800'000'000.25, "a", {{"n", 1}, {"text", "x\"y\n"}}), event(1'700'000'000, "b", {})});
    keep({event(1'800'000'001, "c", {{"yes", true}, {"share", 0.6F}})});
    StoreReader reader(file());
    EXPECT_THAT(reader.texts("SELECT id || ' ' || time || ' ' || name || ' ' || payload FROM events ORDER BY id"),
                ElementsAre("1 1800000000.25 a {\"n\":1,\"text\":\"x\\\"y\\n\"}", "2 1700000000.0 b {}",
                            "3 1800000001.0 c {\"yes\":true,\"share\":0.6}"));
    EXPECT_EQ(tally[ledger::Counter::Kept], 3U);
}

TEST_F(SqliteKeeperTest, NumbersOfRowsOnEverySideOfTheStatementsSize)
{
    std::int64_t expected = 0;
    for (const std::size_t count : {1U, 15U, 16U, 17U, 31U, 32U, 33U, 100U}) {
        std::vector<PlainEvent> given;
        for (std::size_t number = 0; number < count; ++number)
            given.push_back(event(1, "a", {{"n", number}}));
        keep(given);
        expected += static_cast<std::int64_t>(count);
        StoreReader reader(file());
        ASSERT_EQ(reader.eventCount(), expected);
        ASSERT_EQ(reader.number(fmt::format("SELECT count(DISTINCT payload) FROM events WHERE id > {}",
                                            expected - static_cast<std::int64_t>(count))),
                  static_cast<std::int64_t>(count));
    }
}

TEST_F(SqliteKeeperTest, TwoEventsOfOnePayloadBothHaveIt)
{
    const Dictionary shared{{"n", 1}};
    keep({event(1, "a", shared), event(1, "b", shared), event(1, "c", {{"n", 2}}), event(1, "d", shared)});
    StoreReader reader(file());
    EXPECT_THAT(reader.texts("SELECT name || payload FROM events ORDER BY id"),
                ElementsAre("a{\"n\":1}", "b{\"n\":1}", "c{\"n\":2}", "d{\"n\":1}"));
}

TEST_F(SqliteKeeperTest, AMessageWithTwoNamesIsStoredOnce)
{
    const Dictionary first{{"n", 1}, {"kestoreporting_timestamp", 1'700'000'000.5}};
    const Dictionary second{{"n", 2}};
    keep({event(1, "a", first), event(2, "b", first), event(3, "a", second), event(3, "b", second), event(4, "c")});
    StoreReader reader(file());
    EXPECT_EQ(reader.number("SELECT count(*) FROM messages"), 3);
    EXPECT_THAT(reader.texts("SELECT id || ' ' || time || name || payload FROM events ORDER BY id"),
                ElementsAre("1 1.0a{\"n\":1,\"kestoreporting_timestamp\":1700000000.5}",
                            "2 1.0b{\"n\":1,\"kestoreporting_timestamp\":1700000000.5}", "3 3.0a{\"n\":2}",
                            "4 3.0b{\"n\":2}", "5 4.0c{\"key\":1}"));
    EXPECT_THAT(reader.texts("SELECT happened FROM events ORDER BY id"),
                ElementsAre("1700000000.5", "1700000000.5", "NULL", "NULL", "NULL"));
    EXPECT_EQ(tally[ledger::Counter::Kept], 5U);
}

TEST_F(SqliteKeeperTest, NamesAreStoredOnce)
{
    const Dictionary payload{{"n", 1}};
    for (int round = 0; round < 3; ++round) {
        for (int number = 0; number < 10; ++number)
            keep({event(1, "a", payload), event(1, "b", payload), event(1, "a"), event(1, "c")});
        closeWriter();
    }
    EXPECT_THAT(StoreReader(file()).texts("SELECT name || coalesce('+' || second_name, '') FROM kinds ORDER BY id"),
                ElementsAre("a+b", "a", "c"));
    EXPECT_EQ(StoreReader(file()).number("SELECT count(*) FROM events WHERE name = 'a'"), 60);
}

TEST_F(SqliteKeeperTest, WhatIsThereIsWhatWasKeptLessWhatWasRemoved)
{
    const auto counted = [this] { return StoreReader(file()).number("SELECT kept - removed FROM store"); };
    keeper().open();
    EXPECT_EQ(counted(), 0);
    configuration.maximumSizeMegabytes = 1;
    keeper().setConfiguration(configuration);
    const Dictionary both{{"text", std::string(300, 'x')}};
    for (int round = 0; round < 20; ++round) {
        std::vector<PlainEvent> given;
        for (int number = 0; number < 100; ++number)
            for (const char* name : {"a", "b"})
                given.push_back(event(1'800'000'000, name, both));
        keep(given);
        keep(events(150));
        maintain();
        ASSERT_EQ(counted(), StoreReader(file()).eventCount());
    }
    EXPECT_GT(StoreReader(file()).number("SELECT removed FROM store"), 1000);
    EXPECT_EQ(StoreReader(file()).number("SELECT kept FROM store"), 7000);
    EXPECT_EQ(StoreReader(file()).number("SELECT next_event FROM store"), 7001);
}

TEST_F(SqliteKeeperTest, ATransactionThatFailsCountsNothingAndUsesNoNumbers)
{
    keep({event(1, "a")});
    sqlite3* other = nullptr;
    ASSERT_EQ(::sqlite3_open(file().c_str(), &other), SQLITE_OK);
    ASSERT_EQ(::sqlite3_exec(other,
                             "CREATE TRIGGER refuse BEFORE INSERT ON messages WHEN NEW.time = 7"
                             " BEGIN SELECT RAISE(ABORT, 'no'); END",
                             nullptr, nullptr, nullptr),
              SQLITE_OK);
    keep({event(1, "b"), event(7, "c")});
    EXPECT_EQ(lost(StoreError::Other), 2U);
    ASSERT_EQ(::sqlite3_exec(other, "DROP TRIGGER refuse", nullptr, nullptr, nullptr), SQLITE_OK);
    ::sqlite3_close(other);
    log.take();
    clock.advance(SqliteKeeper::secondsBetweenOpenings);
    keep({event(1, "b"), event(7, "c")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT id || name FROM events ORDER BY id"), ElementsAre("1a", "2b", "3c"));
    EXPECT_EQ(StoreReader(file()).number("SELECT kept - removed FROM store"), 3);
}

TEST_F(SqliteKeeperTest, EachDatabaseHasAnEpochOfItsOwn)
{
    const auto epoch = [this] { return StoreReader(file()).text("SELECT epoch FROM store"); };
    keep({event(1)});
    const std::string first = epoch();
    EXPECT_THAT(first, testing::MatchesRegex("[0-9a-f]{32}"));
    closeWriter();
    keep({event(1)});
    EXPECT_EQ(epoch(), first);
    fs::remove(file());
    keep({event(1)});
    EXPECT_THAT(epoch(), testing::MatchesRegex("[0-9a-f]{32}"));
    EXPECT_NE(epoch(), first);
}

TEST_F(SqliteKeeperTest, QueriesOfTheViewUseAnIndex)
{
    keeper().open();
    StoreReader reader(file());
    const auto plan = [&](const std::string& sql) {
        std::string text;
        for (const std::string& step : reader.texts("EXPLAIN QUERY PLAN SELECT * FROM events " + sql, 3))
            text += step + '\n';
        return text;
    };
    const auto searches = [](const std::string& how) {
        return AllOf(HasSubstr(how), Not(HasSubstr("SCAN m\n")), Not(HasSubstr("SCAN messages")));
    };
    EXPECT_THAT(plan("WHERE name = 'a' AND time > 1"),
                searches("SEARCH m USING INDEX messages_by_kind (kind=? AND time>?)"));
    EXPECT_THAT(plan("WHERE time > 1"), searches("SEARCH m USING INDEX messages_by_kind (kind=? AND time>?)"));
    EXPECT_THAT(plan("WHERE id > 1 ORDER BY id LIMIT 5"),
                AllOf(searches("SEARCH m USING INTEGER PRIMARY KEY (rowid>?)"), Not(HasSubstr("TEMP B-TREE"))));
    EXPECT_THAT(plan("ORDER BY id DESC LIMIT 5"), Not(HasSubstr("TEMP B-TREE"))) << "it ends after five rows";
}

TEST_F(SqliteKeeperTest, NumbersAreNeverUsedTwice)
{
    keep({event(1), event(2)});
    configuration.maximumAgeDays = 1;
    keeper().setConfiguration(configuration);
    clock.advance(day);
    maintain();
    closeWriter();
    keep({event(3)});
    EXPECT_EQ(StoreReader(file()).text("SELECT id FROM events"), "3");
}

TEST_F(SqliteKeeperTest, SkipsTheNumbersThatALossOfPowerMayHaveTaken)
{
    keep({event(1), event(2)});
    closeWriter(); // as a kill does
    keep({event(3)});
    closeWriter();
    EXPECT_EQ(StoreReader(file()).text("SELECT max(id) FROM events"), "3") << "the machine ran on";
    noteRunOfTheMachine("00000000-0000-4000-8000-000000000001");
    keep({event(4)});
    closeWriter();
    EXPECT_EQ(StoreReader(file()).text("SELECT max(id) FROM events"), "1000000004");
    EXPECT_EQ(StoreReader(file()).text("SELECT next_source || ' ' || next_session FROM store"), "1000001 1000001");
    keep({event(5)});
    EXPECT_EQ(StoreReader(file()).text("SELECT max(id) FROM events"), "1000000005");
    EXPECT_EQ(StoreReader(file()).text("SELECT kept - removed FROM store"), "5");
}

TEST_F(SqliteKeeperTest, EventsBeforeALossOfPowerAreAsOldAsTheMachineWasOff)
{
    configuration.maximumAgeDays = 1;
    keep({event(1)});
    closeWriter();
    noteRunOfTheMachine("00000000-0000-4000-8000-000000000001");
    clock.advance(20 * hour);
    keep({event(2)});
    clock.advance(5 * hour);
    maintain();
    EXPECT_EQ(StoreReader(file()).text("SELECT group_concat(id) FROM events"), "1000000002");
}

TEST_F(SqliteKeeperTest, SkipsTheNumbersOfADiskThatHasForgotten)
{
    keep({event(1), event(2)});
    const fs::path copy = directory / "copy";
    StoreReader(file()).execute("VACUUM INTO '" + copy.native() + "'");
    keep({event(3), event(4)});
    fs::rename(copy, file());
    keep({event(5)});
    EXPECT_EQ(StoreReader(file()).text("SELECT group_concat(id) FROM events"), "1,2,1000000003");
}

TEST_F(SqliteKeeperTest, SkipsNumbersWhereTheKernelDoesNotNameItsRuns)
{
    keep({event(1)});
    closeWriter();
    noteRunOfTheMachine("");
    keep({event(2)});
    EXPECT_EQ(StoreReader(file()).text("SELECT max(id) FROM events"), "1000000002");
}

TEST_F(SqliteKeeperTest, SkipsNoNumbersAfterAnEndInOrder)
{
    keep({event(1)});
    keeper().prepareForEnd();
    closeWriter();
    EXPECT_EQ(StoreReader(file()).text("SELECT count(*) FROM open_run"), "0");
    keep({event(2)});
    EXPECT_EQ(StoreReader(file()).text("SELECT max(id) FROM events"), "2");
    EXPECT_EQ(StoreReader(file()).text("SELECT boot FROM open_run") + '\n',
              support::readFile("/proc/sys/kernel/random/boot_id"));
}

TEST_F(SqliteKeeperTest, TheNoteOfARunReachesTheDiskBeforeAnEvent)
{
    keeper().open();
    closeWriter();
    noteRunOfTheMachine("00000000-0000-4000-8000-000000000001");
    const int before = synchronizations;
    keeper().open();
    EXPECT_GT(synchronizations, before);
}

TEST_F(SqliteKeeperTest, GoesOnWithTheDatabaseThatIsThere)
{
    keep({event(1, "a")});
    closeWriter();
    keep({event(2, "b")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events ORDER BY id"), ElementsAre("a", "b"));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(SqliteKeeperTest, AnEmptyFileIsANewDatabase)
{
    support::writeFile(file(), "");
    keep({event(1)});
    EXPECT_EQ(StoreReader(file()).eventCount(), 1);
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(SqliteKeeperTest, WhatJsonCannotSayIsLostAndNothingElse)
{
    const double infinity = std::numeric_limits<double>::infinity();
    keep({event(1, "a"), event(1, "b", {{"n", infinity}}), event(1, "c", {{"n", foundation::Array{1, -infinity}}}),
          event(1, "d", {{"n", std::numeric_limits<float>::quiet_NaN()}}), event(1, "e")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name || payload FROM events ORDER BY id"),
                ElementsAre("a{\"key\":1}", "e{\"key\":1}"));
    EXPECT_EQ(lost(StoreError::NotJson), 3U);
    EXPECT_EQ(tally[ledger::Counter::Kept], 2U);
    EXPECT_THAT(log.take(),
                ElementsAre(support::IsLine(LogLevel::Error, "kerl",
                                            "3 analytics events were lost (3 since the start): " + file().string()
                                                + ": their payloads hold NaN or infinity, which JSON cannot express; "
                                                  "correct the programs that send them")));
}

TEST_F(SqliteKeeperTest, AnEventAfterOneThatIsNotJsonDoesNotGetItsPayload)
{
    const Dictionary bad{{"n", std::numeric_limits<double>::quiet_NaN()}};
    keep({event(1, "a", bad), event(1, "b", bad), event(1, "c", {{"n", 1}})});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name || payload FROM events"), ElementsAre("c{\"n\":1}"));
    EXPECT_EQ(lost(StoreError::NotJson), 2U);
}

TEST_F(SqliteKeeperTest, FullSynchronizationIsSetAndTakenBack)
{
    const auto synchronizationsOfACommit = [this] {
        keep({event(1)}); // the first commit of a log differs from the others
        const int before = synchronizations;
        keep({event(1)});
        return synchronizations - before;
    };
    EXPECT_EQ(synchronizationsOfACommit(), 0);
    configuration.synchronization = StoreSynchronization::Full;
    keeper().setConfiguration(configuration);
    EXPECT_EQ(synchronizationsOfACommit(), 1);
    closeWriter();
    EXPECT_EQ(synchronizationsOfACommit(), 1) << "from the beginning";
    configuration.synchronization = StoreSynchronization::Normal;
    keeper().setConfiguration(configuration);
    EXPECT_EQ(synchronizationsOfACommit(), 0);
}

TEST_F(SqliteKeeperTest, ALongPayloadIsKeptWhole)
{
    const std::string text(3'000'000, 'x');
    keep({event(1, "a", {{"text", text}}), event(2, "b")});
    EXPECT_EQ(StoreReader(file()).number("SELECT length(payload ->> 'text') FROM events WHERE id = 1"), 3'000'000);
}

// --- Who sent them

class OriginsTest : public SqliteKeeperTest {
protected:
    void begin(std::uint64_t source, std::string process = "player", std::uint32_t user = 1000)
    {
        batch.announce(SourceBegin{.number = source,
                                   .userIdentifier = user,
                                   .processIdentifier = 77,
                                   .processName = std::move(process),
                                   .time = 1'700'000'000.5});
    }
    void beginSession(std::uint64_t session, std::uint64_t source, std::string application = "org.example.a")
    {
        batch.announce(SessionBegin{.number = session,
                                    .source = source,
                                    .reporterID = 42,
                                    .serviceType = "media",
                                    .application = std::move(application),
                                    .time = 1'700'000'001.5});
    }
    void add(Origin origin, int number, const char* name = "a")
    {
        batch.add(1, origin, name, Dictionary{{"n", number}});
    }
    void keepBatch()
    {
        keeper().keep(batch, tally);
        batch.clear();
    }
    std::vector<std::string> events()
    {
        return StoreReader(file()).texts(
            "SELECT payload || ' ' || coalesce(session, '-') || ' ' || coalesce(source, '-') FROM events ORDER BY id");
    }
    std::vector<std::string> sources()
    {
        return StoreReader(file()).texts("SELECT id || ' ' || user || ' ' || process || ' ' || "
                                         "coalesce(name, '-') || ' ' || began || ' ' || coalesce(ended, '-') "
                                         "FROM sources ORDER BY id");
    }
    std::vector<std::string> sessions()
    {
        return StoreReader(file()).texts(
            "SELECT id || ' ' || coalesce(source, '-') || ' ' || reporter || ' ' || coalesce(service, '-') || ' ' || "
            "application || ' ' || began || ' ' || coalesce(ended, '-') FROM sessions ORDER BY id");
    }

    EventBatch batch;
};

TEST_F(OriginsTest, AnEventNamesItsSourceAndItsSession)
{
    begin(7);
    beginSession(9, 7);
    add({.source = 7, .session = 9}, 1);
    add({.source = 7, .session = 0}, 2);
    add({}, 3);
    keepBatch();
    EXPECT_THAT(events(), ElementsAre("{\"n\":1} 1 1", "{\"n\":2} - 1", "{\"n\":3} - -"));
    EXPECT_THAT(sources(), ElementsAre("1 1000 77 player 1700000000.5 -"));
    EXPECT_THAT(sessions(), ElementsAre("1 1 42 media org.example.a 1700000001.5 -"));
    const std::string boot = StoreReader(file()).text("SELECT boot FROM sources");
    EXPECT_EQ(boot + "\n", support::readFile("/proc/sys/kernel/random/boot_id"));
}

TEST_F(OriginsTest, WithoutAnEventThereIsNoRow)
{
    begin(7);
    beginSession(9, 7);
    keepBatch();
    batch.announceSessionEnd({.number = 9, .time = 2});
    batch.announceSourceEnd({.number = 7, .time = 2});
    keepBatch();
    keep({event(1)});
    EXPECT_THAT(sources(), IsEmpty());
    EXPECT_THAT(sessions(), IsEmpty());
}

TEST_F(OriginsTest, TheirEndsAreKeptAlsoWithoutAnotherEvent)
{
    begin(7);
    beginSession(9, 7);
    add({.source = 7, .session = 9}, 1);
    keepBatch();
    batch.announceSessionEnd({.number = 9, .time = 1'700'000'002});
    batch.announceSourceEnd({.number = 7, .time = 1'700'000'003});
    keepBatch();
    EXPECT_THAT(sources(), ElementsAre("1 1000 77 player 1700000000.5 1700000003.0"));
    EXPECT_THAT(sessions(), ElementsAre("1 1 42 media org.example.a 1700000001.5 1700000002.0"));
}

TEST_F(OriginsTest, AnEventThatComesAfterTheEndStillHasItsSource)
{
    begin(7, "");
    keepBatch();
    batch.announceSourceEnd({.number = 7, .time = 1'700'000'003});
    keepBatch();
    add({.source = 7, .session = 0}, 1, "com.quarn.kesto.kestoreportingclientuptime");
    keepBatch();
    EXPECT_THAT(events(), ElementsAre("{\"n\":1} - 1"));
    EXPECT_THAT(sources(), ElementsAre("1 1000 77 - 1700000000.5 1700000003.0"));
}

TEST_F(OriginsTest, ASessionThatChangesIsWrittenAgain)
{
    begin(7);
    beginSession(9, 7);
    add({.source = 7, .session = 9}, 1);
    keepBatch();
    beginSession(9, 7, "org.example.b");
    add({.source = 7, .session = 9}, 2);
    keepBatch();
    EXPECT_THAT(sessions(), ElementsAre("1 1 42 media org.example.b 1700000001.5 -"));
    EXPECT_THAT(events(), ElementsAre("{\"n\":1} 1 1", "{\"n\":2} 1 1"));
}

TEST_F(OriginsTest, AMessageToAnothersSessionHasItsOwnSource)
{
    begin(7);
    begin(8, "other");
    beginSession(9, 7);
    add({.source = 8, .session = 9}, 1);
    keepBatch();
    EXPECT_THAT(sources(), ElementsAre("1 1000 77 other 1700000000.5 -", "2 1000 77 player 1700000000.5 -"));
    EXPECT_THAT(sessions(), ElementsAre("1 2 42 media org.example.a 1700000001.5 -"));
    EXPECT_THAT(events(), ElementsAre("{\"n\":1} 1 1"));
}

TEST_F(OriginsTest, ANewDatabaseGetsThoseThatLive)
{
    begin(7);
    beginSession(9, 7);
    add({.source = 7, .session = 9}, 1);
    keepBatch();
    fs::remove(file());
    add({.source = 7, .session = 9}, 2);
    keepBatch();
    EXPECT_THAT(events(), ElementsAre("{\"n\":2} 1 1"));
    EXPECT_THAT(sources(), ElementsAre("1 1000 77 player 1700000000.5 -"));
    EXPECT_THAT(sessions(), ElementsAre("1 1 42 media org.example.a 1700000001.5 -"));
}

TEST_F(OriginsTest, WhatATransactionThatFailedWouldHaveWrittenIsWrittenWithTheNext)
{
    keep({event(1)});
    sqlite3* other = nullptr;
    ASSERT_EQ(::sqlite3_open(file().c_str(), &other), SQLITE_OK);
    ASSERT_EQ(::sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
    begin(7);
    beginSession(9, 7);
    add({.source = 7, .session = 9}, 1);
    keepBatch();
    EXPECT_EQ(lost(StoreError::Locked), 1U);
    ASSERT_EQ(::sqlite3_exec(other, "ROLLBACK", nullptr, nullptr, nullptr), SQLITE_OK);
    ::sqlite3_close(other);
    add({.source = 7, .session = 9}, 2);
    keepBatch();
    EXPECT_THAT(events(), ElementsAre("{\"key\":1} - -", "{\"n\":2} 1 1"));
    EXPECT_THAT(sources(), SizeIs(1));
    EXPECT_THAT(sessions(), SizeIs(1));
}

TEST_F(OriginsTest, AnotherRunOfTheServiceHasRowsOfItsOwn)
{
    for (int run = 0; run < 2; ++run) {
        begin(7);
        add({.source = 7, .session = 0}, run);
        keepBatch();
        closeWriter();
    }
    EXPECT_THAT(events(), ElementsAre("{\"n\":0} - 1", "{\"n\":1} - 2"));
    EXPECT_THAT(sources(), SizeIs(2));
}

TEST_F(OriginsTest, WhatIsTooOldIsChargedToWhoSentIt)
{
    configuration.maximumAgeDays = 10;
    begin(7);
    beginSession(9, 7);
    begin(8, "recorder", 1001);
    for (int number = 1; number <= 3; ++number)
        add({.source = 7, .session = 9}, number);
    add({.source = 8, .session = 0}, 4);
    add({}, 5);
    keepBatch();
    clock.advance(11 * day);
    maintain();
    EXPECT_EQ(tally[ledger::Counter::RemovedForAge], 5U);
    const auto isOf = [](const ledger::Culprit& culprit, std::uint64_t count) {
        using ledger::Tally;
        return AllOf(Field(&Tally::Charged::charge, ledger::Charge::Removed), Field(&Tally::Charged::culprit, culprit),
                     Field(&Tally::Charged::count, count));
    };
    EXPECT_THAT(tally.charged(),
                UnorderedElementsAre(isOf({.user = 1000, .process = "player", .application = "org.example.a"}, 3),
                                     isOf({.user = 1001, .process = "recorder", .application = ""}, 1)));
}

TEST_F(OriginsTest, ThoseThatEndedLongAgoAreForgotten)
{
    begin(7);
    keepBatch();
    batch.announceSourceEnd({.number = 7, .time = 2});
    for (std::uint64_t other = 100; other < 1124; ++other) {
        begin(other);
        batch.announceSourceEnd({.number = other, .time = 2});
    }
    keepBatch();
    add({.source = 7, .session = 0}, 1);
    add({.source = 1123, .session = 0}, 2);
    keepBatch();
    EXPECT_THAT(events(), ElementsAre("{\"n\":1} - -", "{\"n\":2} - 1"));
}

// --- Files that are not a database, damaged or newer

TEST_F(SqliteKeeperTest, AFileThatIsNoDatabaseIsSetAside)
{
    support::writeFile(file(), std::string(5000, 'x'));
    clock.set(1'800'000'000);
    keep({event(1)});
    EXPECT_EQ(StoreReader(file()).eventCount(), 1);
    const fs::path aside = file().string() + ".corrupt-20270115T080000Z";
    EXPECT_EQ(support::readFile(aside), std::string(5000, 'x'));
    EXPECT_THAT(log.take(),
                ElementsAre(support::IsLine(LogLevel::Error, "kerl",
                                            file().string() + " is damaged or not a database of events; it is now "
                                                + aside.string() + ", and a new one is begun")));
}

TEST_F(SqliteKeeperTest, ADatabaseOfSomethingElseIsSetAside)
{
    for (const char* sql :
         {"CREATE TABLE other(a)", "CREATE TABLE events(a); PRAGMA user_version = 1", "PRAGMA user_version = 1",
          "PRAGMA user_version = -3", "CREATE TABLE events(id, time, name, payload)", "PRAGMA user_version = 2",
          "CREATE TABLE store(a); PRAGMA user_version = 2"}) {
        closeWriter();
        fs::remove(file());
        sqlite3* connection = nullptr;
        ASSERT_EQ(::sqlite3_open(file().c_str(), &connection), SQLITE_OK);
        ASSERT_EQ(::sqlite3_exec(connection, sql, nullptr, nullptr, nullptr), SQLITE_OK);
        ::sqlite3_close(connection);
        clock.advance(1);
        keep({event(1)});
        EXPECT_EQ(StoreReader(file()).eventCount(), 1) << sql;
        EXPECT_THAT(log.take(), ElementsAre(Field(&LogLine::message, HasSubstr("not a database of events")))) << sql;
    }
}

TEST_F(SqliteKeeperTest, ADatabaseThatIsDamagedWhileItIsUsedIsSetAside)
{
    keep(events(5000));
    closeWriter();
    {
        // All pages except the first are damaged.
        std::fstream damaged(file(), std::ios::in | std::ios::out | std::ios::binary);
        const auto size = static_cast<std::streamsize>(fs::file_size(file()));
        damaged.seekp(8192);
        const std::string rubbish(static_cast<std::size_t>(size - 8192), '\x5a');
        damaged.write(rubbish.data(), static_cast<std::streamsize>(rubbish.size()));
    }
    keep({event(1, "after")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events"), ElementsAre("after"));
    EXPECT_EQ(tally[ledger::Counter::Kept], 5001U);
    EXPECT_THAT(filesNamed(".corrupt-"), SizeIs(3)); // with the log and its index
    EXPECT_THAT(log.take(), ElementsAre(Field(&LogLine::message, HasSubstr("is damaged or not a database of events"))));
}

TEST_F(SqliteKeeperTest, OnlySoManyDamagedDatabasesAreKept)
{
    for (int number = 0; number < 6; ++number) {
        closeWriter();
        fs::remove(directory / "analytics.sqlite3-wal");
        support::writeFile(file(), "damaged " + std::to_string(number));
        clock.advance(60);
        keep({event(1)});
    }
    std::vector<std::string> contents;
    for (const std::string& name : filesNamed(".corrupt-"))
        if (!name.ends_with("-wal") && !name.ends_with("-shm"))
            contents.push_back(support::readFile(directory / name));
    EXPECT_THAT(contents, ElementsAre("damaged 3", "damaged 4", "damaged 5"));
}

TEST_F(SqliteKeeperTest, TwoDamagedDatabasesOfOneMomentAreBothKept)
{
    for (const char* text : {"first", "second"}) {
        closeWriter();
        support::writeFile(file(), text);
        keep({event(1)});
    }
    std::vector<std::string> contents;
    for (const std::string& name : filesNamed(".corrupt-"))
        contents.push_back(support::readFile(directory / name));
    EXPECT_THAT(contents, testing::IsSupersetOf({"first", "second"}));
}

TEST_F(SqliteKeeperTest, ANewerDatabaseIsSetAsideUntouched)
{
    keep({event(1)});
    closeWriter();
    {
        sqlite3* connection = nullptr;
        ASSERT_EQ(::sqlite3_open(file().c_str(), &connection), SQLITE_OK);
        ASSERT_EQ(
            ::sqlite3_exec(connection, "CREATE TABLE more(a); PRAGMA user_version = 3", nullptr, nullptr, nullptr),
            SQLITE_OK);
        ::sqlite3_close(connection);
    }
    keep({event(2, "mine")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events"), ElementsAre("mine"));
    const auto aside = filesNamed(".newer-");
    ASSERT_THAT(aside, Not(IsEmpty()));
    StoreReader newer(directory / aside.front());
    EXPECT_EQ(newer.number("PRAGMA user_version"), 3);
    EXPECT_EQ(newer.eventCount(), 1);
    EXPECT_THAT(log.take(),
                ElementsAre(Field(&LogLine::message, HasSubstr("was made by a later version of the service"))));
}

TEST_F(SqliteKeeperTest, ADatabaseThatIsTakenAwayIsBegunAnew)
{
    keep({event(1, "a")});
    fs::remove(file());
    keep({event(2, "b")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events"), ElementsAre("b"));
    EXPECT_THAT(log.take(), ElementsAre(Field(&LogLine::message, HasSubstr("was removed or replaced"))));
}

TEST_F(SqliteKeeperTest, ADatabaseThatIsPutInItsPlaceIsGoneOnWith)
{
    keep({event(1, "a")});
    closeWriter();
    fs::copy_file(file(), directory / "copy");
    keep({event(2, "b")});
    fs::rename(directory / "copy", file());
    fs::remove(directory / "analytics.sqlite3-wal");
    keep({event(3, "c")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events ORDER BY id"), ElementsAre("a", "c"));
}

TEST_F(SqliteKeeperTest, ASecondServiceInTheSameDirectoryDoesNotWrite)
{
    keep({event(1, "first")});
    SqliteKeeper second(directory, clock, ProviderLog(log));
    second.open();
    EXPECT_THAT(log.take(),
                ElementsAre(Field(&LogLine::message,
                                  AllOf(StartsWith("analytics events cannot be kept: "),
                                        HasSubstr("another process keeps its events in the same directory; "
                                                  "give each service its own state directory")))));
    const std::vector<PlainEvent> given{event(2, "second")};
    ledger::Tally lost;
    keepIn(second, given, lost);
    EXPECT_EQ(lost[ledger::Counter::LostToOtherService], 1U);
    closeWriter();
    clock.advance(SqliteKeeper::secondsBetweenOpenings);
    keepIn(second, given, lost);
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events ORDER BY id"), ElementsAre("first", "second"));
}

// --- Disks that fail

TEST_F(SqliteKeeperTest, AReadOnlyDirectoryLosesEventsAndRecovers)
{
    support::runUnprivileged(directory, [this] {
        ::chmod(directory.c_str(), 0555);
        keep({event(1), event(2)});
        EXPECT_EQ(lost(StoreError::CannotOpen), 2U);
        EXPECT_THAT(log.take(),
                    ElementsAre(Field(&LogLine::message,
                                      AllOf(StartsWith("2 analytics events were lost (2 since the start): "),
                                            HasSubstr("let the user of the service write")))));
        ::chmod(directory.c_str(), 0755);
        keep({event(3)});
        EXPECT_EQ(lost(StoreError::CannotOpen), 3U); // the keeper does not try to open it again with each event
        clock.advance(SqliteKeeper::secondsBetweenOpenings);
        keep({event(4)});
        EXPECT_EQ(StoreReader(file()).eventCount(), 1);
    });
}

TEST_F(SqliteKeeperTest, AReadOnlyDatabaseLosesEventsAndRecovers)
{
    support::runUnprivileged(directory, [this] {
        keep({event(1)});
        closeWriter();
        ::chmod(file().c_str(), 0444);
        keep({event(2)});
        EXPECT_EQ(lost(StoreError::ReadOnly), 1U);
        EXPECT_THAT(log.take(), ElementsAre(Field(&LogLine::message, HasSubstr("the database is read-only"))));
        ::chmod(file().c_str(), 0644);
        clock.advance(SqliteKeeper::secondsBetweenOpenings);
        keep({event(3)});
        EXPECT_EQ(StoreReader(file()).eventCount(), 2);
    });
}

TEST_F(SqliteKeeperTest, AUserWhoMayOnlyReadReadsTheStoreOfAnEndedService)
{
    if (::getuid() != 0)
        GTEST_SKIP() << "only a privileged user can become one without write access";
    keep(events(100));
    closeWriter();
    ::chmod(directory.c_str(), 0755);
    for (const auto& each : fs::directory_iterator(directory))
        ::chmod(each.path().c_str(), 0644);
    const pid_t child = ::fork();
    if (child == 0) {
        if (::setgid(65534) != 0 || ::setuid(65534) != 0)
            ::_exit(2);
        try {
            ::_exit(StoreReader(file()).eventCount() == 100 ? 0 : 1);
        } catch (const std::exception&) {
            ::_exit(3);
        }
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

TEST_F(SqliteKeeperTest, AFullDiskLosesEventsAndRecoversWhenThereIsRoom)
{
    const fs::path small = directory / "small";
    fs::create_directory(small);
    if (::mount("tmpfs", small.c_str(), "tmpfs", 0, "size=2m") != 0)
        GTEST_SKIP() << "a small disk cannot be mounted here: " << std::strerror(errno);
    directory = small;
    keep(events(100));
    support::writeFile(small / "ballast", std::string(8 * megabyte, 'x'));
    std::uint64_t given = 100;
    for (int round = 0; round < 20; ++round, given += 100)
        keep(events(100));
    const std::uint64_t lostEvents = lost(StoreError::DiskFull);
    EXPECT_GT(lostEvents, 0U);
    EXPECT_EQ(lostEvents % 100, 0U); // only whole transactions
    EXPECT_EQ(tally[ledger::Counter::Kept] + lostEvents, given);
    EXPECT_EQ(StoreReader(file()).eventCount(), static_cast<std::int64_t>(tally[ledger::Counter::Kept]));
    EXPECT_THAT(log.take(),
                ElementsAre(Field(&LogLine::message,
                                  AllOf(StartsWith("100 analytics events were lost (100 since the start): "),
                                        HasSubstr("the disk is full; make room, or lower maximum_size_mb")))));

    fs::remove(small / "ballast");
    keep(events(100));
    EXPECT_EQ(lost(StoreError::DiskFull), lostEvents);
    EXPECT_EQ(StoreReader(file()).text("PRAGMA integrity_check"), "ok");
    closeWriter();
    EXPECT_EQ(StoreReader(file()).eventCount(), static_cast<std::int64_t>(given + 100 - lostEvents));
    directory = temporary.path();
    ::umount2(small.c_str(), MNT_DETACH);
}

TEST_F(SqliteKeeperTest, AFileThatMayNotGrowLosesEventsAndTheServiceGoesOn)
{
    support::runInAnotherProcess([this] {
        ::signal(SIGXFSZ, SIG_IGN);
        rlimit limit{};
        ::getrlimit(RLIMIT_FSIZE, &limit);
        const rlimit small{200'000, limit.rlim_max};
        keep(events(10));
        ::setrlimit(RLIMIT_FSIZE, &small);
        for (int round = 0; round < 10; ++round)
            keep(events(200));
        EXPECT_GT(lost(StoreError::DiskFull), 0U);
        EXPECT_EQ(tally[ledger::Counter::Kept] + lost(StoreError::DiskFull), 2010U);
        ::setrlimit(RLIMIT_FSIZE, &limit);
        const std::uint64_t before = tally[ledger::Counter::Kept];
        keep(events(200));
        EXPECT_EQ(tally[ledger::Counter::Kept], before + 200);
        EXPECT_EQ(StoreReader(file()).eventCount(), static_cast<std::int64_t>(before + 200));
    });
}

TEST_F(SqliteKeeperTest, ADiskThatFailsLosesEventsUntilTheDatabaseIsOpenedAnew)
{
    keep({event(1, "a")});
    // SQLite's descriptor of the log becomes one that cannot be written to.
    const FileDescriptor unwritable(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    for (const auto& open : fs::directory_iterator("/proc/self/fd"))
        if (std::error_code gone; fs::read_symlink(open, gone) == file().string() + "-wal") {
            ASSERT_GE(::dup2(unwritable.get(), std::stoi(open.path().filename())), 0);
        }
    keep({event(2, "b")});
    EXPECT_EQ(lost(StoreError::InputOutput), 1U);
    EXPECT_THAT(log.take(),
                ElementsAre(support::IsLine(LogLevel::Error, "kerl",
                                            "1 analytics events were lost (1 since the start): " + file().string()
                                                + ": the disk failed; look for its errors in the kernel's log")));
    keep({event(3, "c")});
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM events ORDER BY id"), ElementsAre("a", "c"));
}

TEST_F(SqliteKeeperTest, WithoutADatabaseNothingIsLeftToTidy)
{
    EXPECT_FALSE(keeper().tidy(true, tally));
    EXPECT_FALSE(keeper().awaitsQuiet());
}

TEST_F(SqliteKeeperTest, LossesAreToldAtOnceAndThenOnceAMinute)
{
    const Dictionary bad{{"n", std::numeric_limits<double>::quiet_NaN()}};
    const auto lose = [&](std::size_t count) { keep(std::vector<PlainEvent>(count, event(1, "a", bad))); };
    const auto told = [&](std::string_view beginning) {
        return ElementsAre(Field(&LogLine::message, StartsWith(std::string(beginning))));
    };
    lose(1);
    EXPECT_THAT(log.take(), told("1 analytics events were lost (1 since the start)"));
    lose(2);
    clock.advance(59);
    lose(3);
    EXPECT_THAT(log.take(), IsEmpty());
    clock.advance(1);
    lose(4);
    EXPECT_THAT(log.take(), told("9 analytics events were lost (10 since the start)"));
    lose(5);
    EXPECT_THAT(log.take(), IsEmpty());
    clock.advance(60);
    maintain();
    EXPECT_THAT(log.take(), told("5 analytics events were lost (15 since the start)"));
    lose(6);
    closeWriter();
    EXPECT_THAT(log.take(), told("6 analytics events were lost (21 since the start)"));
}

// --- Readers

TEST_F(SqliteKeeperTest, AReaderSeesWhatIsCommittedWhileItGoesOn)
{
    keep({event(1)});
    StoreReader reader(file());
    for (std::int64_t count = 1; count < 50; ++count) {
        ASSERT_EQ(reader.eventCount(), count);
        keep({event(1)});
    }
}

TEST_F(SqliteKeeperTest, AReaderThatHoldsATransactionSeesOneStateAndHoldsUpNobody)
{
    keep({event(1)});
    StoreReader reader(file());
    reader.execute("BEGIN");
    EXPECT_EQ(reader.eventCount(), 1);
    keep(events(1000));
    EXPECT_EQ(reader.eventCount(), 1);
    reader.execute("COMMIT");
    EXPECT_EQ(reader.eventCount(), 1001);
}

TEST_F(SqliteKeeperTest, TheLogIsMovedToTheDatabaseBeforeItGrowsLarge)
{
    keeper().open();
    StoreReader reader(file()); // connected; it reads only now and then
    for (int round = 0; round < 100; ++round) {
        keep(events(2000));
        maintain();
        ASSERT_LT(logBytes(), 2 * SqliteKeeper::logBytesBetweenCheckpoints);
        if (round % 10 == 0)
            reader.eventCount();
    }
    EXPECT_GT(fs::file_size(file()), 50 * megabyte);
}

TEST_F(SqliteKeeperTest, AMoreThanLongLogIsMovedEvenWhileThereIsMuchToKeep)
{
    keeper().open();
    std::uint64_t longest = 0;
    for (int round = 0; round < 100; ++round) {
        keep(events(2000));
        longest = std::max(longest, logBytes());
        maintain(false);
    }
    EXPECT_GT(longest, SqliteKeeper::mostLogBytesBetweenCheckpoints);
    EXPECT_LT(longest, SqliteKeeper::mostLogBytesBetweenCheckpoints + 2 * megabyte);
    EXPECT_GT(fs::file_size(file()), 20 * megabyte);
}

TEST_F(SqliteKeeperTest, ALongLogIsMovedOnlyInAQuietMoment)
{
    keeper().open();
    EXPECT_FALSE(keeper().awaitsQuiet());
    for (int round = 0; round < 15; ++round)
        keep(events(2000));
    maintain(false);
    EXPECT_LT(fs::file_size(file()), megabyte);
    EXPECT_TRUE(keeper().awaitsQuiet());
    maintain(true);
    EXPECT_GT(fs::file_size(file()), 8 * megabyte);
    EXPECT_FALSE(keeper().awaitsQuiet());
}

TEST_F(SqliteKeeperTest, ALogThatAReaderHoldsIsNotWaitedForAgainAndAgain)
{
    keeper().open();
    StoreReader reader(file());
    reader.execute("BEGIN");
    EXPECT_EQ(reader.eventCount(), 0);
    for (int round = 0; round < 15; ++round)
        keep(events(2000));
    EXPECT_TRUE(keeper().awaitsQuiet());
    maintain(true);
    EXPECT_FALSE(keeper().awaitsQuiet());
}

TEST_F(SqliteKeeperTest, AReaderThatNeverEndsCostsEventsButNotTheDisk)
{
    configuration.maximumSizeMegabytes = 12;
    keep(events(100));
    StoreReader reader(file());
    reader.execute("BEGIN");
    EXPECT_EQ(reader.eventCount(), 100);
    for (int round = 0; round < 60; ++round) {
        keep(events(1000));
        maintain();
        ASSERT_LT(logBytes(), 14 * megabyte);
    }
    EXPECT_GT(lost(StoreError::LogHeld), 0U);
    EXPECT_THAT(log.take(),
                Each(Field(&LogLine::message,
                           HasSubstr("a program has been reading the database for too "
                                     "long; end it, or let it read in short "
                                     "transactions"))));
    EXPECT_EQ(reader.eventCount(), 100);

    reader.execute("COMMIT");
    const std::uint64_t before = lost(StoreError::LogHeld);
    keep(events(1000));
    EXPECT_EQ(lost(StoreError::LogHeld), before);
}

TEST_F(SqliteKeeperTest, ReadersThatFollowOnEachOtherDoNotKeepTheLogFromBeginningAnew)
{
    configuration.maximumSizeMegabytes = 4;
    keep(events(100));
    // Each reader begins a transaction before the other ends its own, so that there is always a reader.
    std::jthread readers([this](const std::stop_token& stop) {
        StoreReader first(file());
        StoreReader second(file());
        const auto begin = [](StoreReader& reader) {
            reader.execute("BEGIN");
            reader.number("SELECT max(id) FROM events");
        };
        begin(first);
        while (!stop.stop_requested()) {
            begin(second);
            first.execute("COMMIT");
            begin(first);
            second.execute("COMMIT");
        }
    });
    for (int round = 0; round < 60; ++round) {
        keep(events(500));
        for (int wait = 0; wait < 10; ++wait) { // on a busy machine many fail
            maintain();
            clock.advance(SqliteKeeper::secondsBetweenWaits);
        }
    }
    EXPECT_EQ(lost(StoreError::LogHeld), 0U);
    // Usually it has 4.7 MB: half of the limit before the writer waits, a round, and a step of tidying, which writes up
    // to 2 MB, since it changes many pages of 8 KiB. On a busy machine waits fail, and that step begins at the limit.
    EXPECT_LT(logBytes(), 7 * megabyte);
}

TEST_F(SqliteKeeperTest, AProgramThatWritesHoldsUpTheStoreButNotForEver)
{
    keep({event(1)});
    sqlite3* other = nullptr;
    ASSERT_EQ(::sqlite3_open(file().c_str(), &other), SQLITE_OK);
    ASSERT_EQ(::sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
    keep({event(2)});
    EXPECT_EQ(lost(StoreError::Locked), 1U);
    EXPECT_THAT(log.take(), ElementsAre(Field(&LogLine::message, HasSubstr("another program writes to the database"))));
    ASSERT_EQ(::sqlite3_exec(other, "ROLLBACK", nullptr, nullptr, nullptr), SQLITE_OK);
    ::sqlite3_close(other);
    keep({event(3)});
    EXPECT_EQ(StoreReader(file()).eventCount(), 2);
}

// --- Bounds

TEST_F(SqliteKeeperTest, WhatIsTooOldGoes)
{
    configuration.maximumAgeDays = 10;
    keep(events(3000, 10));
    clock.advance(40 * day - 2 * hour);
    keep(events(20, 10));
    clock.advance(2 * hour);
    keep(events(30, 10));
    clock.advance(10 * day - 1);
    keep(events(5, 10));
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 35);
    EXPECT_EQ(tally[ledger::Counter::RemovedForAge], 3020U);
    EXPECT_EQ(keeper().state()->events, 35U);
}

TEST_F(SqliteKeeperTest, AnEventStaysAtMostAnHourLonger)
{
    configuration.maximumAgeDays = 10;
    for (int minute = 0; minute < 24 * 60; minute += 10) {
        keep({event(1)});
        clock.advance(600);
    }
    clock.advance(9 * day + 12 * hour); // half of them are too old
    maintain();
    EXPECT_GE(StoreReader(file()).eventCount(), 71);
    EXPECT_LE(StoreReader(file()).eventCount(), 71 + 7);
}

TEST_F(SqliteKeeperTest, AgeIsLookedAtRarely)
{
    configuration.maximumAgeDays = 10;
    keep({event(1)});
    maintain();
    clock.advance(5 * day);
    keep({event(1)});
    maintain();
    clock.advance(5 * day - 30);
    maintain();
    clock.advance(30);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 2);
    clock.advance(SqliteKeeper::secondsBetweenChecks);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 1);
}

TEST_F(SqliteKeeperTest, AClockThatIsNotSetYetDeletesNothing)
{
    keep(events(100));
    clock.set(0);
    clock.advance(SqliteKeeper::secondsBetweenChecks);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 100);
}

TEST_F(SqliteKeeperTest, EventsFromTheFutureShieldNoOthersAndGoLikeThem)
{
    configuration.maximumAgeDays = 10;
    const double now = clock.secondsSince1970();
    clock.set(now + 5000 * day);
    keep(events(600, 10, clock.secondsSince1970()));
    clock.set(now);
    keep(events(700, 10, now));
    clock.advance(9 * day);
    keep(events(5, 10, clock.secondsSince1970()));
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 1305);
    clock.advance(1 * day);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 5);
}

TEST_F(SqliteKeeperTest, AnEventWithAStampOf1970IsAsYoungAsItIs)
{
    configuration.maximumAgeDays = 10;
    const double now = clock.secondsSince1970();
    clock.set(0);
    keep(events(100, 10, 0));
    clock.set(now);
    clock.advance(2 * day);
    keep(events(100, 10, now));
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 200);
}

TEST_F(SqliteKeeperTest, AClockThatJumpsAheadDeletesHistoryOnlyAfterADayOfRunning)
{
    configuration.maximumAgeDays = 10;
    keep(events(100));
    closeWriter();
    clock.set(clock.secondsSince1970() + 200 * day);
    keep(events(7));
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 107);
    clock.advance(1 * day - 60);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 107);
    clock.advance(60);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 7) << "what was kept before";
    clock.advance(10 * day);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 0);
}

TEST_F(SqliteKeeperTest, AClockThatJumpsAheadAndBackDeletesNothing)
{
    configuration.maximumAgeDays = 10;
    keep(events(100));
    closeWriter();
    const double now = clock.secondsSince1970();
    clock.set(now + 200 * day);
    keep(events(7));
    clock.advance(hour);
    maintain();
    clock.set(now + hour);
    clock.advance(3 * day);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 107);
}

TEST_F(SqliteKeeperTest, ADayOfRunningMayBeSpreadOverSeveralStarts)
{
    configuration.maximumAgeDays = 10;
    keep(events(100));
    closeWriter();
    clock.set(clock.secondsSince1970() + 200 * day);
    for (int start = 0; start < 4; ++start) {
        keep(events(1));
        clock.advance(6 * hour);
        keep(events(1));
        closeWriter();
        EXPECT_EQ(StoreReader(file()).eventCount(), 102 + 2 * start);
    }
    keeper().open();
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 8);
}

TEST_F(SqliteKeeperTest, WhatIsTooMuchGoesOldestFirst)
{
    configuration.maximumSizeMegabytes = 2;
    for (int round = 0; round < 30; ++round) {
        keep(events(1000));
        maintain();
    }
    closeWriter();
    StoreReader reader(file());
    EXPECT_LT(fs::file_size(file()), 2 * megabyte + 2 * SqliteKeeper::bytesBetweenChecks);
    EXPECT_EQ(reader.number("SELECT max(id) FROM events"), 30'000);
    EXPECT_EQ(reader.number("SELECT max(id) - min(id) + 1 - count(*) FROM events"), 0); // no gap: the oldest went first
    EXPECT_GT(reader.eventCount(), 3000);
    EXPECT_EQ(reader.text("PRAGMA integrity_check"), "ok");
}

// --- Shares

class SharesTest : public OriginsTest {
protected:
    void SetUp() override { configuration.maximumSizeMegabytes = 4; }
    // Events of a source, some bytes each.
    void send(std::uint64_t source, int count, std::size_t bytes, std::uint64_t session = 0)
    {
        for (int number = 0; number < count; ++number)
            batch.add(clock.secondsSince1970(), {.source = source, .session = session}, "a",
                      Dictionary{{"text", std::string(bytes, 'x')}, {"n", number}});
        keepBatch();
        maintain();
    }
    std::int64_t left(std::uint64_t row)
    {
        return StoreReader(file()).number(fmt::format("SELECT count(*) FROM events WHERE source = {}", row));
    }
};

TEST_F(SharesTest, ManyLargeEventsOfOneDoNotPushOutTheEventsOfOthers)
{
    begin(1, "modest", 1000);
    begin(2, "greedy", 1001);
    send(1, 4000, 300);
    for (int number = 0; number < 136; ++number)
        send(2, 1, megabyte);
    EXPECT_EQ(left(1), 4000);
    EXPECT_GE(left(2), 1);
    EXPECT_EQ(tally[ledger::Counter::RemovedForShare], 136U - static_cast<std::uint64_t>(left(2)));
    EXPECT_EQ(tally[ledger::Counter::RemovedForSize], 0U);
    EXPECT_THAT(tally.charged(),
                Contains(AllOf(Field(&ledger::Tally::Charged::culprit,
                                     ledger::Culprit{.user = 1001, .process = "greedy", .application = ""}),
                               Field(&ledger::Tally::Charged::count, 136U - static_cast<std::uint64_t>(left(2))))));
    EXPECT_EQ(StoreReader(file()).number("SELECT max(payload ->> 'n') FROM events WHERE source = 1"), 3999);
}

TEST_F(SharesTest, TheOldestOfTheLargestGoFirst)
{
    begin(1, "modest", 1000);
    begin(2, "greedy", 1001);
    send(2, 1000, 1000);
    send(1, 1000, 300);
    for (int round = 0; round < 10; ++round)
        send(2, 1000, 1000);
    EXPECT_EQ(left(2), 1000) << "the modest one came second";
    EXPECT_LT(left(1), 4000);
    StoreReader reader(file());
    EXPECT_EQ(reader.number("SELECT max(id) FROM events WHERE source = 1"), 12'000);
    EXPECT_EQ(reader.number("SELECT max(id) - min(id) + 1 - count(*) FROM events WHERE source = 1 AND id > 2000"), 0);
}

TEST_F(SharesTest, AmongProcessesOfOneUserTheLargestGivesWay)
{
    begin(1, "modest", 1000);
    begin(2, "greedy", 1000);
    send(1, 3000, 300);
    for (int round = 0; round < 20; ++round)
        send(2, 1000, 300);
    EXPECT_EQ(left(1), 3000);
}

TEST_F(SharesTest, AmongApplicationsOfOneProcessTheLargestGivesWay)
{
    begin(1, "server", 1000);
    beginSession(1, 1, "modest");
    beginSession(2, 1, "greedy");
    send(1, 3000, 300, 1);
    for (int round = 0; round < 20; ++round)
        send(1, 1000, 300, 2);
    EXPECT_EQ(StoreReader(file()).number("SELECT count(*) FROM events WHERE session = 1"), 3000);
}

TEST_F(SharesTest, WhoReportsUnderManyNamesGainsNothing)
{
    begin(1, "modest", 1000);
    begin(2, "greedy", 1000);
    for (std::uint64_t session = 1; session <= 100; ++session)
        beginSession(session, 2, fmt::format("name {}", session));
    send(1, 3000, 300);
    for (std::uint64_t session = 1; session <= 100; ++session)
        send(2, 200, 300, session);
    EXPECT_EQ(left(1), 3000);
    EXPECT_LE(StoreReader(file()).number("SELECT count(*) FROM holders WHERE process = 'greedy'"), 65);
}

TEST_F(SharesTest, ManyProcessesOfAUserGainNothingAgainstAnotherUser)
{
    begin(1, "modest", 1000);
    send(1, 3000, 300);
    for (std::uint64_t source = 2; source < 102; ++source) {
        begin(source, fmt::format("process {}", source), 1001);
        send(source, 200, 300);
    }
    EXPECT_EQ(left(1), 3000);
    EXPECT_LE(StoreReader(file()).number("SELECT count(*) FROM holders WHERE user = 1001"), 65);
}

TEST_F(SharesTest, WithOneHolderTheOldestGoForTheSize)
{
    begin(1);
    for (int round = 0; round < 20; ++round)
        send(1, 1000, 300);
    EXPECT_GT(tally[ledger::Counter::RemovedForSize], 1000U);
    EXPECT_EQ(tally[ledger::Counter::RemovedForShare], 0U);
    EXPECT_EQ(StoreReader(file()).number("SELECT max(id) - min(id) + 1 - count(*) FROM events"), 0);
}

TEST_F(SharesTest, WhatEachHoldsIsKnownAgainAfterAStart)
{
    begin(1, "modest", 1000);
    begin(2, "greedy", 1001);
    send(1, 100, 1000);
    send(2, 200, 1000);
    const std::string sql = "SELECT user || ' ' || process || ' ' || bytes FROM holders ORDER BY user";
    const auto before = StoreReader(file()).texts(sql);
    EXPECT_THAT(before, ElementsAre("1000 modest 108190", "1001 greedy 216490"));
    closeWriter();
    begin(3, "modest", 1000);
    send(3, 1, 1000);
    EXPECT_THAT(StoreReader(file()).texts(sql), ElementsAre("1000 modest 109271", "1001 greedy 216490"));
}

TEST_F(SharesTest, AHolderWithoutEventsIsForgotten)
{
    begin(1, "modest", 1000);
    send(1, 100, 1000);
    clock.advance(91 * day);
    begin(2, "other", 1000);
    send(2, 1, 10);
    EXPECT_THAT(StoreReader(file()).texts("SELECT process FROM holders"), ElementsAre("other"));
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM sources ORDER BY id"), ElementsAre("modest", "other"))
        << "it has not ended";
}

TEST_F(SharesTest, SourcesAndSessionsGoAfterTheirLastEvent)
{
    begin(1, "first");
    beginSession(1, 1);
    send(1, 1, 10, 1);
    batch.announceSessionEnd({.number = 1, .time = 2});
    batch.announceSourceEnd({.number = 1, .time = 2});
    keepBatch();
    begin(2, "second");
    send(2, 1, 10);
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM sources ORDER BY id"), ElementsAre("first", "second"));
    clock.advance(50 * day);
    send(2, 1, 10);
    clock.advance(50 * day);
    maintain();
    EXPECT_EQ(StoreReader(file()).eventCount(), 1);
    EXPECT_THAT(StoreReader(file()).texts("SELECT name FROM sources ORDER BY id"), ElementsAre("second"));
    EXPECT_EQ(StoreReader(file()).number("SELECT count(*) FROM sessions"), 0);
}

TEST_F(SharesTest, RemovalsAreSaidOnceAnHour)
{
    std::uint64_t sum = 0;
    const auto said = [&] {
        std::vector<std::string> lines;
        for (const LogLine& line : log.take()) {
            lines.push_back(line.message.substr(0, line.message.find(';')));
            sum += std::stoul(line.message);
        }
        return lines;
    };
    configuration.maximumAgeDays = 1;
    begin(1);
    send(1, 10, 10);
    EXPECT_THAT(said(), IsEmpty());
    clock.advance(2 * day);
    send(1, 5, 10);
    EXPECT_THAT(said(), IsEmpty()) << "with the next tidying";
    maintain();
    EXPECT_THAT(said(),
                ElementsAre("10 analytics events were removed: 10 were too old, 0 were the oldest of too many, "
                            "0 were the oldest of who holds most"));
    for (int round = 0; round < 20; ++round)
        send(1, 1000, 300);
    EXPECT_THAT(said(), IsEmpty());
    clock.advance(hour);
    maintain();
    EXPECT_THAT(said(), SizeIs(1));
    closeWriter();
    EXPECT_THAT(said(), SizeIs(testing::Le(1))) << "what is not said yet is said at the end";
    EXPECT_EQ(sum, tally[ledger::Counter::RemovedForAge] + tally[ledger::Counter::RemovedForSize]);
}

TEST_F(SqliteKeeperTest, FewButLargeEventsDoNotSlipThroughTheBound)
{
    configuration.maximumSizeMegabytes = 4;
    keep(events(10'000, 50));
    for (int round = 0; round < 60; ++round) {
        keep(events(1, megabyte));
        maintain();
        ASSERT_LT(fs::file_size(file()), 8 * megabyte);
    }
    EXPECT_GE(StoreReader(file()).eventCount(), 3);
}

TEST_F(SqliteKeeperTest, ALowerBoundMakesTheFileSmaller)
{
    keep(events(30'000));
    maintain();
    configuration.maximumSizeMegabytes = 1;
    keeper().setConfiguration(configuration);
    maintain();
    closeWriter();
    EXPECT_LT(fs::file_size(file()), 2 * megabyte);
    EXPECT_GT(StoreReader(file()).eventCount(), 1000);
}

TEST_F(SqliteKeeperTest, HousekeepingIsDoneInSmallSteps)
{
    keep(events(30'000));
    maintain();
    configuration.maximumSizeMegabytes = 1;
    keeper().setConfiguration(configuration);
    int steps = 1;
    while (keeper().tidy(true, tally))
        ++steps;
    EXPECT_GT(steps, 15);
}

} // namespace
} // namespace platform
