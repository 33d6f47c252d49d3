// SPDX-License-Identifier: Apache-2.0
// The shared functions, each with common values and edge cases; two formulations of one function are compared with each
// other.
#include "utility/KestoReportingUtility.h"
#include "support/TestPlatform.h"

#include <array>
#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <thread>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

class UtilityTest : public testing::Test {
protected:
    support::TestPlatform platform;
};

// --- the build

using InternalBuild = UtilityTest;

TEST_F(InternalBuild, IsWhatTheDevicePropertySays)
{
    platform.deviceProperties.set("InternalBuild", true);
    EXPECT_TRUE(KestoReportingUtilityIsInternalBuild());
}

TEST_F(InternalBuild, IsNotWhenThePropertySaysSo)
{
    platform.deviceProperties.set("InternalBuild", false);
    EXPECT_FALSE(KestoReportingUtilityIsInternalBuild());
}

TEST_F(InternalBuild, IsNotWhenThePropertyIsMissing)
{
    EXPECT_FALSE(KestoReportingUtilityIsInternalBuild());
}

TEST_F(InternalBuild, IsAskedForOnce)
{
    EXPECT_FALSE(KestoReportingUtilityIsInternalBuild());
    platform.deviceProperties.set("InternalBuild", true);
    EXPECT_FALSE(KestoReportingUtilityIsInternalBuild());
    EXPECT_EQ(platform.deviceProperties.timesAsked("InternalBuild"), 1);
}

TEST_F(InternalBuild, IsAskedForOnceByThreadsThatMeetItTogether)
{
    platform.deviceProperties.set("InternalBuild", true);
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 4; ++thread)
            threads.emplace_back([] { EXPECT_TRUE(KestoReportingUtilityIsInternalBuild()); });
    }
    EXPECT_EQ(platform.deviceProperties.timesAsked("InternalBuild"), 1);
}

// --- processes

using ProcessName = UtilityTest;

TEST_F(ProcessName, OfTheServiceIsItsOwn)
{
    const auto own = platform.processTable.ownProcessIdentifier();
    platform.processTable.add(own, "somebody else");
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(own), "kestod");
}

TEST_F(ProcessName, OfAnotherProcessIsTheKernelsShortName)
{
    platform.processTable.add(17, "player");
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(17), "player");
}

TEST_F(ProcessName, IsNothingForNumbersThatNameNoProcess)
{
    platform.processTable.add(0, "nobody");
    platform.processTable.add(-1, "nobody");
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(0), std::nullopt);
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(-1), std::nullopt);
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(std::numeric_limits<std::int32_t>::min()), std::nullopt);
}

TEST_F(ProcessName, IsNothingForAProcessThatDoesNotExist)
{
    EXPECT_EQ(KestoReportingUtilityProcessNameForPID(17), std::nullopt);
}

TEST_F(ProcessName, InfoFillsTheEntryOnlyOfAProcessThatExists)
{
    platform.processTable.add(17, "player");
    platform::ProcessTableEntry entry{.processIdentifier = 5, .commandName = "as it was"};
    EXPECT_FALSE(KestoReportingUtilityProcessInfoForPID(18, entry));
    EXPECT_EQ(entry.commandName, "as it was");
    EXPECT_TRUE(KestoReportingUtilityProcessInfoForPID(17, entry));
    EXPECT_EQ(entry.processIdentifier, 17);
    EXPECT_EQ(entry.commandName, "player");
}

// --- payloads

TEST(AppName, IsUnknownWhenItIsMissing)
{
    EXPECT_EQ(KestoReportingUtilityRetrieveAppName({}), Value("Unknown"));
    EXPECT_EQ(KestoReportingUtilityRetrieveAppName({{"hostapplicationdisplayid", "x"}}), Value("Unknown"));
}

TEST(AppName, IsTheStoredValue)
{
    EXPECT_EQ(KestoReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", "org.player"}}), Value("org.player"));
    EXPECT_EQ(KestoReportingUtilityRetrieveAppName({{"HostApplicationDisplayID", 7}}), Value(7));
}

TEST(AudioMessageTag, JoinsTheNamesOfCategoryAndType)
{
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({{"a", 1}}, 4, 1),
              (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 0x10000004, 2),
              (Dictionary{{"audiotag", "DSP_PlaybackStop"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 0xFFFFFFFF, 65535),
              (Dictionary{{"audiotag", "UndefinedUnknown"}}));
}

TEST(AudioMessageTag, IsThatOfItsOwnMessageAfterOthers)
{
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 4, 1), (Dictionary{{"audiotag", "PlaybackStart"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 4, 2), (Dictionary{{"audiotag", "PlaybackStop"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 2, 2), (Dictionary{{"audiotag", "RecordStop"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 2, 2), (Dictionary{{"audiotag", "RecordStop"}}));
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag({}, 4, 1), (Dictionary{{"audiotag", "PlaybackStart"}}));
}

TEST(AudioMessageTag, ReplacesAnotherTagAndLeavesTheArgumentAlone)
{
    const Dictionary message{{"audiotag", "mine"}, {"a", 1}};
    EXPECT_EQ(KestoReportingUtilityAddAudioMessageTag(message, 4, 1),
              (Dictionary{{"audiotag", "PlaybackStart"}, {"a", 1}}));
    EXPECT_EQ(message, (Dictionary{{"audiotag", "mine"}, {"a", 1}}));
}

using EventEpochTime = UtilityTest;

TEST_F(EventEpochTime, IsRemovedOutsideInternalBuilds)
{
    const Dictionary message{{"a", 1}, {"kestoreporting_timestamp", 2.5}, {"systemuptime_sec", 3}};
    EXPECT_EQ(KestoReportingUtilityRemoveEventEpochTime(message), (Dictionary{{"a", 1}, {"systemuptime_sec", 3}}));
    EXPECT_EQ(message.size(), 3U);
}

TEST_F(EventEpochTime, IsKeptOnInternalBuilds)
{
    platform.deviceProperties.setInternalBuild(true);
    const Dictionary message{{"a", 1}, {"kestoreporting_timestamp", 2.5}};
    EXPECT_TRUE(KestoReportingUtilityRemoveEventEpochTime(message).isSameObject(message));
}

TEST_F(EventEpochTime, LeavesAMessageWithoutItAsItIs)
{
    const Dictionary message{{"a", 1}, {"kestoreporting_timestamp_", 2.5}};
    EXPECT_TRUE(KestoReportingUtilityRemoveEventEpochTime(message).isSameObject(message));
}

TEST(WhiteSpace, BecomesUnderscoresInKeysAndStaysInValues)
{
    EXPECT_EQ(
        KestoReportingUtilityRemoveWhiteSpaceFromKeys({{"Route Change Count", "two of them"}, {" ", Array{1, 2}}}),
        (Dictionary{{"Route_Change_Count", "two of them"}, {"_", Array{1, 2}}}));
}

TEST(WhiteSpace, OtherThanBlanksStays)
{
    const Dictionary message{{"a\tb", 1}, {"a\nb", 2}, {"a\u00A0b", 3}};
    EXPECT_EQ(KestoReportingUtilityRemoveWhiteSpaceFromKeys(message), message);
}

TEST(WhiteSpace, InInnerKeysStays)
{
    const Dictionary inner{{"a b", 1}};
    EXPECT_EQ(KestoReportingUtilityRemoveWhiteSpaceFromKeys({{"outer key", inner}}),
              (Dictionary{{"outer_key", inner}}));
}

TEST(WhiteSpace, LetsTheLaterOfTwoKeysThatBecomeEqualWin)
{
    EXPECT_EQ(KestoReportingUtilityRemoveWhiteSpaceFromKeys({{"a b", 1}, {"a_b", 2}}), (Dictionary{{"a_b", 2}}));
    EXPECT_EQ(KestoReportingUtilityRemoveWhiteSpaceFromKeys({{"a_b", 1}, {"a b", 2}}), (Dictionary{{"a_b", 2}}));
}

RC_GTEST_PROP(WhiteSpace, IsRemovedAsEntryByEntryWouldRemoveIt, ())
{
    const auto key = rc::gen::container<std::string>(rc::gen::elementOf(std::string("ab _")));
    const auto entries = *rc::gen::container<std::vector<std::pair<std::string, int>>>(
        rc::gen::pair(rc::gen::resize(3, key), rc::gen::inRange(0, 9)));
    Dictionary::Entries given;
    for (const auto& [entryKey, value] : entries)
        given.push_back({foundation::String(entryKey), value});
    const Dictionary message(given);

    Dictionary expected;
    for (const auto& [entryKey, value] : message) {
        std::string clean(entryKey.view());
        std::ranges::replace(clean, ' ', '_');
        expected = expected.with(foundation::String(clean), value);
    }
    RC_ASSERT(KestoReportingUtilityRemoveWhiteSpaceFromKeys(message) == expected);
}

RC_GTEST_PROP(NormalisedMessage, IsWhatTheThreeStepsMakeOfIt, (bool isInternalBuild))
{
    support::TestPlatform platform;
    platform.deviceProperties.setInternalBuild(isInternalBuild);
    const auto key = rc::gen::element<std::string>("a b", "a_b", "audiotag", "audio tag", "kestoreporting timestamp",
                                                   "kestoreporting_timestamp");
    Dictionary::Entries entries;
    for (const auto& [entryKey, value] :
         *rc::gen::container<std::vector<std::pair<std::string, int>>>(rc::gen::pair(key, rc::gen::inRange(0, 9))))
        entries.push_back({foundation::String(entryKey), value});
    const Dictionary message(entries);

    const auto isRight = [](const Dictionary& given, AudioEventType type) {
        const Dictionary expected = KestoReportingUtilityRemoveEventEpochTime(
            KestoReportingUtilityAddAudioMessageTag(KestoReportingUtilityRemoveWhiteSpaceFromKeys(given), 4, type));
        return Value(utility::normaliseMessage(given, 4, type)).text() == Value(expected).text();
    };
    RC_ASSERT(isRight(message, 1));
    std::vector<Value> others(message.size(), "other");
    const Dictionary later = message.empty() ? message : Dictionary(message.shape(), others);
    RC_ASSERT(isRight(later, 2)); // its shape is known now
    platform.deviceProperties.setInternalBuild(!isInternalBuild);
    RC_ASSERT(isRight(later, 2));
}

TEST(NormaliseMessage, GetsTheTagOfItsOwnTypeBehindAMessageOfTheSameCategory)
{
    const support::TestPlatform platform;
    EXPECT_EQ(utility::normaliseMessage({{"a", 1}}, 4, 1), (Dictionary{{"a", 1}, {"audiotag", "PlaybackStart"}}));
    EXPECT_EQ(utility::normaliseMessage({{"a", 1}}, 4, 2), (Dictionary{{"a", 1}, {"audiotag", "PlaybackStop"}}));
}

TEST(NormaliseMessage, MessagesOfOneShapeGetOneShape)
{
    const support::TestPlatform platform;
    const Dictionary first{{"a b", 1}, {"c", 2}};
    const Dictionary second = first.with("c", 3);
    EXPECT_EQ(first.shape().get(), second.shape().get());
    const Dictionary normalised = utility::normaliseMessage(first, 4, 1);
    EXPECT_EQ(normalised.shape().get(), utility::normaliseMessage(second, 4, 1).shape().get());
    EXPECT_EQ(normalised.shape().get(), utility::normaliseMessage(second, 4, 2).shape().get());
}

// --- numbers

TEST(RoundWithPlaces, TakesHalvesAwayFromZero)
{
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(-2.5, 0), -3);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(2.5, 0), 3);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(0.125, 2), 0.13);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(-0.125, 2), -0.13);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(2.4999, 0), 2);
}

TEST(RoundWithPlaces, RoundsToTensAndHundredsWithNegativePlaces)
{
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(1234.5, -2), 1200);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(1250, -2), 1300);
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(15, -1), 20);
}

TEST(RoundWithPlaces, LeavesNaNAsItIs)
{
    EXPECT_TRUE(std::isnan(KestoReportingUtilityRoundWithPlaces(std::nan(""), 2)));
    EXPECT_EQ(KestoReportingUtilityRoundWithPlaces(INFINITY, 2), INFINITY);
}

TEST(Buckets, HaveTheirValuesInOrder)
{
    EXPECT_EQ(KestoReportingUtilityBucketNumberToStringTimes,
              (std::array<double, 11>{0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18000}));
    ASSERT_EQ(KestoReportingUtilityBucketNumberToStringVolumes.size(), 17U);
    for (std::size_t place = 0; place < 17; ++place)
        EXPECT_EQ(KestoReportingUtilityBucketNumberToStringVolumes[place], static_cast<double>(place) * 0.0625);
}

std::optional<std::string> timeBucket(double number)
{
    return KestoReportingUtilityBucketNumberToString(number, KestoReportingUtilityBucketNumberToStringTimes, 0);
}

std::optional<std::string> volumeBucket(double number)
{
    return KestoReportingUtilityBucketNumberToString(number, KestoReportingUtilityBucketNumberToStringVolumes, 2);
}

TEST(Buckets, ATimeFallsIntoTheNearest)
{
    EXPECT_EQ(timeBucket(0.4), "0");
    EXPECT_EQ(timeBucket(3), "5");
    EXPECT_EQ(timeBucket(45), "60");
    EXPECT_EQ(timeBucket(100000), "18000");
    EXPECT_EQ(timeBucket(-5), "0");
}

TEST(Buckets, ANumberHalfwayBetweenTwoFallsIntoTheLarger)
{
    const auto& times = KestoReportingUtilityBucketNumberToStringTimes;
    for (std::size_t place = 0; place + 1 < times.size(); ++place)
        EXPECT_EQ(timeBucket((times[place] + times[place + 1]) / 2), timeBucket(times[place + 1]));
}

TEST(Buckets, AVolumeHasOneFractionDigitAtLeastAndTwoAtMost)
{
    EXPECT_EQ(volumeBucket(0.3), "0.31");
    EXPECT_EQ(volumeBucket(0.5), "0.5");
    EXPECT_EQ(volumeBucket(0), "0.0");
    EXPECT_EQ(volumeBucket(1), "1.0");
    EXPECT_EQ(volumeBucket(2), "1.0");
}

TEST(Buckets, AreShownRoundedHalfToEven)
{
    const auto shown = [](double bucket, unsigned places) {
        return KestoReportingUtilityBucketNumberToString(bucket, std::array{bucket}, places);
    };
    EXPECT_EQ(shown(0.0625, 3), "0.062");
    EXPECT_EQ(shown(0.1875, 3), "0.188");
    EXPECT_EQ(shown(0.5, 0), "0");
    EXPECT_EQ(shown(1.5, 0), "2");
    EXPECT_EQ(shown(1234567, 1), "1234567.0");
}

TEST(Buckets, ThatAreMissingGiveNothing)
{
    EXPECT_EQ(KestoReportingUtilityBucketNumberToString(1, {}, 0), std::nullopt);
}

TEST(Buckets, InNoOrderGiveTheFirstThatTheNextIsFartherThan)
{
    EXPECT_EQ(KestoReportingUtilityBucketNumberToString(1, std::array<double, 4>{5, 3, 9, 1}, 0), "3");
    EXPECT_EQ(KestoReportingUtilityBucketNumberToString(1, std::array<double, 2>{3, 1}, 0), "1");
}

TEST(Buckets, GiveTheLastForNaN)
{
    EXPECT_EQ(timeBucket(std::nan("")), "18000");
}

RC_GTEST_PROP(Buckets, InAscendingOrderGiveTheNearest, ())
{
    const double number = *rc::gen::inRange(-100, 2'000'000) / 100.0;
    const std::string chosen = timeBucket(number).value();
    for (const double bucket : KestoReportingUtilityBucketNumberToStringTimes)
        RC_ASSERT(std::abs(number - std::stod(chosen)) <= std::abs(number - bucket));
}

// --- identity

RC_GTEST_PROP(SessionID, IsTheReporterID, (std::int64_t reporterID))
{
    RC_ASSERT(KestoReportingUtilityExtractSessionIDFromReporterID(reporterID) == reporterID);
}

TEST(SessionID, IsTheReporterIDAtTheEndsOfItsRange)
{
    for (const std::int64_t reporterID :
         {std::int64_t{0}, std::numeric_limits<std::int64_t>::min(), std::numeric_limits<std::int64_t>::max()})
        EXPECT_EQ(KestoReportingUtilityExtractSessionIDFromReporterID(reporterID), reporterID);
}

} // namespace
