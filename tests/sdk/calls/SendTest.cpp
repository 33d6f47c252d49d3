// SPDX-License-Identifier: Apache-2.0
// The promises of `send`: counts, limits, many threads, no allocation, no system call. The last is also one of the
// calls of playbacks.
#include "kesto/kesto.hpp"
#include "kesto/playback.hpp"
#include "sdk/Allocations.h"
#include "sdk/FakeService.h"
#include "sdk/ServedClientTest.h"
#include "support/Sanitizers.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <atomic>
#include <csignal>
#include <cstddef>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <linux/audit.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <map>
#include <numeric>
#include <optional>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using kesto::Category;
using kesto::EventType;
using kesto::Status;
using sdk_test::Answers;
using sdk_test::FakeService;
using testing::ElementsAre;

class SendTest : public sdk_test::ServedClientTest {
protected:
    void connect(FakeService::Handler handler = sdk_test::answerObediently, kesto::Options options = {})
    {
        service_.emplace(path_, std::move(handler));
        options.socketPath = path_;
        options.stateChanged = states_.callback();
        ASSERT_EQ(client_.open(options), Status::Ok);
        ASSERT_EQ(states_.waitFor(1).size(), 1U);
    }

    Status send(const kesto::Message& message) { return client_.send(message, Category::IO, EventType::Error, 42); }

    // Sends until the queue refuses; returns the number of messages taken.
    std::uint64_t fill(const kesto::Message& message)
    {
        std::uint64_t taken = 0;
        for (;;) {
            const Status status = send(message);
            if (status != Status::Ok) {
                EXPECT_EQ(status, Status::QueueFull);
                return taken;
            }
            ++taken;
        }
    }
};

TEST_F(SendTest, CountsWhatBecameOfEveryMessage)
{
    connect();
    kesto::Message message;
    kesto::Message unfinished;
    unfinished.beginArray("list");
    for (int count = 0; count < 10; ++count)
        EXPECT_EQ(send(message), Status::Ok);
    EXPECT_EQ(send(unfinished), Status::Misnested);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    const kesto::Statistics statistics = client_.statistics();
    EXPECT_EQ(statistics.queued, 10U);
    EXPECT_EQ(statistics.sent, 10U);
    EXPECT_EQ(statistics.answered, 10U);
    EXPECT_EQ(statistics.lost, 0U);
    EXPECT_EQ(statistics.dropped_unusable, 1U);
    EXPECT_EQ(statistics.connections, 1U);
}

TEST_F(SendTest, RefusesAMessageOfMoreThanAQuarterOfTheQueue)
{
    kesto::Options options;
    options.queueBytes = 4096;
    connect(sdk_test::answerObediently, options);
    kesto::Message large;
    EXPECT_EQ(send(large.add("text", std::string(1100, 'x'))), Status::TooLarge);
    EXPECT_EQ(client_.statistics().dropped_unusable, 1U);
    EXPECT_EQ(client_.setConfiguration(large, 42), Status::Ok) << "the queue does not limit a configuration";
    kesto::Message small;
    EXPECT_EQ(send(small.add("text", std::string(500, 'x'))), Status::Ok);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    EXPECT_EQ(client_.send(small, Category::IO, EventType::Error, std::vector<kesto::ReporterID>(200, 1)),
              Status::TooLarge);
}

TEST_F(SendTest, CountsTheTimesThatItAddsAmongTheBytesOfAMessage)
{
    kesto::Options options;
    options.queueBytes = 4096;
    connect(sdk_test::answerObediently, options);
    kesto::Message message;
    message.add("text", std::string(810, 'x'));
    ASSERT_EQ(message.size(), 818U);
    EXPECT_EQ(send(message), Status::Ok);
    message.clear().add("text", std::string(811, 'x'));
    EXPECT_EQ(send(message), Status::TooLarge);
}

// If the queue has room, the frame is the limit, for any share of entries and reporters.
TEST_F(SendTest, SendsWhatFitsIntoAFrameAndRefusesWhatDoesNot)
{
    constexpr std::size_t longestFrame = std::size_t{1} << 20;
    kesto::Options options;
    options.queueBytes = std::size_t{8} << 20;
    connect(sdk_test::answerObediently, options);
    const std::vector<kesto::ReporterID> reporters(1000, std::numeric_limits<kesto::ReporterID>::min());
    const auto sendText = [&](std::size_t length) {
        kesto::Message message;
        return client_.send(message.add("text", std::string(length, 'x')), Category::IO, EventType::Error, reporters);
    };
    std::size_t fits = 0;
    std::size_t isTooLarge = longestFrame;
    std::uint64_t sent = 0;
    while (isTooLarge - fits > 1) {
        const std::size_t length = std::midpoint(fits, isTooLarge);
        const Status status = sendText(length);
        if (status == Status::Ok) {
            fits = length;
            EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
            ++sent;
        } else {
            ASSERT_EQ(status, Status::TooLarge);
            isTooLarge = length;
        }
    }
    EXPECT_GT(fits, longestFrame - reporters.size() * 9 - 256) << "nearly all of a frame can be used";
    EXPECT_EQ(client_.statistics().answered, sent);
    EXPECT_EQ(client_.statistics().connections, 1U) << "the service took all messages";
}

TEST_F(SendTest, SendsToAsManyReportersAsTheServiceTakes)
{
    constexpr std::size_t most = 10'000;
    kesto::Options options;
    options.queueBytes = std::size_t{1} << 20;
    connect(sdk_test::answerObediently, options);
    const kesto::Message message;
    EXPECT_EQ(client_.send(message, Category::IO, EventType::Error, std::vector<kesto::ReporterID>(most, 1)),
              Status::Ok);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    EXPECT_EQ(client_.send(message, Category::IO, EventType::Error, std::vector<kesto::ReporterID>(most + 1, 1)),
              Status::TooLarge);
}

// A service that does not answer fills the queue, and then messages are refused: memory does not grow.
TEST_F(SendTest, RefusesAndCountsWhatDoesNotFitBehindAServiceThatDoesNotAnswer)
{
    kesto::Options options;
    options.queueBytes = 8192;
    options.unansweredLimit = 16;
    connect(sdk_test::answerNothing, options);
    kesto::Message message;
    message.add("text", "something to say");
    for (int count = 0; count < 16; ++count)
        EXPECT_EQ(send(message), Status::Ok);
    ASSERT_EQ(service_->waitForCalls(16).size(), 16U);
    const std::uint64_t taken = fill(message);
    EXPECT_GT(taken, 30U);
    EXPECT_LT(taken, 8192U / 64);
    EXPECT_EQ(client_.stopSession(42), Status::Ok) << "room is kept for other calls";
    while (client_.statistics().sent < 16) // the library counts them just after it has sent them
        std::this_thread::yield();
    kesto::Statistics statistics = client_.statistics();
    EXPECT_EQ(statistics.queued, 16 + taken);
    EXPECT_EQ(statistics.sent, 16U);
    EXPECT_EQ(statistics.dropped_queue_full, 1U);

    service_->forEachPeer([](sdk_test::Peer& peer) {
        for (std::uint64_t call = 1; call <= 16; ++call)
            peer.answer(call, {});
    });
    EXPECT_EQ(service_->waitForCalls(32).size(), 32U) << "answers make room";
    client_.close(std::chrono::milliseconds(0));
    statistics = client_.statistics();
    EXPECT_EQ(statistics.queued, statistics.answered + statistics.lost);
    EXPECT_EQ(statistics.answered, 16U);
}

TEST_F(SendTest, DoesNotPileUpBytesForAServiceThatDoesNotRead)
{
    kesto::Options options;
    options.queueBytes = 64 * 1024;
    connect(sdk_test::answerObediently, options);
    service_->setReading(false);
    kesto::Message message;
    message.add("text", std::string(8000, 'x'));
    std::uint64_t taken = 0;
    while (client_.statistics().dropped_queue_full == 0)
        taken += send(message) == Status::Ok ? 1 : 0;
    EXPECT_LT(taken * 8000, 2U * 1024 * 1024) << "the queue, the outbox and the socket's buffer, and no more";
    service_->setReading(true);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    EXPECT_EQ(client_.statistics().answered, taken);
}

TEST_F(SendTest, TakesMessagesOfManyThreadsAndKeepsTheOrderOfEach)
{
    connect();
    constexpr std::int64_t threads = 4;
    constexpr std::int64_t messagesEach = 2000;
    client_.createSession(42);
    client_.startSession(42);
    std::vector<std::thread> senders;
    for (std::int64_t thread = 0; thread < threads; ++thread)
        senders.emplace_back([this, thread] {
            kesto::Message message;
            for (std::int64_t number = 0; number < messagesEach; ++number) {
                message.clear().add("thread", thread).add("number", number);
                while (send(message) == Status::QueueFull)
                    std::this_thread::yield();
            }
        });
    for (std::thread& sender : senders)
        sender.join();
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    EXPECT_EQ(client_.statistics().answered, std::uint64_t{threads * messagesEach});
    std::map<std::int64_t, std::int64_t> next;
    for (const Array& call : service_->waitForCalls(threads * messagesEach + 2)) {
        if (sdk_test::method(call) != 6)
            continue;
        const Dictionary message = *call[2].dictionary();
        const std::int64_t thread = message.find("thread")->number()->int64Value();
        EXPECT_EQ(message.find("number")->number()->int64Value(), next[thread]++);
    }
    EXPECT_EQ(next,
              (std::map<std::int64_t, std::int64_t>{
                  {0, messagesEach}, {1, messagesEach}, {2, messagesEach}, {3, messagesEach}}));
}

// Only the message itself can make the thread send it.
TEST_F(SendTest, WakesAThreadThatSleeps)
{
    for (const bool wakeOnSend : {false, true}) {
        kesto::Options options;
        options.socketPath = path_;
        options.wakeOnSend = wakeOnSend;
        const FakeService service(path_);
        Answers answers;
        kesto::Client client;
        ASSERT_EQ(client.open(options), Status::Ok);
        const kesto::Message message;
        for (std::size_t count = 1; count <= 50; ++count) {
            ASSERT_EQ(client.send(message, Category::IO, EventType::Error, 42, answers.named("send")), Status::Ok);
            ASSERT_EQ(answers.waitFor(count).size(), count);
        }
    }
}

// While a session is started, the thread polls the queue, so that its messages arrive without a ring.
TEST_F(SendTest, ReachesTheServiceWithoutRingingWhileASessionIsStarted)
{
    connect();
    client_.createSession(42);
    client_.startSession(42);
    ASSERT_EQ(client_.flush(sdk_test::patience), Status::Ok);
    const kesto::Message message;
    for (std::size_t count = 1; count <= 10; ++count) {
        ASSERT_EQ(client_.send(message, Category::IO, EventType::Error, 42, answers_.named("send")), Status::Ok);
        ASSERT_EQ(answers_.waitFor(count).size(), count);
    }
}

TEST_F(SendTest, AllocatesNothing)
{
    connect();
    client_.createSession(42);
    client_.startSession(42);
    kesto::Message message;
    message.reserve(256);
    const std::vector<kesto::ReporterID> reporters{42, 43};
    const std::size_t before = sdk_test::allocations();
    for (int count = 0; count < 1000; ++count) {
        message.clear().add("volume", 0.5).add("running", true);
        client_.send(message, Category::Playback, EventType::Start, reporters);
    }
    EXPECT_EQ(sdk_test::allocations(), before);
}

// ---- No system call ----

// From here on, every system call of this thread kills the process, except the one that ends it.
void forbidSystemCalls()
{
    sock_filter program[] = {
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_exit_group, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_KILL_PROCESS),
    };
    const sock_fprog filter{static_cast<unsigned short>(std::size(program)), program};
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 || ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &filter) != 0)
        ::_exit(99);
}

constexpr std::uint64_t messagesWithoutSystemCalls = 20'000;

void check(Status status)
{
    if (status != Status::Ok)
        ::_exit(2);
}

// Sends messages until so many are answered. If it is to wait, it waits for each answer, so that the client's thread
// goes to sleep in between; else it sends as fast as the queue accepts.
void sendMessages(kesto::Client& client, bool waits)
{
    kesto::Message message;
    message.reserve(1024);
    forbidSystemCalls();
    std::uint64_t queued = 0;
    std::uint64_t answered = 0;
    while (answered < messagesWithoutSystemCalls) {
        answered = client.statistics().answered;
        if (queued == messagesWithoutSystemCalls || (waits && answered < queued))
            continue;
        message.clear().add("number", queued).add("volume", 0.5).add("device", "Speaker");
        queued += client.send(message, Category::Playback, EventType::Start, 42) == Status::Ok ? 1 : 0;
    }
}

void sendWithASession(kesto::Client& client)
{
    client.createSession(42);
    client.startSession(42);
    sendMessages(client, false);
}

void sendWithoutASession(kesto::Client& client)
{
    client.createSession(42);
    check(client.flush(sdk_test::patience));
    sendMessages(client, true);
}

// Every call between start and stop.
template <typename Stream> void change(Stream& stream, std::uint64_t round)
{
    stream.volume(static_cast<double>(round % 100) / 100);
    stream.mute(round % 2 == 0);
    stream.route(round % 2 == 0 ? "speaker" : "headset");
    stream.format({"S16LE", static_cast<std::uint32_t>(round), 2});
    stream.pause();
    stream.resume();
}

void playWithASession(kesto::Client& client)
{
    client.createSession(42);
    client.startSession(42);
    kesto::Playback playback(client, "player", kesto::ServiceType::Test);
    kesto::Recording recording(client, "recorder", kesto::ServiceType::Test);
    check(client.flush(sdk_test::patience));
    forbidSystemCalls();
    for (std::uint64_t round = 0; client.statistics().answered < messagesWithoutSystemCalls; ++round) {
        playback.start({"S16LE", 44100, 2}, "speaker");
        recording.start();
        change(playback, round);
        change(recording, round);
        playback.underrun(round, 0.5);
        recording.overrun(round, 0.5);
        playback.stop();
        recording.stop();
    }
    ::syscall(SYS_exit_group, 0); // before they are freed, which a real-time thread leaves to others
}

void playAlone(kesto::Client& client)
{
    kesto::Playback playback(client, "player", kesto::ServiceType::Test);
    check(playback.start());
    forbidSystemCalls();
    for (std::uint64_t round = 0; client.statistics().answered < messagesWithoutSystemCalls; ++round)
        change(playback, round);
    playback.stop();
    ::syscall(SYS_exit_group, 0);
}

// In a process of its own: makes a client and reports with it, until the reporting is complete or makes a forbidden
// system call.
[[noreturn]] void reportInAChild(int serviceIsThere, const std::string& path, void (*report)(kesto::Client&))
{
    ::alarm(static_cast<unsigned>(sdk_test::patience.count()));
    if (char go = 0; ::read(serviceIsThere, &go, 1) != 1)
        ::_exit(3);
    kesto::Client client;
    kesto::Options options;
    options.socketPath = path;
    if (client.open(options) != Status::Ok)
        ::_exit(1);
    report(client);
    ::syscall(SYS_exit_group, 0); // not _exit: with sanitizers it makes further system calls
    __builtin_unreachable();
}

// A process that is forked while it has only one thread, and a service for it.
class ReportingWithoutSystemCalls : public testing::Test {
protected:
    void SetUp() override
    {
        if (threadSanitizerWatches)
            GTEST_SKIP() << "the thread sanitizer makes system calls of its own whenever it sees a new atomic";
        if (::prctl(PR_GET_SECCOMP) < 0)
            GTEST_SKIP() << "an emulator of a processor filters no system calls";
    }

    int statusOf(void (*report)(kesto::Client&))
    {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe(ends.data()), 0);
        const pid_t child = ::fork();
        if (child == 0)
            reportInAChild(ends[0], path_, report);
        service_.emplace(path_);
        EXPECT_EQ(::write(ends[1], "!", 1), 1);
        int status = 0;
        EXPECT_EQ(::waitpid(child, &status, 0), child);
        ::close(ends[0]);
        ::close(ends[1]);
        return status;
    }

    support::TemporaryDirectory directory_;
    const std::string path_ = directory_ / "service";
    std::optional<FakeService> service_;
};

TEST_F(ReportingWithoutSystemCalls, IsWhatSendDoesWhileASessionIsStarted)
{
    const int status = statusOf(sendWithASession);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
    EXPECT_GE(service_->waitForCalls(messagesWithoutSystemCalls).size(), messagesWithoutSystemCalls);
}

TEST_F(ReportingWithoutSystemCalls, IsNotWhatSendDoesWhenTheThreadHasToBeWoken)
{
    const int status = statusOf(sendWithoutASession);
    EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGSYS) << "status " << status;
}

TEST_F(ReportingWithoutSystemCalls, IsWhatEveryCallOfAPlaybackDoesWhileASessionIsStarted)
{
    const int status = statusOf(playWithASession);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
    EXPECT_GE(service_->waitForCalls(messagesWithoutSystemCalls).size(), messagesWithoutSystemCalls);
}

TEST_F(ReportingWithoutSystemCalls, IsWhatAPlaybackDoesFromItsOwnStart)
{
    const int status = statusOf(playAlone);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
    EXPECT_GE(service_->waitForCalls(messagesWithoutSystemCalls).size(), messagesWithoutSystemCalls);
}

} // namespace
