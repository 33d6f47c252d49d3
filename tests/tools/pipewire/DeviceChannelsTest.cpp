// The channels of devices, as their files show them.

#include "kesto-pipewire/DeviceChannels.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

namespace kesto_pipewire {

namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::StartsWith;

constexpr DeviceSerial sink = 30;
constexpr DeviceSerial source = 31;

class DeviceChannelsTest : public testing::Test {
protected:
    DeviceChannelsTest()
    {
        channels.deviceAppeared(sink, {Direction::Output, "speaker"});
        channels.deviceAppeared(source, {Direction::Input, "microphone"});
    }

    // The text of a channel's file without the line of its owner, once it shows what is so now.
    [[nodiscard]] std::string file(const std::string& path)
    {
        channels.flush();
        std::ifstream stream(root / "pipewire" / path);
        std::string owner;
        std::getline(stream, owner);
        EXPECT_THAT(owner, testing::AnyOf("", StartsWith("owner "))) << path;
        std::ostringstream text;
        text << stream.rdbuf();
        return stream ? text.str() : "no file";
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path& root = directory.path();
    const Diagnostics diagnostics{false};
    DeviceChannels channels{root, diagnostics};
    const Moment now{1000, 10};
};

TEST_F(DeviceChannelsTest, EveryGroupHasAChannelBeforeThereIsADevice)
{
    channels.deviceGone(sink);
    channels.deviceGone(source);
    for (const auto* path : {"Tx/-/cycles", "Tx/-/late cycles", "Tx/-/work", "Rx/-/cycles", "Rx/-/late cycles",
                             "Rx/-/work", "Speaker/-/any", "StateTransitionTimes_ms/-/to Running"})
        EXPECT_NE(file(path), "no file") << path;
    EXPECT_EQ(file("Tx/speaker/cycles"), "no file");
}

TEST_F(DeviceChannelsTest, CyclesCountForTheDeviceAndForAllOfItsDirection)
{
    channels.deviceAppeared(32, {Direction::Output, "headset"});
    channels.deviceCycle(sink, {.workNanoseconds = 150'000});
    channels.deviceCycle(sink, {.isLate = true});
    channels.deviceCycle(32, {});
    channels.deviceCycle(source, {});

    EXPECT_EQ(file("Tx/speaker/cycles"), "simple\n2\n");
    EXPECT_EQ(file("Tx/speaker/late cycles"), "simple\n1\n");
    EXPECT_THAT(file("Tx/speaker/work"), AllOf(StartsWith("histogram us\n150 150\n"), HasSubstr("\n100 200 1\n")));
    EXPECT_EQ(file("Tx/-/cycles"), "simple\n3\n");
    EXPECT_EQ(file("Tx/-/late cycles"), "simple\n1\n");
    EXPECT_EQ(file("Rx/microphone/cycles"), "simple\n1\n");
    EXPECT_EQ(file("Rx/-/cycles"), "simple\n1\n");
}

TEST_F(DeviceChannelsTest, StatesAreCountedEachTimeTheyAreEntered)
{
    for (const auto state : {DeviceState::Running, DeviceState::Running, DeviceState::Idle, DeviceState::Running})
        channels.deviceStateChanged(sink, state, now);

    EXPECT_THAT(file("Speaker/speaker/state"),
                AllOf(HasSubstr("Suspended 1 "), HasSubstr("Idle 1 "), HasSubstr("Running 2 "), HasSubstr("Error 0 ")));
    EXPECT_THAT(file("Speaker/-/any"), AllOf(HasSubstr("Idle 2 "), HasSubstr("Running 2 ")));
    EXPECT_THAT(file("Speaker/microphone/state"), HasSubstr("Running 0 "));
}

TEST_F(DeviceChannelsTest, WhenTheLastRunningDeviceGoesNoneRuns)
{
    channels.deviceStateChanged(sink, DeviceState::Running, now);
    channels.deviceGone(sink);

    EXPECT_THAT(file("Speaker/-/any"), HasSubstr("Idle 2 "));
}

TEST_F(DeviceChannelsTest, TheTimeToRunBeginsWithTheFirstLink)
{
    channels.deviceWanted(sink, true, {1000, 10});
    channels.deviceWanted(sink, true, {1000.01, 10.01});
    channels.deviceStateChanged(sink, DeviceState::Idle, {1000.02, 10.02});
    channels.deviceStateChanged(sink, DeviceState::Running, {1000.03, 10.03});

    EXPECT_THAT(file("StateTransitionTimes_ms/speaker/to Running"), StartsWith("histogram ms\n30 30\n"));
    EXPECT_THAT(file("StateTransitionTimes_ms/-/to Running"), StartsWith("histogram ms\n30 30\n"));
}

TEST_F(DeviceChannelsTest, WhoRunsAlreadyOrIsNotWantedAnyMoreHasNoTimeToRun)
{
    channels.deviceWanted(sink, true, now);
    channels.deviceWanted(sink, false, now);
    channels.deviceStateChanged(sink, DeviceState::Running, {1000.5, 10.5});
    channels.deviceWanted(sink, true, {1001, 11});
    channels.deviceStateChanged(sink, DeviceState::Idle, {1002, 12});
    channels.deviceStateChanged(sink, DeviceState::Running, {1003, 13});

    EXPECT_THAT(file("StateTransitionTimes_ms/speaker/to Running"), testing::Not(HasSubstr(" 1\n")));
}

TEST_F(DeviceChannelsTest, WhoWasPausedForLongTookNoTimeToRun)
{
    channels.deviceWanted(sink, true, now);
    channels.deviceStateChanged(sink, DeviceState::Running, {1010.5, 20.5});

    EXPECT_THAT(file("StateTransitionTimes_ms/speaker/to Running"), testing::Not(HasSubstr(" 1\n")));
}

TEST_F(DeviceChannelsTest, DevicesOfOneNameHaveChannelsOfTheirOwn)
{
    channels.deviceAppeared(32, {Direction::Output, "speaker"});
    channels.deviceAppeared(33, {Direction::Input, "speaker"});
    channels.deviceCycle(sink, {});
    for (int cycle = 0; cycle < 2; ++cycle)
        channels.deviceCycle(32, {});
    for (int cycle = 0; cycle < 3; ++cycle)
        channels.deviceCycle(33, {});
    channels.deviceStateChanged(33, DeviceState::Running, now);

    EXPECT_EQ(file("Tx/speaker/cycles"), "simple\n1\n");
    EXPECT_EQ(file("Tx/speaker#2/cycles"), "simple\n2\n");
    EXPECT_EQ(file("Rx/speaker#3/cycles"), "simple\n3\n");
    EXPECT_THAT(file("Speaker/speaker/state"), HasSubstr("Running 0 "));
    EXPECT_THAT(file("Speaker/speaker#2/state"), HasSubstr("Running 0 "));
    EXPECT_THAT(file("Speaker/speaker#3/state"), HasSubstr("Running 1 "));
}

TEST_F(DeviceChannelsTest, WhenTheFirstOfANameGoesTheOthersKeepTheirChannels)
{
    channels.deviceAppeared(32, {Direction::Output, "speaker"});
    channels.deviceCycle(32, {});
    channels.deviceGone(sink);
    channels.deviceCycle(32, {});

    EXPECT_EQ(file("Tx/speaker/cycles"), "no file");
    EXPECT_EQ(file("Tx/speaker#2/cycles"), "simple\n2\n");
    channels.deviceAppeared(33, {Direction::Output, "speaker"});
    EXPECT_EQ(file("Tx/speaker/cycles"), "simple\n0\n") << "its name is free again";
    channels.deviceGone(32);
    EXPECT_EQ(file("Tx/speaker#2/cycles"), "no file");
    EXPECT_EQ(file("Tx/speaker/cycles"), "simple\n0\n");
}

TEST_F(DeviceChannelsTest, ADeviceThatIsReallyCalledLikeASecondOneIsNotMixedUpWithIt)
{
    channels.deviceAppeared(32, {Direction::Output, "speaker#2"});
    channels.deviceAppeared(33, {Direction::Output, "speaker"});
    channels.deviceCycle(33, {});

    EXPECT_EQ(file("Tx/speaker#2/cycles"), "simple\n0\n");
    EXPECT_EQ(file("Tx/speaker#3/cycles"), "simple\n1\n");
}

TEST_F(DeviceChannelsTest, NamesThatNeitherFilesNorReportsTellApartAreOne)
{
    DeviceSerial serial = 40;
    for (const auto* name : {"hdmi/left", "hdmi_left", "hdmi left", "hdmi\nleft", "hdmileft"})
        channels.deviceAppeared(serial++, {Direction::Output, name});
    channels.deviceCycle(42, {});

    EXPECT_EQ(file("Tx/hdmi_left/cycles"), "simple\n0\n");
    EXPECT_EQ(file("Tx/hdmi_left#2/cycles"), "simple\n0\n");
    EXPECT_EQ(file("Tx/hdmi left#3/cycles"), "simple\n1\n");
    EXPECT_EQ(file("Tx/hdmi_left#4/cycles"), "simple\n0\n");
    EXPECT_EQ(file("Tx/hdmileft#5/cycles"), "simple\n0\n");
}

TEST_F(DeviceChannelsTest, ADeviceWithoutAUsableNameIsNotCountedAsAllTogether)
{
    channels.deviceAppeared(40, {Direction::Output, ""});
    channels.deviceAppeared(41, {Direction::Output, "-"});
    channels.deviceAppeared(42, {Direction::Output, "_"});
    channels.deviceCycle(41, {});
    channels.deviceGone(40);

    EXPECT_EQ(file("Tx/-/cycles"), "simple\n1\n");
    EXPECT_EQ(file("Tx/unnamed/cycles"), "no file");
    EXPECT_EQ(file("Tx/unnamed#2/cycles"), "simple\n1\n");
    EXPECT_EQ(file("Tx/unnamed#3/cycles"), "simple\n0\n");
}

TEST_F(DeviceChannelsTest, TheLongestNamesAreToldApartToo)
{
    const std::string longest(255, 'n');
    channels.deviceAppeared(40, {Direction::Output, longest});
    channels.deviceAppeared(41, {Direction::Output, longest});
    channels.deviceCycle(41, {});

    EXPECT_EQ(file("Tx/" + longest + "/cycles"), "simple\n0\n");
    EXPECT_EQ(file("Tx/" + std::string(253, 'n') + "#2/cycles"), "simple\n1\n");
}

TEST_F(DeviceChannelsTest, WhatIsSaidOfUnknownDevicesIsIgnored)
{
    channels.deviceCycle(99, {});
    channels.deviceStateChanged(99, DeviceState::Running, now);
    channels.deviceWanted(99, true, now);
    channels.deviceGone(99);

    EXPECT_EQ(file("Tx/-/cycles"), "simple\n0\n");
    EXPECT_THAT(file("Speaker/-/any"), HasSubstr("Running 0 "));
}

TEST(DeviceChannelsWithoutAFolderTest, LeaveEverythingElseAlone)
{
    const Diagnostics diagnostics(false);
    DeviceChannels channels("/dev/null/channels", diagnostics);
    channels.deviceAppeared(sink, {Direction::Output, "speaker"});
    channels.deviceCycle(sink, {.isLate = true});
    channels.deviceStateChanged(sink, DeviceState::Running, {});
    channels.flush();
    channels.deviceGone(sink);
}

} // namespace

} // namespace kesto_pipewire
