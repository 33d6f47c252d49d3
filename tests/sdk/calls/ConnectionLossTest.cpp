// SPDX-License-Identifier: Apache-2.0
// What happens to calls, sessions and clients if the service goes, never existed, or sends nonsense.
#include "kesto/kesto.hpp"
#include "sdk/FakeService.h"
#include "sdk/ServedClientTest.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace {

using foundation::Array;
using foundation::Value;
using kesto::Category;
using kesto::EventType;
using kesto::State;
using kesto::Status;
using sdk_test::Answers;
using sdk_test::FakeService;
using sdk_test::Peer;
using testing::AllOf;
using testing::ElementsAre;
using testing::Gt;
using testing::Le;
using testing::UnorderedElementsAre;

const std::string lost = ": the connection to the service was lost";

class ConnectionLossTest : public sdk_test::ServedClientTest {
protected:
    void open(bool reconnect)
    {
        kesto::Options retrying = options();
        retrying.reconnect = reconnect;
        retrying.firstRetry = std::chrono::milliseconds(1);
        retrying.longestRetry = std::chrono::milliseconds(20);
        ASSERT_EQ(client_.open(retrying), Status::Ok);
    }

    Status send(kesto::AnswerCallback callback = nullptr)
    {
        kesto::Message message;
        return client_.send(message, Category::Playback, EventType::Start, 42, std::move(callback));
    }
};

TEST_F(ConnectionLossTest, AnswersEverythingUnansweredOnceAndTellsTheStateAfterThat)
{
    service_.emplace(path_, sdk_test::answerNothing);
    open(false);
    client_.createSession(42, answers_.named("create"));
    client_.startSession(42, answers_.named("start"));
    send(answers_.named("send"));
    ASSERT_EQ(service_->waitForCalls(3).size(), 3U);
    service_->disconnectAll();
    EXPECT_THAT(states_.waitFor(2), ElementsAre(State::Connected, State::Disconnected));
    EXPECT_THAT(states_.reasons.entries(), ElementsAre(Status::Ok, Status::ConnectionLost));
    EXPECT_THAT(answers_.entries(), UnorderedElementsAre("create" + lost, "start" + lost, "send" + lost));

    EXPECT_EQ(client_.createSession(43), Status::NotConnected);
    EXPECT_EQ(send(), Status::NotConnected);
    EXPECT_EQ(client_.flush(sdk_test::patience), Status::NotConnected);
    const kesto::Statistics statistics = client_.statistics();
    EXPECT_EQ(statistics.queued, 1U);
    EXPECT_EQ(statistics.sent, 1U);
    EXPECT_EQ(statistics.lost, 1U);
    EXPECT_EQ(statistics.dropped_not_connected, 1U);
    client_.close();
    EXPECT_EQ(answers_.entries().size(), 3U) << "and not once more";
}

TEST_F(ConnectionLossTest, HandsOutWhatWasAnsweredBeforeTheServiceWent)
{
    service_.emplace(path_, [](Peer& peer, const Array& call) {
        sdk_test::answerObediently(peer, call);
        peer.close();
    });
    open(false);
    client_.createSession(42, answers_.named("create"));
    client_.createSession(43, answers_.named("second"));
    ASSERT_GE(answers_.waitFor(1).size(), 1U);
    EXPECT_EQ(answers_.entries().front(), "create");
}

TEST_F(ConnectionLossTest, TellsAFlushThatWaits)
{
    service_.emplace(path_, [](Peer& peer, const Array&) { peer.close(); });
    open(false);
    client_.createSession(42);
    EXPECT_THAT(client_.flush(sdk_test::patience),
                testing::AnyOf(Status::ConnectionLost, // during the wait, or before it
                               Status::NotConnected));
}

TEST_F(ConnectionLossTest, AnswersWhatWaitedForAConnectionThatCouldNotBeMade)
{
    kesto::Options options;
    options.socketPath = path_; // no service listens there
    foundation::Mutex gate;
    gate.lock();
    options.stateChanged = [&](const kesto::StateChange& change) {
        const foundation::Lock lock(gate);
        EXPECT_EQ(change.reason, change.state == State::Disconnected ? Status::ConnectFailed : Status::Ok);
        EXPECT_EQ(change.systemError, change.state == State::Disconnected ? ENOENT : 0);
        EXPECT_EQ(change.socketPath, path_);
        EXPECT_FALSE(change.willRetry);
        states_.add(change.state);
    };
    kesto::Client client; // destroyed before the objects that its callback uses
    EXPECT_EQ(client.open(options), Status::Ok);
    const Status taken = client.createSession(42, answers_.named("create"));
    gate.unlock();
    EXPECT_THAT(states_.waitFor(1), ElementsAre(State::Disconnected));
    if (taken == Status::Ok) { // else it had failed already
        EXPECT_THAT(answers_.waitFor(1), ElementsAre("create" + lost));
    }
    EXPECT_EQ(client.state(), State::Disconnected);
}

TEST_F(ConnectionLossTest, ConnectsAgainWhenTheServiceIsBackAndBeginsWithoutSessions)
{
    service_.emplace(path_);
    kesto::Options options;
    options.socketPath = path_;
    options.reconnect = true;
    options.firstRetry = std::chrono::milliseconds(1);
    options.longestRetry = std::chrono::milliseconds(20);
    sdk_test::Recorder<std::string> connected;
    kesto::Client client; // destroyed before the objects that its callback uses
    options.stateChanged = [&](const kesto::StateChange& change) {
        if (change.state != State::Connected)
            return;
        client.createSession(42);
        client.startSession(42, answers_.named("start"));
        connected.add("connected");
    };
    ASSERT_EQ(client.open(options), Status::Ok);
    ASSERT_EQ(connected.waitFor(1).size(), 1U);
    ASSERT_EQ(client.flush(sdk_test::patience), Status::Ok);
    service_.reset();
    EXPECT_THAT(answers_.waitFor(1), ElementsAre("start" + lost));
    service_.emplace(path_);
    ASSERT_EQ(connected.waitFor(2).size(), 2U);
    ASSERT_EQ(client.send(kesto::Message(), Category::Playback, EventType::Start, 42, answers_.named("send")),
              Status::Ok);
    client.stopSession(42, answers_.named("stop"));
    EXPECT_THAT(answers_.waitFor(4), ElementsAre("start" + lost, "send", "start", "stop"));
    EXPECT_EQ(client.statistics().connections, 2U);
}

TEST_F(ConnectionLossTest, GoesOnTryingUntilTheServiceIsThere)
{
    open(true);
    const auto states = states_.waitFor(5);
    ASSERT_GE(states.size(), 5U);
    for (std::size_t index = 0; index < 4; ++index)
        EXPECT_EQ(states[index], index % 2 == 0 ? State::Disconnected : State::Connecting);
    service_.emplace(path_);
    std::size_t count = 6;
    while (states_.waitFor(count).back() != State::Connected && count < 1000)
        ++count;
    EXPECT_EQ(client_.state(), State::Connected);
    client_.createSession(42, answers_.named("create"));
    EXPECT_THAT(answers_.waitFor(1), ElementsAre("create"));
}

TEST_F(ConnectionLossTest, DoublesThePauseBetweenAttemptsUpToTheLongest)
{
    kesto::Options options;
    options.socketPath = path_;
    options.reconnect = true;
    options.firstRetry = std::chrono::milliseconds(20);
    options.longestRetry = std::chrono::milliseconds(120);
    sdk_test::Recorder<std::int64_t> pauses; // what is left of them when the client tells
    options.stateChanged = [&](const kesto::StateChange& change) {
        if (change.state == State::Disconnected)
            pauses.add(change.retryAfter.count());
    };
    kesto::Client client; // destroyed before the objects that its callback uses
    ASSERT_EQ(client.open(options), Status::Ok);
    const auto first = pauses.waitFor(5);
    const auto isMostOf = [](std::int64_t pause) { return AllOf(Gt(pause / 2), Le(pause)); };
    EXPECT_THAT(std::vector(first.begin(), first.begin() + 5),
                ElementsAre(isMostOf(20), isMostOf(40), isMostOf(80), isMostOf(120), isMostOf(120)));
}

TEST_F(ConnectionLossTest, KillingTheServiceIsAnsweredByTheLossOfTheConnection)
{
    service_.emplace(path_);
    open(false);
    client_.killService(answers_.named("kill"));
    EXPECT_THAT(answers_.waitFor(1), ElementsAre("kill" + lost));
}

// ---- Services that break the protocol ----

// What a client does when it gets these bytes in place of the answer to its first call.
class HostileServiceTest : public ConnectionLossTest {
protected:
    void expectViolation(std::string_view bytes)
    {
        service_.emplace(path_, [bytes = std::string(bytes)](Peer& peer, const Array&) { peer.sendBytes(bytes); });
        open(false);
        client_.createSession(42, answers_.named("create"));
        EXPECT_THAT(answers_.waitFor(1), ElementsAre("create" + lost));
        EXPECT_THAT(states_.waitFor(2), ElementsAre(State::Connected, State::Disconnected));
        EXPECT_THAT(states_.reasons.waitFor(2), ElementsAre(Status::Ok, Status::ProtocolViolation));
    }

    static std::string frame(const Value& value)
    {
        std::string encoded;
        foundation::appendCbor(value, encoded);
        std::string framed;
        platform::appendFrame(encoded, framed);
        return framed;
    }
};

TEST_F(HostileServiceTest, AFrameThatIsTooLongEndsTheConnection)
{
    expectViolation(std::string_view("\x01\x00\x10\x00", 4));
}

TEST_F(HostileServiceTest, BytesThatAreNoCborEndTheConnection)
{
    expectViolation(std::string_view("\x01\x00\x00\x00\xFF", 5));
}

TEST_F(HostileServiceTest, AnEmptyFrameEndsTheConnection)
{
    expectViolation(std::string_view("\x00\x00\x00\x00", 4));
}

TEST_F(HostileServiceTest, ContainersTooDeepInsideEachOtherEndTheConnection)
{
    Value value(true);
    for (int depth = 0; depth < 40; ++depth)
        value = Array{value};
    expectViolation(frame(Array{1, Value(), value}));
}

TEST_F(HostileServiceTest, AnItemThatIsNoAnswerEndsTheConnection)
{
    expectViolation(frame("hello"));
}

TEST_F(HostileServiceTest, AnAnswerWithoutAnErrorFieldEndsTheConnection)
{
    expectViolation(frame(Array{1}));
}

TEST_F(HostileServiceTest, AnAnswerOfTheWrongTypeEndsTheConnection)
{
    expectViolation(frame(Array{1, Value(), "yes"}));
}

TEST_F(HostileServiceTest, AnErrorOfTheWrongTypeEndsTheConnection)
{
    expectViolation(frame(Array{1, Array{"domain", "code"}, true}));
}

TEST_F(HostileServiceTest, TheEndInsideAFrameLosesTheConnection)
{
    service_.emplace(path_, [](Peer& peer, const Array&) {
        peer.sendBytes(std::string_view("\x05\x00\x00\x00\x83", 5));
        peer.close();
    });
    open(false);
    client_.createSession(42, answers_.named("create"));
    EXPECT_THAT(answers_.waitFor(1), ElementsAre("create" + lost));
}

TEST_F(HostileServiceTest, AnswersThatNobodyWaitsForAreCountedAndNothingElse)
{
    service_.emplace(path_, [](Peer& peer, const Array& call) {
        peer.answer(4711, {true});
        sdk_test::answerObediently(peer, call);
        peer.answer(sdk_test::callNumber(call), {true});
    });
    open(false);
    client_.createSession(42, answers_.named("first"));
    client_.createSession(42, answers_.named("second"));
    EXPECT_THAT(answers_.waitFor(2), ElementsAre("first", "second"));
    EXPECT_GE(client_.statistics().unexpected_answers, 2U);
}

// For any bytes of a service, each call is answered exactly once, and the client can be closed.
RC_GTEST_PROP(HostileService, NeverHurtsItsClientWhateverItSends, ())
{
    const auto noise = *rc::gen::container<std::string>(rc::gen::arbitrary<char>());
    const bool asFrame = *rc::gen::arbitrary<bool>();
    const support::TemporaryDirectory directory;
    FakeService service(directory / "service", [&](Peer& peer, const Array&) {
        asFrame ? peer.sendFrame(noise) : peer.sendBytes(noise);
        peer.close();
    });
    Answers answers;
    kesto::Client client;
    kesto::Options options;
    options.socketPath = directory / "service";
    RC_ASSERT(client.open(options) == Status::Ok);
    std::size_t taken = client.createSession(42, answers.named("create")) == Status::Ok ? 1 : 0;
    taken += client.validate(42, answers.named("validate")) == Status::Ok ? 1 : 0; // unless the connection has ended
    client.close(sdk_test::patience);
    RC_ASSERT(answers.entries().size() == taken);
}

} // namespace
