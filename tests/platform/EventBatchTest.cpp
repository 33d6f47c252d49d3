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
        rows.push_back(fmt::format("{} {} {}", row.time, row.name, row.payload));
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
    EXPECT_LE(batch.bytes(), 60'000U);
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
    EXPECT_EQ(batch.rows()[0].payload.data(), batch.rows()[1].payload.data());
    EXPECT_LT(batch.bytes() - before, before);
    batch.add(1, "c", {{"n", 2}});
    batch.add(1, "d", shared);
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a {\"n\":1}", "1 b {\"n\":1}", "1 c {\"n\":2}", "1 d {\"n\":1}"));
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
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a " + json, "1 b " + json));
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a " + json, "1 b " + json));
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
    EXPECT_THAT(rowsOf(batch), ElementsAre("1 a {\"n\":1}", "1 b {\"n\":2}", "1 c {\"n\":2}", "1 d {\"n\":1}"));
    EXPECT_THAT(rowsOf(second), ElementsAre("1 e {\"n\":1}"));
}

} // namespace
} // namespace platform
