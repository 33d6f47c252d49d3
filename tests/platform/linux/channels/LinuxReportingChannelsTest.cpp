// SPDX-License-Identifier: Apache-2.0
// The reporting channels of this system, published ones and the kernel's, found, sampled and compared as by the
// service.
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "platform/linux/channels/Unhurried.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <map>

namespace platform {
namespace {

namespace fs = std::filesystem;
using enum LogLevel;
using support::IsLine;
using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

class LinuxReportingChannelsTest : public testing::Test {
protected:
    using Name = std::optional<std::string_view>;

    void publish(const fs::path& place, std::string_view text)
    {
        fs::create_directories((root / place).parent_path());
        support::writeFile(root / place, text);
    }
    static ReportingChannels::FoundChannels find(LinuxReportingChannels& in, Name group, Name subgroup)
    {
        return in.copyChannelsInGroup(group, subgroup, *in.readChannels(all));
    }
    ReportingChannels::Subscribed subscribe(Name group, Name subgroup)
    {
        return channels.createSubscription(*find(channels, group, subgroup).channels);
    }
    ReportingSample sample(const ReportingChannels::Subscribed& subscribed)
    {
        return channels.createSamples(*subscribed.subscription, *subscribed.channels, *channels.readChannels(all))
            .value();
    }
    static inline const std::vector<ChannelSelection> all{{}};
    static std::map<std::string, std::int64_t> valuesOf(const ReportingSample& sample)
    {
        std::map<std::string, std::int64_t> values;
        for (const ReportingChannel& channel : sample.channels)
            values[*channel.name] = channel.value;
        return values;
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "channels";
    const fs::path sound = directory.path() / "asound";
    support::FakeLog log;
    ledger::Ledger ledger;
    LinuxReportingChannels channels{root, sound, ledger, ProviderLog(log), {.time = unhurried}};
};

TEST_F(LinuxReportingChannelsTest, AreMissingOnADeviceWithoutPublishers)
{
    const auto found = find(channels, "Speaker", std::nullopt);
    EXPECT_EQ(found.error, std::nullopt);
    ASSERT_NE(found.channels, nullptr);
    EXPECT_EQ(channels.channelCount(*found.channels), 0U);
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(LinuxReportingChannelsTest, HoldThoseOfTheSoundCardsInTheirGroups)
{
    fs::copy(fs::path(KESTO_RECORDED_SOUND) / "hda-laptop", sound,
             fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    publish("mixer/Tx/-/late cycles", "simple\n3\n");
    const auto subscribed = subscribe("Tx", std::nullopt);
    EXPECT_EQ(channels.channelCount(*subscribed.channels), 13U);
    const auto before = sample(subscribed);
    const fs::path status = sound / "card0/pcm0p/sub0/status";
    std::string text = support::readFile(status);
    const std::string pointer = "hw_ptr      : 737280";
    text.replace(text.find(pointer), pointer.size(), "hw_ptr      : 785280");
    const std::string now = "tstamp      : 10817.482731009";
    text.replace(text.find(now), now.size(), "tstamp      : 10818.482731009");
    support::writeFile(status, text);
    const auto difference = channels.createDifference(before, sample(subscribed)).value();
    EXPECT_EQ(valuesOf(difference).at("late cycles"), 0);
    const auto isAnalog = [](const ReportingChannel& channel) { return channel.subgroup == "pcm0p"; };
    std::vector<ReportingChannel> analog;
    std::ranges::copy_if(difference.channels, std::back_inserter(analog), isAnalog);
    ASSERT_THAT(analog, SizeIs(4));
    EXPECT_EQ(analog[0].value, 48'000);
    EXPECT_EQ(analog[2].states[0].residency, 1000U);
    EXPECT_EQ(analog[2].states[0].transitions, 0U) << "it was running before";
    EXPECT_EQ(analog[3].states[0].name, "S32_LE/48000/2");
}

TEST_F(LinuxReportingChannelsTest, SayOnceWhatIsWrongWithAFile)
{
    publish("amp/Speaker/-/right", "simple\n1\n");
    publish("amp/Speaker/-/wrong", "simple\n1");
    const auto subscribed = subscribe("Speaker", std::nullopt);
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(Error, "kerl", "channel amp/Speaker/-/wrong is left out: it is not finished")));
    EXPECT_THAT(sample(subscribed).channels, SizeIs(1));
    EXPECT_THAT(log.take(), IsEmpty());
    publish("amp/Speaker/-/wrong", "complicated\n1\n");
    EXPECT_THAT(sample(subscribed).channels, SizeIs(1));
    EXPECT_THAT(log.take(), SizeIs(1)) << "now there is another problem";
    publish("amp/Speaker/-/wrong", "simple\n2\n");
    EXPECT_THAT(sample(subscribed).channels, SizeIs(2));
    EXPECT_THAT(log.take(), IsEmpty());
    publish("amp/Speaker/-/wrong", "complicated\n1\n");
    EXPECT_THAT(sample(subscribed).channels, SizeIs(1));
    EXPECT_THAT(log.take(), SizeIs(1)) << "again";
}

TEST_F(LinuxReportingChannelsTest, NameOnlySoManyFilesAtOnce)
{
    for (std::size_t index = 0; index < ChannelComplaints::mostNamed + 5; ++index)
        publish("amp/Speaker/-/" + std::to_string(index), "half");
    subscribe("Speaker", std::nullopt);
    const auto lines = log.take();
    ASSERT_THAT(lines, SizeIs(ChannelComplaints::mostNamed + 1));
    EXPECT_EQ(lines.back().message, "5 more channels are left out");
}

TEST_F(LinuxReportingChannelsTest, NameTheBoundThatASampleMet)
{
    std::string large = "histogram\n0 0\n";
    while (large.size() < 30'000)
        large += "1000000000000000000 1000000000000000001 1000000000000000000\n";
    const std::size_t fitting = (ChannelTree::Limits().bytes + large.size() - 1) / large.size();
    for (std::size_t index = 0; index < fitting + 2; ++index)
        publish("amp/Speaker/-/" + std::to_string(index), large);
    const auto subscribed = subscribe("Speaker", std::nullopt);
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(Error, "kerl",
                                   "channels left out of a sample: 2, beyond the 4194304 bytes of files "
                                   "that it takes")));
    EXPECT_THAT(sample(subscribed).channels, SizeIs(fitting));
    EXPECT_THAT(log.take(), IsEmpty()) << "once";
    EXPECT_EQ(ledger.account()[ledger::Counter::ChannelsLeftOut], 2U);

    LinuxReportingChannels few(root, sound, ledger, ProviderLog(log), {.channels = 10, .time = unhurried});
    EXPECT_EQ(few.channelCount(*find(few, "Speaker", std::nullopt).channels), 10U);
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(Error, "kerl", "channels left out of a sample: 132, beyond the 10 that it takes")));

    LinuxReportingChannels blind(root, sound, ledger, ProviderLog(log), {.names = 4, .time = unhurried});
    EXPECT_EQ(blind.channelCount(*find(blind, "Speaker", std::nullopt).channels), 0U);
    EXPECT_THAT(log.take(),
                ElementsAre(IsLine(Error, "kerl",
                                   "folders left out of a sample, in part or whole: at least 1, beyond the "
                                   "4 names that it looks at")));
}

TEST_F(LinuxReportingChannelsTest, SayOnceWhatSeveralGroupsMeet)
{
    fs::create_directories(root);
    fs::create_directory_symlink(directory.path(), root / "link");
    for (const char* name : {"a", "b", "c", "d", "e"})
        publish("amp/Speaker/MCA/" + std::string(name), "simple\n1\n");
    LinuxReportingChannels bounded(root, sound, ledger, ProviderLog(log), {.names = 11, .time = unhurried});
    const std::vector<ChannelSelection> groups{{"QuarnZT4", {}},     {"Speaker", {}}, {{}, "MCA"},
                                               {"Haptics", "Stats"}, {"Rx", {}},      {{}, "HwAudio2"}};
    const auto atStart = bounded.readChannels(groups);
    std::vector<ReportingChannels::Subscribed> subscribed;
    for (const auto& [group, subgroup] : groups)
        if (const auto found = bounded.copyChannelsInGroup(group, subgroup, *atStart);
            bounded.channelCount(*found.channels) > 0)
            subscribed.push_back(bounded.createSubscription(*found.channels));
    const auto wrong = {
        IsLine(Error, "kerl", "channel link is left out: Not a directory"),
        IsLine(Error, "kerl",
               "folders left out of a sample, in part or whole: at least 1, beyond the 11 names that it looks at")};
    EXPECT_THAT(log.take(), ElementsAreArray(wrong));
    EXPECT_EQ(ledger.account()[ledger::Counter::ChannelsLeftOut], 2U) << "the link, and at least one folder";
    ASSERT_THAT(subscribed, SizeIs(2));
    const auto sampleAll = [&] {
        const auto moment = bounded.readChannels(groups);
        for (const auto& each : subscribed)
            EXPECT_TRUE(bounded.createSamples(*each.subscription, *each.channels, *moment));
    };
    sampleAll();
    EXPECT_THAT(log.take(), IsEmpty());
    fs::remove(root / "link");
    fs::remove_all(root / "amp/Speaker/MCA");
    sampleAll();
    EXPECT_THAT(log.take(), IsEmpty());
    fs::create_directory_symlink(directory.path(), root / "link");
    for (const char* name : {"a", "b", "c", "d", "e"})
        publish("amp/Speaker/MCA/" + std::string(name), "simple\n1\n");
    sampleAll();
    EXPECT_THAT(log.take(), ElementsAreArray(wrong)) << "again, because it was correct in between";
}

TEST_F(LinuxReportingChannelsTest, OfSoundCardsAreThereThoughTheTreeCannotBeRead)
{
    support::writeFile(root, "a file in its place");
    fs::copy(fs::path(KESTO_RECORDED_SOUND) / "none-running", sound,
             fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    const auto found = find(channels, "Tx", std::nullopt);
    EXPECT_EQ(found.error, ENOTDIR);
    ASSERT_NE(found.channels, nullptr);
    EXPECT_EQ(channels.channelCount(*found.channels), 16U);
    const auto subscribed = channels.createSubscription(*found.channels);
    for (int look = 0; look < 2; ++look)
        EXPECT_THAT(sample(subscribed).channels, SizeIs(16));
    const std::string line = "only sound cards have channels: " + root.native() + " cannot be read: Not a directory";
    EXPECT_THAT(log.take(), ElementsAre(IsLine(Error, "kerl", line))) << "once";
    fs::remove(root);
    EXPECT_THAT(sample(subscribed).channels, SizeIs(16));
    support::writeFile(root, "again");
    EXPECT_THAT(sample(subscribed).channels, SizeIs(16));
    EXPECT_THAT(log.take(), ElementsAre(IsLine(Error, "kerl", line)));
}

TEST_F(LinuxReportingChannelsTest, DoNotSayAgainWhatWasWrongBeforeTheTreeCouldNotBeRead)
{
    fs::copy(fs::path(KESTO_RECORDED_SOUND) / "none-running", sound,
             fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    publish("amp/Tx/-/wrong", "simple\n1");
    const auto subscribed = subscribe("Tx", std::nullopt);
    EXPECT_THAT(log.take(), SizeIs(1));
    fs::rename(root, directory.path() / "away");
    support::writeFile(root, "a file in its place");
    sample(subscribed);
    EXPECT_THAT(log.take(), SizeIs(1)) << "the tree";
    fs::remove(root);
    fs::rename(directory.path() / "away", root);
    sample(subscribed);
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxReportingChannelsTest, AreAnErrorWhereTheTreeCannotBeReadAndNoSoundCardHasAny)
{
    publish("amp/Speaker/-/a", "simple\n1\n");
    const auto subscribed = subscribe("Speaker", std::nullopt);
    fs::remove_all(root);
    support::writeFile(root, "a file in its place");
    EXPECT_EQ(
        channels.createSamples(*subscribed.subscription, *subscribed.channels, *channels.readChannels(all)).error(),
        ENOTDIR);
}

TEST_F(LinuxReportingChannelsTest, OfKnownDriversAreReadHoweverManyFoldersCameMeanwhile)
{
    const auto publishOf = [&](const std::string& driver) { publish(driver + "/Tx/-/" + driver, "simple\n1\n"); };
    const std::vector<std::string> known{"a", "b", "c", "d", "e"};
    std::ranges::for_each(known, publishOf);
    LinuxReportingChannels bounded(root, sound, ledger, ProviderLog(log),
                                   {.drivers = known.size() + 2, .time = unhurried});
    const auto subscribed = bounded.createSubscription(*find(bounded, "Tx", std::nullopt).channels);
    for (int other = 0; other < 50; ++other)
        publishOf("other " + std::to_string(other));
    const auto values = valuesOf(
        bounded.createSamples(*subscribed.subscription, *subscribed.channels, *bounded.readChannels(all)).value());
    for (const std::string& driver : known)
        EXPECT_THAT(values, testing::Contains(Pair(driver, 1)));
    EXPECT_LT(values.size(), 50U) << "the bound was met";
    publish("a/Tx/-/a", "simple\n2\n");
    fs::remove_all(root / "b");
    const auto later = valuesOf(
        bounded.createSamples(*subscribed.subscription, *subscribed.channels, *bounded.readChannels(all)).value());
    EXPECT_EQ(later.at("a"), 2);
    EXPECT_THAT(later, testing::Not(testing::Contains(testing::Key("b"))));
    EXPECT_THAT(log.lines("kerl"), SizeIs(1)) << "of the bound";
}

// Then its absence from the first sample proves nothing: its content may be older.
TEST_F(LinuxReportingChannelsTest, ThatTheFirstSampleCouldNotSeeHaveNoDifference)
{
    fs::copy(fs::path(KESTO_RECORDED_SOUND) / "none-running", sound,
             fs::copy_options::recursive | fs::copy_options::copy_symlinks);
    publish("amp/Tx/-/late cycles", "simple\n1000000\n");
    const auto subscribed = subscribe("Tx", std::nullopt);
    fs::rename(root, directory.path() / "away");
    support::writeFile(root, "a file in its place");
    const auto before = sample(subscribed);
    fs::remove(root);
    fs::rename(directory.path() / "away", root);
    const auto difference = channels.createDifference(before, sample(subscribed)).value();
    EXPECT_THAT(difference.channels, SizeIs(16));
    EXPECT_THAT(valuesOf(difference), testing::Not(testing::Contains(testing::Key("late cycles"))));
}

TEST_F(LinuxReportingChannelsTest, OfASubscriptionStayItsOwnWhenTheTreeGoesAndComesBack)
{
    publish("amp/Speaker/-/a", "simple\n1\n");
    const auto subscribed = subscribe("Speaker", std::nullopt);
    fs::remove_all(root);
    EXPECT_THAT(sample(subscribed).channels, IsEmpty());
    publish("amp/Speaker/-/a", "simple\n2\n");
    publish("amp/Tx/-/b", "simple\n3\n");
    EXPECT_THAT(valuesOf(sample(subscribed)), ElementsAre(Pair("a", 2)));
}

} // namespace
} // namespace platform
