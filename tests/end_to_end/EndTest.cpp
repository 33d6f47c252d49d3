// SPDX-License-Identifier: Apache-2.0
// The end in order: on SIGTERM and SIGINT the service ends its connections as if the clients had gone, keeps what this
// yields, and ends with status 0, within five seconds in any case.
#include "end_to_end/Kestod.h"
#include "end_to_end/ServiceManager.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using support::playback;
using support::typeStart;
using testing::AnyOf;
using testing::Each;
using testing::Field;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;
using testing::SizeIs;

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr std::string_view uptimeEvents = "com.quarn.kesto.kestoreportingclientuptime";
constexpr std::string_view volumeEvents = "com.quarn.kesto.Volume.Summary";
constexpr std::string_view startEvents = "com.quarn.kesto.Playback.Start";
constexpr auto limit = 5s;
constexpr auto lateness = 1s; // until a busy machine shows the end to the test

// Only internal builds derive volume events from the messages' own times.
const Kestod::Files internalBuild = {{"device.toml", "InternalBuild = true\n"}};

// A session that plays: ten seconds by its messages.
void play(WireClient& client, int session)
{
    client.ask(Create, session);
    client.call(Start, session);
    for (const double time : {10.0, 20.0})
        client.ask(SendMessage,
                   Dictionary{{"session_output_running", time < 20},
                              {"PomoSessionVolume", 0.5},
                              {"kestoreporting_timestamp", time}},
                   playback, typeStart, Array{session});
}

// Ends the service by the signal. It must end in order, within the limit.
void endBy(Kestod& kestod, int signal)
{
    const auto begin = Clock::now();
    kestod.signal(signal);
    EXPECT_EQ(kestod.exitStatus(), 0);
    EXPECT_LT(Clock::now() - begin, limit + lateness);
}

class EndBySignalTest : public testing::TestWithParam<int> { };

INSTANTIATE_TEST_SUITE_P(Of, EndBySignalTest, testing::Values(SIGTERM, SIGINT),
                         [](const auto& input) { return input.param == SIGTERM ? "SIGTERM" : "SIGINT"; });

TEST_P(EndBySignalTest, AnIdleServiceSaysWhoAskedAndRemovesItsSocket)
{
    Kestod kestod;
    kestod.startAndAwait();
    endBy(kestod, GetParam());
    EXPECT_THAT(kestod.log(),
                HasSubstr("the service ends: process " + std::to_string(::getpid()) + " (user "
                          + std::to_string(::getuid()) + ") sent " + (GetParam() == SIGTERM ? "SIGTERM" : "SIGINT")));
    EXPECT_FALSE(std::filesystem::exists(kestod.socketPath()));
    EXPECT_EQ(kestod.countInLog("given up"), 0U);
}

TEST_P(EndBySignalTest, StartedSessionsStopAndTheirClientsGetTheirUptime)
{
    Kestod kestod(internalBuild);
    kestod.start();
    WireClient first(kestod.socketPath());
    WireClient second(kestod.socketPath());
    play(first, 1);
    play(first, 2);
    play(second, 3);
    endBy(kestod, GetParam());
    EXPECT_THAT(kestod.events(volumeEvents), SizeIs(3));
    EXPECT_THAT(kestod.events(volumeEvents), Each(Field(&StoreRow::payload, HasSubstr(R"("play_seconds":10)"))));
    EXPECT_THAT(kestod.events(uptimeEvents), SizeIs(2));
    for (const std::string_view line :
         {"ending session 1", "ending session 2", "ending session 3", "removing ", "dealloc "})
        EXPECT_NE(kestod.countInLog(line), 0U) << line;
    EXPECT_EQ(kestod.countInLog("interruptionHandler"), 0U);
    EXPECT_TRUE(first.isClosed()) << "without an answer to the starts";
}

// A session whose end takes long: one of the client that waits for its stop, and one of a client that is still there.
TEST_P(EndBySignalTest, LongSessionsAreReportedInFull)
{
    constexpr int changes = 1000; // twice what ends at once; few enough for a slow machine to report within the limit
    Kestod kestod(internalBuild);
    kestod.start();
    WireClient stopping(kestod.socketPath());
    WireClient playing(kestod.socketPath());
    for (auto* client : {&stopping, &playing}) {
        const int session = client == &stopping ? 1 : 2;
        client->ask(Create, session);
        client->call(Start, session);
        for (int change = 0; change <= changes; ++change)
            client->ask(SendMessage,
                        Dictionary{{"session_output_running", true},
                                   {"PomoSessionVolume", change % 2},
                                   {"kestoreporting_timestamp", change}},
                        playback, typeStart, Array{session});
    }
    stopping.call(Stop, 1);
    endBy(kestod, GetParam());
    EXPECT_THAT(kestod.events(volumeEvents), SizeIs(2 * changes));
    EXPECT_THAT(kestod.events(uptimeEvents), SizeIs(2));
    EXPECT_EQ(kestod.countInLog("given up"), 0U);
    EXPECT_THAT(brokenSums(kestod), testing::IsEmpty());
}

TEST(EndTest, AThousandClientsGetTheirUptimeAndTheirSessionsStop)
{
    constexpr int count = 1000;
    Kestod kestod(internalBuild, {{"KESTO_LOG", "error"}});
    kestod.start();
    std::vector<std::unique_ptr<WireClient>> clients;
    for (int number = 1; number <= count; ++number) {
        clients.push_back(std::make_unique<WireClient>(kestod.socketPath()));
        play(*clients.back(), number);
    }
    endBy(kestod, SIGTERM);
    EXPECT_THAT(kestod.events(uptimeEvents), SizeIs(count));
    EXPECT_THAT(kestod.events(volumeEvents), SizeIs(count));
}

// Sends without waiting for the single answers, until the service closes the connection.
struct BusyClient {
    BusyClient(const Kestod& kestod, int number) : client(kestod.socketPath()), session(number)
    {
        play(client, session);
        thread = std::jthread([this] { work(); });
    }
    void work()
    {
        constexpr int burst = 2000;
        while (true) {
            client.sendFrame(Array{0, static_cast<int>(SendMessage), Dictionary{{"busy", session}}, playback, typeStart,
                                   Array{session}},
                             burst);
            for (int number = 0; number < burst; ++number) {
                if (client.isClosed())
                    return;
                ++answered;
            }
        }
    }

    WireClient client;
    int session;
    std::atomic<std::size_t> answered = 0;
    std::jthread thread; // ends first
};

TEST_P(EndBySignalTest, UnderLoadEveryAnsweredCallIsInTheStore)
{
    constexpr int count = 4;
    Kestod kestod(internalBuild, {{"KESTO_LOG", "error"}});
    kestod.start();
    std::vector<std::unique_ptr<BusyClient>> clients;
    for (int session = 1; session <= count; ++session)
        clients.push_back(std::make_unique<BusyClient>(kestod, session));
    ASSERT_TRUE(waitUntil(
        [&] { return std::ranges::all_of(clients, [](const auto& client) { return client->answered > 5000; }); }));
    endBy(kestod, GetParam());
    for (const auto& client : clients)
        client->thread.join();
    const auto stored = kestod.events(startEvents);
    for (const auto& client : clients) {
        const std::string own = R"("busy":)" + std::to_string(client->session) + ",";
        const auto kept = std::ranges::count_if(stored, [&](const auto& row) { return row.payload.contains(own); });
        EXPECT_GE(static_cast<std::size_t>(kept), client->answered);
    }
    EXPECT_THAT(kestod.events(uptimeEvents), SizeIs(count));
    EXPECT_THAT(kestod.events(volumeEvents), SizeIs(count));
}

// --- the limit

// A thread of the service that runs no more, as if it waited for a disk that hangs.
class FrozenThread {
public:
    FrozenThread(const Kestod& kestod, std::string_view name)
    {
        const auto thread = findThread(kestod, name);
        if (!thread)
            throw std::runtime_error("the service has no such thread");
        // Asleep in an idle service, it holds no lock.
        waitUntil([&] {
            const auto stat = support::readFile(pathOf(kestod, std::to_string(*thread)) / "stat");
            return stat.contains(") S ");
        });
        isFrozen_ = ::ptrace(PTRACE_SEIZE, *thread, nullptr, nullptr) == 0
            && ::ptrace(PTRACE_INTERRUPT, *thread, nullptr, nullptr) == 0
            && ::waitpid(*thread, nullptr, __WALL) == *thread;
        if (isFrozen_)
            waitsForEnd_ = std::jthread([thread = *thread] { ::waitpid(thread, nullptr, __WALL); });
    }

    // False where no process may stop another's thread.
    [[nodiscard]] bool isFrozen() const { return isFrozen_; }

private:
    // What the kernel shows of a thread; without its number, of all.
    static std::filesystem::path pathOf(const Kestod& kestod, const std::string& thread = {})
    {
        return std::filesystem::path("/proc") / std::to_string(kestod.process()) / "task" / thread;
    }
    static std::optional<pid_t> findThread(const Kestod& kestod, std::string_view name)
    {
        for (const auto& thread : std::filesystem::directory_iterator(pathOf(kestod)))
            if (support::readFile(thread.path() / "comm") == std::string(name) + "\n")
                return std::stoi(thread.path().filename());
        return std::nullopt;
    }

    bool isFrozen_ = false;
    std::jthread waitsForEnd_; // the process ends only when this thread's end was taken notice of
};

class EndWithAHangingDiskTest : public testing::Test {
protected:
    // Starts the service with one client, whose last message is not stored.
    void startAndFreeze(const InheritedDescriptors& inherited = {})
    {
        kestod.start(inherited);
        client.emplace(kestod.socketPath());
        client->ask(SendMessage, Dictionary{{"a", 1}}, playback, typeStart, Value());
        frozen.emplace(kestod, "analytics");
        if (!frozen->isFrozen())
            GTEST_SKIP() << "threads of other processes cannot be stopped here";
        client->call(SendMessage, Dictionary{{"a", 2}}, playback, typeStart, Value());
    }

    std::optional<FrozenThread> frozen; // ends after the service
    Kestod kestod{{}, {{"KESTO_LOG", "default"}}};
    std::optional<WireClient> client;
};

TEST_F(EndWithAHangingDiskTest, TheServiceEndsInTimeAndSaysWhatIsNotStored)
{
    startAndFreeze();
    if (IsSkipped())
        return;
    endBy(kestod, SIGTERM);
    EXPECT_THAT(kestod.log(),
                HasSubstr("the end was cut short: it takes longer than 4500ms: given up: 0 calls and ends of "
                          "connections, 0 items of background work, 3 events that were not stored yet\n"));
    EXPECT_THAT(kestod.log(), HasSubstr("lost since the start: lost.end 3\n"));
    const auto lost = readLedger(kestod).culprits[static_cast<std::size_t>(ledger::Charge::Lost)];
    ASSERT_THAT(lost, SizeIs(1));
    EXPECT_EQ(lost[0].culprit, (ledger::Culprit{.user = ::getuid(), .process = "end_to_end_test", .application = {}}));
    EXPECT_EQ(lost[0].count, 3U);
    EXPECT_THAT(kestod.events(startEvents), SizeIs(1));
    EXPECT_TRUE(client->isClosed()) << "it was not answered";
}

TEST_F(EndWithAHangingDiskTest, ASecondSignalEndsTheServiceAtOnce)
{
    startAndFreeze();
    if (IsSkipped())
        return;
    kestod.signal(SIGTERM);
    ASSERT_TRUE(kestod.waitForLog("the service ends: "));
    const auto begin = Clock::now();
    kestod.signal(SIGINT);
    EXPECT_EQ(kestod.exitStatus(), 0);
    EXPECT_LT(Clock::now() - begin, 2s);
    EXPECT_THAT(kestod.log(),
                HasSubstr("the end was cut short: a second signal came: process " + std::to_string(::getpid())
                          + " (user " + std::to_string(::getuid()) + ") sent SIGINT: given up: "));
}

TEST_F(EndWithAHangingDiskTest, TheServiceEndsInTimeEvenIfItsLogHangsToo)
{
    int ends[2] = {};
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const platform::FileDescriptor reader(ends[0]);
    const platform::FileDescriptor writer(ends[1]);
    startAndFreeze({.standardError = writer.get()});
    if (IsSkipped())
        return;
    ASSERT_EQ(::fcntl(writer.get(), F_SETFL, O_NONBLOCK), 0);
    const std::string much(65536, '\n');
    while (::write(writer.get(), much.data(), much.size()) > 0) { }
    while (::write(writer.get(), much.data(), 1) > 0) { }
    ASSERT_EQ(::fcntl(writer.get(), F_SETFL, 0), 0);
    endBy(kestod, SIGTERM);
}

TEST(EndTest, MinutesOfWorkAreCutShortInTimeAndCounted)
{
    constexpr int sessions = 5000;
    constexpr int messages = 2000;
    Kestod kestod({}, {{"KESTO_LOG", "error"}});
    kestod.start();
    WireClient client(kestod.socketPath());
    for (int session = 1; session <= sessions; ++session) {
        client.call(Create, session);
        client.call(Start, session);
        client.nextReply(); // to the first of the two
    }
    client.sendFrame(Array{0, static_cast<int>(SendMessage), Dictionary{{"a", 1}}, playback, typeStart, Value()},
                     messages); // to all sessions
    endBy(kestod, SIGTERM);
    EXPECT_THAT(kestod.log(),
                MatchesRegex("(.|\n)*the end was cut short: it takes longer than 4500ms: given up: "
                             "[1-9][0-9]+ calls and ends of connections, 0 items of background work, "
                             "[0-9]+ events that were not stored yet\n(.|\n)*"));
}

// --- the start

TEST(EndTest, TwoSignalsAtAnyMomentOfTheStartEndTheService)
{
    constexpr int moments = 100;
    Kestod kestod;
    for (int moment = 0; moment < moments; ++moment) {
        kestod.start();
        std::this_thread::sleep_for(moment * 500us); // the moment is what is tested
        kestod.signal(SIGTERM);
        kestod.signal(SIGTERM);
        EXPECT_THAT(kestod.exitStatus(), AnyOf(0, -SIGTERM)) << "after " << moment << " half milliseconds";
    }
    kestod.start();
    WireClient(kestod.socketPath()).ask(GetAllReporters);
    endBy(kestod, SIGTERM);
}

// --- the service manager

TEST(EndTest, TheServiceManagerHearsOfIt)
{
    Notifications manager;
    Kestod kestod({}, {{"NOTIFY_SOCKET", manager.path}});
    kestod.startAndAwait();
    EXPECT_THAT(manager.next(), HasSubstr("READY=1"));
    endBy(kestod, SIGTERM);
    EXPECT_THAT(manager.next(), HasSubstr("STOPPING=1\nSTATUS=ending: process "));
}

TEST(EndTest, APassedSocketStaysAndClientsOfItWaitForTheNextStart)
{
    Kestod kestod({}, {{"RUNTIME_DIRECTORY", ""}, {"KESTO_SERVICE_NAME", ""}});
    const std::filesystem::path path = kestod.directory() / "run" / "passed";
    const platform::FileDescriptor socket = socketBoundTo(path, SOCK_STREAM);
    ASSERT_EQ(::listen(socket.get(), SOMAXCONN), 0);
    kestod.start({.listeningSocket = socket.get()});
    WireClient(path).ask(GetAllReporters);
    endBy(kestod, SIGTERM);
    WireClient client(path);
    const auto call = client.call(GetAllReporters);
    kestod.start({.listeningSocket = socket.get()});
    EXPECT_EQ(client.replyTo(call), (Array{call, Value(), Array{}}));
}

} // namespace
} // namespace end_to_end
