// SPDX-License-Identifier: Apache-2.0
// Playing times, on every build: from the messages of a real client to the table of stretches, through every end that a
// stretch can have.
#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using support::playback;
using support::routeChange;
using support::setup;
using support::typeDeactivate;
using support::typeStart;
using support::typeState;
using support::typeStop;
using support::volume;
using testing::ElementsAre;
using testing::IsEmpty;

const std::string rows = "SELECT printf('%g s on %s at %s: %s', round(seconds, 3), coalesce(device, '?'),"
                         " coalesce(volume, '?'), ending) FROM stretches ORDER BY id";
// By device and volume, as the service's own volume events and as the table have it.
const std::string sumsOfEvents =
    "SELECT payload ->> 'active_devices' || ' ' || (payload ->> 'PomoSessionVolume') || ' '"
    " || round(sum(payload ->> 'play_seconds'), 2) FROM events"
    " WHERE name = 'com.quarn.kesto.Volume.Summary'"
    " GROUP BY payload ->> 'active_devices', payload ->> 'PomoSessionVolume' ORDER BY 1";
const std::string sumsOfStretches = "SELECT device || ' ' || volume || ' ' || round(sum(seconds), 2) FROM stretches"
                                    " GROUP BY device, volume ORDER BY 1";

void begin(WireClient& client, int session)
{
    client.ask(Create, session);
    client.ask(SetServiceType, 7, session);
    client.ask(SetConfiguration, Dictionary{{"HostApplicationDisplayID", "tone-player"}}, session);
    client.call(Start, session);
}

void send(WireClient& client, int category, int type, const Dictionary& message, int session = 1)
{
    client.ask(SendMessage, message, category, type, Array{session});
}

Dictionary state(bool runs, double time, double loudness, const char* device, int run)
{
    return {{"session_output_running", runs},
            {"session_selected_format", "S16LE/44100/2"},
            {"mChannelsPerFrame", 2},
            {"active_devices", device},
            {"PomoSessionVolume", loudness},
            {"session_run", run},
            {"kestoreporting_timestamp", 1'795'264'500 + time},
            {"systemuptime_sec", 9086}};
}

// What kesto-pipewire sends of a tone that is made softer, paused, and moved to a headset.
void playTone(WireClient& client)
{
    begin(client, 1);
    send(client, playback, typeStart, state(true, 3.65, 1, "null-sink", 1));
    send(client, volume, typeState, {{"PomoSessionVolume", 0.5}, {"kestoreporting_timestamp", 1'795'264'505.66}});
    send(client, playback, typeStop, state(false, 9.66, 0.5, "null-sink", 1));
    send(client, playback, typeStart, state(true, 10.66, 0.5, "null-sink", 2));
    send(client, routeChange, typeState,
         {{"active_devices", "headset"}, {"kestoreporting_timestamp", 1'795'264'511.68}});
    send(client, setup, typeState,
         {{"session_selected_format", "S16LE/44100/1"},
          {"mChannelsPerFrame", 1},
          {"kestoreporting_timestamp", 1'795'264'514.68}});
    send(client, playback, typeStop, state(false, 16.89, 0.5, "headset", 2));
    send(client, playback, typeDeactivate,
         {{"session_duration", 13.249}, {"kestoreporting_timestamp", 1'795'264'516.9}});
    client.call(Stop, 1);
    client.nextReply(); // of the start
    client.nextReply();
}

class StretchesOfBuildTest : public testing::TestWithParam<bool> { };

INSTANTIATE_TEST_SUITE_P(On, StretchesOfBuildTest, testing::Bool(),
                         [](const auto& input) { return input.param ? "AnInternalBuild" : "EveryOtherBuild"; });

TEST_P(StretchesOfBuildTest, ATonesTimesAreKept)
{
    Kestod kestod(GetParam() ? Kestod::Files{{"device.toml", "InternalBuild = true\n"}} : Kestod::Files());
    kestod.start();
    WireClient client(kestod.socketPath());
    playTone(client);
    EXPECT_THAT(kestod.query(rows),
                ElementsAre("2.01 s on null-sink at 1.0: change", "4 s on null-sink at 0.5: stopped",
                            "1.02 s on null-sink at 0.5: change", "3 s on headset at 0.5: change",
                            "2.21 s on headset at 0.5: stopped"));
    EXPECT_THAT(kestod.query(sumsOfStretches),
                ElementsAre("headset 0.5 5.21", "null-sink 0.5 5.02", "null-sink 1.0 2.01"));
    EXPECT_THAT(kestod.query("SELECT count(*) FROM stretches x JOIN sessions s ON s.id = x.session"
                             " WHERE s.application = 'tone-player' AND s.service = 'longformaudio'"),
                ElementsAre("5"));
    if (GetParam())
        EXPECT_EQ(kestod.query(sumsOfEvents),
                  (std::vector<std::string>{"headset 0.5 5.21", "null-sink 0.5 5.02", "null-sink 1 2.01"}));
    else
        EXPECT_THAT(kestod.query(sumsOfEvents), IsEmpty());
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST(StretchesTest, ARepetitionThatTheSessionDropsEndsNothingAndCutsNothing)
{
    Kestod kestod;
    kestod.start();
    WireClient client(kestod.socketPath());
    begin(client, 1);
    send(client, playback, typeStart, state(true, 0, 1, "null-sink", 1));
    send(client, playback, typeStart, state(true, 4, 1, "null-sink", 1));
    send(client, playback, typeStop, state(false, 10, 1, "null-sink", 1));
    EXPECT_THAT(kestod.query(rows), ElementsAre("10 s on null-sink at 1.0: stopped"));
}

class StretchesEndTest : public testing::Test {
protected:
    void SetUp() override { kestod.start(); }
    // A session that plays at that volume.
    void play(WireClient& client, double loudness, int session = 1)
    {
        begin(client, session);
        send(client, playback, typeStart, {{"session_output_running", true}, {"PomoSessionVolume", loudness}}, session);
    }
    std::vector<std::string> endings()
    {
        return kestod.query("SELECT volume || ' ' || ending || ' ' || (seconds > 0 AND seconds < 60) FROM stretches"
                            " ORDER BY volume");
    }
    Kestod kestod;
};

TEST_F(StretchesEndTest, TheStopAndTheDestructionOfASessionEndIt)
{
    WireClient client(kestod.socketPath());
    play(client, 0.25, 1);
    play(client, 0.5, 2);
    client.call(Stop, 1);
    client.call(Destroy, 2);
    for (int reply = 0; reply < 3; ++reply) // of the first start, the stop and the destruction
        client.nextReply();
    EXPECT_THAT(endings(), ElementsAre("0.25 stopped 1", "0.5 stopped 1"));
    EXPECT_THAT(kestod.query("SELECT count(*) FROM open_stretches"), ElementsAre("0"));
}

TEST_F(StretchesEndTest, AClientThatVanishesEndsIt)
{
    {
        WireClient client(kestod.socketPath());
        play(client, 0.5);
    }
    (void)kestod.waitForEvents("com.quarn.kesto.kestoreportingclientuptime");
    EXPECT_TRUE(waitUntil([this] { return !endings().empty(); }));
    EXPECT_THAT(endings(), ElementsAre("0.5 vanished 1"));
}

// It says since when it has been playing, as libkesto does after it connected again.
TEST_F(StretchesEndTest, WhatGoesOnAfterItsConnectionBrokeCountsOnce)
{
    const double start = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    const auto says = [start](bool runs, double time) {
        return Dictionary{{"session_output_running", runs}, {"kestoreporting_timestamp", start + time}};
    };
    {
        WireClient client(kestod.socketPath());
        begin(client, 1);
        send(client, playback, typeStart, says(true, 0));
    }
    EXPECT_TRUE(waitUntil([this] { return !kestod.query("SELECT 1 FROM stretches").empty(); }));
    WireClient again(kestod.socketPath());
    begin(again, 1);
    send(again, playback, typeStart, says(true, 0));
    send(again, playback, typeStop, says(false, 200));
    EXPECT_THAT(kestod.query("SELECT ending FROM stretches ORDER BY id"), ElementsAre("vanished", "stopped"));
    EXPECT_THAT(kestod.query("SELECT round(sum(seconds), 6) FROM stretches"), ElementsAre("200.0"));
}

TEST_F(StretchesEndTest, TheServicesEndEndsIt)
{
    WireClient client(kestod.socketPath());
    play(client, 0.5);
    kestod.signal(SIGTERM);
    EXPECT_EQ(kestod.exitStatus(), 0);
    EXPECT_THAT(endings(), ElementsAre("0.5 service-ended 1"));
}

TEST_F(StretchesEndTest, AKilledServiceEndsItAtTheNextStart)
{
    WireClient client(kestod.socketPath());
    play(client, 0.5);
    send(client, volume, typeState, {{"PomoSessionVolume", 0.5}});
    kestod.kill();
    EXPECT_THAT(endings(), IsEmpty());
    kestod.startAndAwait();
    WireClient next(kestod.socketPath());
    begin(next, 1);
    send(next, volume, typeState, {{"PomoSessionVolume", 1}});
    EXPECT_THAT(endings(), ElementsAre("0.5 service-ended 1"));
    EXPECT_THAT(brokenSums(kestod), IsEmpty());
}

TEST_F(StretchesEndTest, TheConfigurationTurnsThemOff)
{
    std::ofstream(kestod.directory() / "configuration" / "analytics.toml") << "stretches = false\n";
    WireClient client(kestod.socketPath());
    play(client, 0.5, 1); // with this one the file may not have been read yet
    EXPECT_TRUE(waitUntil([&] {
        send(client, volume, typeState, {{"PomoSessionVolume", 0.5}}, 1);
        return kestod.query("SELECT count(*) FROM open_stretches") == std::vector<std::string>{"0"};
    }));
    play(client, 1, 2);
    send(client, playback, typeStop, {{"session_output_running", false}}, 2);
    EXPECT_THAT(kestod.query("SELECT count(*) FROM stretches WHERE volume = 1"), ElementsAre("0"));
}

} // namespace
} // namespace end_to_end
