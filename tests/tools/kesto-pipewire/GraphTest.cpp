// SPDX-License-Identifier: Apache-2.0
// The graph of streams, with every order of events that a server may send.

#include "kesto-pipewire/Graph.h"
#include "tools/kesto-pipewire/RecordingDeviceListener.h"
#include "tools/kesto-pipewire/RecordingStreamListener.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_pipewire {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr ObjectID sink = 30;
constexpr ObjectID node = 40;
constexpr ObjectID link = 50;

class GraphTest : public testing::Test {
protected:
    GraphTest() { EXPECT_EQ(add(sink, 30, "speaker", "Audio/Sink"), Interest::Device); }

    using Interest = Graph::Interest;

    [[nodiscard]] Interest add(ObjectID id, StreamSerial serial, std::string_view name = "player",
                               std::string_view mediaClass = "Stream/Output/Audio")
    {
        return graph.addNode(id, {.serial = serial, .mediaClass = mediaClass, .name = name});
    }
    void addStream(ObjectID id, StreamSerial serial, std::string_view name = "player",
                   std::string_view mediaClass = "Stream/Output/Audio")
    {
        ASSERT_EQ(add(id, serial, name, mediaClass), Interest::Stream);
        graph.describeNode(id, {.binary = "player"}, "Music", now);
        listener.news();
    }

    Moment now{1000, 10};
    RecordingStreamListener listener;
    RecordingDeviceListener devices;
    Graph graph{listener, devices};
};

TEST_F(GraphTest, OnlyStreamsAndDevicesOfAudioAreWanted)
{
    EXPECT_EQ(add(1, 1, "a", "Stream/Output/Audio"), Interest::Stream);
    EXPECT_EQ(add(2, 2, "b", "Stream/Input/Audio"), Interest::Stream);
    EXPECT_EQ(add(3, 3, "c", "Audio/Sink"), Interest::Device);
    EXPECT_EQ(add(4, 4, "d", "Audio/Source"), Interest::Device);
    EXPECT_EQ(add(5, 5, "e", "Audio/Duplex"), Interest::Device);
    EXPECT_EQ(add(6, 6, "f", "Stream/Input/Video"), Interest::None);
    EXPECT_EQ(add(7, 7, "g", "Midi/Bridge"), Interest::None);
    EXPECT_EQ(add(8, 8, "h", ""), Interest::None);
    EXPECT_EQ(add(1, 9, "a node is announced once", "Stream/Output/Audio"), Interest::None);

    EXPECT_THAT(devices.news(), ElementsAre("30 output speaker", "3 output c", "4 input d", "5 output e"));
}

TEST_F(GraphTest, ADevicesStateAndLinksAreReported)
{
    addStream(node, 500);
    devices.news();
    graph.setDeviceState(sink, DeviceState::Idle, now);
    graph.addLink(50, {node, sink}, now);
    graph.addLink(51, {node, sink}, now);
    graph.setDeviceState(sink, DeviceState::Running, now);
    graph.remove(50, now);
    graph.remove(51, now);
    graph.remove(sink, now);
    graph.setDeviceState(sink, DeviceState::Idle, now);

    EXPECT_THAT(devices.news(),
                ElementsAre("30 idle", "30 wanted", "30 wanted", "30 running", "30 wanted", "30 unwanted", "30 gone"));
}

// ---- Cycles ----

class GraphCyclesTest : public GraphTest {
protected:
    GraphCyclesTest()
    {
        for (const ObjectID stream : {40, 41}) {
            addStream(stream, 460 + stream);
            graph.setRunning(stream, true, at(0));
        }
        graph.setDeviceState(sink, DeviceState::Running, at(0));
        forget();
    }
    // That many seconds after the streams have set off.
    static std::int64_t nanosecondsAt(double seconds)
    {
        return 1'000'000'000'000 + static_cast<std::int64_t>(seconds * 1e9);
    }
    static Moment at(double seconds) { return momentOfMonotonic(nanosecondsAt(seconds)); }
    void forget()
    {
        listener.news();
        devices.news();
    }
    // The sink drives a cycle in which the first of these is late.
    void passCycle(double when, ObjectID lateNode, ObjectID other = 41)
    {
        graph.noteCycle({.began = nanosecondsAt(when),
                         .driver = NodeCycle{.node = sink},
                         .followers = {{.node = lateNode, .isLate = true}, {.node = other}}});
    }
    static constexpr double justBefore = 0.001;
};

TEST_F(GraphCyclesTest, ACycleIsReportedToItsDevicesAndToTheStreamsThatWereLate)
{
    passCycle(1, 41, 40);
    graph.noteCycle({.began = nanosecondsAt(2), .driver = NodeCycle{.node = sink}, .followers = {{.node = 40}}});

    EXPECT_THAT(listener.news(), ElementsAre("501 late"));
    EXPECT_THAT(devices.news(), ElementsAre("30 late cycle", "30 cycle"));
}

TEST_F(GraphCyclesTest, ADeviceThatFollowsAnotherIsLateByItself)
{
    ASSERT_EQ(add(31, 31, "other speaker", "Audio/Sink"), Interest::Device);
    graph.setDeviceState(31, DeviceState::Running, at(0));
    forget();
    passCycle(1, 40, 31);
    passCycle(2, 31, 40);

    EXPECT_THAT(listener.news(), ElementsAre("500 late"));
    EXPECT_THAT(devices.news(), ElementsAre("31 cycle", "30 late cycle", "31 late cycle", "30 late cycle"));
}

TEST_F(GraphCyclesTest, CyclesMissedWhileStartingDoNotCount)
{
    passCycle(startUpTime - justBefore, 40);
    EXPECT_THAT(listener.news(), IsEmpty());
    EXPECT_THAT(devices.news(), ElementsAre("30 cycle"));
    passCycle(startUpTime + justBefore, 40);
    EXPECT_THAT(listener.news(), ElementsAre("500 late"));
    EXPECT_THAT(devices.news(), ElementsAre("30 late cycle"));
}

TEST_F(GraphCyclesTest, CyclesMissedAfterAPauseDoNotCountEither)
{
    graph.setRunning(40, false, at(5));
    graph.setRunning(40, true, at(6));
    graph.setRunning(40, true, at(6.5)); // repeats the known state
    forget();
    passCycle(5, 40); // the pause interrupted it
    passCycle(6.1, 40);
    EXPECT_THAT(devices.news(), ElementsAre("30 cycle", "30 cycle"));
    passCycle(6.3, 40);
    EXPECT_THAT(listener.news(), ElementsAre("500 late"));
}

TEST_F(GraphCyclesTest, ADeviceSetsOffWithEachOfItsRuns)
{
    ASSERT_EQ(add(31, 31, "other speaker", "Audio/Sink"), Interest::Device);
    passCycle(1, 31);
    graph.setDeviceState(31, DeviceState::Running, at(2));
    passCycle(2.1, 31);
    passCycle(2.3, 31);
    graph.setDeviceState(31, DeviceState::Running, at(3)); // repeats the known state
    passCycle(3.1, 31);
    graph.setDeviceState(31, DeviceState::Idle, at(4));
    graph.setDeviceState(31, DeviceState::Running, at(5));
    passCycle(5.1, 31);

    EXPECT_THAT(devices.news(),
                ElementsAre("31 output other speaker", "31 cycle", "30 cycle", "31 running", "31 cycle", "30 cycle",
                            "31 late cycle", "30 late cycle", "31 running", "31 late cycle", "30 late cycle", "31 idle",
                            "31 running", "31 cycle", "30 cycle"));
}

TEST_F(GraphCyclesTest, WhatIsLateBeforeItStopsWasLate)
{
    graph.setRunning(40, false, at(5));
    forget();
    passCycle(4.9, 40);

    EXPECT_THAT(listener.news(), ElementsAre("500 late")) << "cycles are reported after they have ended";
}

TEST_F(GraphCyclesTest, AStreamIsNotBlamedForCyclesFromBeforeItSetOff)
{
    addStream(42, 502);
    passCycle(5, 42); // IDs are soon used again
    graph.setRunning(42, true, at(6));
    listener.news();
    passCycle(5.9, 42);

    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphCyclesTest, OthersThatAreLateMakeTheDriverLate)
{
    passCycle(0.1, 99); // a filter, or a stream that is gone
    EXPECT_THAT(devices.news(), ElementsAre("30 late cycle"));
    ASSERT_EQ(add(98, 98, "filter", "Audio/Filter"), Interest::None);
    passCycle(0.1, 98);
    EXPECT_THAT(devices.news(), ElementsAre("30 late cycle"));
    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphCyclesTest, ARunningDeviceThatGoesDoesNotCountAsAStreamThatEnds)
{
    graph.setRunning(40, false, at(5));
    graph.remove(sink, at(6));

    EXPECT_TRUE(graph.anyStreamRuns());
    graph.setRunning(41, false, at(7));
    EXPECT_FALSE(graph.anyStreamRuns());
}

// ---- Filters ----

constexpr StreamSerial recordingMark = 0x8000'0000'0000'0000;

class GraphFilterTest : public GraphTest {
protected:
    GraphFilterTest()
    {
        EXPECT_EQ(add(31, 31, "microphone", "Audio/Source"), Interest::Device);
        EXPECT_EQ(add(node, 500, "ardour", ""), Interest::None);
        graph.setDeviceRate(sink, 48000, now);
    }
    // The node's ports are 101, 102, ... for output and 201, 202, ... for input.
    std::optional<ObjectID> play(ObjectID id, ObjectID port, ObjectID device = sink)
    {
        return graph.addLink(id, {node, device, port, 1000 + id}, now);
    }
    std::optional<ObjectID> record(ObjectID id, ObjectID port, ObjectID device = 31)
    {
        return graph.addLink(id, {device, node, 1000 + id, port}, now);
    }
    void describeAndRun()
    {
        graph.describeNode(node, {.name = "Ardour"}, "DSP", now);
        graph.setRunning(node, true, now);
    }
    void playOnTwoPorts()
    {
        play(50, 101);
        play(51, 102);
        describeAndRun();
        listener.news();
    }
    static std::string recording(std::string_view what) { return fmt::format("{} {}", 500 + recordingMark, what); }
};

TEST_F(GraphFilterTest, AFilterIsFollowedFromItsFirstLinkWithADeviceOn)
{
    describeAndRun();
    EXPECT_THAT(listener.news(), IsEmpty()) << "it is not followed yet";
    EXPECT_EQ(play(50, 101), node);
    EXPECT_EQ(play(51, 102), std::nullopt);
    EXPECT_THAT(listener.news(), IsEmpty()) << "it is not described yet";
    describeAndRun();

    EXPECT_THAT(listener.news(),
                ElementsAre("500 appeared output role=DSP application=Ardour", "500 volume 1", "500 devices 'speaker'",
                            "500 format F32P/48000/2 2", "500 devices 'speaker'", "500 format F32P/48000/2 2",
                            "500 runs"));
    EXPECT_EQ(listener.descriptions.at(0).name, "ardour#500");
    EXPECT_TRUE(listener.descriptions.at(0).isFilter);
    EXPECT_TRUE(graph.anyStreamRuns());
}

TEST_F(GraphFilterTest, ItPlaysWhileItRunsAndIsLinkedWithASink)
{
    playOnTwoPorts();
    graph.remove(50, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'", "500 format F32P/48000/1 1"));
    graph.remove(51, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices ''", "500 halts"));
    EXPECT_FALSE(graph.anyStreamRuns());
    play(52, 101);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'", "500 format F32P/48000/1 1", "500 runs"));
    graph.setRunning(node, false, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'", "500 format F32P/48000/1 1", "500 halts"));
    graph.remove(node, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 gone"));
}

TEST_F(GraphFilterTest, APortThatIsLinkedWithTwoDevicesIsOneChannel)
{
    EXPECT_EQ(add(32, 32, "headset", "Audio/Sink"), Interest::Device);
    play(50, 101);
    play(51, 101, 32);
    graph.describeNode(node, {}, "", now);

    EXPECT_THAT(listener.news(), testing::IsSupersetOf({"500 devices 'headset,speaker'", "500 format F32P/48000/1 1"}));
}

TEST_F(GraphFilterTest, OneThatPlaysAndRecordsIsTwoStreams)
{
    graph.setDeviceRate(31, 44100, now);
    play(50, 101);
    record(51, 201);
    record(52, 202);
    describeAndRun();

    EXPECT_THAT(listener.news(),
                testing::IsSupersetOf({std::string("500 appeared output role=DSP application=Ardour"),
                                       std::string("500 devices 'speaker'"), std::string("500 format F32P/48000/1 1"),
                                       std::string("500 runs"), recording("appeared input role=DSP application=Ardour"),
                                       recording("devices 'microphone'"), recording("format F32P/44100/2 2"),
                                       recording("runs")}));
    EXPECT_EQ(listener.descriptions.at(0).name, "ardour#500");
    EXPECT_EQ(listener.descriptions.at(1).name, "ardour#500.input");
    graph.remove(50, now);
    EXPECT_THAT(listener.news(),
                testing::AllOf(testing::Contains("500 halts"), testing::Not(testing::Contains(recording("halts")))));
    graph.remove(node, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 gone", recording("gone")));
    EXPECT_FALSE(graph.anyStreamRuns());
}

TEST_F(GraphFilterTest, OnlyLinksThatPlayOrRecordOnADeviceCount)
{
    EXPECT_EQ(add(41, 501, "other filter", ""), Interest::None);
    EXPECT_EQ(add(42, 502, "Midi-Bridge", "Midi/Bridge"), Interest::None);
    EXPECT_EQ(add(43, 503, "duplex", "Audio/Duplex"), Interest::Device);
    addStream(44, 504);
    EXPECT_EQ(play(50, 101, 41), std::nullopt);
    EXPECT_EQ(record(51, 201, 41), std::nullopt);
    EXPECT_EQ(play(52, 101, 42), std::nullopt);
    EXPECT_EQ(record(53, 201, 44), std::nullopt);
    EXPECT_EQ(record(54, 201, sink), std::nullopt) << "a sink's monitor";
    EXPECT_EQ(play(55, 101, 31), std::nullopt);
    graph.addPortWithoutSound(1056); // of the device
    EXPECT_EQ(record(56, 201, 43), std::nullopt) << "a monitor";
    graph.addPortWithoutSound(109);
    EXPECT_EQ(play(57, 109), std::nullopt) << "MIDI";
    graph.addPortWithoutSound(1058);
    EXPECT_EQ(play(58, 101), std::nullopt) << "MIDI at the device";
    graph.remove(109, now);
    EXPECT_EQ(play(59, 109), node) << "another port with this ID";
    describeAndRun();
    EXPECT_THAT(listener.news(), testing::IsSupersetOf({"500 devices 'speaker'", "500 format F32P/48000/1 1"}));
    EXPECT_EQ(listener.descriptions.size(), 2u) << "with the player";
}

TEST_F(GraphFilterTest, ADuplexDeviceIsBoth)
{
    EXPECT_EQ(add(43, 503, "duplex", "Audio/Duplex"), Interest::Device);
    play(50, 101, 43);
    record(51, 201, 43);
    describeAndRun();

    EXPECT_THAT(listener.news(),
                testing::IsSupersetOf({std::string("500 devices 'duplex'"), recording("devices 'duplex'")}));
}

TEST_F(GraphFilterTest, TheFormatFollowsTheRateOfTheDevice)
{
    play(50, 101);
    record(51, 201);
    describeAndRun();
    EXPECT_THAT(listener.news(), testing::Not(testing::Contains(testing::StartsWith(recording("format")))))
        << "the microphone's rate is not known";
    graph.setDeviceRate(sink, 44100, now);
    EXPECT_THAT(listener.news(), testing::Contains("500 format F32P/44100/1 1"));
    graph.setDeviceRate(sink, 44100, now);
    EXPECT_THAT(listener.news(), IsEmpty());
    graph.setDeviceRate(31, 96000, now);
    EXPECT_THAT(listener.news(), testing::Contains(recording("format F32P/96000/1 1")));
}

TEST_F(GraphFilterTest, FiltersAndStreamsHaveOneLimit)
{
    for (ObjectID id = 0; id < maximumStreams - 1; ++id)
        ASSERT_EQ(add(1000 + id, 1000 + id), Interest::Stream);
    ASSERT_EQ(add(41, 501, "another", ""), Interest::None);
    EXPECT_EQ(play(50, 101), node);
    EXPECT_EQ(graph.addLink(51, {41, sink, 301, 1051}, now), std::nullopt);
    EXPECT_EQ(graph.ignoredObjects(), 1u);
    graph.describeNode(41, {}, "", now);
    EXPECT_THAT(listener.news(), IsEmpty());
    EXPECT_EQ(add(42, 502), Interest::None);
    graph.remove(node, now);

    EXPECT_EQ(graph.addLink(52, {41, sink, 302, 1052}, now), 41);
}

TEST_F(GraphFilterTest, AFilterThatIsLateIsLateInEachDirection)
{
    play(50, 101);
    record(51, 201);
    describeAndRun();
    listener.news();
    const Cycle cycle{.began = 10'500'000'000, .followers = {{.node = node, .isLate = true}}};
    graph.noteCycle(cycle);

    EXPECT_THAT(listener.news(), ElementsAre("500 late", recording("late")));
}

TEST_F(GraphFilterTest, PortsHaveALimit)
{
    for (ObjectID id = 0; id < maximumObjects + 3; ++id)
        graph.addPortWithoutSound(100'000 + id);

    EXPECT_EQ(graph.ignoredObjects(), 3u);
}

// ---- Chains ----

class GraphChainTest : public GraphTest {
protected:
    // A virtual sink and its stream, whose link with the speaker is 60.
    void addSinkChain()
    {
        ASSERT_EQ(add(61, 601, "chain-input", "Audio/Sink"), Interest::Device);
        ASSERT_EQ(add(62, 602, "chain-output"), Interest::Stream);
        graph.setLinkGroup(sink, "", now);
        graph.setLinkGroup(61, "chain-1", now);
        graph.setLinkGroup(62, "chain-1", now);
        graph.describeNode(62, {.name = "chain"}, "", now);
        graph.setRunning(62, true, now);
    }
};

TEST_F(GraphChainTest, WhatPlaysOnAVirtualSinkPlaysOnTheDevicesOfItsStream)
{
    addSinkChain();
    graph.addLink(60, {62, sink}, now);
    addStream(node, 500);
    graph.addLink(link, {node, 61}, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'"));
    ASSERT_EQ(add(31, 31, "headset", "Audio/Sink"), Interest::Device);
    graph.addLink(63, {62, 31}, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'headset,speaker'"));
    graph.remove(60, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'headset'"));
    graph.remove(63, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices ''"));
}

TEST_F(GraphChainTest, TheStreamOfAChainIsNotReported)
{
    addSinkChain();
    graph.addLink(60, {62, sink}, now);
    graph.setVolume(62, 0.5, now);
    graph.setRunning(62, false, now);
    graph.remove(61, now);
    graph.addLink(63, {62, sink}, now);
    graph.remove(60, now);
    graph.remove(62, now);

    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphChainTest, AnObserverThatComesLateLearnsOfTheChainInAnyOrder)
{
    ASSERT_EQ(add(62, 602, "chain-output"), Interest::Stream);
    ASSERT_EQ(add(61, 601, "chain-input", "Audio/Sink"), Interest::Device);
    addStream(node, 500);
    graph.addLink(60, {62, sink}, now);
    graph.addLink(link, {node, 61}, now);
    graph.setLinkGroup(62, "chain-1", now);
    graph.describeNode(62, {.name = "chain"}, "", now);
    graph.setLinkGroup(sink, "", now);
    listener.news();
    graph.setLinkGroup(61, "chain-1", now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'"));
}

TEST_F(GraphChainTest, WhatRecordsFromAVirtualSourceRecordsFromTheDevicesOfItsStream)
{
    ASSERT_EQ(add(31, 31, "microphone", "Audio/Source"), Interest::Device);
    ASSERT_EQ(add(61, 601, "chain-output", "Audio/Source"), Interest::Device);
    ASSERT_EQ(add(62, 602, "chain-input", "Stream/Input/Audio"), Interest::Stream);
    for (const ObjectID device : {sink, ObjectID{31}})
        graph.setLinkGroup(device, "", now);
    graph.setLinkGroup(61, "chain-1", now);
    graph.setLinkGroup(62, "chain-1", now);
    graph.describeNode(62, {}, "", now);
    graph.addLink(60, {31, 62}, now);
    addStream(node, 500, "recorder", "Stream/Input/Audio");
    graph.addLink(link, {61, node}, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'microphone'"));
}

TEST_F(GraphChainTest, MembersOfALinkGroupWithoutADeviceAreStreams)
{
    ASSERT_EQ(add(62, 602, "loopback"), Interest::Stream);
    graph.setLinkGroup(62, "loopback-1", now);
    graph.describeNode(62, {}, "", now);
    graph.setVolume(62, 0.5, now);
    graph.setFormat(62, {"F32P/48000/2", 2}, now);
    graph.setRunning(62, true, now);
    graph.addLink(60, {62, sink}, now);
    EXPECT_THAT(listener.news(), IsEmpty()) << "the sink could be of this group";
    graph.setLinkGroup(sink, "", now);

    EXPECT_THAT(listener.news(),
                ElementsAre("602 appeared output role= application=", "602 volume 0.5", "602 format F32P/48000/2 2",
                            "602 devices 'speaker'", "602 runs"));
}

TEST_F(GraphChainTest, ChainsMayBeLinkedInARing)
{
    addSinkChain();
    ASSERT_EQ(add(71, 701, "second-input", "Audio/Sink"), Interest::Device);
    ASSERT_EQ(add(72, 702, "second-output"), Interest::Stream);
    graph.setLinkGroup(71, "chain-2", now);
    graph.setLinkGroup(72, "chain-2", now);
    graph.describeNode(72, {}, "", now);
    addStream(node, 500);
    graph.addLink(link, {node, 61}, now);
    graph.addLink(73, {62, 71}, now);
    listener.news();
    graph.addLink(74, {72, sink}, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'")) << "through both";
    graph.addLink(75, {72, 61}, now);

    EXPECT_THAT(listener.news(), testing::Each("500 devices 'speaker'"));
}

TEST_F(GraphTest, AStreamsNameHasItsNodesNameAndItsNumber)
{
    addStream(40, 500, "player");
    addStream(41, 501, "player");
    addStream(42, 502, "");
    addStream(43, 503, std::string(300, 'x'));

    EXPECT_EQ(listener.descriptions[0].name, "player#500");
    EXPECT_EQ(listener.descriptions[1].name, "player#501");
    EXPECT_EQ(listener.descriptions[2].name, "unnamed#502");
    EXPECT_EQ(listener.descriptions[3].name, std::string(251, 'x') + "#503");
    EXPECT_FALSE(listener.descriptions[0].isFilter);
}

// ---- Limits and other nodes ----

TEST_F(GraphTest, DevicesBeyondTheLimitKeepTheirNamesOnly)
{
    for (ObjectID id = 1; id < maximumDevices; ++id)
        ASSERT_EQ(add(1000 + id, 1000 + id, "device", "Audio/Sink"), Interest::Device);
    EXPECT_EQ(add(31, 31, "headset", "Audio/Sink"), Interest::None);
    EXPECT_EQ(graph.ignoredObjects(), 1u);
    addStream(node, 500);
    graph.addLink(link, {node, 31}, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'headset'"));
    graph.remove(1001, now);

    EXPECT_EQ(add(32, 32, "another", "Audio/Sink"), Interest::Device);
}

TEST_F(GraphTest, AStreamAppearsWhenItIsDescribedAndOnlyOnce)
{
    ASSERT_EQ(add(node, 500), Interest::Stream);
    EXPECT_THAT(listener.news(), IsEmpty());
    graph.describeNode(node, {.name = "Player"}, "Music", now);
    graph.describeNode(node, {.name = "Player"}, "Music", now);

    EXPECT_THAT(listener.news(), ElementsAre("500 appeared output role=Music application=Player", "500 devices ''"));
}

TEST_F(GraphTest, TheApplicationIsItsIDElseItsBinaryElseItsNameOfNodeOrClient)
{
    const Identity none;
    const Identity all{"org.example.Player", "player", "Player"};
    const Identity binary{"", "player", "Player"};
    const Identity name{"", "", "Player"};
    const struct {
        Identity onNode, onClient;
        std::string application;
    } cases[] = {
        {all, none, "org.example.Player"},
        {binary, none, "player"},
        {name, none, "Player"},
        {none, all, "org.example.Player"},
        {none, binary, "player"},
        {none, name, "Player"},
        {name, binary, "player"},
        {name, all, "org.example.Player"},
        {{"", "", "On the node"}, name, "On the node"},
        {none, none, ""},
    };
    StreamSerial serial = 1000;
    for (const auto& [onNode, onClient, application] : cases) {
        graph.describeClient(7, onClient);
        ASSERT_EQ(
            graph.addNode(node, {.serial = ++serial, .mediaClass = "Stream/Output/Audio", .name = "n", .client = 7}),
            Interest::Stream);
        graph.describeNode(node, onNode, "", now);
        EXPECT_EQ(listener.news().front(), fmt::format("{} appeared output role= application={}", serial, application));
        graph.remove(node, now);
        listener.news();
    }
}

TEST_F(GraphTest, DevicesAreNamedOnceHoweverManyLinksThereAre)
{
    addStream(node, 500);
    EXPECT_EQ(add(31, 31, "another", "Audio/Sink"), Interest::Device);
    graph.addLink(50, {node, sink}, now);
    graph.addLink(51, {node, sink}, now);
    graph.addLink(52, {node, 31}, now);
    EXPECT_THAT(listener.news(),
                ElementsAre("500 devices 'speaker'", "500 devices 'speaker'", "500 devices 'another,speaker'"));
    graph.remove(50, now);
    graph.remove(51, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'another,speaker'", "500 devices 'another'"));
}

TEST_F(GraphTest, AnInputHasTheDeviceAtTheOtherEnd)
{
    addStream(node, 500, "recorder", "Stream/Input/Audio");
    graph.addLink(link, {sink, node}, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'speaker'"));
}

TEST_F(GraphTest, StreamsThatAreLinkedWithEachOtherAreEachOthersDevices)
{
    addStream(40, 500, "player");
    addStream(41, 501, "recorder", "Stream/Input/Audio");
    graph.addLink(link, {40, 41}, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 devices 'recorder'", "501 devices 'player'"));
}

TEST_F(GraphTest, WhoComesLateLearnsOfLinksThatAreThere)
{
    ASSERT_EQ(add(node, 500), Interest::Stream);
    graph.addLink(link, {node, sink}, now);
    EXPECT_THAT(listener.news(), IsEmpty());
    graph.describeNode(node, {}, "", now);

    EXPECT_THAT(listener.news(), ElementsAre("500 appeared output role= application=", "500 devices 'speaker'"));
}

TEST_F(GraphTest, WhatGoesBeforeItsLinksLetsGoOfTheirOtherEnds)
{
    addStream(40, 500);
    addStream(41, 501, "monitor", "Stream/Input/Audio");
    graph.addLink(50, {40, sink}, now);
    graph.addLink(51, {40, sink}, now);
    graph.addLink(52, {sink, 41}, now);
    listener.news();
    devices.news();
    graph.remove(40, now);
    EXPECT_THAT(listener.news(), ElementsAre("500 gone"));
    EXPECT_THAT(devices.news(), ElementsAre("30 wanted")); // by the other stream
    graph.remove(41, now);
    EXPECT_THAT(devices.news(), ElementsAre("30 unwanted"));

    addStream(42, 502);
    graph.addLink(53, {42, sink}, now);
    listener.news();
    devices.news();
    graph.remove(sink, now);
    EXPECT_THAT(devices.news(), ElementsAre("30 gone"));
    EXPECT_THAT(listener.news(), ElementsAre("502 devices ''"));
    graph.remove(53, now); // the link's own end changes nothing more
    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphTest, AnIDThatIsUsedAgainIsAnotherStream)
{
    addStream(node, 500);
    graph.setRunning(node, true, now);
    graph.addLink(link, {node, sink}, now);
    graph.remove(node, now); // before its link, which servers do not do
    listener.news();
    ASSERT_EQ(add(node, 501), Interest::Stream);
    graph.describeNode(node, {}, "", now);
    graph.setRunning(node, true, now);

    EXPECT_THAT(listener.news(), ElementsAre("501 appeared output role= application=", "501 devices ''", "501 runs"));
}

TEST_F(GraphTest, RunningIsReportedWhenItChanges)
{
    addStream(node, 500);
    graph.setRunning(node, false, now);
    graph.setRunning(node, true, now);
    graph.setRunning(node, true, now);
    EXPECT_TRUE(graph.anyStreamRuns());
    graph.setRunning(node, false, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 runs", "500 halts"));
    EXPECT_FALSE(graph.anyStreamRuns());
}

TEST_F(GraphTest, AStreamThatGoesRunsNoMore)
{
    addStream(node, 500);
    graph.setRunning(node, true, now);
    graph.remove(node, now);

    EXPECT_THAT(listener.news(), ElementsAre("500 runs", "500 gone"));
    EXPECT_FALSE(graph.anyStreamRuns());
}

TEST_F(GraphTest, WhatIsSaidOfOtherNodesIsIgnored)
{
    graph.setRunning(sink, true, now);
    graph.setVolume(sink, 1, now);
    graph.setFormat(99, {"S16LE/44100/2", 2}, now);
    graph.describeNode(sink, {}, "", now);
    graph.remove(99, now);
    graph.remove(sink, now);

    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphTest, WhenTheServerGoesEveryStreamGoes)
{
    addStream(40, 500);
    addStream(41, 501);
    ASSERT_EQ(add(42, 502), Interest::Stream); // not described yet
    graph.setRunning(40, true, now);
    listener.news();
    graph.clear(now);

    EXPECT_THAT(listener.news(), testing::UnorderedElementsAre("500 gone", "501 gone"));
    EXPECT_THAT(devices.news(), ElementsAre("30 output speaker", "30 gone"));
    EXPECT_FALSE(graph.anyStreamRuns());
    graph.addLink(link, {40, 41}, now);
    graph.setRunning(41, true, now);
    EXPECT_THAT(listener.news(), IsEmpty());
}

TEST_F(GraphTest, StreamsEndOnceAndBeforeTheDevices)
{
    addStream(node, 500);
    devices.news();
    graph.endStreams(now);
    EXPECT_THAT(listener.news(), ElementsAre("500 gone"));
    EXPECT_THAT(devices.news(), IsEmpty());
    graph.clear(now);

    EXPECT_THAT(listener.news(), IsEmpty());
    EXPECT_THAT(devices.news(), ElementsAre("30 gone"));
}

TEST_F(GraphTest, StreamsBeyondTheLimitAreLeftAsideAndCounted)
{
    for (ObjectID id = 0; id < maximumStreams; ++id)
        ASSERT_EQ(add(1000 + id, 1000 + id), Interest::Stream);
    EXPECT_EQ(add(node, 500), Interest::None);
    EXPECT_EQ(graph.ignoredObjects(), 1u);
    graph.describeNode(node, {}, "", now);
    EXPECT_THAT(listener.news(), IsEmpty());
    graph.remove(1000, now);

    EXPECT_EQ(add(node, 501), Interest::Stream);
}

TEST_F(GraphTest, ObjectsOfEveryOtherKindHaveTheirLimitToo)
{
    for (ObjectID id = 0; id < maximumObjects + 10; ++id) {
        EXPECT_EQ(add(100'000 + id, id, "device", "Audio/Card"), Interest::None);
        graph.addLink(200'000 + id, {sink, sink}, now);
        graph.describeClient(300'000 + id, {});
    }

    EXPECT_EQ(graph.ignoredObjects(), 31u); // one more of the nodes, among which the sink was already
}

TEST_F(GraphTest, ForeignTextIsMadeFitToBeSent)
{
    EXPECT_EQ(add(31, 31, "bad\xFF\xFEnäme", "Audio/Sink"), Interest::Device);
    ASSERT_EQ(add(node, 500), Interest::Stream);
    graph.addLink(link, {node, 31}, now);
    graph.describeNode(node, {.binary = std::string(10'000, 'x')}, "", now);
    const auto heard = listener.news();

    EXPECT_EQ(heard[0], "500 appeared output role= application=" + std::string(255, 'x'));
    EXPECT_EQ(heard[1], "500 devices 'bad??näme'");
}

TEST_F(GraphTest, TextIsNeverCutWithinACharacter)
{
    std::string text(254, 'x');
    text += "\u00e9"; // two bytes, of which one would fit
    ASSERT_EQ(add(node, 500), Interest::Stream);
    graph.describeNode(node, {.binary = text}, "", now);

    EXPECT_EQ(listener.news()[0], "500 appeared output role= application=" + std::string(254, 'x'));
}

} // namespace

} // namespace kesto_pipewire
