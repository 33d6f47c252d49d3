// SPDX-License-Identifier: Apache-2.0
// The record alone: its bytes, its text, and its equality.
#include "sinks/AudioIssueDetected.h"

#include "foundation/GuardedBytes.h"

#include <algorithm>
#include <functional>
#include <gtest/gtest.h>
#include <type_traits>
#include <utility>

namespace {

using namespace std::string_literals;
using foundation::ProtobufError;
using trelmmetrics::AudioIssueDetected;

AudioIssueDetected sample()
{
    AudioIssueDetected record;
    record.setTimestamp(150);
    record.setDuration(7);
    record.setIssuetype("glitch");
    record.setNode("speaker");
    record.setRtaidclient("player");
    return record;
}

const std::string encodedSample = "\x08\x96\x01"
                                  "\x10\x07"
                                  "\x1A\x06"
                                  "glitch"
                                  "\x22\x07"
                                  "speaker"
                                  "\x2A\x06"
                                  "player";

std::string encoded(const AudioIssueDetected& record)
{
    std::string out;
    foundation::ProtobufWriter writer(out);
    record.writeTo(writer);
    return out;
}

std::expected<void, ProtobufError> read(AudioIssueDetected& record, const std::string& bytes)
{
    const GuardedBytes guarded(bytes);
    foundation::ProtobufReader reader(guarded.view());
    return record.readFrom(reader);
}

AudioIssueDetected decoded(const std::string& bytes)
{
    AudioIssueDetected record;
    EXPECT_TRUE(read(record, bytes));
    return record;
}

std::string text(const AudioIssueDetected& record)
{
    std::string out;
    foundation::ProtobufTextFormatter formatter(out);
    record.formatText(formatter, "record");
    return out;
}

static_assert(std::is_base_of_v<foundation::ProtobufMessage, AudioIssueDetected>);
static_assert(std::is_nothrow_move_constructible_v<AudioIssueDetected>);
static_assert(std::is_nothrow_move_assignable_v<AudioIssueDetected>);
static_assert(std::is_nothrow_swappable_v<AudioIssueDetected>);

TEST(AudioIssueDetected, ADefaultRecordIsEmptyWithoutATimeStamp)
{
    const AudioIssueDetected record;
    EXPECT_FALSE(record.hasTimestamp());
    EXPECT_EQ(record.timestamp(), 0U);
    EXPECT_EQ(record.duration(), 0U);
    EXPECT_EQ(record.issuetype(), "");
    EXPECT_EQ(record.node(), "");
    EXPECT_EQ(record.rtaidclient(), "");
}

TEST(AudioIssueDetected, ADefaultRecordIsEightBytesOfEmptyFieldsWithoutATimeStamp)
{
    EXPECT_EQ(encoded({}), "\x10\x00\x1A\x00\x22\x00\x2A\x00"s);
}

TEST(AudioIssueDetected, WritesItsFieldsInTheOrderOfTheirNumbers)
{
    EXPECT_EQ(encoded(sample()), encodedSample);
}

TEST(AudioIssueDetected, WritesATimeStampThatIsSetTo0)
{
    AudioIssueDetected record;
    record.setTimestamp(0);
    EXPECT_TRUE(record.hasTimestamp());
    EXPECT_EQ(encoded(record), "\x08\x00\x10\x00\x1A\x00\x22\x00\x2A\x00"s);
}

TEST(AudioIssueDetected, ReadsWhatItWrote)
{
    const AudioIssueDetected record = decoded(encodedSample);
    EXPECT_EQ(record, sample());
    EXPECT_TRUE(record.hasTimestamp());
    EXPECT_EQ(record.timestamp(), 150U);
    EXPECT_EQ(record.duration(), 7U);
    EXPECT_EQ(record.issuetype(), "glitch");
    EXPECT_EQ(record.node(), "speaker");
    EXPECT_EQ(record.rtaidclient(), "player");
    EXPECT_EQ(decoded(encoded({})), AudioIssueDetected());
}

TEST(AudioIssueDetected, ReadsItsFieldsInAnyOrderAndTheLastOfEachCounts)
{
    EXPECT_EQ(decoded("\x2A\x01z\x10\x01\x2A\x06player\x22\x07speaker\x08\x01\x1A\x06glitch\x10\x07\x08\x96\x01"),
              sample());
}

TEST(AudioIssueDetected, KeepsTheKnownFieldsAmongUnknownOnesAndDropsTheRest)
{
    const std::string unknown = "\x30\x05" // 6, a number
                                "\x39\x01\x02\x03\x04\x05\x06\x07\x08" // 7, eight bytes
                                "\x42\x02xy" // 8, text
                                "\x4B\x08\x63\x1A\x01g\x4C" // 9, a group with fields 1 and 3 of its own
                                "\x55\x01\x02\x03\x04"s; // 10, four bytes
    const AudioIssueDetected record = decoded(unknown + encodedSample + unknown);
    EXPECT_EQ(record, sample());
    EXPECT_EQ(encoded(record), encodedSample);
}

TEST(AudioIssueDetected, SkipsKnownFieldsOfAnotherWireType)
{
    const std::string other = "\x0A\x01x" // 1 as text
                              "\x15\x01\x02\x03\x04" // 2 as four bytes
                              "\x18\x05" // 3 as a number
                              "\x21\x01\x02\x03\x04\x05\x06\x07\x08" // 4 as eight bytes
                              "\x2B\x2C"s; // 5 as a group
    EXPECT_EQ(decoded(other), AudioIssueDetected());
    EXPECT_EQ(decoded(encodedSample + other), sample());
}

TEST(AudioIssueDetected, TakesTheLow32BitsOfALongerDuration)
{
    EXPECT_EQ(decoded("\x10\x87\x80\x80\x80\x10").duration(), 7U); // 2^32 + 7
    EXPECT_EQ(decoded("\x10\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01").duration(), UINT32_MAX);
}

TEST(AudioIssueDetected, TakesTextOfAnyBytes)
{
    EXPECT_EQ(decoded("\x1A\x03\xFF\x00\xC3"s).issuetype(), "\xFF\x00\xC3"s);
}

TEST(AudioIssueDetected, ReadingLeavesFieldsThatDoNotComeAsTheyAre)
{
    AudioIssueDetected record = sample();
    ASSERT_TRUE(read(record, "\x22\x08receiver"));
    AudioIssueDetected expected = sample();
    expected.setNode("receiver");
    EXPECT_EQ(record, expected);
}

TEST(AudioIssueDetected, RefusesEveryTruncationInsideAField)
{
    const std::size_t fieldEnds[] = {0, 3, 5, 13, 22, 30};
    ASSERT_EQ(encodedSample.size(), 30U);
    for (std::size_t length = 0; length <= encodedSample.size(); ++length) {
        AudioIssueDetected record;
        const auto result = read(record, encodedSample.substr(0, length));
        if (std::ranges::count(fieldEnds, length) == 1)
            EXPECT_TRUE(result) << length;
        else
            EXPECT_EQ(result.error(), ProtobufError::Truncated) << length;
    }
}

TEST(AudioIssueDetected, RefusesNumbersAndLengthsThatAreTooLong)
{
    AudioIssueDetected record;
    EXPECT_EQ(read(record, "\x08" + std::string(10, '\x80') + '\0').error(), ProtobufError::VarintTooLong);
    EXPECT_EQ(read(record, "\x1A\x05glit").error(), ProtobufError::Truncated);
    EXPECT_EQ(read(record, "\x1A\xFF\xFF\xFF\xFF\x0F").error(), ProtobufError::Truncated);
    EXPECT_EQ(record, AudioIssueDetected());
}

TEST(AudioIssueDetected, KeepsTheFieldsBeforeWhatIsBroken)
{
    AudioIssueDetected record;
    EXPECT_FALSE(read(record, "\x10\x07\x0C"));
    EXPECT_EQ(record.duration(), 7U);
}

TEST(AudioIssueDetected, ShowsItsFieldsInTheOrderOfTheirNames)
{
    EXPECT_EQ(text(sample()),
              "record {\n"
              "  duration: 7\n"
              "  issuetype: \"glitch\"\n"
              "  node: \"speaker\"\n"
              "  rtaidclient: \"player\"\n"
              "  timestamp: 150\n"
              "}\n");
}

TEST(AudioIssueDetected, ShowsNoTimeStampThatIsNotSet)
{
    EXPECT_EQ(text({}),
              "record {\n"
              "  duration: 0\n"
              "  issuetype: \"\"\n"
              "  node: \"\"\n"
              "  rtaidclient: \"\"\n"
              "}\n");
}

TEST(AudioIssueDetected, ATimeStampOf0DiffersFromNone)
{
    AudioIssueDetected withZero;
    withZero.setTimestamp(0);
    EXPECT_NE(withZero, AudioIssueDetected());
}

TEST(AudioIssueDetected, EveryFieldCountsForEquality)
{
    EXPECT_EQ(sample(), sample());
    for (const auto& change : {+[](AudioIssueDetected& record) { record.setTimestamp(151); },
                               +[](AudioIssueDetected& record) { record.setDuration(8); },
                               +[](AudioIssueDetected& record) { record.setIssuetype("glitcH"); },
                               +[](AudioIssueDetected& record) { record.setNode("speaker2"); },
                               +[](AudioIssueDetected& record) { record.setRtaidclient(""); }}) {
        AudioIssueDetected changed = sample();
        change(changed);
        EXPECT_NE(changed, sample());
    }
}

TEST(AudioIssueDetected, HashesByItsFieldsCombined)
{
    const std::hash<std::string> hash;
    EXPECT_EQ(hash_value(sample()), 150U ^ 7U ^ hash("glitch") ^ hash("speaker") ^ hash("player"));
    EXPECT_EQ(hash_value(AudioIssueDetected()), hash("") ^ hash("") ^ hash(""));
    AudioIssueDetected withZero;
    withZero.setTimestamp(0);
    EXPECT_EQ(hash_value(withZero), hash_value(AudioIssueDetected())) << "a time stamp that is not set counts as 0";
}

TEST(AudioIssueDetected, CopiesAndMovesWhole)
{
    const AudioIssueDetected original = sample();
    AudioIssueDetected copy = original;
    EXPECT_EQ(copy, original);
    copy.setNode("other");
    EXPECT_EQ(original, sample()) << "a copy is a record of its own";

    AudioIssueDetected assigned;
    assigned = original;
    EXPECT_EQ(assigned, original);
    const AudioIssueDetected moved = std::move(assigned);
    EXPECT_EQ(moved, original);
    AudioIssueDetected movedTo;
    movedTo = AudioIssueDetected(original);
    EXPECT_EQ(movedTo, original);
}

TEST(AudioIssueDetected, SwapsWhole)
{
    AudioIssueDetected left = sample();
    AudioIssueDetected right;
    swap(left, right);
    EXPECT_EQ(left, AudioIssueDetected());
    EXPECT_EQ(right, sample());
    EXPECT_FALSE(left.hasTimestamp());
}

} // namespace
