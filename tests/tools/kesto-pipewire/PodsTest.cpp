// SPDX-License-Identifier: Apache-2.0
// Reading PipeWire's values: values as a server builds them, and malformed ones.

#include "kesto-pipewire/Pods.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <spa/param/audio/format.h>
#include <spa/param/audio/raw.h>
#include <spa/param/format.h>
#include <spa/param/param.h>
#include <spa/param/profiler.h>
#include <spa/param/props.h>
#include <spa/pod/builder.h>

#include <array>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

namespace kesto_pipewire {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

// Builds one value, which lives as long as this. Its functions name what they add; `build` ends all that is open.
class PodBuilder {
public:
    PodBuilder() { spa_pod_builder_init(&builder_, bytes_.data(), sizeof bytes_); }
    PodBuilder(const PodBuilder&) = delete;
    PodBuilder& operator=(const PodBuilder&) = delete;

    PodBuilder& object(std::uint32_t type)
    {
        spa_pod_builder_push_object(&builder_, &open(), type, 0);
        return *this;
    }
    PodBuilder& structure()
    {
        spa_pod_builder_push_struct(&builder_, &open());
        return *this;
    }
    PodBuilder& key(std::uint32_t key)
    {
        spa_pod_builder_prop(&builder_, key, 0);
        return *this;
    }
    // A choice of one value, as formats that are settled hold them.
    PodBuilder& choice()
    {
        spa_pod_builder_push_choice(&builder_, &open(), SPA_CHOICE_None, 0);
        return *this;
    }
    PodBuilder& id(std::uint32_t value)
    {
        spa_pod_builder_id(&builder_, value);
        return *this;
    }
    PodBuilder& integer(std::int32_t value)
    {
        spa_pod_builder_int(&builder_, value);
        return *this;
    }
    PodBuilder& wide(std::int64_t value)
    {
        spa_pod_builder_long(&builder_, value);
        return *this;
    }
    PodBuilder& number(float value)
    {
        spa_pod_builder_float(&builder_, value);
        return *this;
    }
    PodBuilder& truth(bool value)
    {
        spa_pod_builder_bool(&builder_, value);
        return *this;
    }
    PodBuilder& text(const char* value)
    {
        spa_pod_builder_string(&builder_, value);
        return *this;
    }
    PodBuilder& numbers(std::vector<float> values)
    {
        spa_pod_builder_array(&builder_, sizeof(float), SPA_TYPE_Float, static_cast<std::uint32_t>(values.size()),
                              values.data());
        return *this;
    }
    PodBuilder& end()
    {
        spa_pod_builder_pop(&builder_, &frames_[--depth_]);
        return *this;
    }
    const spa_pod& build()
    {
        while (depth_ > 0)
            end();
        return *reinterpret_cast<const spa_pod*>(bytes_.data());
    }

private:
    spa_pod_frame& open() { return frames_.at(depth_++); }

    alignas(8) std::array<std::uint8_t, 8192> bytes_{};
    std::array<spa_pod_frame, 8> frames_{};
    std::size_t depth_ = 0;
    spa_pod_builder builder_{};
};

// ---- Volume ----

TEST(UserVolumeTest, IsTheCubeRootOfTheAmplitude)
{
    EXPECT_EQ(userVolume(0), 0);
    EXPECT_EQ(userVolume(0.125), 0.5);
    EXPECT_EQ(userVolume(1), 1);
}

TEST(UserVolumeTest, ASliderPositionIsOneNumberHoweverItWasRounded)
{
    EXPECT_EQ(userVolume(0.3F * 0.3F * 0.3F), 0.3);
    EXPECT_EQ(userVolume(std::pow(19661 / 65536.0, 3)), 0.3); // PulseAudio's value for 30 %
}

TEST(UserVolumeTest, StaysBetween0And1)
{
    EXPECT_EQ(userVolume(3.375), 1); // 150 %
    EXPECT_EQ(userVolume(-1), 0);
    EXPECT_EQ(userVolume(std::numeric_limits<double>::infinity()), 1);
    EXPECT_EQ(userVolume(std::numeric_limits<double>::quiet_NaN()), 0);
}

TEST(ReadVolumeTest, TheLoudestChannelCounts)
{
    EXPECT_EQ(readVolume(PodBuilder()
                             .object(SPA_TYPE_OBJECT_Props)
                             .key(SPA_PROP_volume)
                             .number(1)
                             .key(SPA_PROP_mute)
                             .truth(false)
                             .key(SPA_PROP_channelVolumes)
                             .numbers({0.001F, 0.125F})
                             .build()),
              0.5);
}

TEST(ReadVolumeTest, AnArrayThatLiesAboutItsElementsIsIgnored)
{
    const std::vector<float> large(1024);
    std::array<std::uint8_t, 8192> bytes{};
    spa_pod_builder builder{};
    spa_pod_builder_init(&builder, bytes.data(), bytes.size());
    spa_pod_frame frame{};
    spa_pod_builder_push_object(&builder, &frame, SPA_TYPE_OBJECT_Props, 0);
    spa_pod_builder_prop(&builder, SPA_PROP_channelVolumes, 0);
    spa_pod_builder_array(&builder, 2048, SPA_TYPE_Float, 2, large.data());
    spa_pod_builder_pop(&builder, &frame);

    EXPECT_EQ(readVolume(*reinterpret_cast<const spa_pod*>(bytes.data())), std::nullopt);
}

TEST(ReadVolumeTest, TheVolumeOfTheWholeIsAFactor)
{
    EXPECT_EQ(readVolume(PodBuilder()
                             .object(SPA_TYPE_OBJECT_Props)
                             .key(SPA_PROP_volume)
                             .number(0.5F)
                             .key(SPA_PROP_channelVolumes)
                             .numbers({0.25F})
                             .build()),
              0.5);
}

TEST(ReadVolumeTest, MutedIsZero)
{
    EXPECT_EQ(readVolume(PodBuilder()
                             .object(SPA_TYPE_OBJECT_Props)
                             .key(SPA_PROP_mute)
                             .truth(true)
                             .key(SPA_PROP_channelVolumes)
                             .numbers({1, 1})
                             .build()),
              0);
}

TEST(ReadVolumeTest, PropertiesWithoutAVolumeSayNothingOfIt)
{
    EXPECT_EQ(readVolume(PodBuilder().object(SPA_TYPE_OBJECT_Props).build()), std::nullopt);
    EXPECT_EQ(readVolume(PodBuilder().object(SPA_TYPE_OBJECT_Props).key(SPA_PROP_mute).truth(false).build()),
              std::nullopt);
    EXPECT_EQ(readVolume(PodBuilder().object(SPA_TYPE_OBJECT_Props).key(SPA_PROP_channelVolumes).numbers({}).build()),
              std::nullopt);
}

TEST(ReadVolumeTest, ValuesOfOtherTypesSayNothing)
{
    EXPECT_EQ(readVolume(PodBuilder().integer(1).build()), std::nullopt);
    EXPECT_EQ(readVolume(PodBuilder()
                             .object(SPA_TYPE_OBJECT_Props)
                             .key(SPA_PROP_volume)
                             .text("loud")
                             .key(SPA_PROP_channelVolumes)
                             .number(1)
                             .build()),
              std::nullopt);
}

// ---- Format ----

TEST(ReadFormatTest, IsSampleRateAndChannels)
{
    const auto format = readFormat(PodBuilder()
                                       .object(SPA_TYPE_OBJECT_Format)
                                       .key(SPA_FORMAT_mediaType)
                                       .choice()
                                       .id(SPA_MEDIA_TYPE_audio)
                                       .end()
                                       .key(SPA_FORMAT_mediaSubtype)
                                       .choice()
                                       .id(SPA_MEDIA_SUBTYPE_raw)
                                       .end()
                                       .key(SPA_FORMAT_AUDIO_format)
                                       .choice()
                                       .id(SPA_AUDIO_FORMAT_S16_LE)
                                       .end()
                                       .key(SPA_FORMAT_AUDIO_rate)
                                       .choice()
                                       .integer(44100)
                                       .end()
                                       .key(SPA_FORMAT_AUDIO_channels)
                                       .choice()
                                       .integer(2)
                                       .end()
                                       .build());

    EXPECT_EQ(format, (StreamFormat{"S16LE/44100/2", 2}));
}

TEST(ReadFormatTest, ValuesThatAreNotChoicesAreReadToo)
{
    const auto format = readFormat(PodBuilder()
                                       .object(SPA_TYPE_OBJECT_Format)
                                       .key(SPA_FORMAT_mediaType)
                                       .id(SPA_MEDIA_TYPE_audio)
                                       .key(SPA_FORMAT_AUDIO_format)
                                       .id(SPA_AUDIO_FORMAT_F32P)
                                       .key(SPA_FORMAT_AUDIO_rate)
                                       .integer(48000)
                                       .key(SPA_FORMAT_AUDIO_channels)
                                       .integer(6)
                                       .build());

    EXPECT_EQ(format, (StreamFormat{"F32P/48000/6", 6}));
}

TEST(ReadFormatTest, EncodedSoundIsNamedAfterItsCoding)
{
    const auto format = readFormat(PodBuilder()
                                       .object(SPA_TYPE_OBJECT_Format)
                                       .key(SPA_FORMAT_mediaType)
                                       .id(SPA_MEDIA_TYPE_audio)
                                       .key(SPA_FORMAT_mediaSubtype)
                                       .id(SPA_MEDIA_SUBTYPE_iec958)
                                       .key(SPA_FORMAT_AUDIO_rate)
                                       .integer(48000)
                                       .build());

    EXPECT_EQ(format, (StreamFormat{"iec958/48000", 0}));
}

TEST(ReadFormatTest, OtherFormatsThanSoundAreIgnored)
{
    EXPECT_EQ(readFormat(PodBuilder().integer(1).build()), std::nullopt);
    EXPECT_EQ(readFormat(PodBuilder().object(SPA_TYPE_OBJECT_Format).build()), std::nullopt);
    EXPECT_EQ(
        readFormat(
            PodBuilder().object(SPA_TYPE_OBJECT_Format).key(SPA_FORMAT_mediaType).id(SPA_MEDIA_TYPE_video).build()),
        std::nullopt);
}

TEST(ReadRateTest, IsThatOfASoundsFormat)
{
    const auto rateOf = [](std::uint32_t mediaType) {
        return readRate(PodBuilder()
                            .object(SPA_TYPE_OBJECT_Format)
                            .key(SPA_FORMAT_mediaType)
                            .id(mediaType)
                            .key(SPA_FORMAT_AUDIO_rate)
                            .choice()
                            .integer(44100)
                            .end()
                            .build());
    };
    EXPECT_EQ(rateOf(SPA_MEDIA_TYPE_audio), 44100);
    EXPECT_EQ(rateOf(SPA_MEDIA_TYPE_video), std::nullopt);
    EXPECT_EQ(readRate(PodBuilder().integer(1).build()), std::nullopt);
    EXPECT_EQ(
        readRate(
            PodBuilder().object(SPA_TYPE_OBJECT_Format).key(SPA_FORMAT_mediaType).id(SPA_MEDIA_TYPE_audio).build()),
        std::nullopt);
}

// ---- Cycles ----

struct Times {
    std::int64_t signalBefore = 0;
    std::int64_t signal = 0;
    std::int64_t awake = 0;
    std::int64_t finish = 0;
};

// A profile of cycles, each with its clock, its driver and its followers, as the server's profiler makes it.
class ProfileBuilder : public PodBuilder {
public:
    ProfileBuilder() { structure(); }

    // By the clock.
    ProfileBuilder& cycle(std::int64_t began)
    {
        object(SPA_TYPE_OBJECT_Profiler);
        key(SPA_PROFILER_clock).structure().integer(0).integer(0).text("clock").wide(began).wide(0).end();
        return *this;
    }
    ProfileBuilder& driver(std::int32_t node, const Times& times)
    {
        return block(SPA_PROFILER_driverBlock, node, times, 2);
    }
    ProfileBuilder& follower(std::int32_t node, std::int32_t status, const Times& times = {})
    {
        return block(SPA_PROFILER_followerBlock, node, times, status);
    }
    ProfileBuilder& endCycle()
    {
        end();
        return *this;
    }
    // A whole cycle of the driver 29, which the node 42 follows.
    void cycleOfTwo(std::int64_t began, const Times& driverTimes, std::int32_t status, const Times& followerTimes)
    {
        cycle(began).driver(29, driverTimes).follower(42, status, followerTimes).endCycle();
    }

private:
    ProfileBuilder& block(std::uint32_t kind, std::int32_t node, const Times& times, std::int32_t status)
    {
        key(kind).structure().integer(node).text("name");
        for (const auto time : {times.signalBefore, times.signal, times.awake, times.finish})
            wide(time);
        integer(status).end();
        return *this;
    }
};

// Such as "1000: 41 late, driver 30 50 ns".
std::vector<std::string> cycles(const spa_pod& profile)
{
    std::vector<std::string> told;
    readCycles(profile, [&told](const Cycle& cycle) {
        auto text = std::to_string(cycle.began) + ":";
        const auto add = [&text](const std::string& what, const NodeCycle& part) {
            text += (text.ends_with(':') ? " " : ", ") + what + std::to_string(part.node);
            text += part.workNanoseconds ? " " + std::to_string(*part.workNanoseconds) + " ns" : "";
            text += part.isLate ? " late" : "";
        };
        for (const auto& follower : cycle.followers)
            add("", follower);
        if (cycle.driver)
            add("driver ", *cycle.driver);
        told.push_back(text);
    });
    return told;
}

TEST(ReadCyclesTest, WhoHasNotFinishedIsLate)
{
    ProfileBuilder profile;
    profile.cycle(1000).follower(40, 3).follower(41, 1).endCycle();
    profile.cycle(2000).follower(40, 2).follower(41, 0).endCycle();

    EXPECT_THAT(cycles(profile.build()), ElementsAre("1000: 40, 41 late", "2000: 40 late, 41 late"));
}

TEST(ReadCyclesTest, ACycleBeginsWithTheSignalOfItsDriver)
{
    ProfileBuilder profile;
    profile.cycle(1000).driver(30, {900, 1001, 1002, 1050}).follower(40, 3).endCycle();
    profile.cycle(2000).follower(40, 3).endCycle();

    EXPECT_THAT(cycles(profile.build()), ElementsAre("1001: 40, driver 30 48 ns", "2000: 40"));
}

TEST(ReadCyclesTest, WorkIsFromAwakeToFinishWhereBothAreOfThisCycle)
{
    ProfileBuilder profile;
    profile.cycle(1000)
        .follower(40, 3, {1001, 1002, 1010, 1030})
        .follower(41, 1, {1001, 1002, 1010, 500})
        .follower(42, 3, {0, 0, 0, 700})
        .follower(43, 1, {1001, 1002, 800, 1030})
        .driver(30, {900, 1001, 850, 5000})
        .endCycle();

    EXPECT_THAT(cycles(profile.build()), ElementsAre("1001: 40 20 ns, 41 late, 42, 43 late, driver 30"));
}

// In microseconds, recorded from a real server. A paused follower is not in the records of a driver that starts again;
// the driver's first cycle is over before the follower takes part.
TEST(ReadCyclesTest, ARepeatedRecordWhenADriverStartsAfterAPauseIsNotACycle)
{
    ProfileBuilder profile;
    profile.cycleOfTwo(2010656, {1989431, 2010764, 2010867, 2010878}, 3, {2010764, 2010766, 2010802, 2010860});
    profile.cycleOfTwo(3054813, {2010764, 2010764, 2010867, 3033520}, 1, {2010764, 3033520, 3033520, 2010860});
    profile.cycleOfTwo(3054813, {2010764, 3033520, 3054934, 3054968}, 1, {3033520, 3033520, 3033520, 2010860});
    profile.cycleOfTwo(3054813, {3033520, 3054970, 3055085, 3055087}, 3, {3054970, 3054972, 3055009, 3055080});

    EXPECT_THAT(cycles(profile.build()),
                ElementsAre("2010764: 42 58 ns, driver 29 11 ns", "3033520: 42 late, driver 29 34 ns",
                            "3054970: 42 71 ns, driver 29 2 ns"));
}

// A device that has just been plugged in.
TEST(ReadCyclesTest, ARecordBeforeADriversFirstCycleIsNotACycle)
{
    ProfileBuilder profile;
    profile.cycle(6590594).driver(29, {0, 0, 0, 6569300}).follower(48, 1, {0, 6569300, 6569300, 0}).endCycle();
    profile.cycle(6590594).driver(29, {0, 6569300, 6590665, 6590679}).follower(48, 1).endCycle();

    EXPECT_THAT(cycles(profile.build()), ElementsAre("6569300: 48 late, driver 29 14 ns"));
}

TEST(ReadCyclesTest, AMissedCycleWithTwoRecordsCountsOnce)
{
    ProfileBuilder profile;
    profile.cycleOfTwo(1054751, {1013600, 1013600, 1019036, 1033523}, 1, {1013600, 1033526, 1033524, 1018984});
    profile.cycleOfTwo(1054751, {1013600, 1033523, 1054855, 1054876}, 1, {1033523, 1033526, 1033524, 1018984});
    profile.cycleOfTwo(1076084, {1033523, 1033523, 1054855, 1054877}, 1, {1033523, 1054879, 1054877, 1018984});

    EXPECT_THAT(cycles(profile.build()), ElementsAre("1033523: 42 late, driver 29 21 ns"));
}

TEST(ReadCyclesTest, WhatIsNotAProfileGivesNoCycles)
{
    EXPECT_THAT(cycles(PodBuilder().integer(1).build()), IsEmpty());
    EXPECT_THAT(cycles(PodBuilder().structure().integer(1).text("x").build()), IsEmpty());
    EXPECT_THAT(cycles(PodBuilder().structure().object(SPA_TYPE_OBJECT_Props).build()), IsEmpty());
}

TEST(ReadCyclesTest, BlocksThatAreCutShortTellNothing)
{
    PodBuilder profile;
    profile.structure().object(SPA_TYPE_OBJECT_Profiler);
    profile.key(SPA_PROFILER_clock).structure().integer(0).integer(0).text("clock").wide(1000).end();
    profile.key(SPA_PROFILER_driverBlock).structure().integer(30).text("name").end();
    profile.key(SPA_PROFILER_followerBlock).structure().integer(41).end();
    profile.key(SPA_PROFILER_followerBlock).integer(41);

    EXPECT_THAT(cycles(profile.build()), ElementsAre("1000:"));
}

TEST(ReadCyclesTest, ACycleWithoutAClockIsIgnored)
{
    PodBuilder profile;
    profile.structure().object(SPA_TYPE_OBJECT_Profiler);
    profile.key(SPA_PROFILER_followerBlock).structure().integer(41).text("name");
    profile.wide(0).wide(0).wide(0).wide(0).integer(1).end();

    EXPECT_THAT(cycles(profile.build()), IsEmpty());
}

} // namespace

} // namespace kesto_pipewire
