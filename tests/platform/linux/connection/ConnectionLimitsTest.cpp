// SPDX-License-Identifier: Apache-2.0
// Clients that ask for too much or read too little, and too many clients: each limit holds, affects only the client
// that reached it, and ends with its cause.
#include "platform/linux/connection/ConnectionHarness.h"
#include "support/Sanitizers.h"

#include <atomic>
#include <gmock/gmock.h>
#include <sys/resource.h>

namespace platform {
namespace {

using foundation::Array;
using ledger::Counter;
using support::answerTo;
using support::callNumber;
using support::ConnectionRecord;
using support::SocketClient;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

class ConnectionLimits : public support::ConnectionTest {
protected:
    // Writes calls with so much text, numbered from 0, until the service has stopped reading them and the socket is
    // full. Returns the number of complete calls; `unfinished` is the rest of the next one.
    int writeUntilNotRead(SocketClient& client, std::size_t textLength)
    {
        for (int number = 0;; ++number) {
            unfinished = callNumber(number, textLength);
            while (!unfinished.empty()) {
                const std::size_t count = client.writeWhatFits(unfinished);
                unfinished.erase(0, count);
                if (count == 0 && counted(Counter::ReadingPauses) == 1)
                    return number;
            }
        }
    }

    std::string unfinished; // the rest of the call that was being written
};

TEST_F(ConnectionLimits, ASlowReaderGetsAllOfALargeAnswer)
{
    constexpr int answers = 6;
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    for (int answer = 1; answer <= answers; ++answer)
        support::sendAtOnce(*record.connection, answerTo({answer}, 700 * 1024)); // more than a socket accepts
    EXPECT_EQ(client.readNumbers(answers), (std::vector<int>{1, 2, 3, 4, 5, 6}));
}

TEST_F(ConnectionLimits, WhoDoesNotReadItsAnswersHoldsUpOnlyItself)
{
    constexpr std::size_t answerSize = 512 * 1024;
    constexpr int answers = static_cast<int>(LinuxConnection::manyUnsentBytes / answerSize) + 2;
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    SocketClient other(path);
    ConnectionRecord& otherRecord = connected();

    for (int answer = 1; answer <= answers; ++answer)
        support::sendAtOnce(*record.connection, answerTo({answer}, answerSize));
    EXPECT_EQ(counted(Counter::ReadingPauses), 1U);
    client.write(callNumber(1));

    other.write(callNumber(1));
    ASSERT_TRUE(waitForHistory(otherRecord, {"call 1"}));
    support::sendAtOnce(*otherRecord.connection, answerTo({1}));
    EXPECT_EQ(other.readNumber(), 1);
    EXPECT_EQ(callsOf(record), 0U) << "it was read from";

    for (int answer = 1; answer <= answers; ++answer)
        EXPECT_EQ(client.readNumber(), answer);
    EXPECT_TRUE(waitForHistory(record, {"call 1"}));
    EXPECT_THAT(logged(), IsEmpty());
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), 0U);
}

TEST_F(ConnectionLimits, WhoLeavesFarTooManyAnswersUnreadIsCutOff)
{
    constexpr std::size_t answerSize = 1000 * 1024;
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    SocketClient other(path);
    ConnectionRecord& otherRecord = connected();
    std::size_t sent = 0;
    while (sent <= LinuxConnection::mostUnsentBytes + 1024 * 1024) { // the rest is in the socket
        const std::string answer = answerTo({1}, answerSize);
        support::sendAtOnce(*record.connection, answer);
        sent += frameHeadSize + answer.size();
    }
    EXPECT_TRUE(waitForHistory(record, {"interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("it does not read its answers")));
    EXPECT_GT(counted(Counter::AnswerBytesDropped), LinuxConnection::mostUnsentBytes);
    EXPECT_LE(counted(Counter::AnswerBytesDropped), sent);
    EXPECT_THAT(loggedBehind(),
                ElementsAre(testing::MatchesRegex("connection of process .* was behind: reading paused "
                                                  "1 times, [0-9]+ bytes of answers were dropped")));

    other.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(otherRecord, {"call 1"}));
}

TEST_F(ConnectionLimits, AnAnswerThatNoFrameHoldsBreaksTheConnection)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    support::sendAtOnce(*record.connection, std::string(longestFrame + 1, 'x'));
    EXPECT_TRUE(waitForHistory(record, {"interrupted", "invalidated"}));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("an answer is longer than a frame may be")));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), frameHeadSize + longestFrame + 1);
}

TEST_F(ConnectionLimits, ReadingStopsWhileTheBytesOfUnansweredCallsAreTooMany)
{
    constexpr std::size_t textLength = 10 * 1024;
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    writeUntilNotRead(client, textLength);
    const std::size_t calls = callsOf(record);
    EXPECT_GT(calls * (textLength + 16), LinuxConnection::mostUnansweredBytes);
    EXPECT_LT(calls * textLength, LinuxConnection::mostUnansweredBytes + ConnectionHub::mostReadAtOnce + textLength);

    // The service reads from another client, but not from this one.
    SocketClient other(path);
    ConnectionRecord& otherRecord = connected();
    other.write(callNumber(1));
    ASSERT_TRUE(waitForHistory(otherRecord, {"call 1"}));
    EXPECT_EQ(callsOf(record), calls);

    // When the calls are answered, on any thread, reading goes on.
    std::vector<Connection::Call> answered = progress.look([&] { return std::exchange(record.calls, {}); });
    answered.clear();
    client.write(unfinished);
    EXPECT_TRUE(waitForCalls(record, 1));
    EXPECT_EQ(counted(Counter::ConnectionsInterrupted), 0U);
}

TEST_F(ConnectionLimits, ReadingStopsWhileTheUnansweredCallsAreTooMany)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    writeUntilNotRead(client, 0);
    const std::size_t calls = callsOf(record);
    const std::size_t mostInOneRead = ConnectionHub::mostReadAtOnce / callNumber(1).size();
    EXPECT_GT(calls, LinuxConnection::mostUnansweredCalls);
    EXPECT_LE(calls, LinuxConnection::mostUnansweredCalls + mostInOneRead + 1);
    progress.look([&] { return std::exchange(record.calls, {}); }).clear();
    client.write(unfinished);
    EXPECT_TRUE(waitForCalls(record, 1));
}

// A client that accepts no more answers may still send many calls.
TEST_F(ConnectionLimits, WhoDoesNotListenIsReadFromAllTheSame)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.write(callNumber(1));
    ASSERT_TRUE(waitForCalls(record, 1));
    client.stopReading();
    support::sendAtOnce(*record.connection, answerTo({1}));
    client.write(callNumber(2));
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 2"}));
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), frameHeadSize + answerTo({1}).size());
    client.close();
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 2", "invalidated"}));
}

// Reading pauses because of unsent answers. All of them are dropped without being sent, and then reading must go on.
TEST_F(ConnectionLimits, WhoDoesNotListenIsReadFromAgainWhenItsAnswersWereDropped)
{
    constexpr std::size_t answerSize = 1000 * 1024;
    constexpr std::size_t answers = LinuxConnection::manyUnsentBytes / answerSize + 1; // answers of one turn
    std::vector<WorkItem> letters;
    LinuxWorkQueues queues;
    queues.setTurnEndHandler([&](Turn& turn) {
        if (auto send = turn.letters.take())
            progress.change([&] { letters.push_back(std::move(send)); });
    });
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    {
        const auto queue = queues.makeTurnQueue("server", {.mayBeHelped = true});
        for (std::size_t turns = 1; turns <= 2; ++turns) {
            queue->submit([&](Turn& turn) {
                for (std::size_t answer = 0; answer < answers; ++answer)
                    record.connection->send(turn, answerTo({1}, answerSize));
            });
            ASSERT_TRUE(progress.waitFor([&] { return letters.size() == turns; }));
        }
    }
    client.stopReading();
    for (WorkItem& letter : letters)
        letter();
    EXPECT_GT(counted(Counter::AnswerBytesDropped), 2 * LinuxConnection::manyUnsentBytes);
    client.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(record, {"call 1"}));
}

// Nothing of this is the client's fault: it reads its answers, and has few calls unanswered.
TEST_F(ConnectionLimits, ReadingStopsWhileTheLaneIsFullAndNoPauseIsCounted)
{
    constexpr std::uint64_t calls = 20'000;
    LinuxWorkQueues queues;
    const auto queue = queues.makeTurnQueue("server", {});
    const auto mayRun = queues.makeSemaphore(0);
    queue->submit([&] { mayRun->wait(); });
    const auto lane = queue->makeLane({});
    beforeResuming = [&, isFirst = true](Connection& connection) mutable {
        if (std::exchange(isFirst, false))
            connection.setLane(lane, ledger.workloads().open(connection.userIdentifier()));
    };
    std::atomic<std::uint64_t> submitted = 0;
    std::atomic<std::uint64_t> ran = 0;
    handler = [&](ConnectionRecord&, Connection::Call&) -> std::expected<void, Connection::Violation> {
        ++submitted;
        lane->submit([&] { ++ran; });
        return {};
    };
    listen();
    SocketClient client(path);
    const std::jthread writer([&] {
        for (std::uint64_t number = 0; number < calls; ++number)
            client.write(callNumber(static_cast<int>(number)));
    });
    ASSERT_TRUE(waitForCounter(submitted, 512));
    SocketClient other(path); // when it has been read from, the first one was not again
    static_cast<void>(connected());
    static_cast<void>(connected());
    const std::size_t mostInOneRead = ConnectionHub::mostReadAtOnce / callNumber(1).size();
    EXPECT_LE(submitted, 512 + mostInOneRead + 1);
    mayRun->signal();
    EXPECT_TRUE(waitForCounter(ran, calls));
    EXPECT_EQ(counted(Counter::ReadingPauses), 0U);
    stop();
}

// The program makes connections faster than the queue, which here waits, can remove them.
TEST_F(ConnectionLimits, AProcessWhoseEndsWaitGetsNoMoreConnectionsUntilTheyAreCarriedOut)
{
    constexpr std::size_t most = 16'384;
    LinuxWorkQueues queues;
    const auto queue = queues.makeTurnQueue("server", {});
    const auto mayRun = queues.makeSemaphore(0);
    queue->submit([&] { mayRun->wait(); });
    beforeResuming = [&](Connection& connection) {
        connection.setLane(queue->makeLane({connection.userIdentifier(), connection.processIdentifier()}),
                           ledger.workloads().open(connection.userIdentifier()));
    };
    listen();
    for (std::size_t connection = 0; connection < most; ++connection)
        SocketClient(path).close();
    ASSERT_TRUE(waitForCount(Counter::ConnectionsEnded, most));
    EXPECT_EQ(counted(Counter::ConnectionsRefusedUnfinished), 0U);

    for (int attempt = 0; attempt < 3; ++attempt)
        EXPECT_EQ(SocketClient(path).readNumber(), std::nullopt) << "it is closed immediately";
    EXPECT_EQ(counted(Counter::ConnectionsRefusedUnfinished), 3U);
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), most);
    const std::string process = std::to_string(::getpid());
    const std::string user = std::to_string(::getuid());
    EXPECT_THAT(logged(),
                ElementsAre("process " + process
                            + " gets no more connections for now: 16384 of its own have ended and are not "
                              "removed yet, and 16384 of user "
                            + user + " in all"));

    mayRun->signal();
    EXPECT_TRUE(waitUntil([&] {
        const SocketClient again(path);
        return counted(Counter::ConnectionsAccepted) > most;
    }));
    stop();
}

// Also the starts of ten thousand sessions, which are answered when the sessions stop.
TEST_F(ConnectionLimits, CallsThatStayUnansweredForHoursDoNotHoldUpTheOthers)
{
    constexpr int starts = 10'000;
    constexpr std::uint64_t others = 50'000;
    std::vector<std::shared_ptr<void>> held;
    std::atomic<std::uint64_t> answered = 0;
    handler = [&](ConnectionRecord&, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        if (held.size() < starts)
            held.push_back(std::move(call.caller));
        else
            ++answered;
        return {};
    };
    listen();
    SocketClient client(path);
    for (int number = 0; number < starts + static_cast<int>(others); ++number)
        client.write(callNumber(number, 10));
    EXPECT_TRUE(waitForCounter(answered, others));
}

TEST_F(ConnectionLimits, AClientThatGoesWhileItIsNotReadFromIsNoticed)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    const int written = writeUntilNotRead(client, 1000);
    client.close();
    EXPECT_TRUE(waitForEnd(record));
    stop();
    EXPECT_EQ(record.calls.size(), static_cast<std::size_t>(written)) << "the bytes that it had written were lost";
    EXPECT_THAT(loggedBehind(),
                ElementsAre(testing::EndsWith("was behind: reading paused 1 times, 0 bytes of answers were dropped")));
}

TEST_F(ConnectionLimits, CreditGivenBackFromManyThreadsIsAllThere)
{
    constexpr int rounds = 50'000;
    std::mutex mutex;
    std::vector<std::shared_ptr<void>> held;
    std::atomic<std::uint64_t> delivered = 0;
    handler = [&](ConnectionRecord&, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        const std::scoped_lock lock(mutex);
        held.push_back(std::move(call.caller));
        ++delivered;
        return {};
    };
    listen();
    SocketClient client(path);
    std::vector<std::jthread> answering;
    for (int index = 0; index < 3; ++index) {
        answering.emplace_back([&](const std::stop_token& stopped) {
            while (!stopped.stop_requested()) {
                std::vector<std::shared_ptr<void>> some;
                {
                    const std::scoped_lock lock(mutex);
                    some.assign(std::make_move_iterator(held.end() - static_cast<std::ptrdiff_t>(held.size() / 2)),
                                std::make_move_iterator(held.end()));
                    held.resize(held.size() - held.size() / 2);
                    if (held.size() == 1)
                        held.clear();
                }
                std::this_thread::yield();
            }
        });
    }
    std::string calls;
    for (int number = 0; number < 100; ++number)
        calls += callNumber(number, 100);
    for (int sent = 0; sent < rounds; sent += 100)
        client.write(calls); // would block for ever if a call's room were lost
    EXPECT_TRUE(waitForCounter(delivered, rounds));
}

// The limit of descriptors.

class Descriptors : public support::ConnectionTest {
protected:
    Descriptors() { ::getrlimit(RLIMIT_NOFILE, &before); }
    ~Descriptors() override { ::setrlimit(RLIMIT_NOFILE, &before); }

    void limitTo(rlim_t count) const
    {
        rlimit limit = before;
        limit.rlim_cur = count;
        ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
    }

    // The number that the next descriptor will have.
    static rlim_t nextDescriptor() { return static_cast<rlim_t>(FileDescriptor(::dup(0)).get()); }

    rlimit before = {};
};

TEST_F(Descriptors, ClientsWaitUntilThereIsADescriptorForThem)
{
    KESTO_SKIP_WHERE_TYPES_ARE_CHECKED();
    listen();
    SocketClient first(path);
    ConnectionRecord& record = connected();
    SocketClient second(path);
    connected();
    SocketClient third(path);
    ConnectionRecord& ofThird = connected();
    limitTo(nextDescriptor() + 1);
    SocketClient waiting(path); // takes the last descriptor, so that the service has none to accept it
    ASSERT_TRUE(waitForCount(Counter::AcceptingPauses, 1));

    // Meanwhile the others are served, and the service does not try again and again.
    third.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(ofThird, {"call 1"}));
    first.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(record, {"call 1"}));
    EXPECT_EQ(counted(Counter::AcceptingPauses), 1U);
    EXPECT_THAT(logged(), ElementsAre("new connections have to wait, with 3 open: Too many open files"));

    // The end of a connection makes room immediately.
    waiting.write(callNumber(1));
    first.close();
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
}

TEST_F(Descriptors, ClientsAreAcceptedAfterAPauseWhenDescriptorsWereFreedElsewhere)
{
    KESTO_SKIP_WHERE_TYPES_ARE_CHECKED();
    listen();
    limitTo(nextDescriptor() + 1);
    SocketClient waiting(path);
    ASSERT_TRUE(waitForCount(Counter::AcceptingPauses, 1));
    ::setrlimit(RLIMIT_NOFILE, &before);
    waiting.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
    EXPECT_EQ(logged().size(), 1U);
}

TEST_F(Descriptors, SomeConnectionsAreKeptFromEachUser)
{
    constexpr std::size_t mostOfOneUser = 6; // three quarters of the half that the service itself does not keep
    descriptors = 16;
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    for (std::size_t index = 0; index < mostOfOneUser; ++index) {
        clients.push_back(std::make_unique<SocketClient>(path));
        connected();
    }
    for (int attempt = 0; attempt < 3; ++attempt)
        EXPECT_EQ(SocketClient(path).readNumber(), std::nullopt) << "it is closed immediately";
    EXPECT_EQ(counted(Counter::ConnectionsRefused), 3U);
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), mostOfOneUser);
    EXPECT_THAT(
        logged(),
        ElementsAre("user " + std::to_string(::getuid()) + " has 6 connections and gets no more until one ends"));

    const auto last = progress.look([&] { return records.back(); });
    clients.pop_back();
    ASSERT_TRUE(waitForEnd(*last));
    SocketClient again(path);
    again.write(callNumber(1));
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
    EXPECT_EQ(SocketClient(path).readNumber(), std::nullopt);
    EXPECT_EQ(logged().size(), 1U) << "a user that stays at the limit writes no line at each refusal";
}

TEST_F(Descriptors, ClientsThatComeAndGoWithoutAPauseLeaveRoomForOthersOfTheirUser)
{
    constexpr std::uint64_t connections = 2000;
    descriptors = 64; // of which 32 are for clients, and 24 for those of one user
    beforeResuming = [](Connection& connection) { // an end takes longer than an acceptance
        connection.setInvalidationHandler([] { std::this_thread::sleep_for(std::chrono::microseconds(50)); });
    };
    listen();
    for (std::uint64_t number = 0; number < connections; ++number)
        SocketClient(path).close();
    EXPECT_TRUE(waitForCount(Counter::ConnectionsEnded, connections));
    EXPECT_EQ(counted(Counter::ConnectionsRefused), 0U);
}

TEST_F(Descriptors, ARefusalIsLoggedAgainOnceHalfOfTheUsersConnectionsEnded)
{
    descriptors = 16;
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    const auto connectUpToSix = [&] {
        while (clients.size() < 6) {
            clients.push_back(std::make_unique<SocketClient>(path));
            connected();
        }
        EXPECT_EQ(SocketClient(path).readNumber(), std::nullopt);
    };
    connectUpToSix();
    const auto ended = progress.look([&] { return std::vector(records.end() - 3, records.end()); });
    clients.resize(3);
    for (const auto& record : ended)
        ASSERT_TRUE(waitForEnd(*record));
    connectUpToSix();
    EXPECT_EQ(logged().size(), 2U);
}

TEST_F(Descriptors, SomeAreKeptFromClients)
{
    constexpr std::size_t most = 3;
    descriptors = 6;
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    for (std::size_t index = 0; index < most; ++index) {
        clients.push_back(std::make_unique<SocketClient>(path));
        connected();
    }
    SocketClient waiting(path);
    waiting.write(callNumber(1));
    ASSERT_TRUE(waitForCount(Counter::AcceptingPauses, 1));
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), most);
    clients.pop_back();
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
    EXPECT_THAT(logged(), ElementsAre("new connections have to wait, with 3 open: Too many open files"));
}

TEST_F(Descriptors, NoMoreThan64AreKeptFromClients)
{
    constexpr std::size_t mostOfOneUser = 102; // of 200, 136 are for clients; of these a fourth for other users
    descriptors = 200;
    listen();
    std::vector<std::unique_ptr<SocketClient>> clients;
    for (std::size_t index = 0; index < mostOfOneUser; ++index) {
        clients.push_back(std::make_unique<SocketClient>(path));
        connected();
    }
    EXPECT_EQ(SocketClient(path).readNumber(), std::nullopt);
    EXPECT_EQ(counted(Counter::ConnectionsAccepted), 102U);
    EXPECT_EQ(counted(Counter::ConnectionsRefused), 1U);
}

} // namespace
} // namespace platform
