// SPDX-License-Identifier: Apache-2.0
// Driver logs of channels that are published as files: the whole path from the file to the event, with all changes of
// files in between.
#include "driver/KestoReportingDriverUtility.h"
#include "platform/linux/channels/LinuxReportingChannels.h"
#include "support/DriverMoment.h"
#include "support/ExchangedProviders.h"
#include "support/TemporaryDirectory.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <map>

namespace {

namespace fs = std::filesystem;
using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

class DriverChannels : public testing::Test {
protected:
    DriverChannels()
    {
        platform::install(support::withExchanged(platform::current(), channels));
        fakes.analytics.use("com.quarn.kesto.*");
    }

    // "driver/group/subgroup/channel".
    void publish(const fs::path& place, std::string_view text)
    {
        fs::create_directories((root / place).parent_path());
        support::replaceFile(root / place, text);
    }
    // The service starts with the present channels, and a session begins.
    void begin()
    {
        utility.emplace();
        session->start();
        session->setDriverSnapShot(utility->getSnapShot(support::driverMoment(*utility, fakes)));
        fakes.log.clear();
    }
    // The event of that kind at the session's end, key by key.
    std::map<std::string, std::string> end(const std::string& kind)
    {
        fakes.analytics.clear();
        utility->sendDriverLogsForSession(fakes.turn, session, support::driverMoment(*utility, fakes));
        std::map<std::string, std::string> statistics;
        for (const Dictionary& payload : fakes.analytics.payloads("com.quarn.kesto.Cavlet." + kind))
            for (const auto& [key, value] : payload)
                if (key.view().find("_" + kind + "_") != std::string_view::npos)
                    statistics[std::string(key.view())] = value.text();
        return statistics;
    }

    const support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "channels";
    support::TestPlatform fakes;
    // A slow machine may take longer than the service would.
    static constexpr platform::ChannelTree::Limits unhurried{.time = std::chrono::minutes(10)};
    platform::LinuxReportingChannels channels{root, directory.path() / "asound", fakes.ledger,
                                              platform::ProviderLog(fakes.log), unhurried};
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    std::optional<KestoReportingDriverUtility> utility;
};

TEST_F(DriverChannels, ThatChangedAreReported)
{
    publish("amp<0>/Speaker/-/late cycles", "simple\n3\n");
    publish("amp<0>/Haptics/Stats/duration", "histogram ms\n3 37\n0 10 5\n10 20 0\n");
    publish("amp<0>/-/MCA/power", "state\nOn 2 1000 0.1\nOff 1 9000 0.9\n");
    begin();
    publish("amp<0>/Speaker/-/late cycles", "simple\n10\n");
    publish("amp<0>/Haptics/Stats/duration", "histogram ms\n3 38\n0 10 5\n10 20 2\n");
    publish("amp<0>/-/MCA/power", "state\nOn 2 4000 0.3\nOff 1 10000 0.7\n");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("amp_Speaker_Simple_latecycles", "7")));
    EXPECT_THAT(end("Histogram"),
                ElementsAre(Pair("amp_Haptics_Stats_Histogram_duration",
                                 "count=2,lower=0,upper=20,min=3,max=38,unit=ms::10-20:2")));
    EXPECT_THAT(end("State"),
                ElementsAre(Pair("amp_MCA_State_power",
                                 "name:On,transition:0,residency:3000,duty_cycle:0.750000;"
                                 "name:Off,transition:0,residency:1000,duty_cycle:0.250000;")));
}

TEST_F(DriverChannels, ThatAppearDuringTheSessionAreReportedWithAllTheyHold)
{
    publish("amp/Speaker/-/a", "simple\n3\n");
    begin();
    publish("codec/Speaker/-/b", "simple\n10\n");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("codec_Speaker_Simple_b", "10")));
}

TEST_F(DriverChannels, ThatVanishDuringTheSessionAreNotReported)
{
    publish("amp/Speaker/-/a", "simple\n3\n");
    publish("amp/Speaker/-/b", "simple\n3\n");
    begin();
    publish("amp/Speaker/-/b", "simple\n5\n");
    fs::remove(root / "amp/Speaker/-/a");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("amp_Speaker_Simple_b", "2")));
    fs::remove_all(root);
    EXPECT_THAT(end("Simple"), IsEmpty());
}

TEST_F(DriverChannels, OfAGroupThatWasEmptyAtTheStartOfTheServiceAreNotReported)
{
    begin();
    publish("amp/Speaker/-/a", "simple\n3\n");
    EXPECT_THAT(end("Simple"), IsEmpty());
}

TEST_F(DriverChannels, ThatWrapOrBeginAnewAreReportedWithWhatTheyHold)
{
    publish("amp/Speaker/-/wrapped", "simple\n9223372036854775807\n");
    publish("amp/Speaker/-/anew", "histogram\n1 9\n0 5 4\n5 10 4\n");
    begin();
    publish("amp/Speaker/-/wrapped", "simple\n2\n");
    publish("amp/Speaker/-/anew", "histogram\n1 9\n0 5 0\n5 10 5\n");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("amp_Speaker_Simple_wrapped", "2")));
    EXPECT_THAT(
        end("Histogram"),
        ElementsAre(Pair("amp_Speaker_Histogram_anew", "count=2,lower=0,upper=10,min=1,max=9,unit=(null)::5-10:5")));
}

TEST_F(DriverChannels, ThatShrinkAreReportedWithWhatTheyHold)
{
    publish("amp/Speaker/-/buckets", "histogram\n1 9\n0 5 4\n5 10 4\n");
    publish("amp/Speaker/-/states", "state\nOn 1 100 0.5\nOff 1 100 0.5\n");
    begin();
    publish("amp/Speaker/-/buckets", "histogram\n1 9\n0 5 4\n");
    publish("amp/Speaker/-/states", "state\nOn 1 150 1\n");
    EXPECT_THAT(
        end("Histogram"),
        ElementsAre(Pair("amp_Speaker_Histogram_buckets", "count=1,lower=0,upper=5,min=1,max=9,unit=(null)::0-5:4")));
    EXPECT_THAT(
        end("State"),
        ElementsAre(Pair("amp_Speaker_State_states", "name:On,transition:1,residency:150,duty_cycle:1.000000;")));
}

TEST_F(DriverChannels, ThatAreHalfWrittenAreNotReportedAndCostOneLine)
{
    publish("amp/Speaker/-/whole", "simple\n3\n");
    publish("amp/Speaker/-/half", "simple\n3\n");
    begin();
    publish("amp/Speaker/-/whole", "simple\n4\n");
    publish("amp/Speaker/-/half", "simple\n300");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("amp_Speaker_Simple_whole", "1")));
    EXPECT_THAT(fakes.log.lines("kerl"),
                ElementsAre(support::IsLine(platform::LogLevel::Error, "kerl",
                                            "channel amp/Speaker/-/half is left out: it is not finished")));
}

TEST_F(DriverChannels, OfWhichTheFileBecomesAFolderAreNotReported)
{
    publish("amp/Speaker/-/a", "simple\n3\n");
    publish("amp/Speaker/-/b", "simple\n3\n");
    begin();
    fs::remove(root / "amp/Speaker/-/a");
    publish("amp/Speaker/-/a/b", "simple\n4\n");
    publish("amp/Speaker/-/b", "simple\n4\n");
    EXPECT_THAT(end("Simple"), ElementsAre(Pair("amp_Speaker_Simple_b", "1")));
}

TEST_F(DriverChannels, MayBeAThousandForEachOfTheEightDrivers)
{
    constexpr std::size_t channelsEach = 1000;
    const std::vector<std::string> places{
        "QuarnZT4/-", "Speaker/-", "-/MCA", "Haptics/Stats", "StateTransitionTimes_ms/-", "Rx/-", "Tx/-", "-/HwAudio2"};
    for (const std::string& place : places) {
        fs::create_directories(root / "amp" / place);
        for (std::size_t index = 0; index < channelsEach; ++index)
            support::writeFile(root / "amp" / place / std::to_string(index), "simple\n100\n");
    }
    begin();
    ASSERT_THAT(utility->ioChannelSubscriptions(), SizeIs(places.size()));
    for (const auto& [driver, sample] : *session->driverSnapShot())
        EXPECT_THAT(sample.channels, SizeIs(channelsEach)) << driver;
    for (const std::string& place : places)
        for (std::size_t index = 0; index < channelsEach; ++index)
            support::writeFile(root / "amp" / place / std::to_string(index),
                               "simple\n" + std::to_string(101 + index) + "\n");
    const auto statistics = end("Simple");
    ASSERT_THAT(statistics, SizeIs(places.size() * channelsEach));
    EXPECT_EQ(statistics.at("amp_QuarnZT4_Simple_0"), "1");
    EXPECT_EQ(statistics.at("amp_HwAudio2_Simple_999"), "1000");
    EXPECT_THAT(fakes.log.lines("kerl"), IsEmpty());
}

} // namespace
