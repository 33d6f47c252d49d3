// SPDX-License-Identifier: Apache-2.0
// The reports about streams, with streams and a clock that only exist in these tests.

#include "kesto-pipewire/Reporter.h"
#include "tools/kesto-pipewire/FakeReportingService.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

#include <array>
#include <cmath>
#include <map>
#include <ostream>
#include <string_view>
#include <utility>

namespace kesto_pipewire {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr double origin = 1'700'000'000; // the wall clock at the time that the tests call 0
constexpr StreamSerial stream = 500;
constexpr double justBefore = 0.001;

Moment at(double time)
{
    return {origin + time, 40 + time};
}

class ReporterTest : public testing::Test {
protected:
    ReporterTest() { reporter.serviceAppeared(); }

    // A stream with all properties that it needs to run.
    void appear(StreamSerial serial, double time, const StreamDescription& description = {.application = "player"})
    {
        reporter.appeared(serial, description, at(time));
        reporter.devicesChanged(serial, "", at(time));
        reporter.volumeChanged(serial, 0.5, at(time));
        reporter.formatChanged(serial, {"S16LE/44100/2", 2}, at(time));
        reporter.devicesChanged(serial, "speaker", at(time));
    }
    void run(StreamSerial serial, double time) { reporter.runningChanged(serial, true, at(time)); }
    void halt(StreamSerial serial, double time) { reporter.runningChanged(serial, false, at(time)); }
    void appearAndRun(StreamSerial serial, double time)
    {
        appear(serial, time);
        run(serial, time);
    }
    // Advances the time to that point, and runs due work on the way.
    void pass(double time)
    {
        while (alarm && *alarm <= at(time).uptime) {
            const auto now = *alarm - at(0).uptime;
            alarm.reset();
            reporter.settle(at(now));
        }
    }
    // The reports since the last call.
    std::vector<std::string> news()
    {
        auto told = service.told(origin);
        told.erase(told.begin(), told.begin() + static_cast<std::ptrdiff_t>(seen_));
        seen_ += told.size();
        return told;
    }
    [[nodiscard]] const FakeReportingService::Call& last() const { return service.calls.back(); }

    FakeReportingService service;
    std::optional<double> alarm;
    Reporter reporter{service, 1, [this](std::optional<double> uptime) { alarm = uptime; }};

private:
    std::size_t seen_ = 0;
};

// ---- Sessions ----

TEST_F(ReporterTest, AStreamGetsASessionWhenItAppears)
{
    appear(stream, 0, {.role = "Music", .application = "player"});

    EXPECT_THAT(news(), ElementsAre("create", "service type", "configuration", "start"));
    EXPECT_EQ(service.calls[1].get<std::int64_t>("type"), 7);
    EXPECT_EQ(service.calls[2].get<std::string>("HostApplicationDisplayID"), "player");
}

TEST_F(ReporterTest, AStreamWithoutAnApplicationGetsNoConfiguration)
{
    appear(stream, 0, {});

    EXPECT_THAT(news(), ElementsAre("create", "service type", "start"));
}

TEST(ServiceTypeTest, EveryRoleHasItsServiceType)
{
    EXPECT_EQ(serviceTypeOfRole("Phone"), ServiceType::Telephony);
    EXPECT_EQ(serviceTypeOfRole("Communication"), ServiceType::Telephony);
    EXPECT_EQ(serviceTypeOfRole("Notification"), ServiceType::Alerts);
    EXPECT_EQ(serviceTypeOfRole("Alarm"), ServiceType::Alarms);
    EXPECT_EQ(serviceTypeOfRole("Music"), ServiceType::LongFormAudio);
    EXPECT_EQ(serviceTypeOfRole("Movie"), ServiceType::LongFormAudio);
    EXPECT_EQ(serviceTypeOfRole("Game"), ServiceType::NonLongFormAudio);
    EXPECT_EQ(serviceTypeOfRole("Event"), ServiceType::SystemSounds);
    EXPECT_EQ(serviceTypeOfRole("Test"), ServiceType::Test);
    EXPECT_EQ(serviceTypeOfRole("Accessibility"), ServiceType::Generic);
    EXPECT_EQ(serviceTypeOfRole("music"), ServiceType::Generic);
    EXPECT_EQ(serviceTypeOfRole(""), ServiceType::Generic);
}

TEST_F(ReporterTest, NoTwoStreamsEverHaveTheSameSession)
{
    appear(1, 0);
    appear(2, 0);
    reporter.gone(1, at(1));
    appear(1, 2); // a serial of another server, after the first one went
    const auto created = service.callsOf("create");

    ASSERT_EQ(created.size(), 3u);
    EXPECT_EQ(created[0].session, 1);
    EXPECT_EQ(created[1].session, 2);
    EXPECT_EQ(created[2].session, 3);
}

TEST_F(ReporterTest, AStreamThatGoesEndsItsSession)
{
    appear(stream, 1);
    news();
    reporter.gone(stream, at(3.25));

    EXPECT_THAT(news(), ElementsAre("Playback Deactivate 3.25", "stop", "destroy"));
    EXPECT_EQ(service.callsOf("Playback Deactivate")[0].get<double>("session_duration"), 2.25);
}

TEST_F(ReporterTest, AStreamThatGoesWhileItRunsStopsFirst)
{
    appearAndRun(stream, 1);
    news();
    reporter.gone(stream, at(3));

    EXPECT_THAT(news(), ElementsAre("Playback Stop 3", "Playback Deactivate 3", "stop", "destroy"));
}

TEST_F(ReporterTest, TheLossOfLinksWithTheStreamIsNotAChangeOfRoute)
{
    appearAndRun(stream, 1);
    news();
    halt(stream, 3);
    reporter.devicesChanged(stream, "", at(3.001));
    reporter.gone(stream, at(3.002));

    EXPECT_THAT(news(), ElementsAre("Playback Stop 3", "Playback Deactivate 3.002", "stop", "destroy"));
}

TEST_F(ReporterTest, NothingIsReportedOfAStreamThatHasGone)
{
    appearAndRun(stream, 1);
    reporter.gone(stream, at(3));
    news();
    run(stream, 4);
    reporter.volumeChanged(stream, 0.1, at(4));
    reporter.cycleWasLate(stream, at(4));
    reporter.gone(stream, at(4));
    pass(10);

    EXPECT_THAT(news(), IsEmpty());
    EXPECT_EQ(alarm, std::nullopt);
}

// ---- Start and stop ----

TEST_F(ReporterTest, AStartCarriesTheStateThatWasKnownBefore)
{
    appear(stream, 1);
    reporter.volumeChanged(stream, 0.25, at(2));
    news();
    run(stream, 3.5);

    EXPECT_THAT(news(), ElementsAre("Playback Start 3.5"));
    EXPECT_EQ(last().get<bool>("session_output_running"), true);
    EXPECT_EQ(last().get<std::string>("session_selected_format"), "S16LE/44100/2");
    EXPECT_EQ(last().get<std::int64_t>("mChannelsPerFrame"), 2);
    EXPECT_EQ(last().get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.25);
    EXPECT_EQ(last().get<double>("kestoreporting_timestamp"), origin + 3.5);
    EXPECT_EQ(last().get<std::int64_t>("systemuptime_sec"), 44); // 43.5 rounded
}

TEST_F(ReporterTest, AStopCarriesTheSame)
{
    appearAndRun(stream, 1);
    halt(stream, 2);
    pass(3);

    EXPECT_EQ(last().what, "Playback Stop");
    EXPECT_EQ(last().get<bool>("session_output_running"), false);
    EXPECT_EQ(last().get<std::string>("session_selected_format"), "S16LE/44100/2");
    EXPECT_EQ(last().get<std::int64_t>("mChannelsPerFrame"), 2);
    EXPECT_EQ(last().get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.5);
}

TEST_F(ReporterTest, AnInputIsARecord)
{
    appear(stream, 0, {.direction = Direction::Input, .application = "recorder"});
    news();
    run(stream, 1);
    EXPECT_EQ(last().get<bool>("session_input_running"), true);
    EXPECT_FALSE(last().has("session_output_running"));
    halt(stream, 2);
    reporter.gone(stream, at(3));

    EXPECT_THAT(news(), ElementsAre("Record Start 1", "Record Stop 2", "Record Deactivate 3", "stop", "destroy"));
}

TEST_F(ReporterTest, AStartWaitsForWhatIsNotKnownYetButKeepsItsTime)
{
    reporter.appeared(stream, {}, at(0));
    reporter.volumeChanged(stream, 1, at(0));
    reporter.devicesChanged(stream, "speaker", at(0));
    news();
    run(stream, 1);
    EXPECT_THAT(news(), IsEmpty());
    reporter.formatChanged(stream, {"F32P/48000/6", 6}, at(1.02));

    EXPECT_THAT(news(), ElementsAre("Playback Start 1"));
    EXPECT_EQ(last().get<std::int64_t>("mChannelsPerFrame"), 6);
}

TEST_F(ReporterTest, AStartDoesNotWaitForever)
{
    reporter.appeared(stream, {}, at(0));
    news();
    run(stream, 1);
    pass(1 + settlingTime - justBefore);
    EXPECT_THAT(news(), IsEmpty());
    pass(1 + settlingTime);

    EXPECT_THAT(news(), ElementsAre("Playback Start 1"));
    EXPECT_FALSE(last().has("session_selected_format"));
    EXPECT_FALSE(last().has("mChannelsPerFrame"));
    EXPECT_FALSE(last().has("PomoSessionVolume"));
    EXPECT_EQ(last().get<std::string>("active_devices"), "none");
}

TEST_F(ReporterTest, APauseIsReportedWhenItHasLastedWithTheTimeAtWhichItBegan)
{
    appearAndRun(stream, 1);
    news();
    halt(stream, 5);
    pass(5 + settlingTime - justBefore);
    EXPECT_THAT(news(), IsEmpty());
    pass(5 + settlingTime);
    EXPECT_THAT(news(), ElementsAre("Playback Stop 5"));
    run(stream, 9);

    EXPECT_THAT(news(), ElementsAre("Playback Start 9"));
}

TEST_F(ReporterTest, ADipOfAFewMillisecondsIsNotAPause)
{
    appearAndRun(stream, 1);
    news();
    halt(stream, 5);
    run(stream, 5.004);
    pass(20);

    EXPECT_THAT(news(), IsEmpty());
    EXPECT_EQ(alarm, std::nullopt);
}

TEST_F(ReporterTest, TheShortestSoundIsReported)
{
    appear(stream, 0);
    news();
    run(stream, 1);
    halt(stream, 1.003);
    pass(2);

    EXPECT_THAT(news(), ElementsAre("Playback Start 1", "Playback Stop 1.003"));
}

TEST_F(ReporterTest, AShortSoundIsReportedThoughItsFormatWasNeverKnown)
{
    reporter.appeared(stream, {}, at(0));
    news();
    run(stream, 1);
    halt(stream, 1.003);
    reporter.gone(stream, at(1.004));

    EXPECT_THAT(news(),
                ElementsAre("Playback Start 1", "Playback Stop 1.003", "Playback Deactivate 1.004", "stop", "destroy"));
}

TEST_F(ReporterTest, ASecondRunIsNotARepetitionOfTheFirst)
{
    appearAndRun(stream, 1);
    halt(stream, 2);
    pass(3);
    run(stream, 4);
    halt(stream, 5);
    pass(6);
    const auto starts = service.callsOf("Playback Start");
    const auto stops = service.callsOf("Playback Stop");

    ASSERT_EQ(starts.size(), 2u);
    ASSERT_EQ(stops.size(), 2u);
    EXPECT_NE(starts[0].content(), starts[1].content());
    EXPECT_NE(stops[0].content(), stops[1].content());
    EXPECT_EQ(starts[1].get<std::int64_t>("session_run"), 2);
}

// ---- Volume ----

TEST_F(ReporterTest, AChangeOfVolumeIsReportedAtOnce)
{
    appearAndRun(stream, 1);
    news();
    reporter.volumeChanged(stream, 0.75, at(3));

    EXPECT_THAT(news(), ElementsAre("Volume State 3"));
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.75);
}

TEST_F(ReporterTest, ARepeatedVolumeIsNotTold)
{
    appearAndRun(stream, 1);
    news();
    reporter.volumeChanged(stream, 0.5, at(3));
    pass(10);

    EXPECT_THAT(news(), IsEmpty());
}

TEST_F(ReporterTest, TheFirstStartReportsAnEarlierVolume)
{
    appear(stream, 0);
    news();
    reporter.volumeChanged(stream, 0.75, at(3));
    pass(10);
    EXPECT_THAT(news(), IsEmpty());
    run(stream, 11);

    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.75);
}

TEST_F(ReporterTest, AVolumeSetDuringAPauseIsReported)
{
    appearAndRun(stream, 1);
    halt(stream, 2);
    pass(3);
    news();
    reporter.volumeChanged(stream, 0.75, at(4));
    run(stream, 5);

    EXPECT_THAT(news(), ElementsAre("Volume State 4", "Playback Start 5"));
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.75);
}

TEST_F(ReporterTest, AMovingSliderIsReportedNowAndThenAndAtItsEnd)
{
    appearAndRun(stream, 0);
    news();
    for (int step = 0; step <= 10; ++step) {
        const auto time = 2 + step * 0.03;
        pass(time);
        reporter.volumeChanged(stream, 0.51 + step * 0.01, at(time));
    }
    pass(10);
    const auto told = service.callsOf("Volume State");

    EXPECT_THAT(news(),
                ElementsAre("Volume State 2", "Volume State 2.09", "Volume State 2.18", "Volume State 2.27",
                            "Volume State 2.3"));
    EXPECT_DOUBLE_EQ(told.back().get<double>("PomoSessionVolume").value(), 0.61);
}

// ---- Devices and formats ----

TEST_F(ReporterTest, AMoveToAnotherDeviceIsOneChangeOfRoute)
{
    appearAndRun(stream, 1);
    news();
    reporter.devicesChanged(stream, "", at(4));
    reporter.devicesChanged(stream, "headset", at(4.001));
    halt(stream, 4.0015);
    run(stream, 4.003);
    pass(4.5);

    EXPECT_THAT(news(), ElementsAre("RouteChange State 4.001"));
    EXPECT_EQ(last().get<std::string>("active_devices"), "headset");
}

TEST_F(ReporterTest, ADeviceThatComesRightBackIsNotAChange)
{
    appearAndRun(stream, 1);
    news();
    reporter.devicesChanged(stream, "", at(4));
    halt(stream, 4.001);
    reporter.devicesChanged(stream, "speaker", at(4.03));
    run(stream, 4.04);
    pass(20);

    EXPECT_THAT(news(), IsEmpty());
}

TEST_F(ReporterTest, AStreamThatLosesItsDeviceStopsOnThatDeviceAndThenHasNone)
{
    appearAndRun(stream, 1);
    news();
    reporter.devicesChanged(stream, "", at(4));
    halt(stream, 4.001);
    pass(5);

    EXPECT_THAT(news(), ElementsAre("Playback Stop 4.001", "RouteChange State 4.001"));
    EXPECT_EQ(service.callsOf("Playback Stop")[0].get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(last().get<std::string>("active_devices"), "none");
}

TEST_F(ReporterTest, ALostDeviceIsReportedAfterTheVolumeThatChangedBeforeADip)
{
    appearAndRun(stream, 1);
    news();
    reporter.devicesChanged(stream, "", at(2));
    reporter.volumeChanged(stream, 0.25, at(2.01));
    halt(stream, 2.02);
    pass(2.1);
    run(stream, 2.11);
    pass(3);

    EXPECT_THAT(news(), ElementsAre("Volume State 2.01", "RouteChange State 2.02"));
}

TEST_F(ReporterTest, AMoveDuringAPauseIsReported)
{
    appearAndRun(stream, 1);
    halt(stream, 2);
    pass(3);
    news();
    reporter.devicesChanged(stream, "headset", at(4));
    pass(5);

    EXPECT_THAT(news(), ElementsAre("RouteChange State 4"));
}

TEST_F(ReporterTest, AChangeOfFormatIsReported)
{
    appearAndRun(stream, 1);
    news();
    reporter.formatChanged(stream, {"F32LE/48000/6", 6}, at(4));
    pass(5);

    EXPECT_THAT(news(), ElementsAre("Setup State 4"));
    EXPECT_EQ(last().get<std::string>("session_selected_format"), "F32LE/48000/6");
    EXPECT_EQ(last().get<std::int64_t>("mChannelsPerFrame"), 6);
}

TEST_F(ReporterTest, WhatFollowsAHeldStopWaitsForItAndKeepsItsPlace)
{
    appearAndRun(stream, 1);
    news();
    halt(stream, 4);
    reporter.volumeChanged(stream, 0.1, at(4.02));
    EXPECT_THAT(news(), IsEmpty());
    pass(5);

    EXPECT_THAT(news(), ElementsAre("Playback Stop 4", "Volume State 4.02"));
    EXPECT_EQ(service.callsOf("Playback Stop")[0].get<double>("PomoSessionVolume"), 0.5);
}

TEST_F(ReporterTest, ARestlessDeviceIsReportedNowAndThenAndDelaysNothing)
{
    appearAndRun(stream, 0);
    news();
    for (int turn = 0; turn < 100; ++turn) { // 5 s without a rest
        pass(2 + turn * 0.05);
        reporter.devicesChanged(stream, "dock " + std::to_string(turn), at(2 + turn * 0.05));
    }
    reporter.volumeChanged(stream, 0.2, at(6.96));
    EXPECT_EQ(service.callsOf("Volume State").size(), 0u); // the move to the device is older, and not settled
    pass(6.95 + settlingTime);

    EXPECT_EQ(service.callsOf("Volume State").size(), 1u);
    EXPECT_THAT(service.callsOf("RouteChange State"),
                testing::SizeIs(testing::AllOf(testing::Ge(4u), testing::Le(6u))));
}

TEST_F(ReporterTest, APauseIsReportedThoughTheDeviceIsStillRestless)
{
    appearAndRun(stream, 1);
    news();
    halt(stream, 4);
    reporter.devicesChanged(stream, "headset", at(4.09));
    pass(4 + settlingTime);
    EXPECT_THAT(news(), ElementsAre("Playback Stop 4"));
    run(stream, 4.15);
    pass(5);

    EXPECT_THAT(news(), ElementsAre("RouteChange State 4.09", "Playback Start 4.15"));
}

// ---- Filters ----

class ReporterFilterTest : public ReporterTest {
protected:
    ReporterFilterTest()
    {
        reporter.appeared(stream, {.name = "ardour#500", .isFilter = true}, at(0));
        reporter.volumeChanged(stream, 1, at(0));
        news();
    }
    // A link with the speaker is added or removed; so many there are now.
    void link(int links, double time)
    {
        reporter.devicesChanged(stream, links > 0 ? "speaker" : "", at(time));
        if (links > 0)
            reporter.formatChanged(stream, {"F32P/48000/" + std::to_string(links), links}, at(time));
        reporter.runningChanged(stream, links > 0, at(time));
    }
    void linkTwice(double time)
    {
        link(1, time);
        link(2, time + 0.01);
    }
    void unlinkTwice(double time)
    {
        link(1, time);
        link(0, time + 0.01);
    }
};

TEST_F(ReporterFilterTest, TheFirstStartWaitsForTheOtherLinks)
{
    linkTwice(1);
    EXPECT_THAT(news(), IsEmpty());
    pass(3);

    EXPECT_THAT(news(), ElementsAre("Playback Start 1"));
    EXPECT_EQ(last().get<std::string>("session_selected_format"), "F32P/48000/2");
    EXPECT_EQ(last().get<std::string>("active_devices"), "speaker");
}

TEST_F(ReporterFilterTest, LinksThatGoOneByOneAreAStopWithAllChannels)
{
    linkTwice(1);
    pass(3);
    news();
    unlinkTwice(4);
    pass(6);

    EXPECT_THAT(news(), ElementsAre("Playback Stop 4.01", "RouteChange State 4.01"));
    EXPECT_EQ(service.callsOf("Playback Stop").at(0).get<std::string>("session_selected_format"), "F32P/48000/2");
    EXPECT_EQ(service.callsOf("Playback Stop").at(0).get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(last().get<std::string>("active_devices"), "none");
}

TEST_F(ReporterFilterTest, ALaterStartNamesTheDevice)
{
    linkTwice(1);
    pass(3);
    unlinkTwice(4);
    pass(6);
    news();
    linkTwice(7);
    pass(9);

    EXPECT_THAT(news(), ElementsAre("RouteChange State 7", "Playback Start 7"));
    EXPECT_EQ(last().get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(last().get<std::string>("session_selected_format"), "F32P/48000/2");
}

TEST_F(ReporterFilterTest, ALinkMoreIsAChangeOfFormat)
{
    linkTwice(1);
    pass(3);
    news();
    link(3, 4);
    pass(6);

    EXPECT_THAT(news(), ElementsAre("Setup State 4"));
    EXPECT_EQ(last().get<std::int64_t>("mChannelsPerFrame"), 3);
}

TEST_F(ReporterFilterTest, TheShortestRunHasItsDeviceAndFormat)
{
    link(1, 1);
    link(0, 1.02);
    reporter.gone(stream, at(1.03));

    EXPECT_THAT(news(),
                ElementsAre("Playback Start 1", "Playback Stop 1.02", "Playback Deactivate 1.03", "stop", "destroy"));
    EXPECT_EQ(service.callsOf("Playback Start").at(0).get<std::string>("active_devices"), "speaker");
    EXPECT_EQ(service.callsOf("Playback Start").at(0).get<std::string>("session_selected_format"), "F32P/48000/1");
}

TEST_F(ReporterFilterTest, EveryMessageNamesTheStream)
{
    linkTwice(1);
    pass(3);
    reporter.cycleWasLate(stream, at(3));
    reporter.volumeChanged(stream, 0.5, at(3.5));
    link(3, 4);
    pass(4.5);
    reporter.devicesChanged(stream, "headset", at(5));
    pass(9);
    reporter.gone(stream, at(10));

    std::vector<std::string> named;
    for (const auto& call : service.calls)
        if (call.get<std::string>("stream") == "ardour#500")
            named.push_back(call.what);
    EXPECT_THAT(named,
                ElementsAre("Playback Start", "Volume State", "Setup State", "Error IssueDetector", "RouteChange State",
                            "Playback Stop", "Playback Deactivate"));
}

// ---- Late cycles ----

TEST_F(ReporterTest, LateCyclesAreOneEpisodeUntilThereIsQuiet)
{
    appearAndRun(stream, 0);
    news();
    for (const double time : {5.0, 5.02, 5.04, 6.5})
        reporter.cycleWasLate(stream, at(time));
    pass(6.5 + quietTime - justBefore);
    EXPECT_THAT(news(), IsEmpty());
    pass(6.5 + quietTime);

    EXPECT_THAT(news(), ElementsAre("Error IssueDetector 6.5"));
    EXPECT_EQ(last().get<std::string>("issue"), "late_cycles");
    EXPECT_EQ(last().get<std::int64_t>("late_cycles"), 4);
    EXPECT_EQ(last().get<double>("issue_duration"), 1.5);
    EXPECT_EQ(last().get<std::string>("active_devices"), "speaker");
}

TEST_F(ReporterTest, AfterTheQuietAnotherEpisodeBegins)
{
    appearAndRun(stream, 0);
    news();
    reporter.cycleWasLate(stream, at(5));
    pass(9);
    reporter.cycleWasLate(stream, at(9));
    pass(20);

    EXPECT_THAT(news(), ElementsAre("Error IssueDetector 5", "Error IssueDetector 9"));
}

TEST_F(ReporterTest, TroubleWithoutEndIsReportedOnceAMinute)
{
    appearAndRun(stream, 0);
    news();
    for (double time = 1; time < 151; time += 0.5) {
        pass(time);
        reporter.cycleWasLate(stream, at(time));
    }
    pass(200);
    const auto told = service.callsOf("Error IssueDetector");

    ASSERT_EQ(told.size(), 3u);
    std::int64_t cycles = 0;
    for (const auto& message : told)
        cycles += message.get<std::int64_t>("late_cycles").value();
    EXPECT_EQ(cycles, 300);
}

TEST_F(ReporterTest, CyclesOfAStreamThatDoesNotRunDoNotCount)
{
    appear(stream, 0);
    news();
    reporter.cycleWasLate(stream, at(3));
    pass(20);

    EXPECT_THAT(news(), IsEmpty());
}

TEST_F(ReporterTest, AnEpisodeEndsWithItsRun)
{
    appearAndRun(stream, 0);
    news();
    reporter.cycleWasLate(stream, at(5));
    halt(stream, 5.5);
    pass(5.5 + settlingTime);

    EXPECT_THAT(news(), ElementsAre("Error IssueDetector 5", "Playback Stop 5.5"));
}

// ---- Several streams ----

TEST_F(ReporterTest, StreamsDoNotMix)
{
    appearAndRun(1, 0);
    appearAndRun(2, 1);
    reporter.volumeChanged(1, 0.1, at(2));
    reporter.volumeChanged(2, 0.9, at(3));
    halt(1, 4);
    pass(5);

    std::vector<std::string> first;
    for (const auto& call : service.calls)
        if (call.session == 1 && call.isMessage())
            first.push_back(call.what);
    EXPECT_THAT(first, ElementsAre("Playback Start", "Volume State", "Playback Stop"));
    EXPECT_EQ(last().session, 1);
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.1);
}

// ---- The service goes and comes ----

TEST_F(ReporterTest, WithoutAServiceNothingIsReported)
{
    reporter.serviceLost();
    appearAndRun(stream, 0);
    reporter.volumeChanged(stream, 0.1, at(2));
    reporter.gone(stream, at(3));

    EXPECT_THAT(news(), IsEmpty());
}

TEST_F(ReporterTest, AServiceThatComesLateLearnsTheStateOfEveryStream)
{
    reporter.serviceLost();
    appear(1, 0);
    appearAndRun(2, 1);
    reporter.serviceAppeared();

    EXPECT_THAT(news(),
                ElementsAre("create", "service type", "configuration", "start", //
                            "create", "service type", "configuration", "start", "Playback Start 1"));
    EXPECT_EQ(last().session, 2);
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.5);
}

TEST_F(ReporterTest, AServiceThatCameBackGetsTheTimeSinceWhichTheStateHolds)
{
    appearAndRun(stream, 1);
    reporter.volumeChanged(stream, 0.75, at(10));
    reporter.serviceLost();
    pass(30);
    news();
    reporter.serviceAppeared();

    EXPECT_THAT(news(), ElementsAre("create", "service type", "configuration", "start", "Playback Start 10"));
    EXPECT_EQ(last().get<double>("PomoSessionVolume"), 0.75);
    EXPECT_EQ(last().get<bool>("session_output_running"), true);
    reporter.volumeChanged(stream, 0.5, at(40));
    EXPECT_THAT(news(), ElementsAre("Volume State 40"));
}

TEST_F(ReporterTest, ADipDoesNotMakeTheStateYounger)
{
    appearAndRun(stream, 1);
    reporter.devicesChanged(stream, "", at(9));
    halt(stream, 9.001);
    reporter.devicesChanged(stream, "speaker", at(9.002));
    run(stream, 9.003);
    pass(30);
    reporter.serviceLost();
    reporter.serviceAppeared();

    EXPECT_EQ(news().back(), "Playback Start 1");
}

TEST_F(ReporterTest, AStreamThatPausedWhileTheServiceWasAwayIsNotStarted)
{
    appearAndRun(stream, 1);
    reporter.serviceLost();
    halt(stream, 2);
    pass(3);
    news();
    reporter.serviceAppeared();
    EXPECT_THAT(news(), ElementsAre("create", "service type", "configuration", "start"));
    run(stream, 5);

    EXPECT_THAT(news(), ElementsAre("Playback Start 5"));
}

TEST_F(ReporterTest, AStopThatIsHeldWhileTheServiceComesBackIsReportedAfterTheStart)
{
    appearAndRun(stream, 1);
    reporter.serviceLost();
    halt(stream, 2);
    news();
    reporter.serviceAppeared();
    pass(3);

    EXPECT_THAT(news(),
                ElementsAre("create", "service type", "configuration", "start", "Playback Start 1", "Playback Stop 2"));
}

// ---- The alarm ----

TEST_F(ReporterTest, TheAlarmIsSetOnlyWhileSomethingWaits)
{
    appearAndRun(stream, 1);
    EXPECT_EQ(alarm, std::nullopt);
    halt(stream, 2);
    EXPECT_DOUBLE_EQ(alarm.value(), at(2 + settlingTime).uptime);
    pass(3);

    EXPECT_EQ(alarm, std::nullopt);
}

TEST_F(ReporterTest, AnAlarmThatGoesOffTooEarlyIsSetAgain)
{
    appearAndRun(stream, 1);
    halt(stream, 2);
    alarm.reset();
    reporter.settle(at(2 + settlingTime / 2));

    EXPECT_DOUBLE_EQ(alarm.value(), at(2 + settlingTime).uptime);
}

// ---- All sequences of events ----

// One event of a stream, some time after the event before.
struct Happening {
    enum class Kind { Run, Halt, Volume, Devices, Format, LateCycle } kind = Kind::Run;
    double pause = 0;
    int value = 0;
};

// RapidCheck shows the events of a sequence that breaks a property.
void showValue(const Happening& happening, std::ostream& out)
{
    constexpr std::array<std::string_view, 6> names{"Run", "Halt", "Volume", "Devices", "Format", "LateCycle"};
    out << happening.pause << " s later " << names.at(static_cast<std::size_t>(happening.kind)) << ' '
        << happening.value;
}

rc::Gen<std::vector<Happening>> happenings(std::vector<Happening::Kind> kinds)
{
    // Pauses on both sides of every waiting time; in odd thousandths, so that none ends at a deadline.
    const auto pause = rc::gen::map(rc::gen::element(1, 7, 31, 87, 113, 389, 1171, 2703),
                                    [](int milliseconds) { return milliseconds / 1000.0 + 0.0003; });
    return rc::gen::container<std::vector<Happening>>(rc::gen::build<Happening>(
        rc::gen::set(&Happening::kind, rc::gen::elementOf(kinds)), rc::gen::set(&Happening::pause, pause),
        rc::gen::set(&Happening::value, rc::gen::inRange(0, 3))));
}

class ReporterProperty : public ReporterTest {
protected:
    struct Stretch {
        double begin = 0;
        double end = 0;
    };

    // Applies all events to one stream, and returns its real running times.
    std::vector<Stretch> play(const std::vector<Happening>& happened)
    {
        std::vector<Stretch> ran;
        bool isRunning = false;
        double time = 1;
        appear(stream, time);
        for (const auto& [kind, pause, value] : happened) {
            time += pause;
            pass(time);
            switch (kind) {
            case Happening::Kind::Run:
                if (!std::exchange(isRunning, true))
                    ran.push_back({time, 0});
                run(stream, time);
                break;
            case Happening::Kind::Halt:
                if (std::exchange(isRunning, false))
                    ran.back().end = time;
                halt(stream, time);
                break;
            case Happening::Kind::Volume: reporter.volumeChanged(stream, value / 4.0, at(time)); break;
            case Happening::Kind::Devices: reporter.devicesChanged(stream, std::string(value, 'd'), at(time)); break;
            case Happening::Kind::Format:
                reporter.formatChanged(stream, {std::string(value, 'f'), value}, at(time));
                break;
            case Happening::Kind::LateCycle: reporter.cycleWasLate(stream, at(time)); break;
            }
        }
        time += 5;
        pass(time);
        reporter.gone(stream, at(time));
        if (isRunning)
            ran.back().end = time;
        return ran;
    }
    // Its running times according to the reports.
    [[nodiscard]] std::vector<Stretch> told() const
    {
        std::vector<Stretch> stretches;
        for (const auto& call : service.calls) {
            if (call.what == "Playback Start")
                stretches.push_back({call.time() - origin, 0});
            if (call.what == "Playback Stop") {
                RC_ASSERT(!stretches.empty());
                RC_ASSERT(stretches.back().end == 0);
                stretches.back().end = call.time() - origin;
            }
        }
        return stretches;
    }
};

RC_GTEST_FIXTURE_PROP(ReporterProperty, PlayingIsReportedAsItWasExceptDips, ())
{
    using enum Happening::Kind;
    auto expected = play(*happenings({Run, Halt, Volume, LateCycle}));
    for (std::size_t next = 1; next < expected.size();) {
        if (expected[next].begin - expected[next - 1].end < settlingTime) {
            expected[next - 1].end = expected[next].end;
            expected.erase(expected.begin() + static_cast<std::ptrdiff_t>(next));
        } else {
            ++next;
        }
    }
    const auto stretches = told();

    RC_ASSERT(stretches.size() == expected.size());
    for (std::size_t i = 0; i < expected.size(); ++i) {
        RC_ASSERT(std::abs(stretches[i].begin - expected[i].begin) < 1e-5);
        RC_ASSERT(std::abs(stretches[i].end - expected[i].end) < 1e-5);
    }
}

RC_GTEST_FIXTURE_PROP(ReporterProperty, ReportsAreInOrderAndNeverRepeated, ())
{
    using enum Happening::Kind;
    play(*happenings({Run, Halt, Volume, Devices, Format, LateCycle}));
    RC_ASSERT(alarm == std::nullopt);
    RC_ASSERT(service.calls.front().what == "create");
    RC_ASSERT(service.calls.back().what == "destroy");
    for (const auto& stretch : told())
        RC_ASSERT(stretch.begin < stretch.end);

    double time = 0;
    std::map<std::string, Payload> previous;
    for (const auto& call : service.calls) {
        if (!call.isMessage() || call.what == "Error IssueDetector")
            continue;
        RC_ASSERT(call.time() - origin >= time);
        time = call.time() - origin;
        const auto [known, isFirst] = previous.try_emplace(call.what, call.content());
        RC_ASSERT(isFirst || known->second != call.content());
        known->second = call.content();
    }
}

RC_GTEST_FIXTURE_PROP(ReporterProperty, TheStateThatWasToldLastIsTheLastState, ())
{
    using enum Happening::Kind;
    const auto happened = *happenings({Run, Volume, Devices, Format});
    play(happened);
    std::optional<double> volume;
    std::optional<std::string> devices;
    for (const auto& call : service.calls) {
        if (!call.isMessage())
            continue;
        volume = call.get<double>("PomoSessionVolume").or_else([&] { return volume; });
        devices = call.get<std::string>("active_devices").or_else([&] { return devices; });
    }
    RC_PRE(volume.has_value());
    double lastVolume = 0.5;
    std::string lastDevices = "speaker";
    for (const auto& [kind, pause, value] : happened) {
        if (kind == Volume)
            lastVolume = value / 4.0;
        if (kind == Devices)
            lastDevices = value == 0 ? "none" : std::string(value, 'd');
    }
    RC_ASSERT(volume == lastVolume);
    RC_ASSERT(devices == lastDevices);
}

} // namespace

} // namespace kesto_pipewire
