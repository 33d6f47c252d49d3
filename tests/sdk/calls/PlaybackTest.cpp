// SPDX-License-Identifier: Apache-2.0
// Playbacks and recordings of a client with a service on a real socket: what comes of their calls, what becomes of them
// when the queue is full, the service goes or the client ends, and that they are safe in a real-time thread.
#include "kesto/playback.hpp"

#include "sdk/Allocations.h"
#include "sdk/Described.h"
#include "sdk/FakeService.h"
#include "sdk/ServedClientTest.h"

#include <cmath>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <regex>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using foundation::Array;
using kesto::Playback;
using kesto::Recording;
using kesto::ServiceType;
using kesto::Status;
using sdk_test::described;
using sdk_test::FakeService;
using sdk_test::patience;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

// The calls as text, without the times.
std::vector<std::string> timeless(const std::vector<Array>& calls)
{
    static const std::regex stamps(R"(,?"kestoreporting_timestamp":[0-9.]+,"systemuptime_sec":[0-9]+)");
    static const std::regex duration(R"("session_duration":[0-9.]+)");
    std::vector<std::string> texts = described(calls);
    for (std::string& text : texts)
        text = std::regex_replace(std::regex_replace(text, stamps, ""), duration, "\"session_duration\":...");
    return texts;
}

double timeOf(const Array& call)
{
    return call[2].dictionary()->find("kestoreporting_timestamp")->number()->doubleValue();
}

const std::string began = R"(Playback Start {"session_output_running":true,"PomoSessionVolume":1,"session_run":1})";
const std::string ended = R"(Playback Stop {"session_output_running":false,"PomoSessionVolume":1,"session_run":1})";
const std::string left = R"(Playback Deactivate {"session_duration":...})";
const std::string configured = R"(configure {"HostApplicationDisplayID":"player"})";

class PlaybackTest : public sdk_test::ServedClientTest {
protected:
    void connect(FakeService::Handler handler = sdk_test::answerObediently, kesto::Options given = {})
    {
        service_.emplace(path_, std::move(handler));
        given.socketPath = path_;
        given.stateChanged = states_.callback();
        ASSERT_EQ(client_.open(given), Status::Ok);
        ASSERT_EQ(states_.waitFor(1).size(), 1U);
    }
    // Retries so soon that a test need not wait.
    static kesto::Options reconnecting()
    {
        kesto::Options options;
        options.reconnect = true;
        options.firstRetry = std::chrono::milliseconds(1);
        options.longestRetry = std::chrono::milliseconds(20);
        return options;
    }
    // All calls that have come, after the client has sent what it has.
    std::vector<Array> calls()
    {
        EXPECT_EQ(client_.flush(patience), Status::Ok);
        service_->forEachPeer([](sdk_test::Peer&) { }); // it records a call after it has answered
        return service_->waitForCalls(0);
    }
    [[nodiscard]] bool becomes(kesto::State state)
    {
        std::size_t count = 1;
        while (states_.waitFor(count).size() >= count && states_.entries().back() != state)
            ++count;
        return states_.entries().back() == state;
    }
    // Waits until a client without a service has followed all calls of before: an attempt to connect has failed.
    void awaitAttempt() { static_cast<void>(states_.waitFor(states_.entries().size() + 4)); }
    [[nodiscard]] Playback playback() const { return {client_, "player", ServiceType::LongFormAudio}; }
};

TEST_F(PlaybackTest, SendsWhatItsOwnerDoesInItsOrder)
{
    connect();
    Playback playback = this->playback();
    EXPECT_EQ(playback.status(), Status::Ok);
    EXPECT_EQ(playback.start({"S16LE", 44100, 2}, "speaker"), Status::Ok);
    EXPECT_EQ(playback.volume(0.5), Status::Ok);
    EXPECT_EQ(playback.mute(true), Status::Ok);
    EXPECT_EQ(playback.mute(false), Status::Ok);
    EXPECT_EQ(playback.route("headset"), Status::Ok);
    EXPECT_EQ(playback.format({"F32LE", 48000, 1}), Status::Ok);
    EXPECT_EQ(playback.underrun(3, 0.25), Status::Ok);
    EXPECT_EQ(playback.pause(), Status::Ok);
    EXPECT_EQ(playback.resume(), Status::Ok);
    EXPECT_EQ(playback.stop(), Status::Ok);
    const auto came = calls();
    EXPECT_THAT(timeless(came),
                ElementsAre("create", "type 7", configured, "start",
                            R"(Playback Start {"session_output_running":true,)"
                            R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                            R"("active_devices":"speaker","PomoSessionVolume":1,"session_run":1})",
                            R"(Volume State {"PomoSessionVolume":0.5})", R"(Volume State {"PomoSessionVolume":0})",
                            R"(Volume State {"PomoSessionVolume":0.5})",
                            R"(RouteChange State {"active_devices":"headset"})",
                            R"(Setup State {"session_selected_format":"F32LE/48000/1","mChannelsPerFrame":1})",
                            R"(Error IssueDetector {"issue":"underrun","late_cycles":3,"issue_duration":0.25,)"
                            R"("active_devices":"headset"})",
                            R"(Playback Stop {"session_output_running":false,)"
                            R"("session_selected_format":"F32LE/48000/1","mChannelsPerFrame":1,)"
                            R"("active_devices":"headset","PomoSessionVolume":0.5,"session_run":1})",
                            R"(Playback Start {"session_output_running":true,)"
                            R"("session_selected_format":"F32LE/48000/1","mChannelsPerFrame":1,)"
                            R"("active_devices":"headset","PomoSessionVolume":0.5,"session_run":2})",
                            R"(Playback Stop {"session_output_running":false,)"
                            R"("session_selected_format":"F32LE/48000/1","mChannelsPerFrame":1,)"
                            R"("active_devices":"headset","PomoSessionVolume":0.5,"session_run":2})",
                            left, "stop", "destroy"));
    EXPECT_EQ(client_.statistics().queued, 11U);
    EXPECT_EQ(client_.statistics().sent, 11U);
    EXPECT_EQ(client_.statistics().answered, 11U);
}

TEST_F(PlaybackTest, ARecordingSendsTheSameOfAnInput)
{
    connect();
    Recording recording(client_, "recorder", ServiceType::Telephony);
    recording.start({"S16LE", 16000, 1}, "microphone");
    recording.volume(0.5);
    recording.mute(true);
    recording.route("headset");
    recording.format({"S16LE", 8000, 1});
    recording.overrun(4, 0.5);
    recording.pause();
    recording.resume();
    recording.stop();
    const auto came = timeless(calls());
    ASSERT_EQ(came.size(), 16U);
    EXPECT_EQ(came[1], "type 2");
    EXPECT_EQ(came[4],
              R"(Record Start {"session_input_running":true,"session_selected_format":"S16LE/16000/1",)"
              R"("mChannelsPerFrame":1,"active_devices":"microphone","PomoSessionVolume":1,"session_run":1})");
    EXPECT_EQ(came[9],
              R"(Error IssueDetector {"issue":"overrun","late_cycles":4,"issue_duration":0.5,)"
              R"("active_devices":"headset"})");
    EXPECT_EQ(came[11],
              R"(Record Start {"session_input_running":true,"session_selected_format":"S16LE/8000/1",)"
              R"("mChannelsPerFrame":1,"active_devices":"headset","PomoSessionVolume":0,"session_run":2})");
    EXPECT_EQ(came[13], R"(Record Deactivate {"session_duration":...})");
}

// The time is that of the call, and not of the message that the client's thread makes of it.
TEST_F(PlaybackTest, TheTimesAreThoseOfTheCalls)
{
    const auto now = [] {
        timespec time{};
        ::clock_gettime(CLOCK_REALTIME, &time);
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
    };
    kesto::Options options;
    options.socketPath = path_;
    foundation::Mutex gate;
    gate.lock();
    options.stateChanged = [&gate](const kesto::StateChange&) { const foundation::Lock lock(gate); };
    service_.emplace(path_);
    kesto::Client client; // destroyed before the objects that its callback uses
    EXPECT_EQ(client.open(options), Status::Ok);
    Playback playback(client, "player", ServiceType::LongFormAudio);
    const double before = now();
    playback.start();
    const double between = now();
    playback.stop();
    const double after = now();
    std::this_thread::sleep_for(std::chrono::milliseconds(1)); // so that a later time would be seen
    gate.unlock();
    EXPECT_EQ(client.flush(patience), Status::Ok);
    const auto came = service_->waitForCalls(9);
    ASSERT_EQ(came.size(), 9U);
    EXPECT_GE(timeOf(came[4]), before);
    EXPECT_LE(timeOf(came[4]), between);
    EXPECT_GE(timeOf(came[5]), between);
    EXPECT_LE(timeOf(came[5]), after);
}

TEST_F(PlaybackTest, LongTextsAreCutBetweenCharacters)
{
    connect();
    Playback playback = this->playback();
    const std::string encoding = std::string(254, 'e') + "\xC3\xA4 and more";
    const std::string device = std::string(1023, 'd') + "\xC3\xA4 and more";
    playback.start({encoding.c_str(), 8000, 1}, device.c_str());
    playback.route(std::string(1024, 'x').c_str());
    EXPECT_THAT(timeless(calls()),
                ElementsAre("create", "type 7", configured, "start",
                            AllOf(HasSubstr("\"session_selected_format\":\"" + std::string(254, 'e') + "/8000/1\""),
                                  HasSubstr("\"active_devices\":\"" + std::string(1023, 'd') + "\"")),
                            R"(RouteChange State {"active_devices":")" + std::string(1024, 'x') + "\"}"));
}

TEST_F(PlaybackTest, SeveralAtOnceHaveSessionsOfTheirOwn)
{
    connect();
    Playback music = playback();
    Playback effect(client_, "game", ServiceType::NonLongFormAudio);
    music.start();
    effect.start();
    effect.volume(0.5);
    music.volume(0.25);
    effect.stop();
    const auto came = calls();
    ASSERT_EQ(came.size(), 16U);
    const std::int64_t first = sdk_test::reporterOf(came[0]);
    const std::int64_t second = sdk_test::reporterOf(came[5]);
    EXPECT_NE(first, second);
    EXPECT_EQ(sdk_test::reporterOf(came[10]), second);
    EXPECT_EQ(timeless({came[10]})[0], R"(Volume State {"PomoSessionVolume":0.5})");
    EXPECT_EQ(sdk_test::reporterOf(came[11]), first);
    for (std::size_t index = 12; index < 16; ++index)
        EXPECT_EQ(sdk_test::reporterOf(came[index]), second);
}

// ---- Misuse ----

TEST_F(PlaybackTest, WrongArgumentsAreRefusedAndCounted)
{
    connect();
    Playback playback = this->playback();
    EXPECT_EQ(playback.volume(-0.001), Status::InvalidArgument);
    EXPECT_EQ(playback.volume(std::numeric_limits<double>::quiet_NaN()), Status::InvalidArgument);
    EXPECT_EQ(playback.underrun(1, -1), Status::InvalidArgument);
    EXPECT_EQ(playback.underrun(1, std::numeric_limits<double>::quiet_NaN()), Status::InvalidArgument);
    EXPECT_EQ(playback.format({nullptr, 1, 1}), Status::InvalidArgument);
    EXPECT_EQ(playback.format({"", 1, 1}), Status::InvalidArgument);
    EXPECT_EQ(playback.start({nullptr, 1, 1}), Status::InvalidArgument);
    EXPECT_EQ(kesto_playback_format(playback.get(), nullptr), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(client_.statistics().dropped_unusable, 8U);
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(PlaybackTest, CannotBeMadeWithoutAnApplicationOrAClient)
{
    connect();
    EXPECT_EQ(Playback(client_, nullptr, ServiceType::Test).status(), Status::InvalidArgument);
    EXPECT_EQ(Playback(client_, "", ServiceType::Test).status(), Status::InvalidArgument);
    EXPECT_EQ(kesto_playback_create(client_.get(), "player", KESTO_SERVICE_TEST, nullptr), KESTO_INVALID_ARGUMENT);
    const kesto::Client unopened;
    Playback playback(unopened, "player", ServiceType::Test);
    EXPECT_EQ(playback.status(), Status::Closed);
    EXPECT_EQ(playback.start(), Status::Closed);
    EXPECT_EQ(Playback().volume(1), Status::Closed);
    EXPECT_EQ(Recording().overrun(1, 1), Status::Closed);
}

TEST_F(PlaybackTest, WhatHasNoEffectIsTakenAndSendsNothing)
{
    connect();
    Playback playback = this->playback();
    EXPECT_EQ(playback.stop(), Status::Ok);
    EXPECT_EQ(playback.pause(), Status::Ok);
    EXPECT_EQ(playback.resume(), Status::Ok);
    EXPECT_EQ(playback.volume(0.5), Status::Ok);
    EXPECT_THAT(calls(), IsEmpty());
    playback.start();
    EXPECT_THAT(timeless(calls()).back(), HasSubstr("\"PomoSessionVolume\":0.5"));
}

// ---- The end ----

TEST_F(PlaybackTest, FreeingStopsIt)
{
    connect();
    {
        Playback playback = this->playback();
        playback.start();
    }
    EXPECT_THAT(timeless(calls()),
                ElementsAre("create", "type 7", configured, "start", began, ended, left, "stop", "destroy"));
}

TEST_F(PlaybackTest, MovingPassesTheSessionOn)
{
    connect();
    Playback first = playback();
    first.start();
    Playback second(std::move(first));
    EXPECT_EQ(first.volume(0.5), Status::Closed); // NOLINT(bugprone-use-after-move): what that does
    Playback third;
    third = std::move(second);
    EXPECT_EQ(third.pause(), Status::Ok);
    EXPECT_THAT(timeless(calls()), ElementsAre("create", "type 7", configured, "start", began, ended));
}

TEST_F(PlaybackTest, ClosingTheClientStopsAll)
{
    connect();
    Playback music = playback();
    Playback idle = playback();
    Playback paused = playback();
    music.start();
    paused.start();
    paused.pause();
    EXPECT_EQ(client_.close(patience), Status::Ok);
    const auto came = timeless(service_->waitForCalls(18));
    ASSERT_EQ(came.size(), 18U);
    EXPECT_THAT(std::vector(came.begin() + 11, came.end()),
                ElementsAre(ended, left, "stop", "destroy", left, "stop", "destroy"));
    EXPECT_EQ(music.stop(), Status::Closed);
    EXPECT_EQ(music.start(), Status::Closed);
    EXPECT_EQ(client_.statistics().dropped_not_connected, 2U);
}

TEST_F(PlaybackTest, ItsEndIsSentEvenIfTheProgramDoesNotWaitForIt)
{
    connect();
    {
        const kesto::Client client = std::move(client_);
        Playback playback(client, "player", ServiceType::LongFormAudio);
        playback.start();
    }
    const std::vector<std::string> all{"create", "type 7", configured, "start", began, ended, left, "stop", "destroy"};
    EXPECT_EQ(timeless(service_->waitForCalls(9)), all);
}

TEST_F(PlaybackTest, IsStoppedByTheEndOfItsClient)
{
    connect();
    Playback playback = this->playback();
    playback.start();
    client_ = kesto::Client();
    ASSERT_EQ(service_->waitForCalls(9).size(), 9U);
    EXPECT_EQ(timeless(service_->waitForCalls(9))[5], ended);
}

TEST_F(PlaybackTest, MayOutliveItsClient)
{
    connect();
    Playback music = playback();
    Playback idle = playback();
    music.start();
    EXPECT_EQ(client_.flush(patience), Status::Ok);
    client_ = kesto::Client();
    EXPECT_EQ(music.volume(0.5), Status::Closed);
    EXPECT_EQ(music.stop(), Status::Closed);
    idle = Playback();
    EXPECT_EQ(music.start(), Status::Closed);
}

TEST_F(PlaybackTest, MayOutliveAClientThatIsFreedInItsCallback)
{
    service_.emplace(path_);
    kesto_options options{};
    options.size = sizeof options;
    options.socket_path = path_.c_str();
    kesto_client* client = nullptr;
    ASSERT_EQ(kesto_client_open(&options, &client), KESTO_OK);
    kesto_playback* playback = nullptr;
    ASSERT_EQ(kesto_playback_create(client, "player", KESTO_SERVICE_TEST, &playback), KESTO_OK);
    sdk_test::Recorder<std::string> freed;
    struct Both {
        kesto_client* client;
        sdk_test::Recorder<std::string>& freed;
    } both{client, freed};
    kesto_client_create_session(
        client, 42,
        [](void* user, const kesto_answer*) {
            kesto_client_free(static_cast<Both*>(user)->client);
            static_cast<Both*>(user)->freed.add("freed");
        },
        &both, nullptr);
    ASSERT_EQ(freed.waitFor(1).size(), 1U);
    EXPECT_EQ(kesto_playback_start(playback, nullptr, nullptr), KESTO_CLOSED);
    kesto_playback_free(playback);
}

TEST_F(PlaybackTest, AForkedChildMayFreeIt)
{
    connect();
    Playback playback = this->playback();
    playback.start();
    const auto before = calls().size();
    const pid_t child = ::fork();
    if (child == 0) {
        playback = Playback(); // swaps, and frees the old one at the end of the statement
        ::_exit(0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    EXPECT_EQ(calls().size(), before) << "the parent's goes on";
    playback.stop();
    EXPECT_EQ(calls().size(), before + 4);
}

// ---- A service that goes and comes back ----

TEST_F(PlaybackTest, WithoutReconnectItIsNotConnectedAfterALoss)
{
    connect();
    Playback playback = this->playback();
    playback.start();
    EXPECT_EQ(calls().size(), 5U);
    service_->disconnectAll();
    ASSERT_TRUE(becomes(kesto::State::Disconnected));
    EXPECT_EQ(playback.volume(0.5), Status::NotConnected);
    EXPECT_EQ(playback.stop(), Status::NotConnected);
    EXPECT_EQ(client_.statistics().dropped_not_connected, 2U);
}

TEST_F(PlaybackTest, ANewConnectionGetsEveryStartedSessionAsItIs)
{
    connect(sdk_test::answerObediently, reconnecting());
    Playback unchanged = playback();
    Playback changed = playback();
    Playback paused = playback();
    Playback stopped = playback();
    Playback neverStarted = playback();
    unchanged.start({"S16LE", 44100, 2}, "speaker");
    changed.start({"S16LE", 44100, 2}, "speaker");
    paused.start();
    stopped.start();
    paused.pause();
    const auto first = calls();
    service_.reset();
    ASSERT_TRUE(becomes(kesto::State::Disconnected));
    EXPECT_EQ(changed.volume(0.5), Status::Ok);
    EXPECT_EQ(stopped.stop(), Status::Ok);
    awaitAttempt();
    service_.emplace(path_);
    ASSERT_TRUE(becomes(kesto::State::Connected));

    const auto came = calls();
    const std::string whole = R"(Playback Start {"session_output_running":true,)"
                              R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                              R"("active_devices":"speaker","PomoSessionVolume":)";
    ASSERT_THAT(timeless(came),
                ElementsAre("create", "type 7", configured, "start", whole + "1,\"session_run\":1}", //
                            "create", "type 7", configured, "start", whole + "0.5,\"session_run\":1}", //
                            "create", "type 7", configured, "start"));
    EXPECT_EQ(timeOf(came[4]), timeOf(first[4])) << "nothing has changed since";
    EXPECT_GT(timeOf(came[9]), timeOf(first[9])) << "the volume has";

    paused.resume();
    unchanged.stop();
    const auto later = timeless(calls());
    ASSERT_GT(later.size(), 14U);
    EXPECT_THAT(std::vector(later.begin() + 14, later.end()),
                ElementsAre(R"(Playback Start {"session_output_running":true,"PomoSessionVolume":1,"session_run":2})",
                            testing::StartsWith("Playback Stop"), left, "stop", "destroy"));
}

TEST_F(PlaybackTest, IsFollowedWhileNoServiceWasEverThere)
{
    kesto::Options options = reconnecting();
    options.socketPath = path_;
    options.stateChanged = states_.callback();
    ASSERT_EQ(client_.open(options), Status::Ok);
    Playback playback = this->playback();
    ASSERT_TRUE(becomes(kesto::State::Disconnected));
    EXPECT_EQ(playback.start(), Status::Ok);
    EXPECT_EQ(playback.volume(0.5), Status::Ok);
    EXPECT_EQ(playback.volume(1), Status::Ok);
    awaitAttempt();
    service_.emplace(path_);
    ASSERT_TRUE(becomes(kesto::State::Connected));
    EXPECT_THAT(timeless(service_->waitForCalls(5)), ElementsAre("create", "type 7", configured, "start", began));
}

TEST_F(PlaybackTest, ReportsFromTheClientsOwnCallbacks)
{
    connect();
    Playback playback = this->playback();
    client_.createSession(42, [&](const kesto::Answer&) { playback.start(); });
    EXPECT_THAT(timeless(service_->waitForCalls(6)),
                ElementsAre("create", "create", "type 7", configured, "start", began));
}

// ---- A full queue ----

TEST_F(PlaybackTest, KeepsRoomForWhatDecidesThePlayTime)
{
    kesto::Options options;
    options.queueBytes = 8192;
    options.unansweredLimit = 1;
    connect(sdk_test::answerNothing, options);
    Playback playback = this->playback();
    playback.start();
    ASSERT_EQ(service_->waitForCalls(5).size(), 5U);
    std::uint64_t taken = 0;
    while (playback.volume(static_cast<double>(taken % 1000) / 1000) == Status::Ok)
        ++taken;
    EXPECT_GT(taken, 20U);
    EXPECT_EQ(playback.route("headset"), Status::QueueFull);
    EXPECT_EQ(client_.statistics().dropped_queue_full, 2U);
    EXPECT_EQ(playback.pause(), Status::Ok);
    EXPECT_EQ(playback.resume(), Status::Ok);
    EXPECT_EQ(playback.stop(), Status::Ok);
    EXPECT_EQ(playback.start(), Status::Ok);
}

TEST_F(PlaybackTest, FreeingStopsItEvenIfTheQueueIsFull)
{
    kesto::Options options;
    options.queueBytes = 4096;
    options.unansweredLimit = 1;
    std::atomic<bool> answers = false;
    connect(
        [&answers](sdk_test::Peer& peer, const Array& call) {
            if (answers)
                sdk_test::answerObediently(peer, call);
        },
        options);
    Playback playback = this->playback();
    playback.start();
    ASSERT_EQ(service_->waitForCalls(5).size(), 5U);
    while (playback.pause() == Status::Ok) { }
    playback = Playback();
    answers = true;
    service_->forEachPeer([](sdk_test::Peer& peer) {
        for (const std::uint64_t call : {1, 2, 3})
            peer.answer(call, {true});
        peer.answer(5, {});
    });
    EXPECT_THAT(timeless(service_->waitForCalls(9)),
                ElementsAre("create", "type 7", configured, "start", began, ended, left, "stop", "destroy"));
}

// ---- Real time ----

TEST_F(PlaybackTest, AllocatesNothingInItsCallersThread)
{
    connect();
    Playback playback = this->playback();
    Recording recording(client_, "recorder", ServiceType::Telephony);
    const std::size_t before = sdk_test::allocations();
    for (int round = 0; round < 100; ++round) {
        playback.start({"S16LE", 44100, 2}, "speaker");
        playback.volume(round / 100.0);
        playback.mute(round % 2 == 0);
        playback.route("headset");
        playback.format({"F32LE", 48000, 6});
        playback.underrun(1, 0.5);
        playback.pause();
        playback.resume();
        playback.stop();
        recording.start();
        recording.overrun(1, 0.5);
        recording.stop();
    }
    EXPECT_EQ(sdk_test::allocations(), before);
}

} // namespace
