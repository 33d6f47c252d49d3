// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Connection.h: the order of calls and ends, the lifetimes of handlers and callers, the time
// at which answers leave, and late answers.
#include "platform/contract/Contract.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/connection/SocketClient.h"
#include "platform/linux/queues/LinuxWorkQueues.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeConnection.h"
#include "support/fakes/FakeWorkQueues.h"

#include <atomic>
#include <gmock/gmock.h>
#include <optional>
#include <set>
#include <unistd.h>

namespace contract {
namespace {

using foundation::Array;
using foundation::Value;
using platform::Connection;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

// A call: a number, and text that makes it as large as the test needs.
Array callOf(int number, std::size_t textLength = 0)
{
    return {number, std::string(textLength, 'x')};
}

int numberOf(const Array& frame)
{
    return static_cast<int>(frame[0].number()->int64Value());
}

std::string answer(int number)
{
    return support::answerTo({number});
}

// A process that has connected.
class ContractPeer {
public:
    virtual ~ContractPeer() = default;
    // Makes the calls, all together, and does not wait until they are taken.
    virtual void call(const std::vector<Array>& frames) = 0;
    // Returns when the calls have left the peer.
    virtual void awaitSent() { }
    virtual void close() = 0;
    // Closes the connection in the middle of a call.
    virtual void breakOff() = 0;
    // The number of the next answer; nothing if the connection is closed.
    [[nodiscard]] virtual std::optional<int> nextAnswer() = 0;
    // Whether an answer has arrived.
    [[nodiscard]] virtual bool hasAnswer() = 0;
};

class ConnectionSubject {
public:
    virtual ~ConnectionSubject() = default;
    // Listens until `stop`.
    virtual void listen(platform::ConnectionListenerDelegate& delegate) = 0;
    virtual void stop() = 0;
    [[nodiscard]] virtual std::unique_ptr<ContractPeer> connect() = 0;
    // The process ID of the peers.
    [[nodiscard]] virtual std::int32_t peerProcess() const = 0;
    [[nodiscard]] virtual std::uint32_t peerUser() const = 0;
    // A queue with the turn-end handler of the service.
    [[nodiscard]] virtual platform::TurnQueue& serverQueue() = 0;
    // Runs waiting items, if no thread does.
    virtual void work() { }
};

class FakePeer final : public ContractPeer {
public:
    explicit FakePeer(std::shared_ptr<support::FakeConnection> connection) : connection_(std::move(connection)) { }
    void call(const std::vector<Array>& frames) override
    {
        for (const Array& frame : frames)
            if (!connection_->isOver())
                (void)connection_->call(frame);
    }
    void close() override { connection_->close(); }
    void breakOff() override { connection_->breakOff(); }
    [[nodiscard]] std::optional<int> nextAnswer() override
    {
        EXPECT_TRUE(hasAnswer() || connection_->isOver()) << "this would wait for ever";
        return hasAnswer() ? std::optional(numberOf(connection_->received()[read_++])) : std::nullopt;
    }
    [[nodiscard]] bool hasAnswer() override { return connection_->received().size() > read_; }

private:
    const std::shared_ptr<support::FakeConnection> connection_;
    std::size_t read_ = 0;
};

class FakeConnectionSubject final : public ConnectionSubject {
public:
    void listen(platform::ConnectionListenerDelegate& delegate) override { listener_.setDelegate(delegate); }
    void stop() override { listener_.stop(); }
    [[nodiscard]] std::unique_ptr<ContractPeer> connect() override
    {
        connections_.push_back(listener_.connect(peerProcess(), peerUser()));
        return std::make_unique<FakePeer>(connections_.back());
    }
    [[nodiscard]] std::int32_t peerProcess() const override { return 1001; }
    [[nodiscard]] std::uint32_t peerUser() const override { return 501; }
    [[nodiscard]] platform::TurnQueue& serverQueue() override { return *queue_; }
    void work() override
    {
        queues_.runAll();
        for (const auto& connection : connections_)
            connection->readOn();
    }

private:
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    std::shared_ptr<platform::TurnQueue> queue_ = queues_.makeTurnQueue("server", {.mayBeHelped = true});
    support::FakeConnectionListener listener_;
    std::vector<std::shared_ptr<support::FakeConnection>> connections_;
};

class LinuxPeer final : public ContractPeer {
public:
    explicit LinuxPeer(const std::filesystem::path& path) : client_(path) { }
    ~LinuxPeer() override { ::shutdown(client_.descriptor(), SHUT_RDWR); } // it may still be writing
    LinuxPeer(const LinuxPeer&) = delete;
    LinuxPeer& operator=(const LinuxPeer&) = delete;
    void call(const std::vector<Array>& frames) override
    {
        std::string bytes;
        for (const Array& frame : frames)
            bytes += support::framed(frame);
        writer_ = std::jthread([this, bytes = std::move(bytes)] {
            try {
                client_.write(bytes);
            } catch (const std::system_error&) { // the service has closed the connection
            }
        });
    }
    void awaitSent() override { join(); }
    void close() override
    {
        join();
        client_.close();
    }
    void breakOff() override
    {
        join();
        client_.write(support::framed(callOf(0, 100)).substr(0, 50));
        client_.close();
    }
    [[nodiscard]] std::optional<int> nextAnswer() override { return client_.readNumber(); }
    [[nodiscard]] bool hasAnswer() override { return client_.hasSomethingToRead(); }

private:
    void join()
    {
        if (writer_.joinable())
            writer_.join();
    }

    support::SocketClient client_;
    std::jthread writer_;
};

class LinuxConnectionSubject final : public ConnectionSubject {
public:
    LinuxConnectionSubject()
    {
        queues_.setTurnEndHandler([](platform::Turn& turn) {
            if (auto send = turn.letters.take())
                send();
        });
        queue_ = queues_.makeTurnQueue("server", {.mayBeHelped = true});
        // Both ends of every connection are in this process, so its limit stays unchanged.
        listener_ =
            platform::LinuxConnectionListener::create(platform::ListeningSocket::bind(path_).value(), ledger_, log_)
                .value();
    }
    ~LinuxConnectionSubject() override { stop(); }
    LinuxConnectionSubject(const LinuxConnectionSubject&) = delete;
    LinuxConnectionSubject& operator=(const LinuxConnectionSubject&) = delete;

    void listen(platform::ConnectionListenerDelegate& delegate) override
    {
        listener_->setDelegate(delegate);
        thread_ = std::thread([this] { listener_->resume(); });
    }
    void stop() override
    {
        if (!thread_.joinable())
            return;
        listener_->stop();
        thread_.join();
    }
    [[nodiscard]] std::unique_ptr<ContractPeer> connect() override { return std::make_unique<LinuxPeer>(path_); }
    [[nodiscard]] std::int32_t peerProcess() const override { return ::getpid(); }
    [[nodiscard]] std::uint32_t peerUser() const override { return ::getuid(); }
    [[nodiscard]] platform::TurnQueue& serverQueue() override { return *queue_; }

private:
    static inline constinit platform::LogCategory log_{"com.quarn.kesto", "kerc"};

    const support::TemporaryDirectory directory_;
    const std::filesystem::path path_ = directory_ / "socket";
    ledger::Ledger ledger_; // the end of a turn still counts what it cannot send
    platform::LinuxWorkQueues queues_;
    std::shared_ptr<platform::TurnQueue> queue_;
    std::unique_ptr<platform::LinuxConnectionListener> listener_;
    std::thread thread_;
};

// The record of one connection.
struct Record {
    std::shared_ptr<Connection> connection;
    std::vector<Connection::Call> calls; // not answered yet
    std::vector<std::string> history; // "call 1", "interrupted", "invalidated"
    std::set<std::thread::id> threads; // of the entries of `history`
    // The objects that the handlers hold, one in each handler.
    std::weak_ptr<int> callHandler;
    std::weak_ptr<int> interruptionHandler;
    std::weak_ptr<int> invalidationHandler;

    [[nodiscard]] bool holdsAllHandlers() const
    {
        return !callHandler.expired() && !interruptionHandler.expired() && !invalidationHandler.expired();
    }
    [[nodiscard]] bool holdsNoHandler() const
    {
        return callHandler.expired() && interruptionHandler.expired() && invalidationHandler.expired();
    }
};

class ConnectionContract : public Suite<ConnectionSubject>, public platform::ConnectionListenerDelegate {
public:
    bool shouldAcceptNewConnection(platform::ConnectionListener&,
                                   const std::shared_ptr<Connection>& connection) override
    {
        if (!accepts)
            return false;
        auto record = std::make_shared<Record>();
        record->connection = connection;
        const auto held = std::array{std::make_shared<int>(1), std::make_shared<int>(2), std::make_shared<int>(3)};
        record->callHandler = held[0];
        record->interruptionHandler = held[1];
        record->invalidationHandler = held[2];
        connection->setCallHandler(
            [this, record, mine = held[0]](Connection::Call call) { return take(*record, std::move(call)); });
        connection->setInterruptionHandler([this, record, mine = held[1]] { note(*record, "interrupted"); });
        connection->setInvalidationHandler([this, record, mine = held[2]] { note(*record, "invalidated"); });
        progress.change([&] {
            record->threads.insert(std::this_thread::get_id());
            records.push_back(record);
        });
        connection->resume();
        return true;
    }

protected:
    using Outcome = std::expected<void, Connection::Violation>;

    void TearDown() override { subject->stop(); } // while the test's objects still exist

    void listen() { subject->listen(*this); }

    // A peer, and the record of its connection.
    std::pair<std::unique_ptr<ContractPeer>, std::shared_ptr<Record>> connect()
    {
        auto peer = subject->connect();
        const std::size_t number = connected++;
        EXPECT_TRUE(progress.waitFor([&] { return records.size() > number; }));
        return {std::move(peer), progress.look([&] { return records.at(number); })};
    }
    std::pair<std::unique_ptr<ContractPeer>, std::shared_ptr<Record>> listenAndConnect()
    {
        listen();
        return connect();
    }
    [[nodiscard]] std::vector<std::string> historyOnceItHas(std::size_t length, Record& record)
    {
        subject->work();
        EXPECT_TRUE(progress.waitFor([&] { return record.history.size() >= length; }));
        return progress.look([&] { return record.history; });
    }
    [[nodiscard]] bool waitForEnd(Record& record)
    {
        subject->work();
        return progress.waitFor([&] { return !record.history.empty() && record.history.back() == "invalidated"; });
    }
    [[nodiscard]] std::size_t callsOf(Record& record)
    {
        return progress.look([&] { return record.calls.size(); });
    }
    // Returns after the delivery.
    void makeACall(ContractPeer& peer, Record& record)
    {
        const std::size_t before = callsOf(record);
        peer.call({callOf(1)});
        ASSERT_TRUE(progress.waitFor([&] { return record.calls.size() > before; }));
    }

    void note(Record& record, const std::string& event)
    {
        if (onEnd && !event.starts_with("call"))
            onEnd(record, event);
        progress.change([&] {
            record.threads.insert(std::this_thread::get_id());
            record.history.push_back(event);
        });
    }

    bool accepts = true;
    std::function<Outcome(Record&, const Connection::Call&)> onCall; // on the connection thread, after the record
    std::function<void(Record&, std::string_view)> onEnd;
    support::Progress progress;
    std::vector<std::shared_ptr<Record>> records;
    std::size_t connected = 0;

private:
    Outcome take(Record& record, Connection::Call call)
    {
        note(record, "call " + std::to_string(numberOf(call.frame)));
        const Outcome outcome = onCall ? onCall(record, call) : Outcome();
        progress.change([&] { record.calls.push_back(std::move(call)); });
        return outcome;
    }
};
KESTO_CONTRACT(ConnectionContract, (provider<ConnectionSubject, FakeConnectionSubject>("Fake")),
               (provider<ConnectionSubject, LinuxConnectionSubject>("Linux")));

// --- calls and answers

TEST_P(ConnectionContract, TellsWhoIsAtTheOtherEndAlsoWhenItIsOver)
{
    const auto [peer, record] = listenAndConnect();
    EXPECT_EQ(record->connection->processIdentifier(), subject->peerProcess());
    EXPECT_EQ(record->connection->userIdentifier(), subject->peerUser());
    const std::string description = record->connection->description();
    EXPECT_THAT(description, testing::HasSubstr(std::to_string(subject->peerProcess())));
    peer->close();
    ASSERT_TRUE(waitForEnd(*record));
    EXPECT_EQ(record->connection->processIdentifier(), subject->peerProcess());
    EXPECT_EQ(record->connection->userIdentifier(), subject->peerUser());
    EXPECT_EQ(record->connection->description(), description);
}

TEST_P(ConnectionContract, DeliversCallsInTheirOrderWithWhoMadeThem)
{
    const Array whole{3, foundation::Dictionary{{"volume", 0.5F}, {"on", true}}, Array{-1, "é"}, Value()};
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1), callOf(2), whole});
    EXPECT_THAT(historyOnceItHas(3, *record), ElementsAre("call 1", "call 2", "call 3"));
    ASSERT_TRUE(progress.waitFor([&, &made = record->calls] { return made.size() == 3; }));
    EXPECT_EQ(record->calls[2].frame, whole);
    for (const Connection::Call& call : record->calls)
        EXPECT_EQ(call.caller.get(), record->connection.get());
}

TEST_P(ConnectionContract, CarriesAnswersBackInTheirOrderWheneverTheyAreGiven)
{
    onCall = [](Record& record, const Connection::Call& call) {
        if (numberOf(call.frame) == 1)
            support::sendAtOnce(*record.connection, answer(1));
        return Outcome();
    };
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1), callOf(2), callOf(3)});
    EXPECT_EQ(peer->nextAnswer(), 1);
    ASSERT_THAT(historyOnceItHas(3, *record), SizeIs(3));
    EXPECT_FALSE(peer->hasAnswer());
    std::jthread([&connection = *record->connection] { // from any thread
        support::sendAtOnce(connection, answer(3));
        support::sendAtOnce(connection, answer(2));
    })
        .join();
    EXPECT_EQ(peer->nextAnswer(), 3);
    EXPECT_EQ(peer->nextAnswer(), 2);
}

TEST_P(ConnectionContract, IsTheCurrentOneWhileItsCallIsHandledAndAtNoOtherTime)
{
    const Connection* inCall = nullptr;
    std::atomic<bool> isNone = true;
    const auto look = [&isNone] { isNone = isNone && Connection::current() == nullptr; };
    onCall = [&](Record& record, const Connection::Call& call) {
        if (numberOf(call.frame) == 1)
            inCall = Connection::current();
        subject->serverQueue().submit([&] {
            look();
            note(record, "worked");
        });
        return numberOf(call.frame) == 2 ? std::unexpected(Connection::Violation{"it is the second"}) : Outcome();
    };
    onEnd = [&](Record&, std::string_view) { look(); };
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1), callOf(2)});
    EXPECT_THAT(historyOnceItHas(6, *record), SizeIs(6));
    EXPECT_EQ(inCall, record->connection.get());
    EXPECT_TRUE(isNone) << "on a queue and in the handlers of its end, no call is handled";
    EXPECT_EQ(Connection::current(), nullptr);
}

TEST_P(ConnectionContract, SendsTheAnswersOfATurnWhenTheTurnIsOver)
{
    const auto [peer, record] = listenAndConnect();
    bool hasArrivedBefore = false;
    subject->serverQueue().submit([&, &made = *record, &other = *peer](platform::Turn& turn) {
        made.connection->send(turn, answer(1));
        made.connection->send(turn, answer(2));
        hasArrivedBefore = other.hasAnswer();
        note(made, "turn");
    });
    ASSERT_THAT(historyOnceItHas(1, *record), ElementsAre("turn"));
    EXPECT_EQ(peer->nextAnswer(), 1);
    EXPECT_EQ(peer->nextAnswer(), 2);
    EXPECT_FALSE(hasArrivedBefore);
}

TEST_P(ConnectionContract, SendsWithoutWaitingForAPeerThatDoesNotRead)
{
    constexpr int count = 100;
    const auto [peer, record] = listenAndConnect();
    for (int number = 1; number <= count; ++number) // far more than a socket can hold
        support::sendAtOnce(*record->connection, support::answerTo({number}, 64 * 1024));
    for (int number = 1; number <= count; ++number)
        ASSERT_EQ(peer->nextAnswer(), number);
}

TEST_P(ConnectionContract, ReadsNoMoreFromAPeerWhoseUnansweredCallsAreTooLarge)
{
    constexpr int count = 100;
    constexpr std::size_t large = 64 * 1024;
    listen();
    const auto [other, otherRecord] = connect();
    const auto [peer, record] = connect();
    std::vector<Array> calls;
    for (int number = 1; number <= count; ++number)
        calls.push_back(callOf(number, large));
    peer->call(calls);
    std::size_t delivered = 0;
    for (int quiet = 0; quiet < 20; ++quiet) { // meanwhile another connection makes calls
        makeACall(*other, *otherRecord);
        if (const std::size_t now = callsOf(*record); now == 0 || std::exchange(delivered, now) != now)
            quiet = 0;
    }
    EXPECT_GE(delivered, 1U);
    EXPECT_LT(delivered, std::size_t{count});
    while (callsOf(*record) > 0 || progress.look([&, &made = *record] { return made.history.size() < count; })) {
        std::vector<Connection::Call> answered;
        progress.change([&, &made = *record] { answered.swap(made.calls); });
        answered.clear();
        subject->work();
    }
    const auto history = historyOnceItHas(count, *record);
    ASSERT_THAT(history, SizeIs(count));
    for (int number = 1; number <= count; ++number)
        EXPECT_EQ(history[static_cast<std::size_t>(number) - 1], "call " + std::to_string(number));
}

// --- ends

TEST_P(ConnectionContract, IsInvalidatedOnceWhenThePeerClosesIt)
{
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1)});
    peer->close();
    ASSERT_TRUE(waitForEnd(*record));
    subject->stop(); // nothing can follow
    EXPECT_THAT(record->history, ElementsAre("call 1", "invalidated"));
}

TEST_P(ConnectionContract, IsInterruptedOnceAndThenInvalidatedOnceWhenItBreaks)
{
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1)});
    peer->breakOff();
    ASSERT_TRUE(waitForEnd(*record));
    subject->stop();
    EXPECT_THAT(record->history, ElementsAre("call 1", "interrupted", "invalidated"));
}

TEST_P(ConnectionContract, BreaksWithACallThatTheHandlerRefusesAndDeliversNoneAfterIt)
{
    onCall = [](Record&, const Connection::Call& call) {
        return numberOf(call.frame) == 2 ? std::unexpected(Connection::Violation{"method 99 is unknown"}) : Outcome();
    };
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1), callOf(2), callOf(3)});
    ASSERT_TRUE(waitForEnd(*record));
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
    subject->stop();
    EXPECT_THAT(record->history, ElementsAre("call 1", "call 2", "interrupted", "invalidated"));
}

TEST_P(ConnectionContract, DeliversAllCallsThatWereMadeBeforeTheEndHoweverManyAreUnanswered)
{
    constexpr int count = 40'000;
    std::vector<Array> calls;
    for (int number = 1; number <= count; ++number)
        calls.push_back(callOf(number));
    const auto [peer, record] = listenAndConnect();
    peer->call(calls);
    peer->close();
    ASSERT_TRUE(waitForEnd(*record));
    EXPECT_THAT(record->calls, SizeIs(count));
    EXPECT_EQ(record->history.at(count - 1), "call 40000");
    record->calls.clear();
}

TEST_P(ConnectionContract, EndsForItselfAlone)
{
    listen();
    const auto [bad, badRecord] = connect();
    const auto [good, goodRecord] = connect();
    bad->breakOff();
    ASSERT_TRUE(waitForEnd(*badRecord));
    good->call({callOf(1)});
    EXPECT_THAT(historyOnceItHas(1, *goodRecord), ElementsAre("call 1"));
    support::sendAtOnce(*goodRecord->connection, answer(1));
    EXPECT_EQ(good->nextAnswer(), 1);
}

TEST_P(ConnectionContract, IsOfferedToTheDelegateAndCallsItsHandlersOnOneThread)
{
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1), callOf(2)});
    peer->breakOff();
    ASSERT_TRUE(waitForEnd(*record));
    EXPECT_EQ(record->threads.size(), 1U);
}

TEST_P(ConnectionContract, HoldsItsHandlersUntilTheInvalidationHandlerHasReturnedAndNoneAfterIt)
{
    std::vector<std::string> heldIn;
    onEnd = [&](Record& record, std::string_view event) {
        if (record.holdsAllHandlers())
            heldIn.emplace_back(event);
    };
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1)});
    peer->breakOff();
    ASSERT_TRUE(waitForEnd(*record));
    subject->stop();
    EXPECT_THAT(heldIn, ElementsAre("interrupted", "invalidated"));
    EXPECT_TRUE(record->holdsNoHandler());
}

TEST_P(ConnectionContract, DropsWhatIsSentOnceItIsBroken)
{
    onCall = [](Record&, const Connection::Call&) { return std::unexpected(Connection::Violation{"none is allowed"}); };
    onEnd = [](Record& record, std::string_view) { support::sendAtOnce(*record.connection, answer(1)); };
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1)});
    ASSERT_TRUE(waitForEnd(*record));
    support::sendAtOnce(*record->connection, answer(2));
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
}

TEST_P(ConnectionContract, DropsTheAnswersOfATurnThatItDoesNotOutlive)
{
    const auto [peer, record] = listenAndConnect();
    subject->serverQueue().submit([this, &made = *record](platform::Turn& turn) {
        made.connection->send(turn, answer(1));
        subject->stop();
        note(made, "turn");
    });
    EXPECT_THAT(historyOnceItHas(2, *record), ElementsAre("invalidated", "turn"));
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
}

TEST_P(ConnectionContract, LetsACallOutliveIt)
{
    const auto [peer, record] = listenAndConnect();
    peer->call({callOf(1)});
    peer->close();
    ASSERT_TRUE(waitForEnd(*record));
    ASSERT_THAT(record->calls, SizeIs(1));
    support::sendAtOnce(*record->calls[0].caller, answer(1)); // the peer does not read it
    const std::weak_ptr<Connection> connection = record->connection;
    record->connection.reset();
    EXPECT_FALSE(connection.expired()) << "code that works on a call holds its caller";
    record->calls.clear();
}

// --- the listener

TEST_P(ConnectionContract, EndsWithoutInterruptionWhenItsListenerStops)
{
    const auto [peer, record] = listenAndConnect();
    const auto [other, otherRecord] = connect();
    subject->stop();
    for (const auto& each : {record, otherRecord}) {
        EXPECT_THAT(each->history, ElementsAre("invalidated"));
        EXPECT_TRUE(each->holdsNoHandler());
    }
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
    EXPECT_EQ(other->nextAnswer(), std::nullopt);
}

TEST_P(ConnectionContract, DeliversAllCallsThatWereMadeBeforeItsListenerStopped)
{
    constexpr int count = 40'000; // more than may be unanswered
    std::vector<Array> calls;
    for (int number = 1; number <= count; ++number)
        calls.push_back(callOf(number));
    const auto [peer, record] = listenAndConnect();
    peer->call(calls);
    peer->awaitSent();
    subject->stop();
    EXPECT_THAT(record->calls, SizeIs(count));
    EXPECT_EQ(record->history.back(), "invalidated");
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
    record->calls.clear();
}

TEST_P(ConnectionContract, IsClosedWhenTheDelegateRefusesIt)
{
    accepts = false;
    listen();
    const auto peer = subject->connect();
    EXPECT_EQ(peer->nextAnswer(), std::nullopt);
    EXPECT_THAT(records, IsEmpty());
}

TEST_P(ConnectionContract, IsOfOneOfSeveralPeersOfOneProcess)
{
    listen();
    const auto [first, firstRecord] = connect();
    const auto [second, secondRecord] = connect();
    EXPECT_NE(firstRecord->connection, secondRecord->connection);
    first->call({callOf(1)});
    second->call({callOf(2)});
    EXPECT_THAT(historyOnceItHas(1, *firstRecord), ElementsAre("call 1"));
    EXPECT_THAT(historyOnceItHas(1, *secondRecord), ElementsAre("call 2"));
    support::sendAtOnce(*secondRecord->connection, answer(2));
    EXPECT_EQ(second->nextAnswer(), 2);
    EXPECT_FALSE(first->hasAnswer());
}

} // namespace
} // namespace contract
