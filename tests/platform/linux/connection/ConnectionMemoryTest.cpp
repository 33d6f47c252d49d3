// SPDX-License-Identifier: Apache-2.0
// What many connections hold together, on real sockets: the greedy wait or end, the modest are served, and no frame is
// lost.
#include "platform/linux/connection/ConnectionHarness.h"

#include <atomic>
#include <deque>
#include <filesystem>
#include <gmock/gmock.h>
#include <unistd.h>

namespace platform {
namespace {

using ledger::Counter;
using support::answerTo;
using support::callNumber;
using support::ConnectionRecord;
using support::framed;
using support::SocketClient;
using testing::ElementsAre;
using testing::IsEmpty;

// Calls wait in a queue until the test lets them go.
class ConnectionMemory : public support::ConnectionTest {
protected:
    ConnectionMemory()
    {
        queue = queues.makeTurnQueue("server", {});
        queue->submit([this] { mayRun->wait(); });
        beforeResuming = [this](Connection& connection) {
            const auto lane = queue->makeLane({connection.userIdentifier(), connection.processIdentifier()});
            progress.change([&] { lanes.push_back(lane); });
            connection.setLane(lane, ledger.workloads().open(connection.userIdentifier()));
        };
        handler = [this](ConnectionRecord& record, Connection::Call& call) {
            lanes[static_cast<std::size_t>(
                      std::ranges::find_if(records, [&](const auto& each) { return each.get() == &record; })
                      - records.begin())]
                ->submit([this, &record, frame = std::move(call.frame)] {
                    progress.change(
                        [&] { record.history.push_back("call " + std::to_string(frame[0].number()->int64Value())); });
                });
            ++delivered;
            return std::expected<void, Connection::Violation>();
        };
    }
    void TearDown() override
    {
        mayRun->signal();
        queue.reset();
        ConnectionTest::TearDown();
    }

    void listenWithin(const MemoryLimits& limits)
    {
        memory.setLimits(limits);
        beforeListening = [this] { listener->setMemory(memory); };
        listen();
    }
    // Makes the client send ten calls, of some 112,000 bytes. The last waits until the others are read: a read that
    // ends inside it would bring so many bytes that the rest of it is not read.
    void fill(SocketClient& client)
    {
        for (int number = 1; number <= 9; ++number)
            client.write(callNumber(number, 10'000));
        static_cast<void>(connected());
        ASSERT_TRUE(waitForCounter(delivered, 9));
        client.write(callNumber(10, 20'000));
        ASSERT_TRUE(waitForCounter(delivered, 10));
    }

    support::FakeMemory memory;
    LinuxWorkQueues queues;
    std::shared_ptr<TurnQueue> queue;
    const std::unique_ptr<Semaphore> mayRun = queues.makeSemaphore(0);
    std::vector<std::shared_ptr<Lane>> lanes;
    std::atomic<std::uint64_t> delivered = 0;
};

// Reading pauses beyond 100,000 bytes.
constexpr MemoryLimits small{.ofTheService = 400'000, .ofAUser = 200'000, .ofAClient = 200'000};

TEST_F(ConnectionMemory, ALargeFrameWaitsForTheOneThatIsBeingCompletedAndSmallCallsDoNot)
{
    listenWithin(small);
    SocketClient greedy(path);
    fill(greedy);
    const std::string large = callNumber(1, 50'000);

    SocketClient slow(path);
    static_cast<void>(connected());
    slow.write(std::string_view(large).substr(0, 20'000));
    SocketClient waiting(path);
    ConnectionRecord& ofWaiting = connected();
    waiting.write(large);
    ASSERT_TRUE(waitForCount(Counter::MemoryPauses, 1)) << "only one of the user may complete its frame";

    SocketClient modest(path);
    static_cast<void>(connected());
    modest.write(callNumber(1));
    EXPECT_TRUE(waitForCounter(delivered, 11)) << "a small call passes";

    slow.write(std::string_view(large).substr(20'000));
    EXPECT_TRUE(waitForCounter(delivered, 13)) << "one after the other";
    mayRun->signal();
    EXPECT_TRUE(waitForHistory(ofWaiting, {"call 1"}));
    EXPECT_THAT(logged(), IsEmpty());
}

TEST_F(ConnectionMemory, AGreedyClientIsReadAgainWhenItsCallsHaveRun)
{
    constexpr int calls = 100;
    listenWithin(small);
    SocketClient greedy(path);
    const std::jthread writer([&] {
        for (int number = 1; number <= calls; ++number)
            greedy.write(callNumber(number, 10'000));
    });
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForCount(Counter::MemoryPauses, 1));
    EXPECT_LE(delivered, 17U) << "100,000 bytes, and what one read brings";
    mayRun->signal();
    ASSERT_TRUE(waitForCounter(delivered, calls));
    ASSERT_TRUE(progress.waitFor([&] { return record.history.size() == calls; }));
    for (int number = 1; number <= calls; ++number)
        EXPECT_EQ(record.history[static_cast<std::size_t>(number - 1)], "call " + std::to_string(number));
}

TEST_F(ConnectionMemory, ARaisedLimitIsNoticedWithoutAnythingElse)
{
    listenWithin(small);
    SocketClient greedy(path);
    fill(greedy);
    greedy.write(callNumber(11, 10'000));
    ASSERT_TRUE(waitForCount(Counter::MemoryPauses, 1));
    memory.setLimits({.ofTheService = 400'000, .ofAUser = 400'000, .ofAClient = 400'000});
    EXPECT_TRUE(waitForCounter(delivered, 11));
}

TEST_F(ConnectionMemory, AClientThatGoesWhileItWaitsForRoomIsReadToItsEnd)
{
    listenWithin(small);
    SocketClient greedy(path);
    fill(greedy);
    for (int number = 11; number <= 14; ++number)
        greedy.write(callNumber(number, 10'000));
    ASSERT_TRUE(waitForCount(Counter::MemoryPauses, 1));
    greedy.close();
    mayRun->signal();
    EXPECT_TRUE(waitForCounter(delivered, 14));
    EXPECT_TRUE(waitForCount(Counter::ConnectionsEnded, 1));
}

TEST_F(ConnectionMemory, TheClientWithTheMostUnreadAnswersEndsWhenOneMoreDoesNotFit)
{
    listenWithin({.ofTheService = 16'000'000, .ofAUser = 4'500'000, .ofAClient = 4'500'000});
    SocketClient modest(path);
    ConnectionRecord& ofModest = connected();
    SocketClient greedy(path);
    ConnectionRecord& ofGreedy = connected();
    for (int answer = 1; answer <= 2; ++answer)
        support::sendAtOnce(*ofModest.connection, answerTo({answer}, 600'000)); // its socket takes a part
    for (int answer = 1; answer <= 4; ++answer)
        support::sendAtOnce(*ofGreedy.connection, answerTo({answer}, 700'000));
    support::sendAtOnce(*ofModest.connection, answerTo({3}, 600'000));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), 0U);
    support::sendAtOnce(*ofModest.connection, answerTo({4}, 600'000));
    EXPECT_TRUE(waitForHistory(ofGreedy, {"interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("it does not read its answers, and memory is short")));
    EXPECT_GT(counted(Counter::AnswerBytesDropped), 2'000'000U);
    EXPECT_LE(counted(Counter::AnswerBytesDropped), 2'800'072U);
    EXPECT_EQ(modest.readNumbers(4), (std::vector<int>{1, 2, 3, 4}));
}

TEST_F(ConnectionMemory, AClientEndsItselfWhenItAloneHasTooManyUnreadAnswers)
{
    listenWithin({.ofTheService = 16'000'000, .ofAUser = 2'500'000, .ofAClient = 2'000'000});
    SocketClient client(path);
    ConnectionRecord& record = connected();
    for (int answer = 1; answer <= 4; ++answer)
        support::sendAtOnce(*record.connection, answerTo({answer}, 700'000));
    EXPECT_TRUE(waitForHistory(record, {"interrupted", "invalidated"}));
    EXPECT_GT(counted(Counter::AnswerBytesDropped), 2'000'000U);

    SocketClient next(path);
    ConnectionRecord& ofNext = connected();
    for (int answer = 1; answer <= 2; ++answer)
        support::sendAtOnce(*ofNext.connection, answerTo({answer}, 700'000));
    EXPECT_EQ(next.readNumbers(2), (std::vector<int>{1, 2})) << "what the other held counts no longer";
}

TEST_F(ConnectionMemory, AnotherUserIsServedWhileOneHasUsedUpItsPart)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can be another user";
    constexpr uid_t otherUser = 65534;
    listenWithin(small);
    std::filesystem::permissions(directory.path(), std::filesystem::perms::all);
    std::filesystem::permissions(path, std::filesystem::perms::all);
    SocketClient greedy(path);
    fill(greedy);
    greedy.write(callNumber(11, 10'000));
    ASSERT_TRUE(waitForCount(Counter::MemoryPauses, 1));
    ASSERT_EQ(::seteuid(otherUser), 0);
    SocketClient other(path);
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_EQ(connected().connection->userIdentifier(), otherUser);
    for (int number = 1; number <= 5; ++number)
        other.write(callNumber(number, 10'000));
    EXPECT_TRUE(waitForCounter(delivered, 15));
    EXPECT_EQ(counted(Counter::MemoryPauses), 1U);
}

} // namespace
} // namespace platform
