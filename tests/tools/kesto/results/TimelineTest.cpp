// SPDX-License-Identifier: Apache-2.0
// The timeline of a session's messages.
#include "kesto/results/Timeline.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using foundation::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;
using Run = Timeline::Run;

class TimelineTest : public testing::Test {
protected:
    Timeline::Row add(const std::string& identifier, const Dictionary& payload)
    {
        std::optional<Timeline::Row> row;
        EXPECT_TRUE(timeline.add(identifier, payload, row)) << identifier;
        return row.value_or(Timeline::Row{.time = {}, .kind = "no row", .changes = {}});
    }

    static Dictionary at(double time, Dictionary payload = {})
    {
        return payload.with("kestoreporting_timestamp", time);
    }

    Timeline timeline;
};

TEST_F(TimelineTest, CountsTimeFromTheFirstTimeStamp)
{
    EXPECT_EQ(add("Setup_Setup_1", {}).time, std::nullopt);
    EXPECT_EQ(add("Playback_Start_1", at(1000)).time, 0);
    EXPECT_EQ(add("Playback_Start_2", at(1002.5)).time, 2.5);
    EXPECT_EQ(add("Playback_Start_3", {}).time, std::nullopt);
    EXPECT_EQ(add("Playback_Start_4", at(999)).time, -1);
    EXPECT_EQ(add("Playback_Start_5", {{"kestoreporting_timestamp", "1010 s"}}).time, 10);
    EXPECT_EQ(timeline.start(), 1000);
    EXPECT_EQ(timeline.end(), 10);
    EXPECT_EQ(timeline.messages(), 6U);
}

TEST_F(TimelineTest, NamesCategoryAndType)
{
    EXPECT_EQ(add("Playback_Start_1", {}).kind, "Playback Start");
    EXPECT_EQ(add("DSP_Playback_Start_12", {}).kind, "DSP_Playback Start");
    EXPECT_EQ(add("_Undefined_Generic_1", {}).kind, "_Undefined Generic");
}

TEST_F(TimelineTest, TakesNoOtherIdentifier)
{
    std::optional<Timeline::Row> row;
    for (const char* identifier : {"", "1", "_1", "Playback", "Playback_1", "Playback_Start", "Playback_Start_",
                                   "Playback_Start_x", "Playback_Start_1 "})
        EXPECT_FALSE(timeline.add(identifier, {}, row)) << identifier;
    EXPECT_EQ(timeline.messages(), 0U);
}

TEST_F(TimelineTest, TellsWhatTheMessageOfItsKindBeforeDidNotSay)
{
    EXPECT_EQ(add("Volume_State_1", at(1, {{"PomoSessionVolume", 1}, {"muted", false}})).changes,
              "PomoSessionVolume=1 muted=false");
    EXPECT_EQ(add("Playback_Stop_1", at(1, {{"PomoSessionVolume", 1}})).changes, "PomoSessionVolume=1");
    EXPECT_EQ(add("Volume_State_2", at(2, {{"PomoSessionVolume", 0.5}, {"muted", false}})).changes,
              "PomoSessionVolume=1→0.5");
    EXPECT_EQ(add("Volume_State_3", at(3, {{"device", "a b"}, {"PomoSessionVolume", 0.5}})).changes,
              "device=a b -muted");
    EXPECT_EQ(add("Volume_State_4", at(4, {{"PomoSessionVolume", 0.5}, {"device", "a b"}})).changes,
              "(the same again)");
}

TEST_F(TimelineTest, LeavesOutTimesAndTheTagThatRepeatsTheKind)
{
    EXPECT_EQ(add("Playback_Start_1",
                  at(1, {{"systemuptime_sec", 5}, {"processuptime_ms", 5}, {"audiotag", "PlaybackStart"}, {"a", 1}}))
                  .changes,
              "a=1");
    EXPECT_EQ(add("Setup_Setup_1", at(1)).changes, "");
}

TEST_F(TimelineTest, MarksWhenSoundRuns)
{
    EXPECT_EQ(add("A_B_1", at(0)).run, Run::Silent);
    EXPECT_EQ(add("A_B_2", at(1, {{"session_output_running", true}})).run, Run::Begins);
    EXPECT_EQ(add("A_B_3", at(2)).run, Run::GoesOn);
    EXPECT_EQ(add("A_B_4", at(3, {{"session_output_running", 1}})).run, Run::GoesOn);
    EXPECT_EQ(add("A_B_5", at(4, {{"session_output_running", false}})).run, Run::Ends);
    EXPECT_EQ(add("A_B_6", at(5)).run, Run::Silent);
    EXPECT_EQ(add("A_B_7", at(6, {{"session_output_running", "yes"}})).run, Run::Begins);
    EXPECT_EQ(add("A_B_8", at(8, {{"session_duration", 8}})).run, Run::Ends);
    EXPECT_THAT(timeline.played(), ElementsAre(Stretch{1, 4}, Stretch{6, 8}));
    EXPECT_THAT(timeline.recorded(), IsEmpty());
}

TEST_F(TimelineTest, TellsPlayingFromRecording)
{
    add("A_B_1", at(1, {{"session_input_running", true}}));
    EXPECT_EQ(add("A_B_2", at(2, {{"session_output_running", true}})).run, Run::GoesOn);
    EXPECT_EQ(add("A_B_3", at(3, {{"session_output_running", false}})).run, Run::GoesOn);
    add("A_B_4", at(5));
    EXPECT_THAT(timeline.played(), ElementsAre(Stretch{1, 2}));
    EXPECT_THAT(timeline.recorded(), ElementsAre(Stretch{0, 4})); // still
}

TEST_F(TimelineTest, KeepsVolumeEventsForTheEnd)
{
    EXPECT_EQ(add("Volume_Summary_1", {{"play_seconds", 2.1}}).kind, "no row");
    EXPECT_EQ(add("Volume_Summary_2", {{"a", 1}}).kind, "Volume Summary"); // a client's own
    EXPECT_THAT(timeline.volumeEvents(), ElementsAre(Dictionary{{"play_seconds", 2.1}}));
    EXPECT_EQ(timeline.messages(), 2U);
}

} // namespace
