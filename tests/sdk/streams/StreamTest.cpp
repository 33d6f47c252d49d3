// SPDX-License-Identifier: Apache-2.0
// What a playback and a recording make of their owner's calls, at moments of the test's choosing.
#include "streams/Stream.h"

#include "kesto/playback.h"
#include "platform/linux/connection/FrameReader.h"
#include "sdk/Allocations.h"
#include "sdk/Described.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <new>
#include <set>

namespace {

using libkesto::Call;
using libkesto::Direction;
using libkesto::Moment;
using libkesto::Stream;
using libkesto::StreamAction;
using libkesto::StreamRecord;
using testing::ElementsAre;
using testing::IsEmpty;

// Keeps what came, as the wire has it.
class CallKeeper final : public libkesto::CallTaker {
public:
    void takeCall(const Call& call) override
    {
        if (calls.size() == failingAt) {
            failingAt = never;
            throw std::bad_alloc();
        }
        std::string bytes;
        libkesto::appendCall(calls.size() + 1, call, bytes);
        foundation::CborDecoder decoder;
        calls.push_back(*decoder.decode(std::string_view(bytes).substr(platform::frameHeadSize)).value().array());
    }
    // What came since the last call.
    std::vector<std::string> news()
    {
        auto texts = sdk_test::described(calls);
        texts.erase(texts.begin(), texts.begin() + static_cast<std::ptrdiff_t>(seen_));
        seen_ += texts.size();
        return texts;
    }

    static constexpr std::size_t never = 1000;
    std::size_t failingAt = never; // the number of the call at which memory is exhausted
    std::vector<foundation::Array> calls;

private:
    std::size_t seen_ = 0;
};

class StreamTest : public testing::Test {
protected:
    // A moment so many seconds after the test's first, which was 1000 seconds after the device started.
    static Moment at(double seconds) { return {1'700'000'000 + seconds, 1000 + seconds}; }

    void follow(double seconds, StreamRecord record, std::string_view device = {}, std::string_view encoding = {})
    {
        record.when = at(seconds);
        record.deviceBytes = static_cast<std::uint16_t>(device.size());
        stream_->follow(record, std::string(device).append(encoding), isServed_ ? &service_ : nullptr);
    }
    void start(double seconds)
    {
        follow(seconds,
               {.action = StreamAction::Start, .hasDevice = true, .hasFormat = true, .rate = 44100, .channels = 2},
               "speaker", "S16LE");
    }
    void restart(double seconds) { follow(seconds, {.action = StreamAction::Start}); }
    void pause(double seconds) { follow(seconds, {.action = StreamAction::Pause}); }
    void resume(double seconds) { follow(seconds, {.action = StreamAction::Resume}); }
    void stop(double seconds) { follow(seconds, {.action = StreamAction::Stop}); }
    void volume(double seconds, double volume) { follow(seconds, {.action = StreamAction::Volume, .number = volume}); }
    void mute(double seconds, bool isMuted) { follow(seconds, {.action = StreamAction::Mute, .isMuted = isMuted}); }
    void route(double seconds, std::string_view device) { follow(seconds, {.action = StreamAction::Route}, device); }
    void format(double seconds, std::string_view encoding, std::uint32_t rate, std::uint32_t channels)
    {
        follow(seconds, {.action = StreamAction::Format, .rate = rate, .channels = channels}, {}, encoding);
    }
    void fault(double seconds, std::uint64_t cycles, double duration)
    {
        follow(seconds, {.action = StreamAction::Fault, .number = duration, .cycles = cycles});
    }
    // From now on it is this one.
    void use(Stream& stream) { stream_ = &stream; }

    CallKeeper service_;
    bool isServed_ = true;
    Stream playback_{Direction::Output, "org.example.player", KESTO_SERVICE_LONG_FORM_AUDIO};
    Stream recording_{Direction::Input, "org.example.recorder", KESTO_SERVICE_TELEPHONY};
    Stream* stream_ = &playback_;
};

TEST_F(StreamTest, IsOneSessionFromStartToStop)
{
    start(0);
    EXPECT_THAT(service_.news(),
                ElementsAre("create", "type 7", R"(configure {"HostApplicationDisplayID":"org.example.player"})",
                            "start",
                            R"(Playback Start {"session_output_running":true,)"
                            R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                            R"("active_devices":"speaker","PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000000,"systemuptime_sec":1000})"));
    EXPECT_TRUE(stream_->isStarted());
    stop(2.5);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(Playback Stop {"session_output_running":false,)"
                            R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                            R"("active_devices":"speaker","PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000002.5,"systemuptime_sec":1003})",
                            R"(Playback Deactivate {"session_duration":2.5,)"
                            R"("kestoreporting_timestamp":1700000002.5,"systemuptime_sec":1003})",
                            "stop", "destroy"));
    EXPECT_FALSE(stream_->isStarted());
}

TEST_F(StreamTest, ARecordingSaysThatItsInputRuns)
{
    use(recording_);
    start(0);
    stop(1);
    EXPECT_THAT(service_.news(),
                ElementsAre("create", "type 2", R"(configure {"HostApplicationDisplayID":"org.example.recorder"})",
                            "start",
                            R"(Record Start {"session_input_running":true,"session_selected_format":"S16LE/44100/2",)"
                            R"("mChannelsPerFrame":2,"active_devices":"speaker","PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000000,"systemuptime_sec":1000})",
                            R"(Record Stop {"session_input_running":false,"session_selected_format":"S16LE/44100/2",)"
                            R"("mChannelsPerFrame":2,"active_devices":"speaker","PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})",
                            R"(Record Deactivate {"session_duration":1,)"
                            R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})",
                            "stop", "destroy"));
}

TEST_F(StreamTest, EverySessionHasAReporterOfItsOwn)
{
    std::set<std::int64_t> reporters;
    for (int session = 0; session < 100; ++session) {
        const std::size_t first = service_.calls.size();
        restart(session);
        volume(session + 0.25, 0.5 + session / 1000.0);
        stop(session + 0.5);
        for (std::size_t index = first; index < service_.calls.size(); ++index)
            EXPECT_EQ(sdk_test::reporterOf(service_.calls[index]), sdk_test::reporterOf(service_.calls[first]));
        const std::int64_t reporter = sdk_test::reporterOf(service_.calls[first]);
        EXPECT_GT(reporter, 0);
        reporters.insert(reporter);
    }
    EXPECT_EQ(reporters.size(), 100U);
}

TEST_F(StreamTest, APauseEndsTheRunAndNotTheSession)
{
    restart(0);
    service_.news();
    pause(1);
    pause(2);
    resume(3);
    resume(4);
    pause(5);
    stop(6);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(Playback Stop {"session_output_running":false,"PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})",
                            R"(Playback Start {"session_output_running":true,"PomoSessionVolume":1,"session_run":2,)"
                            R"("kestoreporting_timestamp":1700000003,"systemuptime_sec":1003})",
                            R"(Playback Stop {"session_output_running":false,"PomoSessionVolume":1,"session_run":2,)"
                            R"("kestoreporting_timestamp":1700000005,"systemuptime_sec":1005})",
                            R"(Playback Deactivate {"session_duration":6,)"
                            R"("kestoreporting_timestamp":1700000006,"systemuptime_sec":1006})",
                            "stop", "destroy"));
}

TEST_F(StreamTest, ChangesAreReportedOnceInPausesToo)
{
    start(0);
    service_.news();
    volume(1, 0.5);
    volume(2, 0.5);
    pause(3);
    service_.news();
    volume(4, 0.25);
    route(5, "speaker");
    route(5, "headset");
    format(6, "S16LE", 44100, 2);
    format(6, "F32LE", 48000, 6);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(Volume State {"PomoSessionVolume":0.25,)"
                            R"("kestoreporting_timestamp":1700000004,"systemuptime_sec":1004})",
                            R"(RouteChange State {"active_devices":"headset",)"
                            R"("kestoreporting_timestamp":1700000005,"systemuptime_sec":1005})",
                            R"(Setup State {"session_selected_format":"F32LE/48000/6","mChannelsPerFrame":6,)"
                            R"("kestoreporting_timestamp":1700000006,"systemuptime_sec":1006})"));
}

TEST_F(StreamTest, EveryPartOfAFormatCounts)
{
    start(0);
    service_.news();
    format(1, "S16LE", 48000, 2);
    format(2, "S16LE", 48000, 1);
    format(3, "S24LE", 48000, 1);
    EXPECT_THAT(service_.news(),
                ElementsAre(testing::HasSubstr("\"S16LE/48000/2\",\"mChannelsPerFrame\":2"),
                            testing::HasSubstr("\"S16LE/48000/1\",\"mChannelsPerFrame\":1"),
                            testing::HasSubstr("\"S24LE/48000/1\",\"mChannelsPerFrame\":1")));
}

TEST_F(StreamTest, AFormatWithoutRateOrChannelsIsItsEncoding)
{
    restart(0);
    service_.news();
    format(1, "iec958", 48000, 0);
    format(2, "iec958", 0, 0);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(Setup State {"session_selected_format":"iec958/48000",)"
                            R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})",
                            R"(Setup State {"session_selected_format":"iec958",)"
                            R"("kestoreporting_timestamp":1700000002,"systemuptime_sec":1002})"));
}

// The reported volumes, in their order.
std::vector<double> volumes(const CallKeeper& service)
{
    std::vector<double> all;
    for (const foundation::Array& call : service.calls)
        if (sdk_test::described(call).starts_with("Volume State"))
            all.push_back(call[2].dictionary()->find("PomoSessionVolume")->number()->doubleValue());
    return all;
}

TEST_F(StreamTest, VolumesAreRoundedToFourDecimalsAndAtMostOne)
{
    restart(0);
    volume(1, 0.12345);
    volume(2, 0.123451); // the same
    volume(3, 1.5);
    volume(4, std::numeric_limits<double>::infinity()); // the same
    volume(5, 1); // the same
    volume(6, 0.99996); // the same
    volume(7, 0.99994);
    volume(8, -0.0);
    EXPECT_THAT(volumes(service_), ElementsAre(0.1235, 1, 0.9999, 0));
    EXPECT_THAT(sdk_test::described(service_.calls).back(), testing::HasSubstr(R"("PomoSessionVolume":0,)"));
}

TEST_F(StreamTest, MutedCountsAsZeroAndUnmutingRestores)
{
    restart(0);
    mute(1, false); // the same
    volume(2, 0.5);
    mute(3, true);
    mute(4, true); // the same
    volume(5, 0.75); // still muted
    mute(6, false);
    EXPECT_THAT(volumes(service_), ElementsAre(0.5, 0, 0.75));
}

TEST_F(StreamTest, AVolumeOfBeforeIsThatOfEveryLaterStart)
{
    volume(-1, 0.25);
    mute(-1, true);
    mute(-1, false);
    EXPECT_THAT(service_.news(), IsEmpty());
    start(0);
    EXPECT_THAT(service_.news().back(), testing::HasSubstr(R"("PomoSessionVolume":0.25,"session_run":1)"));
    stop(1);
    service_.news();
    start(2);
    EXPECT_THAT(service_.news().back(), testing::HasSubstr(R"("PomoSessionVolume":0.25,"session_run":1)"));
}

TEST_F(StreamTest, AStartWithoutFormatAndDeviceHasTheLastOnes)
{
    route(-1, "headset");
    format(-1, "S16LE", 48000, 1);
    restart(0);
    EXPECT_THAT(service_.news().back(),
                testing::HasSubstr(R"("session_selected_format":"S16LE/48000/1","mChannelsPerFrame":1,)"
                                   R"("active_devices":"headset",)"));
    stop(1);
    start(2);
    stop(3);
    service_.news();
    restart(4);
    EXPECT_THAT(service_.news().back(),
                testing::HasSubstr(R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                                   R"("active_devices":"speaker",)"));
}

TEST_F(StreamTest, AnEmptyRouteIsNoDevice)
{
    start(0);
    service_.news();
    route(1, "");
    route(2, "none"); // the same
    fault(3, 1, 0.5);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(RouteChange State {"active_devices":"none",)"
                            R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})",
                            testing::HasSubstr(R"("active_devices":"none")")));
}

TEST_F(StreamTest, FaultsAreReportedEachTime)
{
    start(0);
    service_.news();
    fault(1, 56, 1.1734);
    fault(1, 56, 1.1734);
    const std::string underrun = R"(Error IssueDetector {"issue":"underrun","late_cycles":56,"issue_duration":1.173,)"
                                 R"("active_devices":"speaker",)"
                                 R"("kestoreporting_timestamp":1700000001,"systemuptime_sec":1001})";
    EXPECT_THAT(service_.news(), ElementsAre(underrun, underrun));
    use(recording_);
    restart(2);
    service_.news();
    fault(3, 1, 0);
    EXPECT_THAT(service_.news(),
                ElementsAre(R"(Error IssueDetector {"issue":"overrun","late_cycles":1,"issue_duration":0,)"
                            R"("kestoreporting_timestamp":1700000003,"systemuptime_sec":1003})"));
}

TEST_F(StreamTest, WithoutAStartOnlyTheStateChanges)
{
    stop(0);
    pause(1);
    resume(2);
    fault(3, 1, 1);
    route(4, "headset");
    start(5);
    stop(6);
    service_.news();
    resume(7);
    fault(8, 1, 1);
    volume(9, 0.5);
    stop(10);
    EXPECT_THAT(service_.news(), IsEmpty());
}

TEST_F(StreamTest, ASecondStartEndsTheFirstSession)
{
    restart(0);
    service_.news();
    restart(2);
    EXPECT_THAT(service_.news(),
                ElementsAre(testing::StartsWith(R"(Playback Stop {"session_output_running":false,)"),
                            R"(Playback Deactivate {"session_duration":2,)"
                            R"("kestoreporting_timestamp":1700000002,"systemuptime_sec":1002})",
                            "stop", "destroy", "create", "type 7",
                            R"(configure {"HostApplicationDisplayID":"org.example.player"})", "start",
                            R"(Playback Start {"session_output_running":true,"PomoSessionVolume":1,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000002,"systemuptime_sec":1002})"));
}

TEST_F(StreamTest, BytesThatAreNotTextBecomeQuestionMarks)
{
    Stream odd(Direction::Output, "pl\xFFyer", 0);
    use(odd);
    follow(0, {.action = StreamAction::Start, .hasDevice = true, .hasFormat = true}, "sp\xC3", "S\x80");
    EXPECT_THAT(service_.news(),
                ElementsAre("create", "type 0", R"(configure {"HostApplicationDisplayID":"pl?yer"})", "start",
                            testing::HasSubstr(R"("session_selected_format":"S?","active_devices":"sp?")")));
}

TEST_F(StreamTest, ALongApplicationIsCutBetweenCharacters)
{
    Stream longNamed(Direction::Output, std::string(254, 'x') + "\xC3\xA4" + "rest", 0);
    use(longNamed);
    restart(0);
    EXPECT_EQ(service_.news()[2], R"(configure {"HostApplicationDisplayID":")" + std::string(254, 'x') + "\"}");
}

// ---- A service that comes and goes ----

TEST_F(StreamTest, ANewSessionBeginsWithTheStateAndTheTimeSinceWhichItIsSo)
{
    start(0);
    volume(10, 0.5);
    service_.news();
    stream_->renewSession(service_);
    EXPECT_THAT(service_.news(),
                ElementsAre("create", "type 7", R"(configure {"HostApplicationDisplayID":"org.example.player"})",
                            "start",
                            R"(Playback Start {"session_output_running":true,)"
                            R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
                            R"("active_devices":"speaker","PomoSessionVolume":0.5,"session_run":1,)"
                            R"("kestoreporting_timestamp":1700000010,"systemuptime_sec":1010})"));
}

TEST_F(StreamTest, WhatHappensWithoutAServiceIsInTheNewSession)
{
    start(0);
    isServed_ = false;
    pause(1);
    resume(2);
    volume(3, 0.5);
    route(4, "headset");
    volume(5, 0.5); // no change
    service_.news();
    stream_->renewSession(service_);
    EXPECT_EQ(service_.news().back(),
              R"(Playback Start {"session_output_running":true,)"
              R"("session_selected_format":"S16LE/44100/2","mChannelsPerFrame":2,)"
              R"("active_devices":"headset","PomoSessionVolume":0.5,"session_run":2,)"
              R"("kestoreporting_timestamp":1700000004,"systemuptime_sec":1004})");
    isServed_ = true;
    stop(20);
    EXPECT_THAT(service_.news()[1], testing::StartsWith(R"(Playback Deactivate {"session_duration":20,)"));
}

TEST_F(StreamTest, APausedOneGetsASessionAndNoStart)
{
    start(0);
    pause(1);
    service_.news();
    stream_->renewSession(service_);
    EXPECT_THAT(service_.news(), ElementsAre("create", "type 7", testing::_, "start"));
    resume(2);
    EXPECT_THAT(service_.news(), ElementsAre(testing::HasSubstr(R"("session_run":2,)")));
}

TEST_F(StreamTest, FollowingWithoutAServiceDoesNotAllocate)
{
    isServed_ = false;
    const std::string device(KESTO_LONGEST_DEVICE, 'd');
    const std::string encoding(KESTO_LONGEST_ENCODING, 'e');
    const std::string texts = device + encoding;
    StreamRecord record{.action = StreamAction::Start, .hasDevice = true, .hasFormat = true};
    record.deviceBytes = static_cast<std::uint16_t>(device.size());
    const std::size_t before = sdk_test::allocations();
    stream_->follow(record, texts, nullptr);
    record.action = StreamAction::Route;
    stream_->follow(record, device, nullptr);
    record.action = StreamAction::Format;
    stream_->follow(record, encoding, nullptr);
    record.action = StreamAction::Stop;
    stream_->follow(record, {}, nullptr);
    EXPECT_EQ(sdk_test::allocations(), before);
}

// The client's thread follows a record again if memory was exhausted in the middle, after it has lost the connection.
TEST_F(StreamTest, ARecordThatIsFollowedAgainGivesTheSameState)
{
    for (std::size_t failing = 0; failing < 9; ++failing) {
        CallKeeper service;
        service.failingAt = failing;
        Stream stream(Direction::Output, "player", 0);
        StreamRecord record{.action = StreamAction::Start, .when = at(0)};
        const auto followTwice = [&] {
            try {
                stream.follow(record, {}, &service);
            } catch (const std::bad_alloc&) {
                stream.follow(record, {}, nullptr);
            }
        };
        followTwice();
        EXPECT_TRUE(stream.isStarted());
        record = {.action = StreamAction::Pause, .when = at(1)};
        followTwice();
        record = {.action = StreamAction::Resume, .when = at(2)};
        followTwice();
        CallKeeper next;
        stream.renewSession(next);
        EXPECT_THAT(next.news().back(),
                    testing::HasSubstr(R"("session_run":2,"kestoreporting_timestamp":1700000002,)"));
        record = {.action = StreamAction::Stop, .when = at(3)};
        followTwice();
        EXPECT_FALSE(stream.isStarted());
    }
}

} // namespace
