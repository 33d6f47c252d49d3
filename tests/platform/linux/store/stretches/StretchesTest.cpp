// SPDX-License-Identifier: Apache-2.0
// Messages in, stretches out: where a stretch begins, where it is cut and where it ends, and how long it was.
#include "platform/linux/store/stretches/Stretches.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace platform {
namespace {

using foundation::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr double began = 1'800'000'000;
constexpr Origin player{.source = 1, .session = 7};
constexpr SessionOwner ofPlayer{.user = 1000, .process = 4711, .reporterID = 5};

// One line for each stretch: what is to be compared.
std::string text(const Stretch& stretch)
{
    const PlayingState& state = stretch.state;
    return std::string(stretch.isRecording ? "recorded" : "played") + " from " + std::to_string(stretch.began - began)
        + " for " + std::to_string(stretch.seconds) + " on " + state.devices.value_or("?") + " in "
        + state.format.value_or("?") + "/" + (state.channels ? std::to_string(*state.channels) : "?") + " at "
        + (state.volume ? std::to_string(*state.volume) : "?") + ": " + std::string(name(stretch.ending));
}

class StretchesTest : public testing::Test {
protected:
    // A message that arrives so many seconds after the beginning, and says so unless `happened` is empty.
    void add(double time, std::string_view kind, Dictionary payload, bool saysWhen = true, Origin origin = player)
    {
        if (saysWhen)
            payload = payload.with("kestoreporting_timestamp", began + time);
        batch.add(began + time, origin, "com.quarn.kesto." + std::string(kind), payload);
    }
    void takeBatch(StretchEnding vanished = StretchEnding::Vanished)
    {
        const auto ownerOf = [this](std::uint64_t session) {
            const auto owner = owners.find(session);
            return owner == owners.end() ? std::nullopt : std::optional(owner->second);
        };
        stretches.take(batch.rows(), batch.announcements(), ownerOf, vanished);
        for (const OriginEnd& end : batch.announcements().sessionEnds)
            owners.erase(end.number);
        batch.clear();
    }
    std::vector<std::string> ended()
    {
        takeBatch();
        std::vector<std::string> texts;
        for (const Stretch& stretch : stretches.ended())
            texts.push_back(text(stretch));
        return texts;
    }

    std::map<std::uint64_t, SessionOwner> owners = {{7, ofPlayer}}; // of the sessions that live
    EventBatch batch;
    Stretches stretches;
};

// --- Where they begin and end

TEST_F(StretchesTest, OnePlaysFromTheMessageThatSaysSoToTheMessageThatSaysNot)
{
    add(0, "Playback.Start",
        {{"session_output_running", true},
         {"active_devices", "speaker"},
         {"session_selected_format", "S16LE/44100/2"},
         {"mChannelsPerFrame", 2},
         {"PomoSessionVolume", 0.5}});
    EXPECT_THAT(ended(), IsEmpty());
    add(10, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 10.000000 on speaker in S16LE/44100/2/2 at 0.500000: stopped"));
}

struct End {
    std::string name;
    std::string kind;
    Dictionary payload;
    bool ends;
};

class StretchesEndTest : public StretchesTest, public testing::WithParamInterface<End> { };

INSTANTIATE_TEST_SUITE_P(
    Of, StretchesEndTest,
    testing::Values(
        End{"OutputThatDoesNotRun", "Generic.State", {{"session_output_running", false}}, true},
        End{"TheStopOfPlayback", "Playback.Stop", {}, true}, End{"ItsDeactivation", "Playback.Deactivate", {}, true},
        End{"TheDurationOfTheSession", "Generic.State", {{"session_duration", 4}}, true},
        End{"OutputThatRunsOnAtAStop", "Playback.Stop", {{"session_output_running", true}}, false},
        End{"OutputThatRunsOnBesideADuration",
            "Playback.State",
            {{"session_output_running", true}, {"session_duration", 4}},
            false},
        End{"TheStopOfARecord", "Record.Stop", {}, false}, End{"TheStopOfAnother", "DSP_Playback.Stop", {}, false},
        End{"InputThatDoesNotRun", "Playback.Stop", {{"session_input_running", false}}, false},
        End{"AVolumeSummary", "Volume.Summary", {{"session_duration", 4}, {"PomoSessionVolume", 0.1}}, false},
        End{"StatisticsOfDrivers", "Cavlet.Simple", {{"session_output_running", false}}, false}),
    [](const auto& input) { return input.param.name; });

TEST_P(StretchesEndTest, EndsItOrNot)
{
    add(0, "Playback.Start", {{"session_output_running", true}});
    add(10, GetParam().kind, GetParam().payload);
    EXPECT_EQ(ended().size(), GetParam().ends ? 1U : 0U);
    add(20, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(),
                ElementsAre(std::string("played from 0.000000 for ") + (GetParam().ends ? "10.000000" : "20.000000")
                            + " on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, OneBeginsWithAStartOfPlaybackOrRecordWithoutTheKeys)
{
    add(0, "Playback.Start", {});
    add(1, "Record.Start", {});
    add(2, "Input.Start", {});
    add(5, "Playback.Stop", {});
    add(7, "Record.Deactivate", {});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 5.000000 on ? in ?/? at ?: stopped",
                            "recorded from 1.000000 for 6.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, AStartThatSaysThatNothingRunsBeginsNone)
{
    add(0, "Playback.Start", {{"session_output_running", false}});
    add(1, "Playback.Start", {{"session_input_running", false}});
    add(10, "Playback.Stop", {});
    EXPECT_THAT(ended(), IsEmpty());
}

TEST_F(StretchesTest, AServiceTypesNameOfAMessageSaysTheSame)
{
    batch.add(began, player, "com.quarn.longformaudio.Playback.Start", {});
    batch.add(began + 3, player, "com.quarn.longformaudio.Playback.Stop", {});
    EXPECT_THAT(ended(), ElementsAre("played from 0.000000 for 3.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, OutputAndInputRunSideBySide)
{
    add(0, "PlaybackAndRecord.Start", {{"session_output_running", true}, {"session_input_running", true}});
    add(4, "Playback.Stop", {{"session_output_running", false}});
    add(6, "Record.Stop", {{"session_input_running", false}});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 4.000000 on ? in ?/? at ?: stopped",
                            "recorded from 0.000000 for 6.000000 on ? in ?/? at ?: stopped"));
}

// --- Where they are cut

TEST_F(StretchesTest, EveryChangeOfTheWayCutsOneAndARepetitionDoesNot)
{
    const Dictionary start{{"session_output_running", true},
                           {"active_devices", "speaker"},
                           {"session_selected_format", "F32/48000/2"},
                           {"mChannelsPerFrame", 2},
                           {"PomoSessionVolume", 1}};
    add(0, "Playback.Start", start);
    add(1, "Playback.Start", start);
    add(2, "Volume.State", {{"PomoSessionVolume", 0.5}});
    add(3, "Volume.State", {{"PomoSessionVolume", 0.5}});
    add(5, "RouteChange.State", {{"active_devices", "headset"}});
    add(9, "Setup.State", {{"session_selected_format", "F32/48000/1"}, {"mChannelsPerFrame", 1}});
    add(17, "Setup.State", {{"mChannelsPerFrame", 4}});
    add(33, "Playback.Stop", {{"session_output_running", false}, {"active_devices", "none"}});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 2.000000 on speaker in F32/48000/2/2 at 1.000000: change",
                            "played from 2.000000 for 3.000000 on speaker in F32/48000/2/2 at 0.500000: change",
                            "played from 5.000000 for 4.000000 on headset in F32/48000/2/2 at 0.500000: change",
                            "played from 9.000000 for 8.000000 on headset in F32/48000/1/1 at 0.500000: change",
                            "played from 17.000000 for 16.000000 on headset in F32/48000/1/4 at 0.500000: "
                            "stopped"));
}

TEST_F(StretchesTest, AChangeCutsOutputAndInput)
{
    add(0, "IO.Start", {{"session_output_running", true}, {"session_input_running", true}});
    add(1, "RouteChange.State", {{"active_devices", "headset"}});
    add(3, "IO.Stop", {{"session_output_running", false}, {"session_input_running", false}});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 1.000000 on ? in ?/? at ?: change",
                            "recorded from 0.000000 for 1.000000 on ? in ?/? at ?: change",
                            "played from 1.000000 for 2.000000 on headset in ?/? at ?: stopped",
                            "recorded from 1.000000 for 2.000000 on headset in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, WhatChangedInAPauseCountsForTheNextOne)
{
    add(0, "Volume.State", {{"PomoSessionVolume", 0.25}, {"active_devices", "speaker"}});
    add(1, "Playback.Start", {{"session_output_running", true}});
    add(2, "Playback.Stop", {{"session_output_running", false}});
    add(3, "Volume.State", {{"PomoSessionVolume", 0.75}});
    add(4, "Playback.Start", {{"session_output_running", true}});
    add(6, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(),
                ElementsAre("played from 1.000000 for 1.000000 on speaker in ?/? at 0.250000: stopped",
                            "played from 4.000000 for 2.000000 on speaker in ?/? at 0.750000: stopped"));
}

TEST_F(StretchesTest, AFirstVolumeCountsFromTheBeginning)
{
    add(0, "Playback.Start", {{"session_output_running", true}});
    add(5, "Volume.State", {{"PomoSessionVolume", 0.5}});
    add(9, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(), ElementsAre("played from 0.000000 for 9.000000 on ? in ?/? at 0.500000: stopped"));
}

TEST_F(StretchesTest, ValuesOfAnotherTypeSayNothing)
{
    add(0, "Playback.Start",
        {{"session_output_running", true}, {"active_devices", "speaker"}, {"PomoSessionVolume", 0.5}});
    add(5, "Generic.State",
        {{"active_devices", 7},
         {"PomoSessionVolume", "loud"},
         {"mChannelsPerFrame", true},
         {"session_selected_format", 1}});
    add(6, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(), ElementsAre("played from 0.000000 for 6.000000 on speaker in ?/? at 0.500000: stopped"));
}

TEST_F(StretchesTest, LongTextsAreCutBetweenCharacters)
{
    add(0, "Playback.Start",
        {{"session_output_running", true},
         {"active_devices", std::string(255, 'd') + "\u00e4"},
         {"session_selected_format", std::string(100, 'f')}});
    add(1, "Playback.Stop", {{"session_output_running", false}});
    takeBatch();
    ASSERT_EQ(stretches.ended().size(), 1U);
    EXPECT_EQ(stretches.ended()[0].state.devices, std::string(255, 'd'));
    EXPECT_EQ(stretches.ended()[0].state.format, std::string(64, 'f'));
}

// --- Time

TEST_F(StretchesTest, WithoutStampsTheTimeOfArrivalCounts)
{
    add(0, "Playback.Start", {}, false);
    add(4, "Playback.Stop", {}, false);
    EXPECT_THAT(ended(), ElementsAre("played from 0.000000 for 4.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, AStampOnOneSideOnlyLeavesTheLengthToTheTimesOfArrival)
{
    batch.add(began + 1, player, "com.quarn.kesto.Playback.Start",
              {{"kestoreporting_timestamp", 5.0}}); // of its uptime
    batch.add(began + 4, player, "com.quarn.kesto.Playback.Stop", {});
    takeBatch();
    ASSERT_EQ(stretches.ended().size(), 1U);
    EXPECT_EQ(stretches.ended()[0].seconds, 3.0);
    EXPECT_EQ(stretches.ended()[0].began, began + 1);
}

TEST_F(StretchesTest, StampsOfAnotherClockCountAmongEachOther)
{
    stretches.setEarlierEnd(began - 100);
    batch.add(began, player, "com.quarn.kesto.Playback.Start", {{"kestoreporting_timestamp", 5.0}});
    batch.add(began, player, "com.quarn.kesto.Playback.Stop", {{"kestoreporting_timestamp", 7.5}});
    takeBatch();
    ASSERT_EQ(stretches.ended().size(), 1U);
    EXPECT_EQ(stretches.ended()[0].seconds, 2.5);
}

TEST_F(StretchesTest, TimeThatStandsStillOrRunsBackwardsIsLeftOut)
{
    add(10, "Playback.Start", {{"session_output_running", true}, {"PomoSessionVolume", 1}});
    add(5, "Volume.State", {{"PomoSessionVolume", 0.5}});
    add(5, "Volume.State", {{"PomoSessionVolume", 0.4}});
    add(8, "Playback.Stop", {{"session_output_running", false}});
    EXPECT_THAT(ended(), ElementsAre("played from 5.000000 for 3.000000 on ? in ?/? at 0.400000: stopped"));
    EXPECT_EQ(stretches.takeLeftOut(), 2U);
    EXPECT_EQ(stretches.takeLeftOut(), 0U);
}

TEST_F(StretchesTest, ALengthThatNoNumberCanHoldIsLeftOut)
{
    batch.add(began, player, "com.quarn.kesto.Playback.Start", {{"kestoreporting_timestamp", -1.7e308}});
    batch.add(began, player, "com.quarn.kesto.Playback.Stop", {{"kestoreporting_timestamp", 1.7e308}});
    EXPECT_THAT(ended(), IsEmpty());
    EXPECT_EQ(stretches.takeLeftOut(), 1U);
}

TEST_F(StretchesTest, WhatAnEarlierRunOfTheServiceCountedIsNotCountedAgain)
{
    stretches.setEarlierEnd(began + 100);
    batch.add(began + 130, player, "com.quarn.kesto.Playback.Start", {{"kestoreporting_timestamp", began + 20}});
    add(150, "Playback.Stop", {});
    EXPECT_THAT(ended(), ElementsAre("played from 100.000000 for 50.000000 on ? in ?/? at ?: stopped"));
}

// --- A session that is made anew

// The player's connection breaks after 10 seconds of playing; another session says that it has played since 4 and stops
// at 15.
class StretchesContinuedTest : public StretchesTest {
protected:
    void playUntilBroken(double time = 10)
    {
        add(0, "Playback.Start", {});
        breakOff(7, time);
    }
    void breakOff(std::uint64_t session, double time)
    {
        batch.announcePlayingEnd(session, began + time, PlayingEnding::Vanished);
        batch.announceSessionEnd({.number = session, .time = began + time});
        takeBatch();
    }
    std::vector<std::string> continued(const SessionOwner& owner, double since = 4, double until = 15)
    {
        owners[8] = owner;
        goOn(12, since, next);
        add(until, "Playback.Stop", {}, true, next);
        return ended();
    }
    // A Start that arrives so late, and says since when.
    void goOn(double arrives, double since, Origin origin)
    {
        batch.add(began + arrives, origin, "com.quarn.kesto.Playback.Start",
                  {{"kestoreporting_timestamp", began + since}});
    }

    static constexpr Origin next{.source = 2, .session = 8};
};

TEST_F(StretchesContinuedTest, CountsFromWhereItsConnectionBroke)
{
    playUntilBroken();
    EXPECT_THAT(continued(ofPlayer),
                ElementsAre("played from 0.000000 for 10.000000 on ? in ?/? at ?: vanished",
                            "played from 10.000000 for 5.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesContinuedTest, CountsFromTheLastOfTwoBreaks)
{
    playUntilBroken(6);
    owners[9] = ofPlayer;
    goOn(8, 0, {.source = 3, .session = 9});
    breakOff(9, 11);
    // The two seconds before 8 are counted in place of the last two before 11.
    EXPECT_THAT(continued(ofPlayer, 0),
                ElementsAre("played from 0.000000 for 6.000000 on ? in ?/? at ?: vanished",
                            "played from 8.000000 for 3.000000 on ? in ?/? at ?: vanished",
                            "played from 9.000000 for 6.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesContinuedTest, CountsFromTheThirdBreakOn)
{
    playUntilBroken(6);
    for (const std::uint64_t session : {9U, 10U}) {
        owners[session] = ofPlayer;
        goOn(6, 0, {.source = 3, .session = session});
        breakOff(session, 8);
    }
    EXPECT_THAT(continued(ofPlayer, 0).back(), "played from 10.000000 for 5.000000 on ? in ?/? at ?: stopped");
}

TEST_F(StretchesContinuedTest, CountsNothingOfWhatLiesBeforeTheBreak)
{
    playUntilBroken();
    owners[8] = ofPlayer;
    goOn(12, 4, next);
    add(9, "RouteChange.State", {{"active_devices", "headset"}}, true, next);
    add(15, "Playback.Stop", {}, true, next);
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 10.000000 on ? in ?/? at ?: vanished",
                            "played from 10.000000 for 5.000000 on headset in ?/? at ?: stopped"));
    EXPECT_EQ(stretches.takeLeftOut(), 1U);
}

TEST_F(StretchesContinuedTest, TellsPlayingFromRecording)
{
    add(5, "Record.Start", {});
    playUntilBroken();
    owners[8] = ofPlayer;
    goOn(12, 0, next);
    batch.add(began + 12, next, "com.quarn.kesto.Record.Start", {{"kestoreporting_timestamp", began + 5}});
    add(15, "Playback.Stop", {}, true, next);
    add(16, "Record.Stop", {}, true, next);
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 10.000000 on ? in ?/? at ?: vanished",
                            "recorded from 5.000000 for 5.000000 on ? in ?/? at ?: vanished",
                            "played from 10.000000 for 5.000000 on ? in ?/? at ?: stopped",
                            "recorded from 10.000000 for 6.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesContinuedTest, CountsInFullAfterAClockWasSetBack)
{
    playUntilBroken();
    EXPECT_THAT(continued(ofPlayer, -3600, -3500).back(),
                "played from -3600.000000 for 100.000000 on ? in ?/? at ?: stopped");
}

TEST_F(StretchesContinuedTest, GoesByTheClientsClock)
{
    batch.add(began, player, "com.quarn.kesto.Playback.Start", {{"kestoreporting_timestamp", 100}});
    breakOff(7, 10);
    owners[8] = ofPlayer;
    batch.add(began + 12, next, "com.quarn.kesto.Playback.Start", {{"kestoreporting_timestamp", 100}});
    batch.add(began + 20, next, "com.quarn.kesto.Playback.Stop", {{"kestoreporting_timestamp", 120}});
    takeBatch();
    ASSERT_EQ(stretches.ended().size(), 2U);
    EXPECT_EQ(stretches.ended()[0].seconds, 10);
    EXPECT_EQ(stretches.ended()[1].began, 110);
    EXPECT_EQ(stretches.ended()[1].seconds, 10);
}

TEST_F(StretchesContinuedTest, AnotherUserProcessOrReporterContinuesNothing)
{
    playUntilBroken();
    SessionOwner anotherUser = ofPlayer;
    SessionOwner anotherProcess = ofPlayer;
    SessionOwner anotherReporter = ofPlayer;
    anotherUser.user = 1001;
    anotherProcess.process = 4712;
    anotherReporter.reporterID = 6;
    for (const SessionOwner& owner : {anotherUser, anotherProcess, anotherReporter}) {
        EXPECT_THAT(continued(owner).back(), "played from 4.000000 for 11.000000 on ? in ?/? at ?: stopped");
        batch.announceSessionEnd({.number = 8, .time = began + 15});
        takeBatch();
    }
}

TEST_F(StretchesContinuedTest, AStoppedSessionIsNotContinued)
{
    add(0, "Playback.Start", {});
    batch.announcePlayingEnd(7, began + 10, PlayingEnding::Stopped);
    batch.announceSessionEnd({.number = 7, .time = began + 10});
    takeBatch();
    EXPECT_THAT(continued(ofPlayer).back(), "played from 4.000000 for 11.000000 on ? in ?/? at ?: stopped");
}

TEST_F(StretchesContinuedTest, NorIsOneThatPlayedNothingWhenItsConnectionBroke)
{
    add(0, "Playback.Start", {});
    add(5, "Playback.Stop", {});
    breakOff(7, 10);
    EXPECT_THAT(continued(ofPlayer, 6).back(), "played from 6.000000 for 9.000000 on ? in ?/? at ?: stopped");
}

TEST_F(StretchesContinuedTest, TheLaterEndCountsOfTheServicesAndTheConnections)
{
    playUntilBroken();
    stretches.setEarlierEnd(began + 12);
    EXPECT_THAT(continued(ofPlayer).back(), "played from 12.000000 for 3.000000 on ? in ?/? at ?: stopped");
}

TEST_F(StretchesContinuedTest, OnlyTheLastBrokenConnectionsAreRemembered)
{
    playUntilBroken();
    for (std::uint64_t session = 100; session < 100 + Stretches::mostBrokenOff; ++session) {
        owners[session] = {.user = 1000, .process = 1, .reporterID = static_cast<std::int64_t>(session)};
        add(0, "Playback.Start", {}, true, {.source = 4, .session = session});
        breakOff(session, 10);
    }
    EXPECT_THAT(continued(ofPlayer).back(), "played from 4.000000 for 11.000000 on ? in ?/? at ?: stopped");
}

// --- Ends without a message

TEST_F(StretchesTest, AStoppedSessionPlaysNoMoreUntilItBeginsAgain)
{
    add(0, "Playback.Start", {{"PomoSessionVolume", 0.5}});
    batch.announcePlayingEnd(7, began + 2, PlayingEnding::Stopped);
    add(5, "Playback.Start", {});
    batch.announcePlayingEnd(7, began + 6, PlayingEnding::Stopped);
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 2.000000 on ? in ?/? at 0.500000: stopped",
                            "played from 5.000000 for 1.000000 on ? in ?/? at 0.500000: stopped"));
}

TEST_F(StretchesTest, AStopStaysAtItsPlaceWhenBatchesAreJoinedAndPayloadsAreLost)
{
    EventBatch turn;
    const auto nan = std::numeric_limits<double>::quiet_NaN();
    batch.add(began, player, "com.quarn.kesto.Playback.Start", {{"lost", nan}});
    batch.add(began, player, "com.quarn.kesto.Playback.Start", {});
    turn.add(began, player, "com.quarn.kesto.Generic.State", {{"lost", nan}});
    turn.announcePlayingEnd(7, began + 1, PlayingEnding::Stopped);
    turn.add(began + 5, player, "com.quarn.kesto.Playback.Start", {});
    batch.takeFrom(turn);
    add(6, "Playback.Stop", {}, false);
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 1.000000 on ? in ?/? at ?: stopped",
                            "played from 5.000000 for 1.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, ADestroyedSessionStops)
{
    add(0, "Playback.Start", {});
    batch.announceSessionEnd({.number = 7, .time = began + 3});
    EXPECT_THAT(ended(), ElementsAre("played from 0.000000 for 3.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, WithItsClientItVanishesAndWithTheServiceItEnds)
{
    for (const StretchEnding ending : {StretchEnding::Vanished, StretchEnding::ServiceEnded}) {
        add(0, "Playback.Start", {});
        batch.announcePlayingEnd(7, began + 3, PlayingEnding::Vanished);
        takeBatch(ending);
    }
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 3.000000 on ? in ?/? at ?: vanished",
                            "played from 0.000000 for 3.000000 on ? in ?/? at ?: service-ended"));
}

TEST_F(StretchesTest, AllEndTogetherAndNothingIsKnownAfterwards)
{
    add(0, "Playback.Start", {{"PomoSessionVolume", 0.5}});
    takeBatch();
    stretches.endAll(began + 8);
    add(9, "Playback.Start", {});
    add(10, "Playback.Stop", {});
    EXPECT_THAT(ended(),
                ElementsAre("played from 0.000000 for 8.000000 on ? in ?/? at 0.500000: service-ended",
                            "played from 9.000000 for 1.000000 on ? in ?/? at ?: stopped"));
}

TEST_F(StretchesTest, MessagesOfNoSessionOfAnUnknownOneAndOfOneThatEndedBeginNothing)
{
    batch.announceSessionEnd({.number = 7, .time = began});
    takeBatch();
    for (const std::uint64_t session : {0U, 7U, 8U}) {
        add(1, "Playback.Start", {}, true, {.source = 1, .session = session});
        add(2, "Playback.Stop", {}, true, {.source = 1, .session = session});
    }
    EXPECT_THAT(ended(), IsEmpty());
    EXPECT_FALSE(stretches.hasChanges());
}

// --- For the database

TEST_F(StretchesTest, WhatRunsIsToBeWrittenAndItsRowIsToGoWhenItIsOver)
{
    add(0, "Playback.Start", {{"PomoSessionVolume", 0.5}});
    takeBatch();
    ASSERT_EQ(stretches.rowChanges().size(), 1U);
    EXPECT_EQ(stretches.rowChanges()[0].open->began.time(), began);
    EXPECT_EQ(stretches.rowChanges()[0].state->volume, 0.5);
    stretches.written();
    EXPECT_FALSE(stretches.hasChanges());
    add(1, "Playback.Stop", {});
    takeBatch();
    ASSERT_EQ(stretches.rowChanges().size(), 1U);
    EXPECT_EQ(stretches.rowChanges()[0].open, nullptr);
    stretches.written();
    EXPECT_FALSE(stretches.hasChanges());
    EXPECT_THAT(ended(), IsEmpty());
}

TEST_F(StretchesTest, WhatBeganAndEndedInOneBatchHasNoRow)
{
    add(0, "Playback.Start", {});
    add(1, "Playback.Stop", {});
    takeBatch();
    EXPECT_THAT(stretches.rowChanges(), IsEmpty());
    EXPECT_EQ(stretches.ended().size(), 1U);
}

TEST_F(StretchesTest, WhatCouldNotBeWrittenWaitsAndIsBounded)
{
    for (int run = 0; run < 1030; ++run) {
        add(2 * run, "Playback.Start", {});
        add(2 * run + 1, "Playback.Stop", {});
        takeBatch();
        stretches.notWritten();
    }
    EXPECT_EQ(stretches.ended().size(), 1024U);
    EXPECT_EQ(stretches.ended().front().began, began);
    EXPECT_EQ(stretches.takeLeftOut(), 6U);
}

TEST_F(StretchesTest, AnotherDatabaseGetsAllThatRuns)
{
    add(0, "Playback.Start", {});
    takeBatch();
    stretches.written();
    stretches.forgetRows();
    ASSERT_EQ(stretches.rowChanges().size(), 1U);
    EXPECT_NE(stretches.rowChanges()[0].open, nullptr);
}

// --- Properties

// Changes only cut stretches. So their lengths add up to the time that output ran, which the model sums up from the
// starts and stops alone.
RC_GTEST_PROP(StretchesProperty, TheLengthsAddUpToTheTimeThatOutputRan, ())
{
    const auto ownerOf = [](std::uint64_t session) { return session == 7 ? std::optional(ofPlayer) : std::nullopt; };
    Stretches stretches;
    EventBatch batch;
    const bool saysWhen = *rc::gen::arbitrary<bool>();
    const auto steps = *rc::gen::container<std::vector<std::pair<int, int>>>(
        rc::gen::pair(rc::gen::inRange(0, 9), rc::gen::inRange(0, 50)));
    double time = began;
    double ran = 0;
    bool isRunning = false;
    const auto send = [&](std::string_view kind, Dictionary payload) {
        if (saysWhen)
            payload = payload.with("kestoreporting_timestamp", time);
        batch.add(time, player, "com.quarn.kesto." + std::string(kind), payload);
    };
    for (const auto& [what, seconds] : steps) {
        time += seconds;
        ran += isRunning ? seconds : 0;
        switch (what) {
        case 0: send("Playback.Start", {{"session_output_running", true}}); break;
        case 1: send("Playback.Start", {}); break;
        case 2: send("Playback.Stop", {{"session_output_running", false}}); break;
        case 3: send("Playback.Deactivate", {{"session_duration", 1}}); break;
        case 4: batch.announcePlayingEnd(7, time, PlayingEnding::Stopped); break;
        case 5: send("Volume.State", {{"PomoSessionVolume", seconds / 50.0}}); break;
        case 6: send("RouteChange.State", {{"active_devices", std::to_string(seconds)}}); break;
        case 7: send("Record.Start", {{"session_input_running", seconds % 2}}); break;
        default: send("Setup.State", {{"mChannelsPerFrame", seconds}}); break;
        }
        isRunning = what < 2 || (what > 4 && isRunning);
        if (seconds % 3 == 0) {
            stretches.take(batch.rows(), batch.announcements(), ownerOf, StretchEnding::Vanished);
            batch.clear();
        }
    }
    batch.announceSessionEnd({.number = 7, .time = time});
    stretches.take(batch.rows(), batch.announcements(), ownerOf, StretchEnding::Vanished);
    double sum = 0;
    for (const Stretch& stretch : stretches.ended()) {
        RC_ASSERT(stretch.seconds > 0);
        sum += stretch.isRecording ? 0 : stretch.seconds;
    }
    RC_ASSERT(sum == ran);
}

} // namespace
} // namespace platform
