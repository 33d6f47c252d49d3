// Faults of every kind, and what the ledger says after each: nothing goes uncounted.
#include "end_to_end/Kestod.h"
#include "end_to_end/SmallDisk.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"

#include <atomic>
#include <cmath>
#include <gmock/gmock.h>
#include <sqlite3.h>
#include <thread>
#include <tuple>
#include <unistd.h>

namespace end_to_end {
namespace {

namespace fs = std::filesystem;

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using ledger::Counter;
using testing::IsEmpty;

constexpr int playback = 4;
constexpr int typeStart = 1;

class FaultsTest : public testing::Test {
protected:
    explicit FaultsTest(const Kestod::Files& configuration = {}) : kestod(configuration, {{"KESTO_LOG", "default"}}) { }
    void SetUp() override { kestod.start(); }

    // A client with a started session 1.
    [[nodiscard]] WireClient connect() const
    {
        WireClient client(kestod.socketPath());
        client.ask(Create, 1);
        client.call(Start, 1);
        client.ask(Validate, 1);
        return client;
    }
    // Sends messages, each unlike the others, and returns when all are answered.
    void send(WireClient& client, int count, std::size_t size = 10)
    {
        for (int number = 0; number < count; ++number)
            client.ask(SendMessage, Dictionary{{"n", ++sent}, {"text", std::string(size, 'x')}}, playback, typeStart,
                       Array{1});
    }
    [[nodiscard]] fs::path store() const { return kestod.directory() / "state" / "analytics.sqlite3"; }
    [[nodiscard]] std::uint64_t counted(Counter counter) const { return readLedger(kestod)[counter]; }

    Kestod kestod;
    std::int64_t sent = 0;
};

TEST_F(FaultsTest, EachMessageIsCountedByWhatBecameOfIt)
{
    WireClient client = connect();
    send(client, 3);
    const Dictionary same{{"a", 1}};
    for (int time = 0; time < 4; ++time)
        client.ask(SendMessage, same, playback, typeStart, Array{1});
    client.ask(Create, 2);
    client.ask(SendMessage, same, playback, typeStart, Array{2, 77, 0});
    EXPECT_EQ(counted(Counter::Deliveries), 8U);
    EXPECT_EQ(counted(Counter::Recorded), 4U);
    EXPECT_EQ(counted(Counter::Repeated), 3U);
    EXPECT_EQ(counted(Counter::Inert), 1U);
    EXPECT_EQ(counted(Counter::Events), 16U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(FaultsTest, PayloadsThatJsonCannotExpressAreCountedAsLost)
{
    WireClient client = connect();
    client.ask(SendMessage, Dictionary{{"a", std::nan("")}}, playback, typeStart, Array{1});
    client.ask(SendMessage, Dictionary{{"a", Array{1, -INFINITY}}}, playback, typeStart, Array{1});
    send(client, 1);
    EXPECT_EQ(counted(Counter::LostNotJson), 4U);
    EXPECT_EQ(counted(Counter::Kept), 2U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(FaultsTest, SessionsAndReceiversBeyondTheirCapsAreCountedAsRefused)
{
    WireClient client = connect();
    std::vector<Value> reporterIDs;
    for (int reporterID = 1; reporterID <= 10'002; ++reporterID)
        client.call(Create, reporterID);
    for (int reporterID = 1; reporterID <= 10'002; ++reporterID)
        ASSERT_TRUE(client.nextReply());
    EXPECT_EQ(counted(Counter::SessionsRefused), 2U);
    for (int reporterID = 1; reporterID <= 200; ++reporterID)
        reporterIDs.emplace_back(reporterID);
    client.ask(SendMessage, Dictionary{{"text", std::string(1'000'000, 'x')}}, playback, typeStart, Array(reporterIDs));
    EXPECT_GT(counted(Counter::RefusedForSize), 100U);
    EXPECT_EQ(counted(Counter::Deliveries), 200U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    EXPECT_EQ(readLedger(kestod).culprits[0].at(0).culprit.user, ::getuid());
}

TEST_F(FaultsTest, AStoreThatAnotherProgramLocksLosesWhatItCountsAsLost)
{
    WireClient client = connect();
    send(client, 5);
    sqlite3* other = nullptr;
    ASSERT_EQ(sqlite3_open(store().c_str(), &other), SQLITE_OK);
    sqlite3_busy_timeout(other, 10'000);
    ASSERT_EQ(sqlite3_exec(other, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
    send(client, 2);
    ASSERT_EQ(sqlite3_exec(other, "ROLLBACK", nullptr, nullptr, nullptr), SQLITE_OK);
    sqlite3_close(other);
    send(client, 5);
    EXPECT_EQ(counted(Counter::LostToLock), 4U);
    EXPECT_EQ(counted(Counter::Kept), 20U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(FaultsTest, AStoreThatIsRemovedTakesItsEventsAlongAndIsReplaced)
{
    WireClient client = connect();
    send(client, 10);
    fs::remove(store());
    send(client, 5);
    EXPECT_EQ(counted(Counter::Kept), 30U);
    EXPECT_EQ(counted(Counter::RemovedByDamage), 20U);
    EXPECT_EQ(kestod.eventCount(), 10U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(FaultsTest, AStoreThatIsReplacedByAnOlderOneIsCountedAsItIs)
{
    WireClient client = connect();
    send(client, 10);
    client.close();
    std::ignore = kestod.waitForEvents("*uptime");
    kestod.kill();
    fs::copy_file(store(), kestod.directory() / "old");
    fs::copy_file(store().native() + "-wal", kestod.directory() / "old-wal");
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 10);
    kestod.kill();
    fs::copy_file(kestod.directory() / "old", store(), fs::copy_options::overwrite_existing);
    fs::copy_file(kestod.directory() / "old-wal", store().native() + "-wal", fs::copy_options::overwrite_existing);
    fs::remove(store().native() + "-shm");
    kestod.startAndAwait();
    WireClient last = connect();
    send(last, 1);
    EXPECT_GE(counted(Counter::RemovedByDamage), 20U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(FaultsTest, AStoreThatIsTruncatedWhileTheServiceIsStopped)
{
    WireClient client = connect();
    send(client, 200, 1000);
    kestod.kill();
    fs::resize_file(store(), fs::file_size(store()) / 2);
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 5);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

class FullDiskTest : public FaultsTest {
protected:
    void SetUp() override
    {
        if (!disk.isMounted())
            GTEST_SKIP() << "needs the right to mount";
        FaultsTest::SetUp();
    }
    void TearDown() override { kestod.kill(); }

    const SmallDisk disk{kestod.directory() / "state"};
};

TEST_F(FullDiskTest, ADiskThatIsFullAndFreeAgainLosesWhatItCountsAsLost)
{
    WireClient client = connect();
    send(client, 10);
    disk.fill();
    send(client, 100, 4000);
    EXPECT_GT(counted(Counter::LostToDiskFull), 0U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    disk.makeRoom();
    const std::uint64_t kept = counted(Counter::Kept);
    send(client, 10);
    EXPECT_EQ(counted(Counter::Kept), kept + 20) << "it keeps events again";
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    EXPECT_EQ(counted(Counter::Events), 240U);
}

// --- Kills

// A client that sends as fast as it gets answers, until the service goes. Counts answered messages.
void sendUntilTheEnd(const fs::path& socket, std::atomic<std::uint64_t>& answered)
{
    try {
        WireClient client(socket);
        client.ask(Create, 1);
        client.call(Start, 1);
        constexpr int window = 32;
        auto sendNext = [&, number = std::int64_t{0}]() mutable {
            client.call(SendMessage, Dictionary{{"n", ++number}, {"text", std::string(50, 'x')}}, playback, typeStart,
                        Array{1});
        };
        for (int unanswered = 0; unanswered < window; ++unanswered)
            sendNext();
        while (client.nextReply()) {
            ++answered;
            sendNext();
        }
    } catch (const std::exception&) { // the service went before the session was there
    }
}

class KilledUnderLoadTest : public FaultsTest, public testing::WithParamInterface<bool> { };

TEST_P(KilledUnderLoadTest, WhatWasAnsweredIsCountedAndKept)
{
    std::atomic<std::uint64_t> answered = 0;
    constexpr int rounds = 10;
    for (int round = 0; round < rounds; ++round) {
        if (round > 0)
            kestod.startAndAwait();
        {
            std::vector<std::jthread> clients;
            for (int client = 0; client < 3; ++client)
                clients.emplace_back([&] { sendUntilTheEnd(kestod.socketPath(), answered); });
            const std::uint64_t before = answered;
            EXPECT_TRUE(waitUntil([&] { return answered > before + 100; }));
            if (GetParam()) {
                WireClient(kestod.socketPath()).call(KillService);
                EXPECT_EQ(kestod.exitStatus(), 2);
            } else {
                kestod.kill();
            }
        }
        const ledger::Account account = readLedger(kestod);
        EXPECT_GE(account[Counter::Deliveries], answered);
        EXPECT_GE(account[Counter::Kept] + account[Counter::Unwanted], 2 * answered);
    }
    kestod.startAndAwait();
    WireClient client = connect();
    send(client, 1);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    EXPECT_EQ(counted(Counter::RemovedByDamage), 0U);
    EXPECT_GE(kestod.eventCount(), 2 * answered);
}

INSTANTIATE_TEST_SUITE_P(BySignalOrCall, KilledUnderLoadTest, testing::Bool(),
                         [](const auto& test) { return test.param ? "ByKillService" : "BySigkill"; });

TEST_F(FaultsTest, ConnectionsThatComeAndGoAreCounted)
{
    WireClient client = connect();
    constexpr std::uint64_t count = 2000;
    for (std::uint64_t number = 0; number < count; ++number)
        WireClient(kestod.socketPath()).ask(Create, 1);
    EXPECT_TRUE(waitUntil([&] {
        const ledger::Account account = readLedger(kestod);
        return account[Counter::ConnectionsEnded] == count;
    }));
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), count + 1);
    EXPECT_EQ(counted(Counter::SessionsCreated), count + 1);
    EXPECT_TRUE(waitUntil([&] { return counted(Counter::SessionsGone) == count; }));
    send(client, 1);
    EXPECT_TRUE(waitUntil([&] { return counted(Counter::Kept) == count + 2; })) << "an uptime event of each";
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

} // namespace
} // namespace end_to_end
