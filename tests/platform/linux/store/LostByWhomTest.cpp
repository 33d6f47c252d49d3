// SPDX-License-Identifier: Apache-2.0
// Whose events were lost: for each reason for which the keeper loses events, it charges those who sent them.
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/AnotherProcess.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <csignal>
#include <fcntl.h>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <sqlite3.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

using foundation::Dictionary;
using ledger::Counter;
using support::runInAnotherProcess;
using support::runUnprivileged;
using testing::ElementsAre;
using testing::IsEmpty;

namespace fs = std::filesystem;

constexpr Origin player{.source = 7, .session = 9};
constexpr Origin recorder{.source = 8, .session = 0};

class LostByWhomTest : public testing::Test {
protected:
    // No check is due, which would read beside the tests' readers.
    LostByWhomTest() { support::writeFile(file().string() + "-checked", "1800000000"); }
    SqliteKeeper& keeper()
    {
        if (!keeper_) {
            keeper_.emplace(temporary.path(), clock, ProviderLog(log));
            AnalyticsConfiguration configuration;
            configuration.maximumSizeMegabytes = 1;
            keeper_->setConfiguration(configuration);
        }
        return *keeper_;
    }
    // Three events of the player's session, one of the recorder, which has none, and one of an unknown source.
    static void keepFive(EventKeeper& keeper, ledger::Tally& tally)
    {
        EventBatch batch;
        batch.announce(SourceBegin{.number = player.source, .userIdentifier = 1000, .processName = "player"});
        batch.announce(SourceBegin{.number = recorder.source, .userIdentifier = 1001, .processName = "recorder"});
        batch.announce(
            SessionBegin{.number = player.session, .source = player.source, .application = "org.example.player"});
        const Dictionary message{{"n", 1}};
        batch.add(1, player, "com.quarn.kesto.a", message);
        batch.add(1, player, "com.quarn.media.a", message);
        batch.add(1, recorder, "com.quarn.kesto.b", {{"n", 2}});
        batch.add(1, player, "com.quarn.kesto.c", {{"n", 3}});
        batch.add(1, {}, "com.quarn.kesto.d", {{"n", 4}});
        keeper.keep(batch, tally);
    }
    void expectLoss(Counter reason)
    {
        ledger::Tally tally;
        keepFive(keeper(), tally);
        EXPECT_EQ(tally[reason], 5U);
        EXPECT_EQ(tally[Counter::Kept], 0U);
        EXPECT_THAT(charged(tally), ElementsAre("lost 1000 player org.example.player 3", "lost 1001 recorder  1"));
    }
    static std::vector<std::string> charged(const ledger::Tally& tally)
    {
        std::vector<std::string> lines;
        for (const auto& [charge, culprit, count] : tally.charged())
            lines.push_back(
                fmt::format("{} {} {} {} {}", name(charge), culprit.user, culprit.process, culprit.application, count));
        std::ranges::sort(lines);
        return lines;
    }
    void keepOne(std::size_t payloadSize = 1)
    {
        EventBatch batch;
        batch.add(1, {}, "com.quarn.kesto.a", {{"text", std::string(payloadSize, 'x')}});
        ledger::Tally tally;
        keeper().keep(batch, tally);
        ASSERT_EQ(tally[Counter::Kept], 1U);
    }
    // As another program, which holds its connection until it is destroyed.
    std::shared_ptr<sqlite3> execute(const char* sql) const
    {
        sqlite3* connection = nullptr;
        EXPECT_EQ(::sqlite3_open(file().c_str(), &connection), SQLITE_OK);
        EXPECT_EQ(::sqlite3_exec(connection, sql, nullptr, nullptr, nullptr), SQLITE_OK);
        return {connection, ::sqlite3_close};
    }
    fs::path file() const { return temporary.path() / "analytics.sqlite3"; }

    support::TemporaryDirectory temporary;
    support::ManualClock clock;
    support::FakeLog log;

private:
    std::optional<SqliteKeeper> keeper_; // made where it is used, which may be another process
};

TEST_F(LostByWhomTest, WhatIsKeptIsChargedToNoOne)
{
    ledger::Tally tally;
    keepFive(keeper(), tally);
    EXPECT_EQ(tally[Counter::Kept], 5U);
    EXPECT_THAT(charged(tally), IsEmpty());
}

TEST_F(LostByWhomTest, WhatJsonCannotSay)
{
    const Dictionary bad{{"n", std::numeric_limits<double>::quiet_NaN()}};
    EventBatch batch;
    batch.announce(SourceBegin{.number = player.source, .userIdentifier = 1000, .processName = "player"});
    batch.announce(SourceBegin{.number = recorder.source, .userIdentifier = 1001, .processName = "recorder"});
    batch.add(1, player, "com.quarn.kesto.a", bad);
    batch.add(1, player, "com.quarn.media.a", bad);
    batch.add(1, recorder, "com.quarn.kesto.b", {{"n", 1}});
    ledger::Tally tally;
    keeper().keep(batch, tally);
    EXPECT_EQ(tally[Counter::LostNotJson], 2U);
    EXPECT_EQ(tally[Counter::Kept], 1U);
    EXPECT_THAT(charged(tally), ElementsAre("lost 1000 player  2"));
}

TEST_F(LostByWhomTest, WhatASourceSentBeforeItEndedInTheSameBatch)
{
    EventBatch batch;
    batch.announce(SourceBegin{.number = player.source, .userIdentifier = 1000, .processName = "player"});
    batch.add(1, player, "com.quarn.kesto.a", {{"n", 1}});
    batch.announceSourceEnd({.number = player.source, .time = 2});
    keepOne();
    const auto other = execute("BEGIN IMMEDIATE");
    ledger::Tally tally;
    keeper().keep(batch, tally);
    EXPECT_THAT(charged(tally), ElementsAre("lost 1000 player  1"));
}

TEST_F(LostByWhomTest, OnADiskThatIsFull)
{
    runInAnotherProcess([this] {
        keepOne();
        ::signal(SIGXFSZ, SIG_IGN);
        const rlimit noMore{fs::file_size(file().string() + "-wal"), RLIM_INFINITY};
        ::setrlimit(RLIMIT_FSIZE, &noMore);
        expectLoss(Counter::LostToDiskFull);
    });
}

TEST_F(LostByWhomTest, InADatabaseThatIsReadOnly)
{
    runUnprivileged(temporary.path(), [this] {
        execute("PRAGMA journal_mode = DELETE; CREATE TABLE a(b)");
        ::chmod(file().c_str(), 0444);
        expectLoss(Counter::LostToReadOnly);
    });
}

TEST_F(LostByWhomTest, WhileAnotherProgramWrites)
{
    keepOne();
    const auto other = execute("BEGIN IMMEDIATE");
    expectLoss(Counter::LostToLock);
}

TEST_F(LostByWhomTest, WhileAnotherServiceHasTheDirectory)
{
    SqliteKeeper first(temporary.path(), clock, ProviderLog(log));
    first.open();
    expectLoss(Counter::LostToOtherService);
}

TEST_F(LostByWhomTest, InADirectoryThatIsReadOnly)
{
    runUnprivileged(temporary.path(), [this] {
        ::chmod(temporary.path().c_str(), 0555);
        expectLoss(Counter::LostToOpening);
    });
}

TEST_F(LostByWhomTest, OnADiskThatFails)
{
    keepOne();
    // SQLite's descriptor of the log becomes one that cannot be written to.
    const FileDescriptor unwritable(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    for (const auto& open : fs::directory_iterator("/proc/self/fd"))
        if (std::error_code gone; fs::read_symlink(open, gone) == file().string() + "-wal") {
            ASSERT_GE(::dup2(unwritable.get(), std::stoi(open.path().filename())), 0);
        }
    expectLoss(Counter::LostToInputOutput);
}

TEST_F(LostByWhomTest, InADamagedDatabaseThatCannotBeSetAside)
{
    support::writeFile(file(), std::string(5000, 'x'));
    ::chmod(file().c_str(), 0666);
    runUnprivileged(temporary.path(), [this] {
        ::chmod(temporary.path().c_str(), 0555);
        expectLoss(Counter::LostToDamage);
    });
}

TEST_F(LostByWhomTest, InANewerDatabaseThatCannotBeSetAside)
{
    execute("PRAGMA user_version = 3");
    ::chmod(file().c_str(), 0666);
    runUnprivileged(temporary.path(), [this] {
        ::chmod(temporary.path().c_str(), 0555);
        expectLoss(Counter::LostToNewerStore);
    });
}

TEST_F(LostByWhomTest, WhileAReaderHoldsTheLog)
{
    keepOne();
    support::StoreReader reader(file());
    reader.execute("BEGIN");
    EXPECT_EQ(reader.eventCount(), 1);
    keepOne(1'200'000);
    expectLoss(Counter::LostToReader);
}

TEST_F(LostByWhomTest, WhereSqliteRefuses)
{
    keepOne();
    execute("CREATE TRIGGER refusal BEFORE INSERT ON messages BEGIN SELECT RAISE(ABORT, 'no'); END");
    expectLoss(Counter::LostToOther);
}

} // namespace
} // namespace platform
