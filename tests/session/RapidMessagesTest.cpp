// SPDX-License-Identifier: Apache-2.0
// Bursts: which payloads are folded together, the place of the folded payload, and its content.
#include "session/GeneratedMessages.h"
#include "session/KestoReportingSession.h"
#include "session/NaiveAggregation.h"

#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace {

using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::array<std::string_view, 2> switches{"spatial-audio-accessory-feature", "spatializationEnabled"};

Messages combine(const Messages& payloads, std::span<const std::string_view> keys = switches, double maximumPause = 2.0)
{
    return KestoReportingSession::combineRapidMessages(*storeOf(payloads), keys, maximumPause);
}

// A payload that can be combined, and another that cannot.
Dictionary flip(const Value& time, const Value& enabled = true)
{
    return {{"spatializationEnabled", enabled}, {"kestoreporting_timestamp", time}};
}
Dictionary flipWithoutTime()
{
    return {{"spatializationEnabled", "untimed"}};
}
Dictionary plain(double time)
{
    return {{"ringerstate", 1}, {"kestoreporting_timestamp", time}};
}

TEST(RapidMessages, AreNothingWhereThereIsNothing)
{
    EXPECT_THAT(combine({}), IsEmpty());
}

TEST(RapidMessages, LeavePlainPayloadsAsTheyAre)
{
    EXPECT_THAT(combine({plain(0), plain(0), plain(100), {}}),
                ElementsAre(plain(0), plain(0), plain(100), Dictionary{}));
}

TEST(RapidMessages, BecomeOneWhenEachComesWithinThePauseOfTheOneBefore)
{
    EXPECT_THAT(combine({flip(0), flip(1), flip(2.5)}), ElementsAre(flip(2.5)));
    EXPECT_THAT(combine({flip(0), flip(3)}), ElementsAre(flip(0), flip(3)));
}

TEST(RapidMessages, FormOneBurstHoweverLongTheChain)
{
    Messages chain;
    for (int time = 0; time <= 200; time += 2)
        chain.push_back(flip(time));
    EXPECT_THAT(combine(chain), ElementsAre(flip(200)));
}

TEST(RapidMessages, JoinWhenThePauseIsExactlyTheLongest)
{
    EXPECT_THAT(combine({flip(0), flip(2.0)}), ElementsAre(flip(2.0)));
    EXPECT_THAT(combine({flip(0), flip(2.0000001)}), ElementsAre(flip(0), flip(2.0000001)));
    EXPECT_THAT(combine({flip(0), flip(0.25)}, switches, 0.25), ElementsAre(flip(0.25)));
    EXPECT_THAT(combine({flip(0), flip(0)}, switches, -1), ElementsAre(flip(0), flip(0)));
}

TEST(RapidMessages, StandWhereTheFirstOfThemStood)
{
    const Dictionary a{{"spatializationEnabled", 1}, {"a", 1}, {"kestoreporting_timestamp", 0}};
    const Dictionary b = plain(1);
    const Dictionary c{{"spatializationEnabled", 0}, {"c", 3}, {"kestoreporting_timestamp", 1.5}};
    EXPECT_THAT(combine({a, b, c}), ElementsAre(a.mergedWith(c), b));
}

TEST(RapidMessages, AreNotPartedByPlainPayloadsBetweenThem)
{
    EXPECT_THAT(combine({flip(0), plain(100), flip(2), plain(-5), flip(4)}),
                ElementsAre(flip(4), plain(100), plain(-5)));
}

TEST(RapidMessages, KeepTheLastValueOfEachKey)
{
    EXPECT_THAT(combine({flip(0, 1), flip(0.5, 0)}), ElementsAre(flip(0.5, 0)));
    EXPECT_THAT(combine({{{"spatializationEnabled", 1}, {"session_output_running", true}, {"PomoSessionVolume", 0.5}},
                         {{"spatial-audio-accessory-feature", 1}, {"PomoSessionVolume", 0.75}}}),
                ElementsAre(Dictionary{{"spatializationEnabled", 1},
                                       {"session_output_running", true},
                                       {"PomoSessionVolume", 0.75},
                                       {"spatial-audio-accessory-feature", 1}}));
}

TEST(RapidMessages, KeepTheTimeOfTheLastThatHasOne)
{
    EXPECT_THAT(combine({flip(1), flipWithoutTime()}),
                ElementsAre(Dictionary{{"spatializationEnabled", "untimed"}, {"kestoreporting_timestamp", 1}}));
}

TEST(RapidMessages, JoinWhateverTheirTimeAfterOneWithoutATime)
{
    EXPECT_THAT(combine({flip(1), flipWithoutTime(), flip(1000)}), ElementsAre(flip(1000)));
}

TEST(RapidMessages, CountAsTimeZeroWithoutATime)
{
    EXPECT_THAT(combine({flip(1000), flipWithoutTime()}),
                ElementsAre(Dictionary{{"spatializationEnabled", "untimed"}, {"kestoreporting_timestamp", 1000}}));
    EXPECT_THAT(combine({flip(-10), flipWithoutTime()}), ElementsAre(flip(-10), flipWithoutTime()))
        << "after a time long before zero that is a pause";
}

TEST(RapidMessages, JoinHoweverManyPayloadsStandBetweenThem)
{
    for (const int between : {1, 254, 255, 256, 257, 600}) {
        Messages payloads;
        Messages combined;
        for (int burst = 0; burst < 3; ++burst) {
            payloads.push_back(flip(10 * burst));
            combined.push_back(flip(10 * burst + 1, false));
            for (int number = 0; number < between; ++number) {
                payloads.push_back(plain(number));
                combined.push_back(plain(number));
            }
            payloads.push_back(flip(10 * burst + 1, false));
            payloads.push_back(plain(-1));
            combined.push_back(plain(-1));
        }
        EXPECT_EQ(combine(payloads), combined) << between;
    }
}

TEST(RapidMessages, JoinWhenTimeFalls)
{
    EXPECT_THAT(combine({flip(100), flip(1), flip(3)}), ElementsAre(flip(3)));
    EXPECT_THAT(combine({flip(100), flip(1), flip(3.1)}), ElementsAre(flip(1), flip(3.1)));
}

TEST(RapidMessages, ReadTimesThatAreNoNumbers)
{
    EXPECT_THAT(combine({flip(1), flip("4 s")}), ElementsAre(flip(1), flip("4 s")));
    EXPECT_THAT(combine({flip(1), flip("soon")}), ElementsAre(flip("soon"))) << "that is 0";
    EXPECT_THAT(combine({flip(1), flip(Value()), flip(2.5)}), ElementsAre(flip(Value()), flip(2.5)))
        << "null is a time, and 0";
    EXPECT_EQ(combine({flip(1), flip(std::numeric_limits<double>::quiet_NaN()), flip(1000)}).size(), 1U);
}

TEST(RapidMessages, AreThoseWithAnyOfTheKeysWhateverItsValue)
{
    EXPECT_THAT(combine({{{"a", Value()}}, {{"b", 1}}, {{"c", 1}}}, std::array<std::string_view, 2>{"a", "b"}),
                ElementsAre(Dictionary{{"a", Value()}, {"b", 1}}, Dictionary{{"c", 1}}));
    EXPECT_THAT(combine({flip(0), flip(1)}, {}), ElementsAre(flip(0), flip(1))) << "no keys, no bursts";
}

RC_GTEST_PROP(RapidMessages, AreWhatTheirDefinitionMakesOfThem, ())
{
    const auto pause = *rc::gen::element(2.0, 0.5, 0.0, -1.0, 1e6);
    for (const Messages& payloads : *generated::manyPayloads(30)) {
        const auto store = storeOf(payloads);
        const Messages combined = KestoReportingSession::combineRapidMessages(*store, switches, pause);
        const Messages expected = naive::combineRapidMessages(
            messagesOf(*store), {"spatial-audio-accessory-feature", "spatializationEnabled"}, pause);
        RC_ASSERT(textsOf(combined) == textsOf(expected));
    }
}

} // namespace
