// SPDX-License-Identifier: Apache-2.0
// A client and a service on a real socket: every operation, its answers, and the ends that a client can have.
#include "kesto/kesto.hpp"
#include "sdk/FakeService.h"
#include "sdk/ServedClientTest.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <memory>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using kesto::Category;
using kesto::EventType;
using kesto::Group;
using kesto::ServiceType;
using kesto::State;
using kesto::Status;
using sdk_test::FakeService;
using sdk_test::patience;
using sdk_test::Peer;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::chrono::milliseconds longEnough = patience;

class ClientTest : public sdk_test::ServedClientTest {
protected:
    // A client of a service that answers like this.
    void connect(FakeService::Handler handler = sdk_test::answerObediently)
    {
        service_.emplace(path_, std::move(handler));
        ASSERT_EQ(client_.open(options()), Status::Ok);
    }
};

TEST_F(ClientTest, SendsEveryOperationAsTheProtocolHasIt)
{
    service_.emplace(path_);
    kesto::Options unstamped = options();
    unstamped.stamp = false;
    ASSERT_EQ(client_.open(unstamped), Status::Ok);
    kesto::Message message;
    message.add("volume", 0.5).add("running", true);
    const Dictionary sent{{"volume", 0.5}, {"running", true}};
    constexpr kesto::ReporterID large = std::numeric_limits<kesto::ReporterID>::min();

    EXPECT_EQ(client_.createSession(42), Status::Ok);
    EXPECT_EQ(client_.setServiceType(ServiceType::LongFormAudio, 42), Status::Ok);
    EXPECT_EQ(client_.getServiceType(large, nullptr), Status::Ok);
    EXPECT_EQ(client_.setConfiguration(message, 42), Status::Ok);
    EXPECT_EQ(client_.startSession(42), Status::Ok);
    EXPECT_EQ(client_.send(message, Category::Playback, EventType::Start, 42), Status::Ok);
    EXPECT_EQ(client_.send(message, Group::DSP | Category::Playback, EventType::Unknown, {42, large}), Status::Ok);
    EXPECT_EQ(client_.send(message, Category::IO, EventType::Error, {}), Status::Ok);
    EXPECT_EQ(client_.send(message, Category::IO, EventType::Error, kesto::Reporters::allStarted()), Status::Ok);
    EXPECT_EQ(client_.stopSession(42), Status::Ok);
    EXPECT_EQ(client_.destroySession(42), Status::Ok);
    EXPECT_EQ(client_.validate(42, nullptr), Status::Ok);
    EXPECT_EQ(client_.getAllReporters(nullptr), Status::Ok);
    EXPECT_EQ(client_.killService(), Status::Ok);

    EXPECT_THAT(service_->waitForCalls(14),
                ElementsAre(Array{1, 1, 42}, Array{2, 2, 7, 42}, Array{3, 3, large}, Array{4, 4, sent, 42},
                            Array{5, 5, 42}, Array{6, 6, sent, 4, 1, Array{42}},
                            Array{7, 6, sent, 0x10000004, 65535, Array{42, large}}, Array{8, 6, sent, 7, 6, Array{}},
                            Array{9, 6, sent, 7, 6, Value()}, Array{10, 7, 42}, Array{11, 8, 42}, Array{12, 9, 42},
                            Array{13, 10}, Array{14, 11}));
}

TEST_F(ClientTest, HandsOutEveryAnswerWithItsResult)
{
    connect();
    kesto::Message message;
    client_.createSession(42, [&](const kesto::Answer& answer) {
        EXPECT_TRUE(answer.ok() && answer.success());
        EXPECT_EQ(answer.call(), 1U);
        EXPECT_EQ(answer.operation(), kesto::Operation::CreateSession);
        EXPECT_EQ(answer.reporter(), 42);
        answers_.add("create");
    });
    client_.setServiceType(ServiceType::Test, 42, answers_.named("type"));
    client_.getServiceType(42, [&](const kesto::Answer& answer) {
        EXPECT_EQ(answer.serviceType(), ServiceType::Test);
        answers_.add("get type");
    });
    client_.getServiceType(43, [&](const kesto::Answer& answer) {
        EXPECT_EQ(answer.serviceType(), ServiceType::Unknown);
        answers_.add("get unknown type");
    });
    client_.setConfiguration(message, 42, answers_.named("configure"));
    client_.startSession(42, answers_.named("start"));
    client_.send(message, Category::Playback, EventType::Start, 42, answers_.named("send"));
    client_.validate(42, [&](const kesto::Answer& answer) {
        EXPECT_EQ(answer.validReporter(), 42);
        EXPECT_EQ(answer.serviceType(), ServiceType::Test);
        answers_.add("validate");
    });
    client_.validate(43, [&](const kesto::Answer& answer) {
        EXPECT_EQ(answer.validReporter(), 0);
        EXPECT_EQ(answer.serviceType(), ServiceType::Unknown);
        answers_.add("validate unknown");
    });
    client_.getAllReporters([&](const kesto::Answer& answer) {
        EXPECT_THAT(answer.reporters(), ElementsAre(42));
        answers_.add("reporters");
    });
    client_.stopSession(42, answers_.named("stop"));
    client_.destroySession(42, answers_.named("destroy"));
    EXPECT_EQ(client_.flush(longEnough), Status::Ok);
    EXPECT_THAT(answers_.entries(),
                ElementsAre("create", "type", "get type", "get unknown type", "configure", "send", "validate",
                            "validate unknown", "reporters", "start", "stop", "destroy"));
}

TEST_F(ClientTest, CallsBackForBothAnswersAboutReporterZero)
{
    connect();
    client_.getServiceType(0, answers_.named("type"));
    EXPECT_EQ(client_.flush(longEnough), Status::Ok);
    EXPECT_THAT(answers_.entries(), ElementsAre("type", "type"));
}

TEST_F(ClientTest, CallsBackTwiceForAStartThatIsAnsweredTwice)
{
    connect([](Peer& peer, const Array& call) {
        if (sdk_test::method(call) == 5) // as while a trace runs
            peer.answer(sdk_test::callNumber(call), {true});
        sdk_test::answerObediently(peer, call);
    });
    client_.createSession(42);
    client_.startSession(42, answers_.named("start"));
    EXPECT_THAT(answers_.waitFor(1), ElementsAre("start"));
    client_.stopSession(42, answers_.named("stop"));
    EXPECT_THAT(answers_.waitFor(3), ElementsAre("start", "start", "stop"));
}

TEST_F(ClientTest, TellsAStartThatItsSessionWasDestroyed)
{
    connect();
    client_.createSession(42);
    client_.startSession(42, answers_.named("start"));
    client_.destroySession(42, answers_.named("destroy"));
    EXPECT_THAT(answers_.waitFor(2),
                ElementsAre("start: the session was destroyed before its start was answered", "destroy"));
}

TEST_F(ClientTest, HandsOnTheErrorOfTheService)
{
    connect([](Peer& peer, const Array& call) {
        peer.answer(sdk_test::callNumber(call), {}, Array{"com.quarn.audio.reporting", 1});
    });
    kesto::Message message;
    client_.send(message, Category::Playback, EventType::Start, 42, answers_.named("send"));
    client_.createSession(42, answers_.named("create"));
    EXPECT_THAT(answers_.waitFor(2),
                ElementsAre("send: com.quarn.audio.reporting 1", "create: com.quarn.audio.reporting 1"));
    const kesto::Statistics statistics = client_.statistics();
    EXPECT_EQ(statistics.answered, 1U);
    EXPECT_EQ(statistics.refused, 1U);
}

TEST_F(ClientTest, FlushWaitsForAnswersButNotForStarts)
{
    connect();
    client_.createSession(42, answers_.named("create"));
    client_.startSession(42, answers_.named("start"));
    EXPECT_EQ(client_.flush(longEnough), Status::Ok);
    EXPECT_THAT(answers_.entries(), ElementsAre("create"));
}

TEST_F(ClientTest, FlushEndsWithItsTime)
{
    connect(sdk_test::answerNothing);
    client_.createSession(42);
    EXPECT_EQ(client_.flush(std::chrono::milliseconds(1)), Status::TimedOut);
}

TEST_F(ClientTest, CannotBeWaitedForInItsOwnCallback)
{
    connect();
    client_.createSession(42, [&](const kesto::Answer&) {
        answers_.add(kesto::errorText(client_.flush(longEnough)));
        answers_.add(kesto::errorText(client_.close(longEnough)));
    });
    const std::string wrongThread = "a callback of a client cannot wait for that client";
    EXPECT_THAT(answers_.waitFor(2), ElementsAre(wrongThread, wrongThread));
}

TEST_F(ClientTest, TakesCallsInCallbacks)
{
    connect();
    client_.createSession(42, [&](const kesto::Answer&) {
        client_.startSession(42, answers_.named("start"));
        client_.stopSession(42, answers_.named("stop"));
    });
    EXPECT_THAT(answers_.waitFor(2), ElementsAre("start", "stop"));
}

TEST_F(ClientTest, GivesWhatTheStateCallbackSaysAheadOfWhatWasSentBefore)
{
    kesto::Options given = options();
    given.stamp = false;
    foundation::Mutex gate;
    kesto::Client client; // destroyed before the objects that its callback uses
    gate.lock();
    given.stateChanged = [&](const kesto::StateChange& change) {
        if (change.state != State::Connected)
            return;
        const foundation::Lock lock(gate);
        client.createSession(42);
        client.startSession(42);
        kesto::Message message;
        client.send(message.add("which", "first"), Category::Playback, EventType::Start, 42);
    };
    service_.emplace(path_);
    EXPECT_EQ(client.open(given), Status::Ok);
    kesto::Message message;
    client.send(message.add("which", "second"), Category::Playback, EventType::Start, 42);
    gate.unlock();
    EXPECT_EQ(client.flush(longEnough), Status::Ok);
    EXPECT_THAT(service_->waitForCalls(4),
                ElementsAre(Array{1, 1, 42}, Array{2, 5, 42},
                            Array{3, 6, Dictionary{{"which", "first"}}, 4, 1, Array{42}},
                            Array{4, 6, Dictionary{{"which", "second"}}, 4, 1, Array{42}}));
}

TEST_F(ClientTest, ClosesWithEverythingAnswered)
{
    connect();
    kesto::Message message;
    client_.createSession(42, answers_.named("create"));
    client_.startSession(42, answers_.named("start"));
    client_.send(message, Category::Playback, EventType::Start, 42, answers_.named("send"));
    EXPECT_EQ(client_.close(longEnough), Status::Ok);
    EXPECT_THAT(answers_.entries(), ElementsAre("create", "send", "start: the client is closed"));
    EXPECT_THAT(states_.entries(), ElementsAre(State::Connected, State::Closed));
    EXPECT_EQ(client_.state(), State::Closed);
    EXPECT_EQ(client_.close(longEnough), Status::Ok) << "a second close does nothing";
    EXPECT_EQ(client_.createSession(43), Status::Closed);
    EXPECT_EQ(client_.send(message, Category::Playback, EventType::Start, 42), Status::Closed);
    EXPECT_EQ(client_.flush(longEnough), Status::Closed);
}

TEST_F(ClientTest, SaysWhenItClosedWithoutAllAnswers)
{
    connect(sdk_test::answerNothing);
    client_.createSession(42, answers_.named("create"));
    EXPECT_EQ(client_.close(std::chrono::milliseconds(1)), Status::TimedOut);
    EXPECT_THAT(answers_.entries(), ElementsAre("create: the client is closed"));
}

TEST_F(ClientTest, ReleasesEveryCallbackExactlyOnceWhateverBecomesOfIt)
{
    const auto counter = std::make_shared<int>();
    const auto callback = [counter](const kesto::Answer&) { };
    {
        connect(sdk_test::answerNothing);
        kesto::Message message;
        kesto::Message unusable;
        unusable.append(1);
        EXPECT_EQ(client_.createSession(42, callback), Status::Ok);
        EXPECT_EQ(client_.send(message, Category::IO, EventType::Error, 42, callback), Status::Ok);
        EXPECT_EQ(client_.send(unusable, Category::IO, EventType::Error, 42, callback), Status::Misnested);
        EXPECT_EQ(client_.setConfiguration(unusable, 42, callback), Status::Misnested);
        EXPECT_EQ(client_.setConfiguration(message, 42, callback), Status::Ok);
        EXPECT_EQ(kesto::Client().createSession(42, callback), Status::Closed);
        EXPECT_EQ(client_.close(std::chrono::milliseconds(1)), Status::TimedOut);
        EXPECT_EQ(client_.createSession(42, callback), Status::Closed);
        EXPECT_EQ(client_.setConfiguration(message, 42, callback), Status::Closed);
    }
    EXPECT_EQ(counter.use_count(), 2) << "the test's own two";
}

TEST_F(ClientTest, CanBeFreedInItsOwnCallback)
{
    service_.emplace(path_);
    const auto closed = std::make_shared<sdk_test::Recorder<bool>>();
    kesto_client* client = nullptr;
    kesto_options given{};
    given.size = sizeof given;
    given.socket_path = path_.c_str();
    given.state_user = closed.get();
    given.state_release = [](void* user) { static_cast<sdk_test::Recorder<bool>*>(user)->add(true); };
    ASSERT_EQ(kesto_client_open(&given, &client), KESTO_OK);
    kesto_client_create_session(
        client, 42, [](void* user, const kesto_answer*) { kesto_client_free(static_cast<kesto_client*>(user)); },
        client, nullptr);
    EXPECT_THAT(closed->waitFor(1), ElementsAre(true)) << "it is gone";
}

TEST_F(ClientTest, CanBeFreedInAForkedChildWithoutDisturbingTheParent)
{
    connect();
    client_.createSession(42, answers_.named("create"));
    ASSERT_EQ(client_.flush(longEnough), Status::Ok);
    const pid_t child = ::fork();
    if (child == 0) {
        {
            const kesto::Client inherited = std::move(client_);
        }
        ::_exit(0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    client_.validate(42, answers_.named("validate"));
    EXPECT_THAT(answers_.waitFor(2), ElementsAre("create", "validate"));
}

TEST_F(ClientTest, RefusesOptionsThatNoSocketCanHave)
{
    kesto::Options given = options();
    given.socketPath = std::string(200, 'x');
    EXPECT_EQ(client_.open(given), Status::InvalidArgument);
    given = options();
    given.socketPath.clear();
    given.serviceName = "../escape";
    EXPECT_EQ(client_.open(given), Status::InvalidArgument);
    EXPECT_FALSE(client_.isOpen());
    kesto_options empty{};
    kesto_client* client = nullptr;
    EXPECT_EQ(kesto_client_open(&empty, &client), KESTO_INVALID_ARGUMENT) << "the size is not filled in";
    EXPECT_EQ(kesto_client_open(nullptr, nullptr), KESTO_INVALID_ARGUMENT);
}

TEST_F(ClientTest, LooksAfterNullPointers)
{
    EXPECT_EQ(kesto_client_create_session(nullptr, 42, nullptr, nullptr, nullptr), KESTO_CLOSED);
    EXPECT_EQ(kesto_client_send(nullptr, nullptr, 1, 1, nullptr, 0, nullptr, nullptr, nullptr), KESTO_CLOSED);
    EXPECT_EQ(kesto_client_set_configuration(nullptr, nullptr, 1, nullptr, nullptr, nullptr), KESTO_CLOSED);
    EXPECT_EQ(kesto_client_flush(nullptr, 0), KESTO_CLOSED);
    EXPECT_EQ(kesto_client_close(nullptr, 0), KESTO_OK);
    EXPECT_EQ(kesto_client_state(nullptr), KESTO_STATE_CLOSED);
    kesto_client_free(nullptr);
    connect();
    EXPECT_EQ(kesto_client_send(client_.get(), nullptr, 1, 1, nullptr, 0, nullptr, nullptr, nullptr),
              KESTO_INVALID_ARGUMENT);
    kesto::Message message;
    EXPECT_EQ(kesto_client_send(client_.get(), message.get(), 1, 1, nullptr, 3, nullptr, nullptr, nullptr),
              KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_client_set_configuration(client_.get(), nullptr, 1, nullptr, nullptr, nullptr),
              KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(client_.statistics().dropped_unusable, 2U);
}

TEST_F(ClientTest, HasAWordForEveryStatus)
{
    for (int status = KESTO_OK; status <= KESTO_SESSION_ENDED; ++status)
        EXPECT_STRNE(kesto_error_text(static_cast<kesto_status>(status)), "unknown status") << status;
    EXPECT_STREQ(kesto_error_text(static_cast<kesto_status>(9999)), "unknown status");
}

} // namespace
