// SPDX-License-Identifier: Apache-2.0
// Listing and watching the drivers' channels.
#include "kesto/channels.hpp"
#include "support/ParseJson.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <thread>

namespace kesto_tool {
namespace {

using foundation::Value;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

class ChannelsCommand : public testing::Test {
protected:
    ChannelsCommand() { tool.setVariable("KESTO_CHANNEL_ROOT"); }

    void publish(const std::filesystem::path& place, std::string_view text) const
    {
        std::filesystem::create_directories((root / place).parent_path());
        support::replaceFile(root / place, text);
    }
    // Keeps the machine's own sound cards out of the test.
    [[nodiscard]] Tool::Arguments arguments(const Tool::Arguments& more = {}) const
    {
        Tool::Arguments all{"channels", "--sound", "/nonexistent"};
        all.insert(all.end(), more.begin(), more.end());
        return all;
    }
    void publishAll() const
    {
        publish("amp<0x1a>/Haptics/Stats/Over Temp_Count", "simple\n7\n");
        publish("amp<0x1a>/Speaker/-/latency", "histogram ms\n3 37\n0 10 5\n10 20 0\n30 40 2\n");
        publish("amp<0x1a>/-/MCA/power", "state\nRunning 12 88000 0.880000\nIdle 11 12000 0.120000\n");
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path root = directory.path() / "run/channels";
    Tool tool{directory.path()};
};

TEST_F(ChannelsCommand, ListsWhatIsPublished)
{
    publishAll();
    EXPECT_EQ(tool.print(arguments()),
              "DRIVER           GROUP        SUBGROUP   CHANNEL                  CONTENT\n"
              "amp<0x1a>        -            MCA        power                    Running 88.0% 12x, Idle 12.0% 11x\n"
              "amp<0x1a>        Haptics      Stats      Over Temp_Count          7\n"
              "amp<0x1a>        Speaker      -          latency                  0-10:5 30-40:2 ms, 3 to 37\n");
}

TEST_F(ChannelsCommand, SaysThatItFoundNone)
{
    EXPECT_EQ(tool.print(arguments()), "No channels are published in " + root.native() + ".\n");
    EXPECT_EQ(tool.print(arguments({"--json"})), "");
}

TEST_F(ChannelsCommand, ListsForPrograms)
{
    publishAll();
    std::istringstream lines(tool.print(arguments({"--json"})));
    std::vector<foundation::Dictionary> channels;
    for (std::string line; std::getline(lines, line);)
        channels.push_back(*support::parseJson(line)->dictionary());
    ASSERT_EQ(channels.size(), 3U);
    EXPECT_EQ(*channels[0].find("group"), Value());
    EXPECT_EQ(*channels[0].find("subgroup"), Value("MCA"));
    EXPECT_EQ(*channels[0].find("kind"), Value("state"));
    EXPECT_EQ(*(*channels[0].find("states")->array())[1].dictionary()->find("residency"), Value(12'000));
    EXPECT_EQ(*channels[1].find("driver"), Value("amp<0x1a>"));
    EXPECT_EQ(*channels[1].find("channel"), Value("Over Temp_Count"));
    EXPECT_EQ(*channels[1].find("value"), Value(7));
    EXPECT_EQ(*channels[2].find("unit"), Value("ms"));
    EXPECT_EQ(*channels[2].find("maximum"), Value(37));
    EXPECT_EQ(*(*channels[2].find("buckets")->array())[2].dictionary()->find("hits"), Value(2));
    EXPECT_GT(channels[2].find("time")->asDouble(), 1'700'000'000);
}

TEST_F(ChannelsCommand, ListsThoseOfAGroupOrASubgroup)
{
    publishAll();
    EXPECT_THAT(tool.print(arguments({"--group", "Speaker"})), AllOf(HasSubstr("latency"), Not(HasSubstr("power"))));
    EXPECT_THAT(tool.print(arguments({"--subgroup", "MCA"})), AllOf(HasSubstr("power"), Not(HasSubstr("latency"))));
    EXPECT_THAT(tool.print(arguments({"--group", "../.."})), StartsWith("No channels"));
}

TEST_F(ChannelsCommand, FindsTheTreeThatIsNamed)
{
    publish("amp/Tx/-/a", "simple\n1\n");
    const auto other = directory.path() / "other";
    std::filesystem::rename(root, other);
    EXPECT_THAT(tool.print(arguments({"--root", other})), HasSubstr("amp"));
    tool.setVariable("KESTO_CHANNEL_ROOT=" + other.native());
    EXPECT_THAT(tool.print(arguments()), HasSubstr("amp"));
}

TEST_F(ChannelsCommand, ShowsSoundCardsBesideWhatIsPublished)
{
    publish("mixer/Tx/-/late cycles", "simple\n1\n");
    const std::string output = tool.print({"channels", "--sound", KESTO_RECORDED_SOUND "/usb-headset"});
    EXPECT_THAT(output, HasSubstr("late cycles"));
    EXPECT_THAT(output, HasSubstr("Headset          Tx           pcm0p      sub0 hw_ptr              5820000 frames"));
    EXPECT_THAT(output, HasSubstr("sub0 format              S16_LE/16000/1 100.0% 1x"));
}

TEST_F(ChannelsCommand, TellsWhatIsLeftOut)
{
    publish("amp/Tx/-/a", "simple\n1\n");
    publish("amp/Tx/-/half\x1b", "simple\n1");
    const Finished finished = tool.run(arguments());
    EXPECT_EQ(finished.status, 0);
    EXPECT_EQ(finished.errors, "kesto: channel amp/Tx/-/half? is left out: it is not finished\n");
    EXPECT_THAT(finished.output, HasSubstr("amp"));
}

TEST_F(ChannelsCommand, SaysWhyTheTreeCannotBeRead)
{
    support::writeFile(root, "");
    const Finished finished = tool.run(arguments());
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors, "kesto: " + root.native() + ": Not a directory\n");
}

TEST_F(ChannelsCommand, ListsSoundCardsThoughTheTreeCannotBeRead)
{
    support::writeFile(root, "");
    const Finished finished = tool.run({"channels", "--sound", KESTO_RECORDED_SOUND "/usb-headset"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors, "kesto: " + root.native() + ": Not a directory\n");
    EXPECT_THAT(finished.output, HasSubstr("Headset          Tx           pcm0p      sub0 hw_ptr"));
}

TEST_F(ChannelsCommand, WatchesWhatChanges)
{
    publish("amp/Tx/-/still", "simple\n5\n");
    kesto::PublisherOptions options;
    options.root = root;
    kesto::Publisher publisher;
    kesto::SimpleChannel channel;
    ASSERT_EQ(publisher.open(options), kesto::Status::Ok);
    ASSERT_EQ(channel.create(publisher, {"mixer", "Tx", "", "cycles"}), kesto::Status::Ok);
    const auto watching = tool.start(arguments({"--watch", "--interval", "0.05", "--json"}));
    const std::jthread changing([&](const std::stop_token& end) { // the time of the tool's first reading is not known
        while (!end.stop_requested()) {
            channel.add(7);
            publisher.flush();
        }
    });
    const std::string seen = watching->waitForOutput("\n");
    EXPECT_THAT(seen, HasSubstr("\"channel\":\"cycles\""));
    EXPECT_THAT(seen, Not(HasSubstr("still")));
}

TEST_F(ChannelsCommand, EndsAfterSoManyLooks)
{
    publish("amp/Tx/-/still", "simple\n5\n");
    EXPECT_EQ(tool.print(arguments({"--watch", "--interval", "0.01", "--count", "2"})),
              "TIME     DRIVER           GROUP        SUBGROUP   CHANNEL                  CONTENT\n");
    EXPECT_EQ(tool.run(arguments({"--count", "2"})).status, 2) << "there is nothing to count";
    EXPECT_EQ(tool.run(arguments({"--watch", "--interval", "0"})).status, 2);
}

} // namespace
} // namespace kesto_tool
