// SPDX-License-Identifier: Apache-2.0
// Volume events: which stretches of playing become events, their content, and their log lines.
#include "session/AllocatedBytes.h"
#include "session/GeneratedMessages.h"
#include "session/KestoReportingSession.h"
#include "session/NaiveAggregation.h"
#include "support/Sanitizers.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr double nan = std::numeric_limits<double>::quiet_NaN();
constexpr double infinity = std::numeric_limits<double>::infinity();

// A payload at that time with these entries.
Dictionary at(const Value& time, const Dictionary& entries)
{
    return Dictionary{{"kestoreporting_timestamp", time}}.mergedWith(entries);
}
Dictionary startAt(const Value& time, const Value& volume = 0.5)
{
    return at(time, {{"session_output_running", true}, {"PomoSessionVolume", volume}});
}
Dictionary stopAt(const Value& time)
{
    return at(time, {{"session_output_running", false}});
}

class SessionVolumeEvents : public testing::Test {
protected:
    static Messages create(const Messages& payloads, const std::optional<Value>& process = Value("player"),
                           double minimumPlaytime = 0.5)
    {
        session::StorageShare share(session::StorageBudget::service());
        return KestoReportingSession::createVolumeMessages(*storeOf(payloads), process, minimumPlaytime, share);
    }

    // The play times, as texts.
    static std::vector<std::string> playTimes(const Messages& payloads)
    {
        return values(create(payloads), "play_seconds");
    }

    static std::vector<std::string> values(const Messages& events, std::string_view key)
    {
        std::vector<std::string> values;
        for (const Dictionary& event : events)
            values.push_back(event.find(key)->text());
        return values;
    }

    support::TestPlatform platform;
};

// --- the content of an event

TEST_F(SessionVolumeEvents, SayWhatWasPlayedHowInThirteenEntriesInOrder)
{
    const auto events = create({at(100,
                                   {{"session_selected_format", "lpcm, 48 kHz"},
                                    {"active_devices", "Speaker"},
                                    {"spatial-audio-accessory-feature", true},
                                    {"spatializationEnabled", 1},
                                    {"ringerstate", 2},
                                    {"mChannelsPerFrame", 6},
                                    {"PomoSessionVolume", 0.3},
                                    {"session_output_running", true}}),
                                stopAt(170.25)});
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_EQ(
        Value(events[0]).text(),
        R"({"session_selected_format":"lpcm, 48 kHz","active_devices":"Speaker",)"
        R"("HostApplicationDisplayID":"player","PomoSessionVolume":0.3,"PomoSessionVolumeBucketed":"0.3125",)"
        R"("play_seconds":70.25,"spatial-audio-accessory-feature":true,"spatializationEnabled":1,"ringerstate":2,)"
        R"("mChannelsPerFrame":6,"play_secondsBucketed":"60","msgidx":1,"msgcnt":1})");
}

TEST_F(SessionVolumeEvents, SayWhatIsAssumedWhereNothingWasSaid)
{
    const auto events = create({startAt(0), stopAt(1)});
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_EQ(Value(events[0]).text(),
              R"({"session_selected_format":"unknown","active_devices":"unknown","HostApplicationDisplayID":"player",)"
              R"("PomoSessionVolume":0.5,"PomoSessionVolumeBucketed":"0.5","play_seconds":1,)"
              R"("spatial-audio-accessory-feature":false,"spatializationEnabled":false,"ringerstate":false,)"
              R"("mChannelsPerFrame":-1,"play_secondsBucketed":"1","msgidx":1,"msgcnt":1})");
}

TEST_F(SessionVolumeEvents, GiveThePlayTimeAsAFloatOf32Bits)
{
    const auto events = create({startAt(1'767'225'600.1), stopAt(1'767'225'607.3)});
    ASSERT_THAT(events, SizeIs(1));
    const auto playTime = events[0].find("play_seconds")->number();
    EXPECT_EQ(playTime->kind(), foundation::Number::Kind::Float32);
    EXPECT_EQ(playTime->text(), "7.2") << "the difference of the times, as doubles, has many more digits";
}

TEST_F(SessionVolumeEvents, AreNumberedAndCounted)
{
    const auto events = create({startAt(0, 0.5), at(30, {{"PomoSessionVolume", 0.75}}), stopAt(100)});
    EXPECT_THAT(values(events, "play_seconds"), ElementsAre("30", "70"));
    EXPECT_THAT(values(events, "PomoSessionVolume"), ElementsAre("0.5", "0.75"));
    EXPECT_THAT(values(events, "msgidx"), ElementsAre("1", "2"));
    EXPECT_THAT(values(events, "msgcnt"), ElementsAre("2", "2"));
}

TEST_F(SessionVolumeEvents, SayHowItWasBeforeTheMessageThatEndsTheStretch)
{
    const auto events = create({startAt(0),
                                at(10,
                                   {{"session_output_running", false},
                                    {"PomoSessionVolume", 1},
                                    {"active_devices", "Speaker"},
                                    {"mChannelsPerFrame", 2}})});
    EXPECT_THAT(values(events, "PomoSessionVolume"), ElementsAre("0.5"));
    EXPECT_THAT(values(events, "active_devices"), ElementsAre("unknown"));
    EXPECT_THAT(values(events, "mChannelsPerFrame"), ElementsAre("-1"));
}

TEST_F(SessionVolumeEvents, BucketVolumesToSixteenths)
{
    const std::vector<std::pair<Value, std::string>> expected{
        {0, "0.0"},          {0.03, "0.0"},
        {0.03125, "0.0625"}, {0.5F, "0.5"},
        {0.97, "1.0"},       {1, "1.0"},
        {true, "1.0"},       {2, "1.0"},
        {-3, "0.0"},         {nan, "1.0"},
        {"0.4", "0.375"},    {"loud", "0.0"},
        {Value(), "0.0"},    {Value(foundation::Array{1}), "0.0"}};
    for (const auto& [volume, bucket] : expected)
        EXPECT_THAT(values(create({startAt(0, volume), stopAt(1)}), "PomoSessionVolumeBucketed"), ElementsAre(bucket))
            << volume.text();
}

TEST_F(SessionVolumeEvents, BucketPlayTimes)
{
    const std::vector<std::pair<double, std::string>> expected{
        {0.51, "1"},    {1, "1"},          {2.9, "1"},     {3, "5"},           {7.5, "10"},    {20, "30"},
        {44, "30"},     {45, "60"},        {180, "300"},   {1050, "1800"},     {2699, "1800"}, {2700, "3600"},
        {5400, "7200"}, {12'600, "18000"}, {1e9, "18000"}, {infinity, "18000"}};
    for (const auto& [playTime, bucket] : expected)
        EXPECT_THAT(values(create({startAt(0), stopAt(playTime)}), "play_secondsBucketed"), ElementsAre(bucket))
            << playTime;
    EXPECT_THAT(values(create({startAt(0), stopAt(0.25)}, Value("player"), 0), "play_secondsBucketed"),
                ElementsAre("0"));
}

TEST_F(SessionVolumeEvents, NameTheApplicationEvenIfItIsNotText)
{
    EXPECT_THAT(values(create({startAt(0), stopAt(1)}, Value(7)), "HostApplicationDisplayID"), ElementsAre("7"));
}

// --- which stretches count

TEST_F(SessionVolumeEvents, CountOnlyStretchesLongerThanTheMinimum)
{
    EXPECT_THAT(create({startAt(10), stopAt(10.4)}), IsEmpty());
    EXPECT_THAT(create({startAt(10), stopAt(10.5)}), IsEmpty());
    EXPECT_THAT(playTimes({startAt(10), stopAt(10.6)}), ElementsAre("0.6"));
    EXPECT_THAT(create({startAt(10), stopAt(5)}, Value("player"), -5), IsEmpty());
    EXPECT_THAT(create({startAt(10), stopAt(5)}, Value("player"), -6), SizeIs(1));
}

TEST_F(SessionVolumeEvents, CountNothingOfWhatIsNoTime)
{
    EXPECT_THAT(create({startAt(nan), stopAt(10)}), IsEmpty());
    EXPECT_THAT(create({startAt(10), stopAt(nan)}), IsEmpty());
}

TEST_F(SessionVolumeEvents, NeedAnApplication)
{
    EXPECT_THAT(create({startAt(0), at(30, {{"PomoSessionVolume", 0.75}}), stopAt(100)}, std::nullopt), IsEmpty());
}

TEST_F(SessionVolumeEvents, NeedAVolume)
{
    EXPECT_THAT(create({at(0, {{"session_output_running", true}}), stopAt(10)}), IsEmpty());
    EXPECT_THAT(create({at(0, {{"session_output_running", true}}), stopAt(10), startAt(20), stopAt(30)}), SizeIs(1));
}

TEST_F(SessionVolumeEvents, AreNothingWhenNothingRan)
{
    EXPECT_THAT(create({}), IsEmpty());
    EXPECT_THAT(create({stopAt(1), at(2, {{"PomoSessionVolume", 0.5}}), at(30, {{"PomoSessionVolume", 0.6}}), {}}),
                IsEmpty());
}

TEST_F(SessionVolumeEvents, AreNothingWhileTheStretchGoesOn)
{
    EXPECT_THAT(create({startAt(0), at(100, {{"mChannelsPerFrame", 2}})}), IsEmpty());
}

TEST_F(SessionVolumeEvents, NeedTimes)
{
    EXPECT_THAT(create({{{"session_output_running", true}, {"PomoSessionVolume", 0.5}},
                        {{"PomoSessionVolume", 0.75}},
                        {{"session_output_running", false}}}),
                IsEmpty())
        << "without a time every message counts as time 0";
}

// --- what ends a stretch

TEST_F(SessionVolumeEvents, EndWithTheSession)
{
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"session_duration", 10}})}), ElementsAre("10"));
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"session_duration", Value()}})}), ElementsAre("10"))
        << "for any duration";
}

TEST_F(SessionVolumeEvents, EndWithTheSessionEvenWhenOutputIsSaidToRun)
{
    EXPECT_THAT(
        playTimes({startAt(0), at(10, {{"session_duration", 10}, {"session_output_running", true}}), stopAt(15)}),
        ElementsAre("10", "5"));
}

TEST_F(SessionVolumeEvents, CountFromZeroAfterTheEndOfASessionThatNeverStopped)
{
    // The end clears the begin of the stretch, but in the state output still runs.
    EXPECT_THAT(playTimes({startAt(100), at(110, {{"session_duration", 10}}), startAt(120), stopAt(130)}),
                ElementsAre("10", "130"));
    EXPECT_THAT(playTimes({startAt(100), at(110, {{"session_duration", 10}}), at(115, {{"session_duration", 15}})}),
                ElementsAre("10", "115"));
}

TEST_F(SessionVolumeEvents, EndWhenOneOfFiveThingsChanges)
{
    const std::vector<std::pair<const char*, std::pair<Value, Value>>> changes{
        {"session_selected_format", {"lpcm", "aac"}},
        {"active_devices", {"Speaker", "Headphones"}},
        {"ringerstate", {1, 2}},
        {"PomoSessionVolume", {0.5, 0.6}},
    };
    for (const auto& [key, values] : changes) {
        const Dictionary first{{key, values.first}};
        const Dictionary second{{key, values.second}};
        const auto from = at(0, first.mergedWith({{"session_output_running", true}}));
        const auto withVolume = Dictionary{{"PomoSessionVolume", 0.5}}.mergedWith(from);
        EXPECT_THAT(playTimes({withVolume, at(10, first), stopAt(30)}), ElementsAre("30")) << key << " stays";
        EXPECT_THAT(playTimes({withVolume, at(10, second), stopAt(30)}), ElementsAre("10", "20")) << key;
    }
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatializationEnabled", true}}), stopAt(30)}),
                ElementsAre("10", "20"));
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatializationEnabled", false}}), stopAt(30)}), ElementsAre("30"));
}

TEST_F(SessionVolumeEvents, DoNotEndWhenTheAccessorySettingOrTheChannelsChange)
{
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatial-audio-accessory-feature", true}}),
                           at(20, {{"mChannelsPerFrame", 6}, {"else", 1}}), stopAt(30)}),
                ElementsAre("30"));
    const auto events =
        create({startAt(0), at(10, {{"spatial-audio-accessory-feature", true}, {"mChannelsPerFrame", 6}}), stopAt(30)});
    EXPECT_THAT(values(events, "spatial-audio-accessory-feature"), ElementsAre("1")) << "but they are carried";
    EXPECT_THAT(values(events, "mChannelsPerFrame"), ElementsAre("6"));
}

TEST_F(SessionVolumeEvents, DoNotEndWhenTheVolumeIsFirstHeardOf)
{
    const auto events =
        create({at(0, {{"session_output_running", true}}), at(10, {{"PomoSessionVolume", 0.5}}), stopAt(30)});
    EXPECT_THAT(values(events, "play_seconds"), ElementsAre("30"));
    EXPECT_THAT(values(events, "PomoSessionVolume"), ElementsAre("0.5"));
}

TEST_F(SessionVolumeEvents, DoNotEndWhenOutputIsSaidToRunAgain)
{
    EXPECT_THAT(playTimes({startAt(0), startAt(10), stopAt(30)}), ElementsAre("30"));
}

TEST_F(SessionVolumeEvents, TakeNoNoticeOfChangesWhileNothingRuns)
{
    const auto events = create({at(0, {{"PomoSessionVolume", 0.1}}), at(5, {{"PomoSessionVolume", 0.2}}),
                                at(10, {{"session_output_running", true}, {"PomoSessionVolume", 0.3}}), stopAt(30),
                                at(40, {{"PomoSessionVolume", 0.9}})});
    EXPECT_THAT(values(events, "play_seconds"), ElementsAre("20"));
    EXPECT_THAT(values(events, "PomoSessionVolume"), ElementsAre("0.3"));
}

TEST_F(SessionVolumeEvents, EndOnceForSeveralChangesInOneMessage)
{
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"PomoSessionVolume", 1}, {"ringerstate", 1}, {"active_devices", "x"}}),
                           stopAt(30)}),
                ElementsAre("10", "20"));
}

TEST_F(SessionVolumeEvents, CountTheNextStretchFromTheChangeEvenWhenTheOneBeforeWasTooShort)
{
    EXPECT_THAT(playTimes({startAt(0), at(0.25, {{"PomoSessionVolume", 1}}), stopAt(30)}), ElementsAre("29.75"));
}

TEST_F(SessionVolumeEvents, TakeABurstOfSwitchesForOneMessage)
{
    // The feature goes on and off within the pause: nothing changed, and the burst's time is that of its last message.
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatializationEnabled", true}}),
                           at(11, {{"spatializationEnabled", false}}), stopAt(30)}),
                ElementsAre("30"));
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatial-audio-accessory-feature", true}}),
                           at(11.5, {{"spatializationEnabled", true}}), stopAt(30)}),
                ElementsAre("11.5", "18.5"));
    EXPECT_THAT(playTimes({startAt(0), at(10, {{"spatializationEnabled", true}}),
                           at(12.5, {{"spatializationEnabled", false}}), stopAt(30)}),
                ElementsAre("10", "2.5", "17.5"));
}

TEST_F(SessionVolumeEvents, SeeABurstBeforeWhatCameBetweenItsMessages)
{
    // The switch at 21 belongs to the burst that begins at 20, and takes effect there: output stops before the volume
    // changes.
    const auto events =
        create({startAt(0), at(20, {{"spatial-audio-accessory-feature", true}}), at(20.5, {{"PomoSessionVolume", 1}}),
                at(21, {{"spatializationEnabled", true}, {"session_output_running", false}})});
    EXPECT_THAT(values(events, "play_seconds"), ElementsAre("21"));
    EXPECT_THAT(values(events, "PomoSessionVolume"), ElementsAre("0.5"));
}

// --- values of the wrong type

TEST_F(SessionVolumeEvents, TakeNumbersAndTextsForTruthValues)
{
    const auto playTimesWith = [](const Value& on, const Value& off) {
        return playTimes({at(0, {{"session_output_running", on}, {"PomoSessionVolume", 0.5}}),
                          at(10, {{"session_output_running", off}})});
    };
    for (const Value& on : {Value(true), Value(1), Value(-1), Value(0.1), Value(std::uint64_t{1} << 63), Value("YES"),
                            Value("true"), Value(" 2"), Value(1.0F)})
        for (const Value& off : {Value(false), Value(0), Value(0.0), Value(-0.0F), Value("no"), Value("0"), Value(""),
                                 Value(), Value(foundation::Array{1}), Value(Dictionary{{"a", 1}}),
                                 Value(foundation::Data{"1"}), Value(foundation::Date{1})})
            EXPECT_THAT(playTimesWith(on, off), ElementsAre("10")) << on.text() << " and " << off.text();
    EXPECT_THAT(playTimesWith(Value(), false), IsEmpty());
    EXPECT_THAT(playTimesWith(true, 2), IsEmpty());
}

TEST_F(SessionVolumeEvents, CompareRingerAndSpatializationAsNumbers)
{
    const auto ends = [](const Value& before, const Value& after) {
        return create({startAt(0), at(1, {{"ringerstate", before}}), at(10, {{"ringerstate", after}}), stopAt(30)})
                   .back()
                   .find("play_seconds")
                   ->text()
            == "20";
    };
    for (const Value& one : {Value(true), Value(1), Value(1.0), Value(1.0F), Value("1"), Value(" +1.0 on")})
        for (const Value& alsoOne : {Value(true), Value(1), Value(1.0), Value(1.0F), Value("1"), Value(" +1.0 on")})
            EXPECT_FALSE(ends(one, alsoOne)) << one.text() << " and " << alsoOne.text();
    for (const Value& zero : {Value(false), Value(0), Value("x"), Value(), Value(foundation::Array{1})}) {
        EXPECT_FALSE(ends(zero, 0)) << zero.text();
        EXPECT_TRUE(ends(zero, 1)) << zero.text();
    }
    EXPECT_TRUE(ends((std::int64_t{1} << 53) + 1, std::int64_t{1} << 53));
    EXPECT_TRUE(ends(nan, nan)) << "which equals nothing";
}

TEST_F(SessionVolumeEvents, CompareFormatsAndDevicesAsTexts)
{
    const auto ends = [](const Value& before, const Value& after) {
        return create(
                   {startAt(0), at(1, {{"active_devices", before}}), at(10, {{"active_devices", after}}), stopAt(30)})
                   .back()
                   .find("play_seconds")
                   ->text()
            == "20";
    };
    EXPECT_FALSE(ends("1", 1));
    EXPECT_FALSE(ends(1, 1.0));
    EXPECT_FALSE(ends(true, 1));
    EXPECT_FALSE(ends(nan, nan)) << "the text is the same";
    EXPECT_TRUE(ends("a", "A"));
    EXPECT_TRUE(ends("", Value()));
    EXPECT_FALSE(ends(foundation::Array{1, 2}, "[1,2]"));
}

TEST_F(SessionVolumeEvents, CompareVolumesAsObjects)
{
    const auto ends = [](const Value& before, const Value& after) {
        return create({startAt(0, before), at(10, {{"PomoSessionVolume", after}}), stopAt(30)}).size() == 2;
    };
    EXPECT_FALSE(ends(1, true));
    EXPECT_FALSE(ends(0.5, 0.5F));
    EXPECT_TRUE(ends(0.3, 0.3F));
    EXPECT_TRUE(ends(0.5, "0.5"));
    EXPECT_TRUE(ends(nan, nan));
    EXPECT_FALSE(ends(Value(), Value()));
}

TEST_F(SessionVolumeEvents, ReadTimesThatAreTexts)
{
    EXPECT_THAT(playTimes({startAt("10.5 s"), stopAt(" +20.5")}), ElementsAre("10"));
    EXPECT_THAT(playTimes({startAt("soon"), stopAt("20.5")}), ElementsAre("20.5"));
    EXPECT_THAT(playTimes({startAt(foundation::Date{5}), stopAt(true)}), ElementsAre("1"));
}

TEST_F(SessionVolumeEvents, CarryValuesOfTheWrongTypeAsTheyAre)
{
    const Dictionary odd{{"session_selected_format", foundation::Array{1, "a"}},
                         {"active_devices", Value()},
                         {"spatial-audio-accessory-feature", "yes"},
                         {"ringerstate", Dictionary{{"a", 1}}},
                         {"mChannelsPerFrame", 2.5},
                         {"session_output_running", true},
                         {"PomoSessionVolume", "0.5"}};
    const auto events = create({at(0, odd), stopAt(1)});
    ASSERT_THAT(events, SizeIs(1));
    for (const auto& [key, value] : odd.without("session_output_running"))
        EXPECT_EQ(*events[0].find(key), value) << key.view();
}

// --- log lines

TEST_F(SessionVolumeEvents, SayInTheLogWhatTheyAddAndSkip)
{
    create({startAt(0), at(0.25, {{"PomoSessionVolume", 0.6}}), at(10, {{"PomoSessionVolume", 0.7}}), stopAt(20),
            startAt(30), stopAt(30.5)});
    const auto line = [](const std::string& message) { return IsLine(Debug, "keri", message); };
    const std::string function = "+[KestoReportingSession createVolumeMessages:process:minimumPlaytime:]";
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(line("entering createVolumeMessages " + function),
                            line("skipped volume message, too short { func=" + function + ", action=skip, count=0 }"),
                            line("added volume message { func=" + function + ", action=add, count=1 }"),
                            line("added volume message { func=" + function + ", action=add, count=2 }"),
                            line("skipped volume message, too short { func=" + function + ", action=skip, count=2 }"),
                            line("returning volume message { func=" + function + ", action=return, count=2 }")));
    for (const auto& each : platform.log.lines()) {
        EXPECT_EQ(each.subsystem, "com.quarn.kesto");
        EXPECT_EQ(each.name, "KestoReportingSession");
        EXPECT_EQ(each.file, "KestoReportingSessionVolume.cpp");
    }
}

TEST_F(SessionVolumeEvents, SaySkippedInTheSameWordsForWantOfApplicationOrVolume)
{
    const std::string function = "+[KestoReportingSession createVolumeMessages:process:minimumPlaytime:]";
    const auto lines = ElementsAre(
        IsLine(Debug, "keri", "entering createVolumeMessages " + function),
        IsLine(Debug, "keri", "skipped volume message, too short { func=" + function + ", action=skip, count=0 }"),
        IsLine(Debug, "keri", "returning volume message { func=" + function + ", action=return, count=0 }"));
    create({startAt(0), stopAt(10)}, std::nullopt);
    EXPECT_THAT(platform.log.take(), lines);
    create({at(0, {{"session_output_running", true}}), stopAt(10)});
    EXPECT_THAT(platform.log.take(), lines);
}

TEST_F(SessionVolumeEvents, SayThatTheyReturnNothing)
{
    create({});
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(testing::_,
                            IsLine(Debug, "keri",
                                   "returning volume message { func=+[KestoReportingSession "
                                   "createVolumeMessages:process:minimumPlaytime:], action=return, count=0 }")));
}

// --- against the definition

RC_GTEST_PROP(VolumeMessagesOfAnyStore, AreWhatTheirDefinitionMakesOfIt, ())
{
    support::TestPlatform platform;
    const auto process = *rc::gen::weightedElement<std::optional<Value>>({{8, Value("player")}, {1, std::nullopt}});
    const auto minimum = *rc::gen::element(0.5, 0.5, 0.0, -10.0);
    for (const Messages& payloads : *generated::manyPayloads(30)) {
        const auto store = storeOf(payloads);
        platform.log.clear();
        session::StorageShare share(session::StorageBudget::service());
        const Messages events = KestoReportingSession::createVolumeMessages(*store, process, minimum, share);
        const auto expected = naive::createVolumeMessages(messagesOf(*store), process, minimum);
        RC_ASSERT(textsOf(events) == textsOf(expected.events));
        std::vector<std::string> said;
        for (const auto& line : platform.log.lines())
            said.push_back(line.message);
        RC_ASSERT(said == expected.logLines);
    }
}

TEST_F(SessionVolumeEvents, ComeFromHundredsOfThousandsOfMessagesInOrder)
{
    Messages payloads;
    for (int second = 0; second < 200'000; ++second)
        payloads.push_back(at(second, {{"session_output_running", second % 100 < 50}, {"PomoSessionVolume", 0.5}}));
    const auto events = create(payloads);
    ASSERT_THAT(events, SizeIs(2000));
    EXPECT_EQ(*events.back().find("msgidx"), Value(2000));
    EXPECT_EQ(*events.front().find("msgcnt"), Value(2000));
    EXPECT_EQ(*events.back().find("play_seconds"), Value(50));
}

TEST_F(SessionVolumeEvents, ComeFromABurstOfHundredsOfThousandsOfMessages)
{
    Messages payloads{startAt(0)};
    for (int message = 0; message < 200'000; ++message)
        payloads.push_back(at(1 + message * 0.001, {{"spatializationEnabled", message % 2 == 0}}));
    payloads.push_back(stopAt(1000));
    EXPECT_THAT(playTimes(payloads), ElementsAre("1000"));
}

// --- the cost

TEST_F(SessionVolumeEvents, ShareWhatAClientSaidOnce)
{
    const std::string large(std::size_t{1} << 20, 'x');
    Messages payloads{startAt(0).mergedWith({{"active_devices", large}})};
    for (int change = 1; change <= 20; ++change)
        payloads.push_back(at(change, {{"PomoSessionVolume", change % 2}, {"ringerstate", 1}}));
    const Messages events = create(payloads);
    ASSERT_THAT(events, SizeIs(20));
    const auto first = events[0].find("active_devices")->string();
    EXPECT_EQ(*first, large);
    for (const Dictionary& event : events)
        EXPECT_TRUE(event.find("active_devices")->string()->isSameObject(*first));
    EXPECT_EQ(values(events, "ringerstate").front(), "0");
    EXPECT_EQ(values(events, "ringerstate").back(), "1");
}

// Each event would be written to the store, and twice to the disk.
TEST_F(SessionVolumeEvents, AreLostWhenTogetherTheyWouldTakeFarTooMuch)
{
    constexpr std::size_t size = std::size_t{1} << 20;
    constexpr int changes = 100;
    Messages payloads{startAt(0).mergedWith({{"active_devices", std::string(size, 'x')}})};
    for (int change = 1; change <= changes; ++change)
        payloads.push_back(at(change, {{"PomoSessionVolume", change % 2}}));
    payloads.push_back(at(changes + 1, {{"active_devices", "small"}}));
    payloads.push_back(stopAt(changes + 2));
    const Messages events = create(payloads);
    const std::size_t fit = KestoReportingSession::mostVolumeEventBytes / size - 1;
    ASSERT_THAT(events, SizeIs(fit + 1)) << "a small event still has room";
    EXPECT_EQ(*events.back().find("active_devices"), Value("small"));
    EXPECT_EQ(values(events, "msgidx").back(), std::to_string(fit + 1));
    EXPECT_EQ(values(events, "msgcnt").front(), std::to_string(fit + 1));
    EXPECT_THAT(platform.log.lines("keri"),
                testing::Contains(IsLine(Error, "keri",
                                         std::to_string(changes + 1 - fit)
                                             + " volume events are lost: with them all would take more than 67108864 "
                                               "bytes"))
                    .Times(1));
}

// One half of a volume each second, and the other half in the next.
std::unique_ptr<session::MessageStore> storeOfVolumeChanges(int changes)
{
    Messages payloads{startAt(0)};
    for (int change = 1; change <= changes; ++change)
        payloads.push_back(at(change, {{"PomoSessionVolume", change % 2}}));
    return storeOf(payloads);
}

// Makes the events, and checks that the paid bytes are those that they take, or at most a fifth more.
void expectToPayForWhatTheyTake(const session::MessageStore& store, std::size_t count)
{
    session::StorageShare share(session::StorageBudget::service());
    const auto before = allocatedBytes();
    forgetMostAllocatedBytes();
    const auto events = KestoReportingSession::createVolumeMessages(store, Value("player"), 0.5, share);
    const auto taken = static_cast<double>(mostAllocatedBytes() - before);
    const auto paid = static_cast<double>(share.bytes() + KestoReportingSession::unpaidVolumeEventBytes);
    EXPECT_GE(paid / taken, 1.0);
    EXPECT_LE(paid / taken, 1.2);
    EXPECT_EQ(events.size(), count);
}

TEST_F(SessionVolumeEvents, ArePaidForWithWhatTheyTake)
{
    KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
    platform.log.setThreshold(Error);
    expectToPayForWhatTheyTake(*storeOfVolumeChanges(200'000), 200'000);
}

TEST_F(SessionVolumeEvents, ArePaidForWithWhatTheyTakeWhenEachHasATextOfItsOwn)
{
    KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
    platform.log.setThreshold(Error);
    Messages payloads{startAt(0)};
    for (int change = 1; change <= 50'000; ++change)
        payloads.push_back(at(change,
                              {{"active_devices", "Headphones " + std::to_string(change)},
                               {"session_selected_format", "lpcm, " + std::to_string(change) + " Hz"}}));
    expectToPayForWhatTheyTake(*storeOf(payloads), 50'000);
}

TEST_F(SessionVolumeEvents, StayWithinTheirBound)
{
    KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
    platform.log.setThreshold(Error);
    const auto store = storeOfVolumeChanges(300'000);
    session::StorageShare share(session::StorageBudget::service());
    const auto before = allocatedBytes();
    forgetMostAllocatedBytes();
    const auto events = KestoReportingSession::createVolumeMessages(*store, Value("player"), 0.5, share);
    EXPECT_LE(mostAllocatedBytes() - before, std::ptrdiff_t{64} << 20);
    EXPECT_GT(events.size(), 200'000U);
    EXPECT_LT(events.size(), 300'000U);
}

TEST_F(SessionVolumeEvents, ShareTheirKeys)
{
    const auto events = create({startAt(0), at(30, {{"PomoSessionVolume", 0.75}}), stopAt(100)});
    ASSERT_THAT(events, SizeIs(2));
    EXPECT_EQ(events[0].shape().get(), events[1].shape().get());
    const auto later = create({startAt(0), stopAt(100)});
    EXPECT_EQ(later.at(0).shape().get(), events[0].shape().get());
}

TEST_F(SessionVolumeEvents, ArePaidForAsLongAsTheShareIsThere)
{
    const auto budget = std::make_shared<session::StorageBudget>(std::size_t{1} << 30);
    const auto store = storeOfVolumeChanges(10'000);
    {
        session::StorageShare share(budget);
        const auto events = KestoReportingSession::createVolumeMessages(*store, Value("player"), 0.5, share);
        EXPECT_THAT(events, SizeIs(10'000));
        EXPECT_GE(budget->taken(), events.size() * 256);
    }
    EXPECT_EQ(budget->taken(), 0U);
}

TEST_F(SessionVolumeEvents, AreLostWhenTheBudgetHasNoRoomForThem)
{
    const auto budget = std::make_shared<session::StorageBudget>(std::size_t{1} << 20);
    const auto store = storeOfVolumeChanges(10'000);
    session::StorageShare share(budget);
    const auto events = KestoReportingSession::createVolumeMessages(*store, Value("player"), 0.5, share);
    EXPECT_LE(budget->taken(), std::size_t{1} << 20);
    ASSERT_GT(events.size(), 1000U);
    ASSERT_LT(events.size(), 4000U);
    EXPECT_EQ(*events.front().find("msgcnt"), Value(events.size()));
    EXPECT_THAT(
        platform.log.lines("keri"),
        testing::Contains(IsLine(Error, "keri",
                                 std::to_string(10'000 - events.size()) + " volume events are lost for lack of memory"))
            .Times(1));
}

// Only one session ends at a time, so a few events take memory from no other client.
TEST_F(SessionVolumeEvents, AreThereInSmallNumbersEvenWhenTheBudgetIsUsedUp)
{
    session::StorageShare share(std::make_shared<session::StorageBudget>(0));
    const auto store = storeOfVolumeChanges(50);
    EXPECT_THAT(KestoReportingSession::createVolumeMessages(*store, Value("player"), 0.5, share), SizeIs(50));
    EXPECT_EQ(share.bytes(), 0U);
}

// 64 KiB are free. Beside its process's name the event takes 296 bytes, and the word "unknown" twice, with 48 bytes for
// each as an object.
TEST_F(SessionVolumeEvents, TakeExactlyTheirUnpaidBytesWhenTheBudgetIsUsedUpAndNotOneMore)
{
    constexpr std::size_t longestProcess = 65'536 - 296 - 2 * (48 + 7);
    const auto store = storeOfVolumeChanges(1);
    const auto eventsOf = [&](std::size_t process) {
        session::StorageShare share(std::make_shared<session::StorageBudget>(0));
        return KestoReportingSession::createVolumeMessages(*store, Value(std::string(process, 'x')), 0.5, share);
    };
    EXPECT_THAT(eventsOf(longestProcess), SizeIs(1));
    EXPECT_THAT(eventsOf(longestProcess + 1), IsEmpty());
}

} // namespace
