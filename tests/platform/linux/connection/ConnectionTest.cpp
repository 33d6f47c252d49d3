// SPDX-License-Identifier: Apache-2.0
// Connections over real sockets: calls and answers, all the ways in which they end, and the time at which the answers
// of a turn leave.
#include "platform/linux/connection/ConnectionHarness.h"

#include <array>
#include <atomic>
#include <fcntl.h>
#include <fstream>
#include <gmock/gmock.h>
#include <latch>
#include <numeric>
#include <ranges>
#include <set>
#include <sys/resource.h>
#include <unistd.h>

namespace platform {
namespace {

using foundation::Array;
using foundation::Value;
using ledger::Counter;
using support::answerTo;
using support::callNumber;
using support::ConnectionRecord;
using support::framed;
using support::SocketClient;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

std::vector<int> numbersUpTo(int last)
{
    std::vector<int> numbers(static_cast<std::size_t>(last));
    std::iota(numbers.begin(), numbers.end(), 1);
    return numbers;
}

class Connections : public support::ConnectionTest { };

TEST_F(Connections, NameTheProcessAndTheUserAtTheOtherEnd)
{
    listen();
    SocketClient client(path);
    EXPECT_EQ(connected().connection->description(),
              "connection of process " + std::to_string(::getpid()) + " (user " + std::to_string(::getuid()) + ")");
}

TEST_F(Connections, PutCallsTogetherThatArriveInPieces)
{
    listen();
    SocketClient client(path);
    for (const char byte : callNumber(1) + callNumber(2))
        client.write(std::string_view(&byte, 1));
    EXPECT_TRUE(waitForHistory(connected(), {"call 1", "call 2"}));
}

TEST_F(Connections, TakeTheLongestFrame)
{
    listen();
    SocketClient client(path);
    const std::string overhead = callNumber(1, longestFrame / 2).substr(frameHeadSize);
    const std::size_t textLength = longestFrame - (overhead.size() - longestFrame / 2);
    const std::string call = callNumber(1, textLength);
    ASSERT_EQ(call.size(), frameHeadSize + longestFrame);
    client.write(call);
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
}

TEST_F(Connections, CallAllHandlersOnOneThread)
{
    listen();
    SocketClient client(path);
    SocketClient other(path);
    client.write(callNumber(1));
    client.close();
    other.write(callNumber(1) + "\x01");
    other.close();
    ConnectionRecord& first = connected();
    ConnectionRecord& second = connected();
    EXPECT_TRUE(waitForEnd(first));
    EXPECT_TRUE(waitForEnd(second));
    stop();
    std::set<std::thread::id> threads(first.threads.begin(), first.threads.end());
    threads.insert(second.threads.begin(), second.threads.end());
    EXPECT_EQ(threads.size(), 1U);
}

TEST_F(Connections, AreNotInterruptedWhenTheListenerStopsInsideAFrame)
{
    listen();
    SocketClient client(path);
    client.write(callNumber(1) + "\x01");
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForCalls(record, 1));
    stop();
    EXPECT_THAT(record.history, ElementsAre("call 1", "invalidated"));
    EXPECT_THAT(logged(), IsEmpty());
}

TEST_F(Connections, BreakByTheirLastCallWhenTheListenerStops)
{
    std::latch isBusy(1);
    std::latch goesOn(1);
    handler = [&](ConnectionRecord& record, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        if (call.frame[0] == Value(2))
            return std::unexpected(Connection::Violation{"method 99 is unknown"});
        progress.change([&] { record.history.emplace_back("call 1"); });
        isBusy.count_down();
        goesOn.wait();
        return {};
    };
    listen();
    SocketClient client(path);
    client.write(callNumber(1));
    ConnectionRecord& record = connected();
    isBusy.wait();
    client.write(callNumber(2));
    listener->stop();
    goesOn.count_down();
    stop();
    EXPECT_THAT(record.history, ElementsAre("call 1", "interrupted", "invalidated"));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("method 99 is unknown")));
}

TEST_F(Connections, EndAfterTheStoppedHandler)
{
    beforeListening = [this] {
        listener->setStoppedHandler([this] { EXPECT_THAT(records.at(0)->history, IsEmpty()); });
    };
    listen();
    const SocketClient client(path);
    ConnectionRecord& record = connected();
    stop();
    EXPECT_THAT(record.history, ElementsAre("invalidated"));
}

TEST_F(Connections, AreNotAcceptedByAListenerThatWasStoppedBeforeItBegan)
{
    beforeListening = [this] { listener->stop(); };
    listen();
    SocketClient client(path); // waits in the socket
    stop();
    EXPECT_THAT(records, IsEmpty());
    listener.reset();
    EXPECT_EQ(client.readNumber(), std::nullopt);
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(Connections, MayOutliveTheirListener)
{
    listen();
    SocketClient client(path);
    client.write(callNumber(1));
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForCalls(record, 1));
    stop();
    listener.reset();
    support::sendAtOnce(*record.connection, answerTo(record.calls[0].frame));
    record.calls.clear(); // releases the caller
    EXPECT_EQ(client.readNumber(), std::nullopt);
}

TEST_F(Connections, DropAndCountWhatIsSentToThemWhenTheyAreOver)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.close();
    ASSERT_TRUE(waitForHistory(record, {"invalidated"}));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), 0U);
    support::sendAtOnce(*record.connection, std::string(100, 'x'));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), frameHeadSize + 100);
}

TEST_F(Connections, DiscardDescriptorsThatAClientPasses)
{
    listen();
    const auto openDescriptors = [] {
        return std::distance(std::filesystem::directory_iterator("/proc/self/fd"),
                             std::filesystem::directory_iterator());
    };
    SocketClient client(path);
    ConnectionRecord& record = connected();
    const auto before = openDescriptors();

    std::string call = callNumber(1);
    iovec bytes = {call.data(), call.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control = {};
    msghdr message = {};
    message.msg_iov = &bytes;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    const int passed = client.descriptor();
    std::memcpy(CMSG_DATA(header), &passed, sizeof passed);
    ASSERT_EQ(::sendmsg(client.descriptor(), &message, 0), static_cast<ssize_t>(call.size()));

    EXPECT_TRUE(waitForCalls(record, 1));
    EXPECT_EQ(openDescriptors(), before);
}

TEST_F(Connections, ServeAThousandClientsAtOnce)
{
    constexpr std::size_t count = 1000;
    rlimit limit = {};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &limit), 0);
    if (limit.rlim_max < 2 * count + 200)
        GTEST_SKIP() << "the process may open only " << limit.rlim_max << " files";
    const rlimit before = limit;
    limit.rlim_cur = limit.rlim_max;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);

    handler = [](ConnectionRecord& record, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        support::sendAtOnce(*record.connection, answerTo(call.frame));
        return {};
    };
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    for (std::size_t index = 0; index < count; ++index)
        clients.push_back(std::make_unique<SocketClient>(path));
    for (std::size_t index = 0; index < count; ++index)
        clients[index]->write(callNumber(static_cast<int>(index)) + callNumber(static_cast<int>(count + index)));
    for (std::size_t index = 0; index < count; ++index) {
        EXPECT_EQ(clients[index]->readNumber(), static_cast<int>(index));
        EXPECT_EQ(clients[index]->readNumber(), static_cast<int>(count + index));
    }
    clients.clear();
    EXPECT_TRUE(progress.waitFor([&] {
        return std::ranges::all_of(
            records, [](const auto& record) { return record->history == std::vector<std::string>{"invalidated"}; });
    }));
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), count);
    EXPECT_EQ(counted(Counter::ConnectionsInterrupted), 0U);
    ::setrlimit(RLIMIT_NOFILE, &before);
}

// The ends of connections.

class ConnectionEnds : public support::ConnectionTest { };

TEST_F(ConnectionEnds, WithoutInterruptionWhenThePeerClosesBetweenFrames)
{
    listen();
    SocketClient client(path);
    client.write(callNumber(1));
    client.close();
    EXPECT_TRUE(waitForHistory(connected(), {"call 1", "invalidated"}));
    EXPECT_THAT(logged(), IsEmpty());
    EXPECT_EQ(counted(Counter::ConnectionsInterrupted), 0U);
}

TEST_F(ConnectionEnds, WithoutInterruptionWhenThePeerOnlyStopsWriting)
{
    listen();
    SocketClient client(path);
    client.stopWriting();
    EXPECT_TRUE(waitForHistory(connected(), {"invalidated"}));
    EXPECT_THAT(logged(), IsEmpty());
}

TEST_F(ConnectionEnds, WithAnInterruptionInsideAFrame)
{
    listen();
    SocketClient client(path);
    const std::string call = callNumber(2, 100);
    client.write(callNumber(1) + call.substr(0, call.size() / 2));
    client.close();
    EXPECT_TRUE(waitForHistory(connected(), {"call 1", "interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("the stream ends inside a frame")));
    EXPECT_EQ(counted(Counter::ConnectionsInterrupted), 1U);
}

TEST_F(ConnectionEnds, WithAnInterruptionInsideAHead)
{
    listen();
    SocketClient client(path);
    client.write("\x05");
    client.close();
    EXPECT_TRUE(waitForHistory(connected(), {"interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("the stream ends inside a frame")));
}

// A peer resets a Unix connection if it closes the connection before it has read everything.
TEST_F(ConnectionEnds, WithAnInterruptionWhenThePeerResetsIt)
{
    listen();
    SocketClient client(path);
    client.write(callNumber(1));
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForCalls(record, 1));
    support::sendAtOnce(*record.connection, answerTo(record.calls[0].frame));
    client.waitForSomethingToRead();
    client.write(callNumber(2)); // it is still delivered
    client.close();
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 2", "interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("Connection reset by peer")));
}

TEST_F(ConnectionEnds, WithAnInterruptionWhenAnAnswerFindsThePeerGone)
{
    std::latch isHeldUp(1);
    std::latch proceed(1);
    handler = [&](ConnectionRecord&, Connection::Call&) -> std::expected<void, Connection::Violation> {
        isHeldUp.count_down();
        proceed.wait();
        return {};
    };
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    support::sendAtOnce(*record.connection, answerTo({1}));
    client.waitForSomethingToRead();
    SocketClient other(path);
    other.write(callNumber(1));
    isHeldUp.wait(); // the connection thread is busy, so only the answer can find that the peer has gone
    client.close();
    support::sendAtOnce(*record.connection, answerTo({2}));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), frameHeadSize + answerTo({2}).size());
    proceed.count_down();
    EXPECT_TRUE(waitForHistory(record, {"interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("Connection reset by peer")));
}

struct BadFrame {
    std::string name;
    std::string bytes;
    std::string reason;
};

void PrintTo(const BadFrame& frame, std::ostream* out)
{
    *out << frame.name;
}

std::string rawFrame(std::string_view item)
{
    std::string bytes;
    appendFrame(item, bytes);
    return bytes;
}

std::string deeplyNested(std::size_t depth)
{
    return std::string(depth - 1, '\x81') + '\x80';
}

class Violations : public ConnectionEnds, public testing::WithParamInterface<BadFrame> { };

TEST_P(Violations, EndThatConnectionWithOneLineAndNoOther)
{
    listen();
    SocketClient bad(path);
    ConnectionRecord& badRecord = connected();
    SocketClient good(path);
    ConnectionRecord& goodRecord = connected();
    good.write(callNumber(1));
    ASSERT_TRUE(waitForCalls(goodRecord, 1));

    bad.write(callNumber(1) + GetParam().bytes + callNumber(2)); // the second call is never read
    EXPECT_TRUE(waitForHistory(badRecord, {"call 1", "interrupted", "invalidated"}));
    EXPECT_EQ(bad.readNumber(), std::nullopt);
    EXPECT_THAT(logged(), ElementsAre(endsBecause(GetParam().reason)));
    EXPECT_EQ(counted(Counter::ConnectionsInterrupted), 1U);

    good.write(callNumber(2));
    EXPECT_TRUE(waitForHistory(goodRecord, {"call 1", "call 2"}));
    support::sendAtOnce(*goodRecord.connection, answerTo({2}));
    EXPECT_EQ(good.readNumber(), 2);
}

INSTANTIATE_TEST_SUITE_P(
    Framing, Violations,
    testing::Values(BadFrame{"TooLong", std::string("\x01\x00\x10\x00", 4), "a frame is longer than 1048576 bytes"},
                    BadFrame{"MuchTooLong", "\xFF\xFF\xFF\xFF", "a frame is longer than 1048576 bytes"},
                    BadFrame{"Empty", std::string(4, '\0'), "the CBOR item is not complete"},
                    BadFrame{"TooDeep", rawFrame(deeplyNested(33)), "the CBOR item is nested too deep"},
                    BadFrame{"NotCbor", rawFrame("\xFF"), "not well-formed CBOR"},
                    BadFrame{"HttpRequest", "GET / HTTP/1.1\r\n\r\n", "a frame is longer than 1048576 bytes"},
                    BadFrame{"Truncated", rawFrame("\x82\x01"), "the CBOR item is not complete"},
                    BadFrame{"TwoItems", rawFrame(std::string("\x80\x80", 2)), "bytes follow the CBOR item"},
                    BadFrame{"InvalidUtf8", rawFrame("\x81\x62\xC3\x28"), "text is not valid UTF-8"},
                    BadFrame{"NoArray", rawFrame("\x01"), "a frame is not an array"}),
    [](const auto& instance) { return instance.param.name; });

TEST_F(ConnectionEnds, WithAnInterruptionWhenTheHandlerFindsAViolation)
{
    std::vector<int> handled;
    handler = [&](ConnectionRecord&, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        handled.push_back(static_cast<int>(call.frame[0].number()->int64Value()));
        if (handled.back() == 2)
            return std::unexpected(Connection::Violation{"method 99 is unknown"});
        return {};
    };
    listen();
    SocketClient client(path);
    client.write(callNumber(1) + callNumber(2) + callNumber(3));
    EXPECT_TRUE(waitForHistory(connected(), {"interrupted", "invalidated"}));
    EXPECT_THAT(handled, ElementsAre(1, 2));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("method 99 is unknown")));
}

// Answers and turns.

class Turns : public support::ConnectionTest {
protected:
    Turns()
    {
        queues.setTurnEndHandler([this](Turn& turn) {
            if (auto send = turn.letters.take())
                progress.change([&] { ended.push_back(std::move(send)); });
        });
        queue = queues.makeTurnQueue("server", {.mayBeHelped = true});
    }
    void TearDown() override
    {
        stop();
        queue.reset();
    }

    // Runs the function as a separate turn.
    void turn(const std::function<void(Turn&)>& function)
    {
        const std::size_t before = progress.look([&] { return ended.size(); });
        queue->submit([&](Turn& turn) { function(turn); });
        ASSERT_TRUE(progress.waitFor([&] { return ended.size() > before; }));
    }

    LinuxWorkQueues queues;
    std::shared_ptr<TurnQueue> queue;
    std::vector<WorkItem> ended; // send the answers of the turns that ended
};

TEST_F(Turns, HoldTheirAnswersBackUntilWhatTheyStoredIsKept)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    turn([&](Turn& turn) {
        record.connection->send(turn, answerTo({1}));
        record.connection->send(turn, answerTo({2}));
    });
    EXPECT_FALSE(client.hasSomethingToRead());
    std::jthread([&] { ended[0](); }); // like a store's thread
    EXPECT_THAT(client.readNumbers(2), ElementsAre(1, 2));
}

TEST_F(Turns, HoldBackNothingThatIsSentOutsideOfThem)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    turn([&](Turn& turn) {
        record.connection->send(turn, answerTo({1}));
        std::jthread([&] { support::sendAtOnce(*record.connection, answerTo({2})); });
    });
    EXPECT_EQ(client.readNumber(), 2);
    EXPECT_FALSE(client.hasSomethingToRead());
    ended[0]();
    EXPECT_EQ(client.readNumber(), 1);
}

TEST_F(Turns, SendToSeveralConnectionsInTheOrderOfEach)
{
    constexpr int answers = 50;
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    std::vector<ConnectionRecord*> connections;
    for (int index = 0; index < 5; ++index) {
        clients.push_back(std::make_unique<SocketClient>(path));
        connections.push_back(&connected());
    }
    for (int rounds = 0; rounds < 2; ++rounds) {
        turn([&](Turn& turn) {
            for (int answer = 1; answer <= answers; ++answer) {
                for (ConnectionRecord* record : connections)
                    record->connection->send(turn, answerTo({rounds * answers + answer}));
            }
        });
    }
    for (WorkItem& send : ended)
        send();
    for (const auto& client : clients)
        EXPECT_EQ(client->readNumbers(2 * answers), numbersUpTo(2 * answers));
}

TEST_F(Turns, SendNothingToConnectionsThatEndedMeanwhile)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    turn([&](Turn& turn) { record.connection->send(turn, answerTo({1})); });
    client.close();
    ASSERT_TRUE(waitForHistory(record, {"invalidated"}));
    ended[0]();
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), frameHeadSize + answerTo({1}).size());
}

TEST_F(Turns, AreHelpedWithByTheConnectionThread)
{
    std::thread::id ranOn;
    handler = [&](ConnectionRecord& record, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        queue->submit([&ranOn, connection = record.connection, call = std::move(call)](Turn& turn) {
            ranOn = std::this_thread::get_id();
            EXPECT_EQ(Connection::current(), nullptr);
            connection->send(turn, answerTo(call.frame));
        });
        return {};
    };
    listen();
    SocketClient client(path);
    client.write(callNumber(1));
    ASSERT_TRUE(progress.waitFor([&] { return ended.size() == 1; }));
    ended[0]();
    EXPECT_EQ(client.readNumber(), 1);
    client.close();
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForHistory(record, {"invalidated"}));
    EXPECT_EQ(ranOn, record.threads[0]);
}

// From several threads, with a client that is sometimes slow: every answer comes once, and those of a thread in order.
TEST_F(Turns, AnswersFromManyThreadsAllArrive)
{
    constexpr int threads = 4;
    constexpr int answers = 2000;
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    std::vector<std::jthread> senders;
    for (int sender = 0; sender < threads; ++sender) {
        senders.emplace_back([&, sender] {
            for (int answer = 0; answer < answers; ++answer)
                support::sendAtOnce(*record.connection, answerTo({sender * answers + answer}, 500));
        });
    }
    std::vector<int> next(threads, 0);
    for (const int number : client.readNumbers(threads * answers)) {
        const auto sender = static_cast<std::size_t>(number / answers);
        EXPECT_EQ(number % answers, next[sender]);
        ++next[sender];
    }
    EXPECT_EQ(next, std::vector<int>(threads, answers));
}

} // namespace
} // namespace platform
