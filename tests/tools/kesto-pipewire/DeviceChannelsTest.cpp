// SPDX-License-Identifier: Apache-2.0
// The channels of devices, as their files show them.

#include "kesto-pipewire/DeviceChannels.h"
#include "kesto-pipewire/DriverName.h"
#include "support/TemporaryDirectory.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sstream>

namespace kesto_pipewire {

namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::StartsWith;

constexpr DeviceSerial sink = 30;
constexpr DeviceSerial source = 31;
const std::string ownDriver = "pipewire-" + std::to_string(::geteuid());

class DeviceChannelsTest : public testing::Test {
protected:
    DeviceChannelsTest()
    {
        channels.deviceAppeared(sink, {Direction::Output, "speaker"});
        channels.deviceAppeared(source, {Direction::Input, "microphone"});
    }

    // The text of a channel's file without its owner's line, after a flush.
    [[nodiscard]] std::string file(const std::string& path)
    {
        channels.flush();
        std::ifstream stream(root / ownDriver / path);
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

TEST_F(DeviceChannelsTest, TheLongestNamesDifferToo)
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

// ---- Publishing fails, or another user was first ----

class DeviceChannelsInTroubleTest : public testing::Test {
protected:
    static constexpr uid_t nobody = 65534;

    void makeChannels() { channels.emplace(root, diagnostics); }
    // The lines since the last call, without their common beginning.
    template <typename Action> static std::string said(Action action)
    {
        testing::internal::CaptureStderr();
        action();
        std::string text = testing::internal::GetCapturedStderr();
        const std::string_view begin = "kesto-pipewire: ";
        for (auto at = text.find(begin); at != std::string::npos; at = text.find(begin))
            text.erase(at, begin.size());
        return text;
    }
    // The drivers that have channels.
    [[nodiscard]] std::vector<std::string> drivers() const
    {
        std::vector<std::string> names;
        for (const auto& driver : std::filesystem::directory_iterator(root))
            if (std::filesystem::exists(driver.path() / "Tx/-/cycles"))
                names.push_back(driver.path().filename());
        return names;
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path root = directory.path() / "channels";
    const Diagnostics diagnostics{false};
    std::optional<DeviceChannels> channels;
};

TEST_F(DeviceChannelsInTroubleTest, NothingIsSaidWhereAllIsWell)
{
    EXPECT_EQ(said([this] { makeChannels(); }), "");
    EXPECT_THAT(drivers(), ElementsAre(ownDriver));
}

TEST_F(DeviceChannelsInTroubleTest, EverythingElseGoesOnWithoutAFolder)
{
    support::writeFile(root, "a file in its place");
    said([this] {
        makeChannels();
        channels->deviceAppeared(sink, {Direction::Output, "speaker"});
        channels->deviceCycle(sink, {.isLate = true});
        channels->deviceStateChanged(sink, DeviceState::Running, {});
        channels->flush();
        channels->deviceGone(sink);
    });
    EXPECT_EQ(support::readFile(root), "a file in its place");
}

TEST_F(DeviceChannelsInTroubleTest, WhatIsWrongIsSaidOnceWithTheFolderItsOwnerAndWhatToDo)
{
    support::writeFile(root, "a file in its place");
    EXPECT_EQ(said([this] {
                  makeChannels();
                  channels->flush();
                  channels->deviceAppeared(sink, {Direction::Output, "speaker"});
              }),
              "statistics of devices cannot be published in " + (root / ownDriver).native() + ": Not a directory. "
                  + root.native() + " belongs to " + userName(::geteuid()) + ": let " + userName(::geteuid())
                  + " write there, or name another folder with --channels. It is tried again with each session.\n");
    std::filesystem::remove(root);
    std::filesystem::create_symlink("missing/folder", root);
    EXPECT_THAT(said([this] { channels->flush(); }), HasSubstr("No such file or directory"))
        << "now there is another problem";
}

TEST_F(DeviceChannelsInTroubleTest, AFolderThatIsMissingIsNamed)
{
    const auto missing = directory.path() / "missing";
    EXPECT_EQ(said([&] { channels.emplace(missing / "channels", diagnostics); }),
              "statistics of devices cannot be published in " + (missing / "channels" / ownDriver).native()
                  + ": No such file or directory. " + missing.native()
                  + " does not exist: start the reporting service, or name another folder with --channels. It is tried "
                    "again with each session.\n");
}

TEST_F(DeviceChannelsInTroubleTest, ItIsTriedAgainAndThenAllIsThere)
{
    support::writeFile(root, "a file in its place");
    said([this] {
        makeChannels();
        channels->deviceAppeared(sink, {Direction::Output, "speaker"});
        channels->deviceAppeared(source, {Direction::Input, "microphone"});
        channels->deviceStateChanged(sink, DeviceState::Running, {});
    });
    std::filesystem::remove(root);
    EXPECT_EQ(said([this] { channels->flush(); }),
              "statistics of devices are published in " + (root / ownDriver).native() + "\n");
    EXPECT_THAT(drivers(), ElementsAre(ownDriver));
    EXPECT_THAT(support::readFile(root / ownDriver / "Speaker/speaker/state"), HasSubstr("\nRunning 1 "));
    EXPECT_THAT(support::readFile(root / ownDriver / "Speaker/microphone/state"), HasSubstr("\nRunning 0 "));
    EXPECT_THAT(support::readFile(root / ownDriver / "Speaker/-/any"), HasSubstr("\nRunning 1 "));
    channels->deviceCycle(sink, {});
    EXPECT_EQ(said([this] { channels->flush(); }), "");
    EXPECT_THAT(support::readFile(root / ownDriver / "Tx/speaker/cycles"), EndsWith("\nsimple\n1\n"));
}

TEST_F(DeviceChannelsInTroubleTest, ADeviceThatAppearsIsReasonToTryAgain)
{
    support::writeFile(root, "a file in its place");
    said([this] { makeChannels(); });
    std::filesystem::remove(root);
    said([this] { channels->deviceAppeared(sink, {Direction::Output, "speaker"}); });
    EXPECT_TRUE(std::filesystem::exists(root / ownDriver / "Tx/speaker/cycles"));
}

TEST_F(DeviceChannelsInTroubleTest, ADeviceThatCannotBePublishedIsTriedAgainToo)
{
    makeChannels();
    support::writeFile(root / ownDriver / "StateTransitionTimes_ms/speaker", "a file in its place");
    EXPECT_THAT(said([this] { channels->deviceAppeared(sink, {Direction::Output, "speaker"}); }),
                AllOf(HasSubstr("Not a directory"), HasSubstr(ownDriver)));
    EXPECT_FALSE(std::filesystem::exists(root / ownDriver / "Tx/speaker")) << "all of its channels or none";
    channels->deviceStateChanged(sink, DeviceState::Running, {});
    channels->deviceCycle(sink, {});
    std::filesystem::remove(root / ownDriver / "StateTransitionTimes_ms/speaker");
    said([this] { channels->flush(); });
    EXPECT_THAT(support::readFile(root / ownDriver / "Speaker/speaker/state"), HasSubstr("\nRunning 1 "));
    EXPECT_THAT(support::readFile(root / ownDriver / "Tx/-/cycles"), EndsWith("\nsimple\n1\n"))
        << "it counted among all";
}

TEST_F(DeviceChannelsInTroubleTest, OneDeviceThatCannotBePublishedHoldsUpNoOther)
{
    support::writeFile(root, "a file in its place");
    said([this] {
        makeChannels();
        for (DeviceSerial serial = 40; serial < 60; ++serial) // in any order
            channels->deviceAppeared(serial, {Direction::Output, serial < 50 ? std::to_string(serial) : "speaker"});
    });
    std::filesystem::remove(root);
    std::filesystem::create_directories(root / ownDriver / "StateTransitionTimes_ms");
    support::writeFile(root / ownDriver / "StateTransitionTimes_ms/speaker", "a file in its place");
    support::writeFile(root / ownDriver / "StateTransitionTimes_ms/speaker#10", "a file in its place");
    said([this] { channels->flush(); });
    for (DeviceSerial other = 40; other < 50; ++other)
        EXPECT_TRUE(std::filesystem::exists(root / ownDriver / "Tx" / std::to_string(other) / "cycles")) << other;
}

TEST_F(DeviceChannelsInTroubleTest, AnotherOwnerOfTheNameDoesNotPreventPublishing)
{
    std::filesystem::create_directories(root / ownDriver);
    if (::geteuid() != 0 || ::chown((root / ownDriver).c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give folders away";
    const auto saying = said([this] { makeChannels(); });
    ASSERT_EQ(drivers().size(), 1U);
    const auto driver = drivers()[0];
    EXPECT_THAT(driver, testing::MatchesRegex("pipewire-0<[0-9a-f]+>"));
    EXPECT_EQ(saying,
              (root / ownDriver).native() + " belongs to nobody: statistics of devices are published in " + driver
                  + " beside it\n");
    channels.reset();
    EXPECT_THAT(drivers(), testing::IsEmpty());

    std::filesystem::create_directories(root / driver / "Tx/-"); // as a killed process would leave it
    said([this] { makeChannels(); });
    EXPECT_THAT(drivers(), ElementsAre(driver)) << "and is taken over";
    channels.reset();
    std::filesystem::create_directories(root / driver);
    ASSERT_EQ(::chown((root / driver).c_str(), nobody, nobody), 0);
    said([this] { makeChannels(); });
    ASSERT_EQ(drivers().size(), 1U);
    EXPECT_NE(drivers()[0], driver) << "that name is known by now, too";
}

TEST_F(DeviceChannelsInTroubleTest, ALinkInThePlaceOfTheNameIsAnothersToo)
{
    std::filesystem::create_directories(root);
    std::filesystem::create_directory_symlink(directory.path(), root / ownDriver);
    if (::geteuid() != 0 || ::lchown((root / ownDriver).c_str(), nobody, nobody) != 0)
        GTEST_SKIP() << "only root can give links away";
    said([this] { makeChannels(); });
    ASSERT_EQ(drivers().size(), 1U);
    EXPECT_THAT(drivers()[0], StartsWith("pipewire-0<"));
}

TEST_F(DeviceChannelsInTroubleTest, WhatTheAdministratorMadeForTheUserCountsAsTheUsers)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    std::filesystem::create_directories(root / "pipewire-65534");
    std::filesystem::permissions(directory.path(), std::filesystem::perms(0755));
    std::filesystem::permissions(root, std::filesystem::perms(01777));
    std::filesystem::permissions(root / "pipewire-65534", std::filesystem::perms(0777));
    ASSERT_EQ(::seteuid(nobody), 0);
    EXPECT_EQ(said([this] { makeChannels(); }), "");
    EXPECT_THAT(drivers(), ElementsAre("pipewire-65534"));
    channels.reset();
    ASSERT_EQ(::seteuid(0), 0);
}

TEST_F(DeviceChannelsInTroubleTest, AUserWhoMayNotWriteGetsTheNameOfTheOwner)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    std::filesystem::create_directories(root);
    std::filesystem::permissions(directory.path(), std::filesystem::perms(0755));
    ASSERT_EQ(::seteuid(nobody), 0);
    const auto saying = said([this] { makeChannels(); });
    channels.reset();
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_EQ(saying,
              "statistics of devices cannot be published in " + root.native() + "/pipewire-65534: Permission denied. "
                  + root.native()
                  + " belongs to root: let nobody write there, or name another folder with --channels. It is tried "
                    "again with each session.\n");
}

TEST_F(DeviceChannelsInTroubleTest, UsersPublishBesideEachOther)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    std::filesystem::create_directories(root);
    std::filesystem::permissions(directory.path(), std::filesystem::perms(0755));
    std::filesystem::permissions(root, std::filesystem::perms(01777));
    makeChannels();
    ASSERT_EQ(::seteuid(nobody), 0);
    {
        DeviceChannels others(root, diagnostics);
        EXPECT_THAT(drivers(), testing::UnorderedElementsAre("pipewire-0", "pipewire-65534"));
    }
    ASSERT_EQ(::seteuid(0), 0);
    EXPECT_THAT(drivers(), ElementsAre("pipewire-0"));
}

} // namespace

} // namespace kesto_pipewire
