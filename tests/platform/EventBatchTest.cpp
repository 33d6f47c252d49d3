// SPDX-License-Identifier: Apache-2.0
// The rows that a batch gives to the database: their texts stay right when batches are joined, both events of a message
// share one written payload, and payloads that JSON cannot express are left out.
#include "platform/EventBatch.h"

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace platform {
namespace {

using foundation::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;

std::vector<std::string> rowsOf(EventBatch& batch)
{
    std::vector<std::string> rows;
    for (const EventRow& row : batch.rows())
        rows.push_back(fmt::format("{} {}{}{} {}", row.time, row.name, row.secondName.empty() ? "" : "+",
                                   row.secondName, row.payload));
    return rows;
}

Dictionary large(char letter)
{
    return {{"text", std::string(EventBatch::largestWrittenAtOnce, letter)}};
}

const Dictionary notJson{{"n", std::numeric_limits<double>::infinity()}};

TEST(EventBatchTest, IsEmptyAtFirstAndWhenCleared)
{
    EventBatch batch;
    EXPECT_EQ(batch.size(), 0U);
    EXPECT_EQ(batch.bytes(), 0U);
    batch.add(1, "a", {{"n", 1}});
    batch.add(2, "b", large('x'));
    EXPECT_EQ(batch.size(), 2U);
    batch.clear();
    EXPECT_EQ(batch.size(), 0U);
    EXPECT_EQ(batch.bytes(), 0U);
    EXPECT_THAT(batch.rows(), IsEmpty());
}

TEST(EventBatchTest, EachEventCountsBesideItsPayload)
{
    const Dictionary shared{{"n", 1}};
    EventBatch batch;
    for (int number = 0; number < 1000; ++number)
        batch.add(1, "name", shared);
    EXPECT_GE(batch.bytes(), 20'000U);
    EXPECT_LE(batch.bytes(), 100'000U);
}

TEST(EventBatchTest, EventsComeInTheirOrder)
{
    EventBatch batch;
    batch.add(1.5, "a", {{"n", 1}});
    batch.add(1, "b", {});
    batch.add(2, "", {{"text", "\n"}});
    EXPECT_THAT(rowsOf(batch), ElementsAre("1.5 a {\"n\":1}", "1 b {}", "2  {\"text\":\"\\n\"}"));
}

TEST(EventBatchTest, APayloadThatFollowsItselfIsWrittenOnce)
{
    const Dictionary shared{{"n", 1}};
    EventBatch batch;
    batch.add(1, "a", shared);
    const std::size_t before = batch.bytes();
    batch.add(1, "b", shared);
    EXPECT_EQ(batch.bytes() - before, 1U) << "the name";
    batch.add(1, "c", {{"n", 2}});
    batch.add(1, "d", shared);
    batch.add(1, "d", shared);
    EXPECT_EQ(batch.rows()[2].payload.data(), batch.rows()[3].payload.data());
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a+b {\"n\":1}", "1 c {\"n\":2}", "1 d {\"n\":1}", "1 d {\"n\":1}"));
}

TEST(EventBatchTest, TheEmptyPayloadIsAPayloadLikeAnyOther)
{
    EventBatch batch;
    batch.add(1, "a", {});
    batch.add(1, "b", {});
    batch.add(1, "c", {{"n", 1}});
    batch.add(1, "d", {});
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a {}", "1 b {}", "1 c {\"n\":1}", "1 d {}"));
}

TEST(EventBatchTest, WhatJsonCannotSayIsLeftOutWithAllEventsThatHaveIt)
{
    EventBatch batch;
    batch.add(1, "a", notJson);
    batch.add(1, "b", notJson);
    batch.add(1, "c", {{"n", 1}});
    batch.add(1, "d", notJson);
    EXPECT_EQ(batch.size(), 4U);
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 c {\"n\":1}"));
}

TEST(EventBatchTest, ALargePayloadCountsAndIsWrittenWhenTheRowsAreWanted)
{
    const Dictionary shared = large('x');
    EventBatch batch;
    batch.add(1, "a", shared);
    batch.add(1, "b", shared);
    EXPECT_GT(batch.bytes(), EventBatch::largestWrittenAtOnce);
    EXPECT_LT(batch.bytes(), 2 * EventBatch::largestWrittenAtOnce);
    const std::string json = "{\"text\":\"" + std::string(EventBatch::largestWrittenAtOnce, 'x') + "\"}";
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a+b " + json));
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a+b " + json));
}

TEST(EventBatchTest, ALargePayloadThatIsNotJsonIsLeftOutToo)
{
    EventBatch batch;
    batch.add(1, "a", large('x').mergedWith(notJson));
    batch.add(1, "b", {{"n", 1}});
    EXPECT_EQ(batch.size(), 2U);
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 b {\"n\":1}"));
}

TEST(EventBatchTest, JoinedBatchesAreBothWhole)
{
    EventBatch batch;
    EventBatch second;
    second.add(2, "b", {{"n", 2}});
    batch.takeFrom(second); // into an empty batch
    EXPECT_EQ(second.size(), 0U);
    second.add(3, "c", large('y'));
    second.add(3, "d", notJson);
    second.add(3, "e", {{"n", 3}});
    batch.takeFrom(second);
    batch.takeFrom(second); // from an empty batch
    EXPECT_EQ(second.size(), 0U);
    EXPECT_EQ(second.bytes(), 0U);
    EXPECT_EQ(batch.size(), 4U);
    EXPECT_THAT(rowsOf(batch),
                ElementsAre("2 b {\"n\":2}",
                            "3 c {\"text\":\"" + std::string(EventBatch::largestWrittenAtOnce, 'y') + "\"}",
                            "3 e {\"n\":3}"));
}

TEST(EventBatchTest, AfterJoiningOnlyTheLastPayloadIsShared)
{
    const Dictionary first{{"n", 1}};
    const Dictionary last{{"n", 2}};
    EventBatch batch;
    EventBatch second;
    batch.add(1, "a", first);
    second.add(1, "b", last);
    batch.takeFrom(second);
    batch.add(1, "c", last);
    batch.add(1, "d", first);
    second.add(1, "e", first); // the second batch starts again without shared payloads
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a {\"n\":1}", "1 b+c {\"n\":2}", "1 d {\"n\":1}"));
    EXPECT_THAT(rowsOf(second), ElementsAre("1 e {\"n\":1}"));
}

// --- Messages with two names

TEST(EventBatchTest, TheSecondEventOfAMessageIsInTheRowOfTheFirst)
{
    const Dictionary shared{{"n", 1}};
    EventBatch batch;
    batch.add(1, {.source = 1, .session = 2}, "a", shared);
    batch.add(1.25, {.source = 1, .session = 2}, "b", shared);
    EXPECT_EQ(batch.size(), 2U);
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a+b {\"n\":1}"));
    EXPECT_EQ(batch.rows()[0].events(), 2U);
    EXPECT_EQ(batch.rows()[0].origin, (Origin{.source = 1, .session = 2}));
}

TEST(EventBatchTest, AThirdNameTheSameNameAndAnotherOriginAreOtherMessages)
{
    const Dictionary shared{{"n", 1}};
    EventBatch batch;
    batch.add(1, "a", shared);
    batch.add(1, "b", shared);
    batch.add(1, "c", shared);
    batch.add(1, "c", shared);
    batch.add(1, {.source = 1, .session = 0}, "d", shared);
    batch.add(1, {.source = 1, .session = 1}, "e", shared);
    batch.add(1, {.source = 2, .session = 1}, "f", shared);
    EXPECT_EQ(batch.size(), 7U);
    EXPECT_THAT(rowsOf(batch),
                ElementsAre("1 a+b {\"n\":1}", "1 c {\"n\":1}", "1 c {\"n\":1}", "1 d {\"n\":1}", "1 e {\"n\":1}",
                            "1 f {\"n\":1}"));
}

// --- When it happened

TEST(EventBatchTest, AStampThatIsANumberSaysWhenTheMessageHappened)
{
    const auto happened = [](const foundation::Value& stamp) {
        EventBatch batch;
        batch.add(1, "a", {{"n", 1}, {"kestoreporting_timestamp", stamp}});
        return batch.rows()[0].happened;
    };
    EXPECT_EQ(happened(1'767'225'600.25), 1'767'225'600.25);
    EXPECT_EQ(happened(7), 7.0);
    EXPECT_EQ(happened(0.5F), 0.5);
    EXPECT_EQ(happened(true), std::nullopt);
    EXPECT_EQ(happened("1767225600"), std::nullopt);
    EXPECT_EQ(happened(foundation::Value()), std::nullopt);
    EventBatch batch;
    batch.add(1, "a", {{"n", 1}});
    EXPECT_EQ(batch.rows()[0].happened, std::nullopt);
}

// --- What a payload says about playing

TEST(EventBatchTest, WhatAPayloadSaysAboutPlayingIsRead)
{
    EventBatch batch;
    batch.add(1, "a",
              {{"session_output_running", true},
               {"session_input_running", 0},
               {"session_duration", "long"},
               {"active_devices", "speaker"},
               {"session_selected_format", "S16LE/44100/2"},
               {"mChannelsPerFrame", 2.0},
               {"PomoSessionVolume", 0.5},
               {"kestoreporting_timestamp", 7}});
    batch.add(1, "a", {{"kestoreporting_timestamp", 8}, {"active_device", 1}, {"session_durations", 1}});
    const auto rows = batch.rows();
    EXPECT_EQ(rows[0].happened, 7.0);
    ASSERT_NE(rows[0].playing, nullptr);
    EXPECT_EQ(rows[0].playing->isOutputRunning, true);
    EXPECT_EQ(rows[0].playing->isInputRunning, false);
    EXPECT_TRUE(rows[0].playing->hasDuration);
    EXPECT_EQ(rows[0].playing->devices, "speaker");
    EXPECT_EQ(rows[0].playing->format, "S16LE/44100/2");
    EXPECT_EQ(rows[0].playing->channels, 2);
    EXPECT_EQ(rows[0].playing->volume, 0.5);
    EXPECT_EQ(rows[1].happened, 8.0);
    EXPECT_EQ(rows[1].playing, nullptr);
}

TEST(EventBatchTest, WhatPayloadsSayAboutPlayingStaysWithThemWhenBatchesAreJoined)
{
    EventBatch batch;
    EventBatch second;
    batch.add(1, "a", {{"active_devices", "speaker"}});
    batch.add(1, "b", {{"n", 1}});
    second.add(1, "c", {{"n", 2}});
    second.add(1, "d", {{"active_devices", "headset"}, {"text", std::string(100'000, 'x')}});
    batch.takeFrom(second);
    const auto rows = batch.rows();
    EXPECT_EQ(rows[0].playing->devices, "speaker");
    EXPECT_EQ(rows[1].playing, nullptr);
    EXPECT_EQ(rows[2].playing, nullptr);
    EXPECT_EQ(rows[3].playing->devices, "headset");
}

TEST(EventBatchTest, EndsOfPlayingKeepTheirPlaceAmongTheMessages)
{
    EventBatch batch;
    EventBatch second;
    batch.add(1, "a", {{"n", 1}});
    batch.add(1, "b", notJson);
    second.announcePlayingEnd(3, 8, PlayingEnding::Stopped);
    second.add(1, "c", {{"n", 2}});
    second.announcePlayingEnd(4, 9, PlayingEnding::Vanished);
    batch.takeFrom(second);
    EXPECT_THAT(batch.announcements().playingEnds,
                ElementsAre(PlayingEnd{.session = 3, .time = 8, .ending = PlayingEnding::Stopped, .place = 2},
                            PlayingEnd{.session = 4, .time = 9, .ending = PlayingEnding::Vanished, .place = 3}));
    ASSERT_EQ(batch.rows().size(), 2U);
    EXPECT_EQ(batch.rows()[1].place, 2U) << "the lost one has a place too";
    batch.clear();
    EXPECT_TRUE(batch.empty());
}

// --- Origins

TEST(EventBatchTest, SaysHowManyEventsAreOfWhichOrigin)
{
    const Origin player{.source = 7, .session = 9};
    const Origin recorder{.source = 8, .session = 0};
    const Dictionary message{{"n", 1}};
    EventBatch batch;
    batch.add(1, player, "a", message);
    batch.add(1, player, "b", message); // the second event of the message
    batch.add(1, recorder, "a", notJson);
    batch.add(1, {}, "a", large('x'));
    batch.add(1, player, "c", {{"n", 2}});
    EXPECT_THAT(batch.eventsByOrigin(),
                ElementsAre(std::pair(Origin(), 1U), std::pair(player, 3U), std::pair(recorder, 1U)));
    EXPECT_THAT(eventsByOrigin(batch.rows()), ElementsAre(std::pair(Origin(), 1U), std::pair(player, 3U)));
    EXPECT_THAT(eventsByOrigin(batch.rowsWithoutJson()), ElementsAre(std::pair(recorder, 1U)));
    batch.clear();
    EXPECT_THAT(batch.eventsByOrigin(), IsEmpty());
    EXPECT_THAT(batch.rowsWithoutJson(), IsEmpty());
}

// --- Announcements

TEST(EventBatchTest, AnnouncementsAreJoinedAndForgottenLikeEvents)
{
    EventBatch batch;
    EventBatch second;
    EXPECT_TRUE(batch.empty());
    batch.announce(SourceBegin{.number = 1, .userIdentifier = 1000, .processIdentifier = 7, .processName = "a"});
    EXPECT_FALSE(batch.empty());
    EXPECT_EQ(batch.size(), 0U) << "only events count";
    const std::size_t before = batch.bytes();
    EXPECT_GT(before, 40U);
    second.announce(SourceBegin{.number = 2});
    second.announce(SessionBegin{.number = 3, .source = 2, .reporterID = 42});
    second.announceSessionEnd({.number = 3, .time = 8});
    second.announceSourceEnd({.number = 2, .time = 9});
    batch.takeFrom(second);
    EXPECT_TRUE(second.empty());
    EXPECT_EQ(second.bytes(), 0U);
    EXPECT_GT(batch.bytes(), before);
    EXPECT_THAT(
        batch.announcements().sources,
        ElementsAre(SourceBegin{.number = 1, .userIdentifier = 1000, .processIdentifier = 7, .processName = "a"},
                    SourceBegin{.number = 2}));
    EXPECT_THAT(batch.announcements().sessions, ElementsAre(SessionBegin{.number = 3, .source = 2, .reporterID = 42}));
    EXPECT_THAT(batch.announcements().sessionEnds, ElementsAre(OriginEnd{.number = 3, .time = 8}));
    EXPECT_THAT(batch.announcements().sourceEnds, ElementsAre(OriginEnd{.number = 2, .time = 9}));
    batch.clear();
    EXPECT_TRUE(batch.empty());
    EXPECT_EQ(batch.bytes(), 0U);
}

} // namespace
} // namespace platform
