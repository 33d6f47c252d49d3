// SPDX-License-Identifier: Apache-2.0
// Faults of every kind, and what the ledger says after each: nothing goes uncounted.
#include "end_to_end/AnotherProcess.h"
#include "end_to_end/Disks.h"
#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "platform/linux/damage/DatabaseDamage.h"
#include "platform/linux/files/FileDescriptor.h"
#include "support/MessageKinds.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cmath>
#include <csignal>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <random>
#include <stdexcept>
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
using support::playback;
using support::typeStart;
using testing::IsEmpty;

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
    // For sums that do not hold at once: events come outside answers, or the store is being repaired.
    void expectSumsInTime()
    {
        WireClient client = connect();
        std::vector<std::string> broken;
        waitUntil([&] {
            send(client, 1);
            broken = sumsNow();
            return broken.empty();
        });
        EXPECT_THAT(broken, IsEmpty());
    }
    // After an end that was not clean: every page has been looked at then, or damage was met before.
    void expectSumsAfterCheck()
    {
        WireClient client = connect();
        EXPECT_TRUE(waitUntil([&] {
            send(client, 1);
            return fs::exists(store().native() + "-checked") || isSetAside();
        }));
        expectSumsInTime();
    }
    [[nodiscard]] fs::path store() const { return kestod.directory() / "state" / "analytics.sqlite3"; }
    [[nodiscard]] std::uint64_t counted(Counter counter) const { return readLedger(kestod)[counter]; }

    Kestod kestod;
    std::int64_t sent = 0;

private:
    [[nodiscard]] bool isSetAside() const
    {
        return std::ranges::any_of(support::namesIn(store().parent_path()),
                                   [](const std::string& name) { return name.contains(".corrupt-"); });
    }
    [[nodiscard]] std::vector<std::string> sumsNow() const
    {
        try {
            return brokenSums(kestod);
        } catch (const std::runtime_error& error) {
            return {error.what()}; // the store is being exchanged
        }
    }
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

TEST_F(FaultsTest, AMessageToMoreReceiversThanAFrameMayNameEndsTheConnection)
{
    WireClient client = connect();
    client.call(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Array(std::vector<Value>(10'001, Value(1))));
    EXPECT_TRUE(client.isClosed());
    WireClient other = connect();
    send(other, 1);
    EXPECT_EQ(counted(Counter::Deliveries), 1U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

// A client may have 32 MiB, and the user 48. No event is wanted, so the store stays small.
class MemoryUsedUpTest : public FaultsTest {
protected:
    MemoryUsedUpTest()
        : FaultsTest(Kestod::Files{{"analytics.toml", "used = []\n"}, {"limits.toml", "memory_mb = 64\n"}})
    {
    }

    // Begins a session and sends it so many messages of a megabyte.
    void sendLarge(WireClient& client, int session, int messages)
    {
        client.ask(Create, session);
        client.call(Start, session);
        for (int number = 0; number < messages; ++number)
            client.ask(SendMessage, Dictionary{{"n", number}, {"text", std::string(1'000'000, 'x')}}, playback,
                       typeStart, Array{session});
    }
};

TEST_F(MemoryUsedUpTest, MessagesBeyondThatOfAClientAndOfAUserAreCountedAsRefused)
{
    WireClient client(kestod.socketPath());
    sendLarge(client, 1, 40);
    EXPECT_EQ(counted(Counter::Recorded), 33U);
    EXPECT_EQ(counted(Counter::RefusedForMemory), 7U);
    WireClient another(kestod.socketPath());
    sendLarge(another, 2, 40);
    EXPECT_EQ(counted(Counter::Recorded), 50U);
    EXPECT_EQ(counted(Counter::RefusedForMemory), 30U);
    EXPECT_EQ(counted(Counter::RefusedForSize), 0U);
    const auto culprits = readLedger(kestod).culprits[static_cast<std::size_t>(ledger::Charge::Refused)];
    ASSERT_EQ(culprits.size(), 1U);
    EXPECT_EQ(culprits.front().culprit.user, ::getuid());
    EXPECT_EQ(culprits.front().count, 30U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(MemoryUsedUpTest, AHigherLimitCountsFromTheMomentThatItIsWritten)
{
    WireClient client(kestod.socketPath());
    sendLarge(client, 1, 40);
    support::replaceFile(kestod.directory() / "configuration" / "limits.toml", "memory_mb = 128\n");
    EXPECT_TRUE(waitUntil([&] {
        client.ask(SendMessage, Dictionary{{"n", "again"}, {"text", std::string(1'000'000, 'x')}}, playback, typeStart,
                   Array{1});
        return counted(Counter::Recorded) == 34;
    }));
}

// The longest time that the suite waits for. The service waits two seconds for each transaction.
TEST_F(FaultsTest, AStoreThatAnotherProgramLocksForTwentySecondsLosesWhatItCountsAsLost)
{
    WireClient client = connect();
    send(client, 5);
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    {
        support::Writer other(store());
        other.execute("PRAGMA busy_timeout = 10000");
        other.execute("BEGIN IMMEDIATE");
        while (std::chrono::steady_clock::now() < end)
            send(client, 1);
    }
    const auto lost = static_cast<std::uint64_t>(2 * (sent - 5));
    send(client, 5);
    EXPECT_EQ(counted(Counter::LostToLock), lost);
    EXPECT_GE(lost, 10U);
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

TEST_F(FaultsTest, AStoreThatIsTruncatedWhileTheServiceRuns)
{
    WireClient client = connect();
    send(client, 200, 1000);
    kestod.kill();
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 5);
    fs::resize_file(store(), fs::file_size(store()) / 2);
    send(again, 200, 1000);
    kestod.kill();
    kestod.startAndAwait(); // looks at every page, because its end was not clean
    expectSumsAfterCheck();
}

TEST_F(FaultsTest, ALogThatIsRemovedWhileTheServiceRunsCostsNoEvent)
{
    WireClient client = connect();
    send(client, 100);
    fs::remove(store().native() + "-wal");
    send(client, 100);
    kestod.kill();
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 1);
    EXPECT_EQ(counted(Counter::RemovedByDamage), 0U);
    EXPECT_GE(kestod.eventCount(), 402U);
    expectSumsInTime();
}

TEST_F(FaultsTest, ALedgerThatIsRemovedWhileTheServiceRunsIsMadeAnewWithAllCounts)
{
    WireClient client = connect();
    send(client, 10);
    const fs::path ledger = kestod.directory() / "state" / "analytics.ledger";
    fs::remove(ledger);
    EXPECT_TRUE(waitUntil([&] {
        send(client, 1);
        return fs::exists(ledger);
    }));
    kestod.kill();
    EXPECT_EQ(counted(Counter::Deliveries), static_cast<std::uint64_t>(sent));
    EXPECT_EQ(counted(Counter::Kept), 2 * static_cast<std::uint64_t>(sent));
    kestod.start();
    expectSumsInTime();
    EXPECT_EQ(counted(Counter::RemovedByDamage), 0U);
}

// By the seed of what is overwritten, and whether the service runs meanwhile.
class OverwrittenPagesTest : public FaultsTest, public testing::WithParamInterface<std::tuple<unsigned, bool>> { };

TEST_P(OverwrittenPagesTest, CostOnlyEventsThatAreCounted)
{
    constexpr std::uint64_t pageSize = 8192;
    const auto [seed, runs] = GetParam();
    std::mt19937 random(seed);
    WireClient client = connect();
    send(client, 300, 1000);
    kestod.kill();
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 5); // the log is in the database now
    if (!runs)
        kestod.kill();
    support::overwriteRandomPages(store(), 1 + seed % 8, random, pageSize);
    if (runs) {
        send(again, 100, 1000);
        kestod.kill();
    }
    kestod.startAndAwait();
    expectSumsAfterCheck();
    const std::uint64_t kept = counted(Counter::Kept);
    WireClient last = connect();
    send(last, 10);
    EXPECT_GE(counted(Counter::Kept), kept + 20);
}

INSTANTIATE_TEST_SUITE_P(OfSeed, OverwrittenPagesTest, testing::Combine(testing::Range(1U, 9U), testing::Bool()),
                         [](const auto& test) {
                             return std::to_string(std::get<0>(test.param))
                                 + (std::get<1>(test.param) ? "WhileRunning" : "WhileStopped");
                         });

// --- Disks

// The disk of the state directory has 2 MB.
class FullDiskTest : public FaultsTest {
protected:
    void SetUp() override
    {
        if (!disk)
            GTEST_SKIP() << "needs the right to mount";
        FaultsTest::SetUp();
    }

    const SmallDisk disk{kestod.directory() / "state", "2m"};
};

TEST_F(FullDiskTest, ADiskThatIsFullAndFreeAgainLosesWhatItCountsAsLost)
{
    WireClient client = connect();
    send(client, 10);
    disk.fill();
    send(client, 100, 4000);
    EXPECT_GT(counted(Counter::LostToDiskFull), 0U);
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    disk.free();
    const std::uint64_t kept = counted(Counter::Kept);
    send(client, 10);
    EXPECT_EQ(counted(Counter::Kept), kept + 20) << "it keeps events again";
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
    EXPECT_EQ(counted(Counter::Events), 240U);
}

TEST_F(FaultsTest, AStoreThatIsReadOnlyAndWritableAgainLosesWhatItCountsAsLost)
{
    WireClient client = connect();
    send(client, 10);
    kestod.kill();
    {
        const ReadOnlyView view(store());
        if (!view)
            GTEST_SKIP() << "needs the right to mount";
        kestod.start();
        client = connect();
        send(client, 10);
        EXPECT_EQ(counted(Counter::LostToReadOnly), 20U);
        EXPECT_THAT(brokenSums(kestod), IsEmpty());
    }
    EXPECT_TRUE(waitUntil([&] { // it tries again every second
        send(client, 1);
        return counted(Counter::Kept) > 20;
    }));
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

// --- Clocks

class ClockTest : public FaultsTest, public testing::WithParamInterface<std::chrono::days> {
protected:
    void SetUp() override
    {
        kestod.shiftClock(std::chrono::seconds(0));
        FaultsTest::SetUp();
    }
};

TEST_P(ClockTest, ThatIsSetWhileTheServiceRunsCostsNoEvent)
{
    WireClient client = connect();
    send(client, 10);
    kestod.shiftClock(GetParam());
    send(client, 10);
    kestod.kill();
    kestod.startAndAwait();
    WireClient again = connect();
    send(again, 10);
    const double shift = std::chrono::duration<double>(GetParam()).count();
    const std::vector<std::string> times =
        kestod.query("SELECT time FROM events WHERE name GLOB '*.Start' ORDER BY id");
    ASSERT_EQ(times.size(), 60U);
    EXPECT_NEAR(std::stod(times.back()) - std::stod(times.front()), shift, 100) << "the service saw the clock";
    EXPECT_EQ(readLedger(kestod).sum(ledger::Charge::Removed), 0U);
    expectSumsInTime();
}

TEST_P(ClockTest, ThatIsSetWhileTheServiceIsStoppedCostsNoEvent)
{
    WireClient client = connect();
    send(client, 10);
    kestod.kill();
    kestod.shiftClock(GetParam());
    kestod.start();
    WireClient again = connect();
    send(again, 10);
    EXPECT_EQ(counted(Counter::Kept), 40U);
    EXPECT_EQ(readLedger(kestod).sum(ledger::Charge::Removed), 0U);
    expectSumsInTime();
}

INSTANTIATE_TEST_SUITE_P(By, ClockTest, testing::Values(std::chrono::days(91), std::chrono::days(-3653)),
                         [](const auto& shift) { return shift.param.count() > 0 ? "NinetyOneDays" : "TenYearsBack"; });

// --- Ends under load

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

enum class End : std::uint8_t { BySigkill, ByKillService, BySigterm };
const char* nameOf(End end)
{
    switch (end) {
    case End::BySigkill: return "BySigkill";
    case End::ByKillService: return "ByKillService";
    case End::BySigterm: break;
    }
    return "BySigterm";
}

class EndUnderLoadTest : public FaultsTest, public testing::WithParamInterface<End> {
protected:
    void end()
    {
        switch (GetParam()) {
        case End::BySigkill: return kestod.kill();
        case End::ByKillService:
            WireClient(kestod.socketPath()).call(KillService);
            EXPECT_EQ(kestod.exitStatus(), 2);
            return;
        case End::BySigterm:
            kestod.signal(SIGTERM);
            EXPECT_EQ(kestod.exitStatus(), 0);
            return;
        }
    }
};

TEST_P(EndUnderLoadTest, WhatWasAnsweredIsCountedAndKept)
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
            end();
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

INSTANTIATE_TEST_SUITE_P(Ends, EndUnderLoadTest, testing::Values(End::BySigkill, End::ByKillService, End::BySigterm),
                         [](const auto& test) { return nameOf(test.param); });

TEST(FloodedLogTest, AClientThatCallsTooOftenLosesItsOwnLinesOnly)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.startAndAwait();
    constexpr int calls = 10'000;
    {
        WireClient flooding(kestod.socketPath());
        flooding.ask(Create, 1);
        for (int call = 0; call < calls; ++call)
            flooding.call(Validate, 1);
        for (int call = 0; call < calls; ++call)
            ASSERT_TRUE(flooding.nextReply());
    }
    EXPECT_TRUE(waitUntil([&] { return kestod.countInLog("made too many log lines") != 0; }));
    WireClient(kestod.socketPath()).ask(Validate, 4711);
    kestod.awaitLog();
    const std::size_t written = kestod.countInLog("validating reporter 1\n");
    EXPECT_GE(written, 1990U) << "its first lines are others";
    EXPECT_LT(written, 5000U);
    EXPECT_EQ(readLedger(kestod)[Counter::LogLinesLeftOut], calls - written);
    EXPECT_EQ(kestod.countInLog("validating reporter 4711\n"), 1U);
}

TEST(FloodedLogTest, AProcessThatComesAndGoesTooOftenLosesItsOwnLinesOnly)
{
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.startAndAwait();
    constexpr std::size_t connections = 5'000;
    constexpr std::size_t linesOfEach = 5; // about the connection itself
    for (std::size_t number = 0; number < connections; ++number)
        WireClient(kestod.socketPath()).ask(Create, 1);
    EXPECT_TRUE(waitUntil([&] { return readLedger(kestod)[Counter::SessionsGone] == connections; }));
    EXPECT_TRUE(doInAnotherProcess([&] { WireClient(kestod.socketPath()).ask(Validate, 4711); }));
    EXPECT_TRUE(waitUntil([&] { return kestod.countInLog("validating reporter 4711\n") == 1; }));
    const std::size_t written = kestod.countInLog("newConnection: ") + kestod.countInLog("new client with pid")
        + kestod.countInLog("removing ") + kestod.countInLog("dealloc ")
        + kestod.countInLog("invalidationHandler: connection exited");
    EXPECT_GE(written, 2000U);
    EXPECT_LT(written, linesOfEach * connections / 2);
    EXPECT_GT(readLedger(kestod)[Counter::LogLinesLeftOut], linesOfEach * connections / 2);
}

TEST(BlockedLogTest, CallsAreAnsweredAndLinesThatAreLostAreCounted)
{
    std::array<int, 2> ends{};
    ASSERT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    const platform::FileDescriptor reader(ends[0]); // reads nothing
    const platform::FileDescriptor writer(ends[1]);
    Kestod kestod({}, {{"KESTO_LOG", "default"}});
    kestod.start({.standardError = writer.get()});
    constexpr int callsOfAProcess = 1500; // each with a line, and within the process's share
    for (int count = 0; count < 8; ++count) // more than may wait
        ASSERT_TRUE(doInAnotherProcess([&] {
            WireClient client(kestod.socketPath());
            for (int call = 0; call < callsOfAProcess; ++call)
                client.call(Validate, 1);
            for (int call = 0; call < callsOfAProcess; ++call)
                std::ignore = client.nextReply().value();
        }));
    const ledger::Account account = readLedger(kestod);
    EXPECT_GT(account[Counter::LogLinesLost], 0U);
    EXPECT_EQ(account[Counter::LogLinesLeftOut], 0U);
    WireClient(kestod.socketPath()).call(KillService);
    EXPECT_EQ(kestod.exitStatus(), 2) << "the end does not wait for ever";
}

TEST_F(FaultsTest, ConnectionsThatComeAndGoAreCounted)
{
    WireClient client = connect();
    constexpr std::uint64_t count = 10'000;
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
