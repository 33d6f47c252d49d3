// SPDX-License-Identifier: Apache-2.0
// The observer's reports of real streams on a real PipeWire without hardware.

#include "kesto-pipewire/Observer.h"
#include "tools/kesto-pipewire/HeadlessPipeWire.h"
#include "tools/kesto-pipewire/RecordingDeviceListener.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <pipewire/pipewire.h>

#include <algorithm>
#include <csignal>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <vector>

namespace kesto_pipewire {

namespace {

constexpr double patience = 20; // seconds; events normally come within a fraction of one

// A stream as the observer reported it.
struct SeenStream {
    StreamDescription description;
    bool runs = false;
    std::optional<double> volume{};
    std::optional<StreamFormat> format{};
    std::string devices{};
    std::vector<double> lateCycles{}; // when they began
    bool isGone = false;
    // When it last started or stopped running, changed its volume, and went.
    double runningChangedAt = 0;
    double volumeChangedAt = 0;
    double goneAt = 0;
};

// Records every reported stream, in the order of appearance.
class SeenStreams : public StreamListener {
public:
    explicit SeenStreams(std::function<void()> changed) : changed_(std::move(changed)) { }

    void appeared(StreamSerial serial, const StreamDescription& description, Moment) override
    {
        EXPECT_TRUE(!indices_.contains(serial) || at(serial).isGone);
        indices_[serial] = streams.size();
        streams.push_back({.description = description});
        changed_();
    }
    void runningChanged(StreamSerial serial, bool running, Moment when) override
    {
        at(serial).runs = running;
        at(serial).runningChangedAt = when.secondsSince1970;
        changed_();
    }
    void volumeChanged(StreamSerial serial, double volume, Moment when) override
    {
        if (std::exchange(at(serial).volume, volume) != volume)
            at(serial).volumeChangedAt = when.secondsSince1970;
        changed_();
    }
    void formatChanged(StreamSerial serial, const StreamFormat& format, Moment) override
    {
        at(serial).format = format;
        changed_();
    }
    void devicesChanged(StreamSerial serial, const std::string& devices, Moment) override
    {
        at(serial).devices = devices;
        changed_();
    }
    void cycleWasLate(StreamSerial serial, Moment when) override
    {
        at(serial).lateCycles.push_back(when.secondsSince1970);
        changed_();
    }
    void gone(StreamSerial serial, Moment when) override
    {
        at(serial).isGone = true;
        at(serial).goneAt = when.secondsSince1970;
        changed_();
    }

    std::vector<SeenStream> streams;

private:
    SeenStream& at(StreamSerial serial) { return streams.at(indices_.at(serial)); }

    std::function<void()> changed_;
    std::map<StreamSerial, std::size_t> indices_;
};

class ObserverTest : public testing::Test {
protected:
    void SetUp() override
    {
        if (!server.reasonToSkip().empty())
            GTEST_SKIP() << server.reasonToSkip();
        pw_init(nullptr, nullptr);
        pw_log_set_level(SPA_LOG_LEVEL_NONE);
        loop.emplace();
        timeout = loop->addTimer([this] {
            timedOut = true;
            loop->quit();
        });
        observer.emplace(*loop, server.socket(), seen, devices, diagnostics);
    }
    void TearDown() override
    {
        observer.reset();
        timeout = {};
        loop.reset();
        if (server.reasonToSkip().empty())
            pw_deinit();
    }

    // Runs the loop until the condition holds.
    [[nodiscard]] bool happens(std::function<bool()> condition)
    {
        awaited = std::move(condition);
        timedOut = false;
        loop->arm(timeout, patience);
        if (!awaited())
            loop->run();
        loop->disarm(timeout);
        awaited = nullptr;
        return !timedOut;
    }
    void letTimePass(double seconds)
    {
        auto timer = loop->addTimer([this] { loop->quit(); });
        loop->arm(timer, seconds);
        loop->run();
    }
    [[nodiscard]] std::ptrdiff_t lateCyclesOfDevices() const
    {
        return std::ranges::count_if(devices.cycles(), &NodeCycle::isLate);
    }
    [[nodiscard]] SeenStream& first() { return seen.streams.at(0); }
    // Whether the stream of that number, from 0, runs and all its properties are known.
    [[nodiscard]] bool plays(std::size_t number) const
    {
        if (seen.streams.size() <= number)
            return false;
        const auto& stream = seen.streams[number];
        return stream.runs && stream.volume && stream.format && !stream.devices.empty();
    }
    void quitWhenItHappened()
    {
        if (awaited && awaited())
            loop->quit();
    }

    HeadlessPipeWire server;
    Diagnostics diagnostics{false};
    RecordingDeviceListener devices{[this] { quitWhenItHappened(); }};
    SeenStreams seen{[this] { quitWhenItHappened(); }};
    std::optional<Loop> loop;
    Source timeout;
    bool timedOut = false;
    std::function<bool()> awaited;
    std::optional<Observer> observer;
};

TEST_F(ObserverTest, APlayerIsSeenWithAllThatIsKnownOfIt)
{
    observer->start();
    const auto player = server.playTone("Game");
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().description.direction, Direction::Output);
    EXPECT_EQ(first().description.role, "Game");
    EXPECT_EQ(first().description.application, "tone-player");
    EXPECT_EQ(first().volume, 1);
    EXPECT_EQ(first().format, (StreamFormat{"S16LE/44100/2", 2}));
    EXPECT_EQ(first().devices, "null-sink");
}

TEST_F(ObserverTest, APlayerOverPulseIsSeenUnderItsOwnName)
{
    observer->start();
    const auto player = server.playOverPulse("phone");
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().description.role, "Communication");
    EXPECT_EQ(first().description.application, "pacat"); // and not the server's that speaks for it
}

TEST_F(ObserverTest, WhoComesLateSeesWhatAlreadyPlays)
{
    const auto player = server.playOverPulse("music");
    server.runToEnd({"sh", "-c", "until pactl list short sink-inputs | grep -q .; do sleep 0.01; done"});
    server.runToEnd({"pactl", "set-sink-input-volume", server.onlySinkInput(), "30%"});
    observer->start();
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().description.role, "Music");
    EXPECT_EQ(first().volume, 0.3);
    EXPECT_EQ(first().devices, "null-sink");
}

TEST_F(ObserverTest, APauseAndItsEndAreSeen)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    auto before = currentMoment().secondsSince1970;
    player->write("pause\n");
    ASSERT_TRUE(happens([this] { return !first().runs; }));
    EXPECT_THAT(first().runningChangedAt, testing::AllOf(testing::Ge(before), testing::Le(before + 0.5)));
    EXPECT_EQ(first().devices, "null-sink");
    before = currentMoment().secondsSince1970;
    player->write("play\n");
    ASSERT_TRUE(happens([this] { return first().runs; }));

    EXPECT_THAT(first().runningChangedAt, testing::AllOf(testing::Ge(before), testing::Le(before + 0.5)));
    EXPECT_EQ(seen.streams.size(), 1u);
}

TEST_F(ObserverTest, VolumeAndMuteAreSeenOnTheScaleOfTheUser)
{
    observer->start();
    const auto player = server.playOverPulse("music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    const auto input = server.onlySinkInput();
    server.runToEnd({"pactl", "set-sink-input-volume", input, "50%"});
    EXPECT_TRUE(happens([this] { return first().volume == 0.5; }));
    server.runToEnd({"pactl", "set-sink-input-volume", input, "20%", "40%"});
    EXPECT_TRUE(happens([this] { return first().volume == 0.4; }));
    server.runToEnd({"pactl", "set-sink-input-mute", input, "1"});
    EXPECT_TRUE(happens([this] { return first().volume == 0; }));
    server.runToEnd({"pactl", "set-sink-input-mute", input, "0"});
    EXPECT_TRUE(happens([this] { return first().volume == 0.4; }));
    server.runToEnd({"pactl", "set-sink-input-volume", input, "150%"});

    EXPECT_TRUE(happens([this] { return first().volume == 1; }));
}

TEST_F(ObserverTest, TwoStreamsAtOnceAreDistinguished)
{
    observer->start();
    const auto one = server.playOverPulse("music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    const auto input = server.onlySinkInput();
    const auto other = server.playTone("Game");
    ASSERT_TRUE(happens([this] { return plays(1); }));
    server.runToEnd({"pactl", "set-sink-input-volume", input, "50%"});
    ASSERT_TRUE(happens([this] { return first().volume == 0.5; }));
    EXPECT_EQ(seen.streams[1].volume, 1);
    other->write("pause\n");
    ASSERT_TRUE(happens([this] { return !seen.streams[1].runs; }));
    EXPECT_TRUE(first().runs);
    one->kill(SIGKILL);
    ASSERT_TRUE(happens([this] { return first().isGone; }));

    EXPECT_FALSE(seen.streams[1].isGone);
}

TEST_F(ObserverTest, ARecorderIsSeenAsAnInput)
{
    observer->start();
    const auto recorder = server.record();
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().description.direction, Direction::Input);
    EXPECT_EQ(first().devices, "null-sink");
}

TEST_F(ObserverTest, AStreamThatIsKilledIsGone)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    player->kill(SIGKILL);

    EXPECT_TRUE(happens([this] { return first().isGone; }));
}

TEST_F(ObserverTest, AStreamFollowsItsDevices)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    server.runToEnd({"pactl", "load-module", "module-null-sink", "sink_name=headset"});
    server.runToEnd({"pactl", "set-default-sink", "headset"});
    ASSERT_TRUE(happens([this] { return first().devices == "headset" && first().runs; }));
    server.runToEnd({"pactl", "unload-module", "module-null-sink"});

    EXPECT_TRUE(happens([this] { return first().devices == "null-sink" && first().runs; }));
    EXPECT_EQ(seen.streams.size(), 1u);
}

TEST_F(ObserverTest, AStreamWithoutADeviceDoesNotRun)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    server.runToEnd({"pw-link", "-d", "tone-player:output_FL", "null-sink:playback_FL"});
    server.runToEnd({"pw-link", "-d", "tone-player:output_FR", "null-sink:playback_FR"});
    ASSERT_TRUE(happens([this] { return first().devices.empty() && !first().runs; }));
    server.runToEnd({"pw-link", "tone-player:output_FL", "null-sink:playback_FL"});

    EXPECT_TRUE(happens([this] { return first().devices == "null-sink" && first().runs; }));
}

// ---- Filters and chains ----

TEST_F(ObserverTest, AFilterIsSeenFromItsFirstLinkWithADeviceOn)
{
    observer->start();
    const auto filter = server.runFilter(2, 1);
    server.link("null-sink:monitor_FL", "tone-filter:input_1");
    server.link("tone-filter:midi", "null-sink:playback_FL");
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    EXPECT_EQ(first().description.application, "tone-player") << "neither a monitor nor MIDI counts";
    server.link("tone-filter:output_1", "null-sink:playback_FL");
    server.link("tone-filter:output_2", "null-sink:playback_FR");
    ASSERT_TRUE(happens([this] { return plays(1) && seen.streams[1].format->channels == 2; }));

    const auto& stream = seen.streams[1];
    EXPECT_EQ(stream.description.direction, Direction::Output);
    EXPECT_EQ(stream.description.application, "tone-filter");
    EXPECT_THAT(stream.description.name, testing::MatchesRegex("tone-filter#[0-9]+"));
    EXPECT_EQ(stream.format, (StreamFormat{"F32P/48000/2", 2}));
    EXPECT_EQ(stream.volume, 1);
    EXPECT_EQ(stream.devices, "null-sink");
    filter->kill(SIGKILL);
    EXPECT_TRUE(happens([this] { return seen.streams[1].isGone; }));
    EXPECT_EQ(seen.streams.size(), 2u);
}

TEST_F(ObserverTest, WhoComesLateSeesAFilterThatPlays)
{
    const auto filter = server.runFilter(1, 0);
    server.link("tone-filter:output_1", "null-sink:playback_FL");
    observer->start();

    EXPECT_TRUE(happens([this] { return plays(0) && first().format->text == "F32P/48000/1"; }));
}

TEST_F(ObserverTest, AFilterPlaysWhileItIsLinked)
{
    observer->start();
    const auto filter = server.runFilter(1, 0);
    server.link("tone-filter:output_1", "null-sink:playback_FL");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    server.unlink("tone-filter:output_1", "null-sink:playback_FL");
    ASSERT_TRUE(happens([this] { return !first().runs && first().devices.empty(); }));
    server.link("tone-filter:output_1", "null-sink:playback_FL");

    EXPECT_TRUE(happens([this] { return plays(0); }));
    EXPECT_EQ(seen.streams.size(), 1u);
}

TEST_F(ObserverTest, AFilterThatPlaysAndRecordsIsTwoStreams)
{
    observer->start();
    const auto source = server.runChain("Audio/Source");
    server.link("null-sink:monitor_FL", "chain-input:input_FL");
    const auto filter = server.runFilter(1, 1);
    server.link("tone-filter:output_1", "null-sink:playback_FL");
    server.link("chain-output:capture_FL", "tone-filter:input_1");
    ASSERT_TRUE(happens([this] { return plays(0) && plays(1); }));

    EXPECT_EQ(first().description.direction, Direction::Output);
    EXPECT_EQ(first().devices, "null-sink");
    EXPECT_EQ(seen.streams[1].description.direction, Direction::Input);
    EXPECT_EQ(seen.streams[1].devices, "null-sink");
    EXPECT_EQ(seen.streams[1].description.name, first().description.name + ".input");
    server.unlink("chain-output:capture_FL", "tone-filter:input_1");
    EXPECT_TRUE(happens([this] { return !seen.streams[1].runs; }));
    EXPECT_TRUE(first().runs);
}

TEST_F(ObserverTest, WhatPlaysThroughAChainPlaysOnceAndOnTheRealDevice)
{
    observer->start();
    const auto chain = server.runChain("Audio/Sink");
    server.link("chain-output:output_FL", "null-sink:playback_FL");
    const auto player = server.playOverPulse("music", "chain-input");
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().description.application, "pacat");
    EXPECT_EQ(first().devices, "null-sink");
    server.runToEnd({"pactl", "load-module", "module-null-sink", "sink_name=headset"});
    server.link("chain-output:output_FL", "headset:playback_FL");
    EXPECT_TRUE(happens([this] { return first().devices == "headset,null-sink"; }));
    EXPECT_EQ(seen.streams.size(), 1u);
}

TEST_F(ObserverTest, WhoComesLateSeesThroughAChainToo)
{
    const auto chain = server.runChain("Audio/Sink");
    server.link("chain-output:output_FL", "null-sink:playback_FL");
    const auto player = server.playOverPulse("music", "chain-input");
    server.runToEnd({"sh", "-c", "until pactl list sink-inputs | grep -q pacat; do sleep 0.01; done"});
    observer->start();
    ASSERT_TRUE(happens([this] { return plays(0); }));

    EXPECT_EQ(first().devices, "null-sink");
    EXPECT_EQ(seen.streams.size(), 1u);
}

TEST_F(ObserverTest, AStreamThatDoesNotKeepPaceIsLate)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    player->kill(SIGSTOP);
    ASSERT_TRUE(happens([this] { return first().lateCycles.size() >= 5; }));
    player->kill(SIGCONT);
    player->write("pause\n");

    EXPECT_TRUE(happens([this] { return !first().runs; }));
}

TEST_F(ObserverTest, ADeviceIsSeenAtWorkAndInTrouble)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    player->kill(SIGSTOP);
    ASSERT_TRUE(happens([this] { return first().lateCycles.size() >= 5; }));
    player->kill(SIGCONT);

    const auto news = devices.news();
    for (const auto* what : {" output null-sink", " wanted", " running", " cycle", " late cycle"})
        EXPECT_THAT(news, testing::Contains(testing::EndsWith(what)));
}

TEST_F(ObserverTest, APauseIsNeitherWorkNorLateness)
{
    constexpr double pause = 0.5;
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    std::vector<double> resumptions;
    const auto playOn = [this] {
        const auto heard = devices.cycles().size();
        return happens([this, heard] { return devices.cycles().size() >= heard + 60; });
    };
    for (int turn = 0; turn < 3; ++turn) {
        ASSERT_TRUE(playOn());
        player->write("pause\n");
        ASSERT_TRUE(happens([this] { return !first().runs; }));
        letTimePass(pause);
        player->write("play\n");
        ASSERT_TRUE(happens([this] { return first().runs; }));
        resumptions.push_back(first().runningChangedAt);
    }
    ASSERT_TRUE(playOn());

    std::int64_t longestWork = 0;
    for (const auto& cycle : devices.cycles())
        longestWork = std::max(longestWork, cycle.workNanoseconds.value_or(0));
    EXPECT_LT(static_cast<double>(longestWork) / 1e9, pause / 2);
    EXPECT_EQ(lateCyclesOfDevices(), std::ssize(first().lateCycles)) << "if the machine is busy, there may be some";
    for (const auto resumption : resumptions)
        EXPECT_THAT(first().lateCycles,
                    testing::Each(testing::AnyOf(testing::Lt(resumption - pause / 2),
                                                 testing::Gt(resumption + startUpTime / 2))));
}

TEST_F(ObserverTest, AMissedCycleIsOneOfTheDevice)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    ASSERT_TRUE(happens([this] { return devices.cycles().size() >= 30; }));
    player->kill(SIGSTOP);
    ASSERT_TRUE(happens([this] { return first().lateCycles.size() >= 20; }));
    player->kill(SIGCONT);

    EXPECT_EQ(lateCyclesOfDevices(), std::ssize(first().lateCycles));
}

TEST_F(ObserverTest, WhenPipeWireDiesItsStreamsGoAndItsSuccessorsAreSeen)
{
    observer->start();
    {
        const auto player = server.playTone("Music");
        ASSERT_TRUE(happens([this] { return plays(0); }));
        const auto before = currentMoment().secondsSince1970;
        server.kill();
        ASSERT_TRUE(happens([this] { return first().isGone; }));
        EXPECT_LE(first().goneAt, before + 0.5);
    }
    server.clearAway();
    server.start();
    const auto player = server.playTone("Game");

    EXPECT_TRUE(happens([this] { return plays(1); }));
    EXPECT_EQ(seen.streams[1].description.role, "Game");
    EXPECT_FALSE(seen.streams[1].isGone);
}

TEST_F(ObserverTest, AnObserverThatWasThereFirstFindsPipeWireWhenItComes)
{
    server.clearAway();
    observer->start();
    server.start();
    const auto player = server.playTone("Music");

    EXPECT_TRUE(happens([this] { return plays(0); }));
}

TEST_F(ObserverTest, WhenItStopsEveryStreamIsGone)
{
    observer->start();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(happens([this] { return plays(0); }));
    observer->stop();

    EXPECT_TRUE(first().isGone);
}

} // namespace

} // namespace kesto_pipewire
