// SPDX-License-Identifier: Apache-2.0
// Frames come out as they were sent, for any cuts of the stream, and a frame that is only announced takes no memory.
#include "platform/linux/connection/FrameReader.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <string>
#include <vector>

namespace platform {
namespace {

std::string asFrame(std::string_view frame)
{
    std::string bytes;
    appendFrame(frame, bytes);
    return bytes;
}

const std::string headOfLongest("\x00\x00\x10\x00", frameHeadSize);
const std::string headOfTooLong("\x01\x00\x10\x00", frameHeadSize);

// Feeds the bytes and appends the frames that they complete; false after an error.
bool read(FrameReader& reader, std::string_view bytes, std::vector<std::string>& frames)
{
    reader.feed(bytes);
    while (true) {
        const auto frame = reader.next();
        if (!frame)
            return false;
        if (!*frame)
            return true;
        frames.emplace_back(**frame);
    }
}

TEST(FrameReader, WritesTheLengthAsFourLittleEndianBytes)
{
    EXPECT_EQ(asFrame(std::string(0x010203, 'x')).substr(0, frameHeadSize), std::string("\x03\x02\x01\x00", 4));
    EXPECT_EQ(asFrame("abc"),
              std::string("\x03\x00\x00\x00"
                          "abc",
                          7));
}

TEST(FrameReader, HandsOutWholeFramesWhereTheyLie)
{
    const std::string bytes = asFrame("first") + asFrame("second");
    FrameReader reader;
    reader.feed(bytes);
    const auto first = reader.next();
    ASSERT_TRUE(first && *first);
    EXPECT_EQ(**first, "first");
    EXPECT_EQ((*first)->data(), bytes.data() + frameHeadSize) << "it was copied";
    EXPECT_EQ(reader.next(), std::string_view("second"));
    EXPECT_EQ(reader.next(), std::nullopt);
    EXPECT_FALSE(reader.isInsideFrame());
}

TEST(FrameReader, TakesAnEmptyFrame)
{
    FrameReader reader;
    std::vector<std::string> frames;
    EXPECT_TRUE(read(reader, asFrame("") + asFrame("x") + asFrame(""), frames));
    EXPECT_EQ(frames, (std::vector<std::string>{"", "x", ""}));
}

TEST(FrameReader, PutsAFrameTogetherFromSingleBytes)
{
    FrameReader reader;
    std::vector<std::string> frames;
    for (const char byte : asFrame("hello") + asFrame("world"))
        EXPECT_TRUE(read(reader, std::string_view(&byte, 1), frames));
    EXPECT_EQ(frames, (std::vector<std::string>{"hello", "world"}));
}

TEST(FrameReader, KnowsWhetherItStandsInsideAFrame)
{
    FrameReader reader;
    std::vector<std::string> frames;
    EXPECT_FALSE(reader.isInsideFrame());
    for (const char byte : asFrame("ab").substr(0, frameHeadSize + 1)) {
        EXPECT_TRUE(read(reader, std::string_view(&byte, 1), frames));
        EXPECT_TRUE(reader.isInsideFrame());
    }
    EXPECT_TRUE(read(reader, "b", frames));
    EXPECT_FALSE(reader.isInsideFrame());
}

TEST(FrameReader, TakesTheLongestFrameAndRefusesALongerOneByItsHead)
{
    FrameReader reader;
    std::vector<std::string> frames;
    EXPECT_TRUE(read(reader, headOfLongest + std::string(longestFrame, 'x'), frames));
    ASSERT_EQ(frames.size(), 1U);
    EXPECT_EQ(frames[0].size(), longestFrame);

    EXPECT_FALSE(read(reader, headOfTooLong, frames));
    FrameReader bytewise;
    EXPECT_TRUE(read(bytewise, headOfTooLong.substr(0, 3), frames));
    EXPECT_FALSE(read(bytewise, headOfTooLong.substr(3), frames));
}

TEST(FrameReader, GivesTheFramesBeforeOneThatIsTooLong)
{
    FrameReader reader;
    std::vector<std::string> frames;
    EXPECT_FALSE(read(reader, asFrame("good") + headOfTooLong + "more", frames));
    EXPECT_EQ(frames, std::vector<std::string>{"good"});
}

TEST(FrameReader, HoldsWhatCameAndNotWhatWasAnnounced)
{
    FrameReader reader;
    std::vector<std::string> frames;
    EXPECT_TRUE(read(reader, headOfLongest + "a few bytes", frames));
    EXPECT_LT(reader.heldBytes(), 64U);
    EXPECT_TRUE(read(reader, std::string(1000, 'x'), frames));
    EXPECT_LT(reader.heldBytes(), 3000U);
}

TEST(FrameReader, GivesTheRoomForALargeFrameBack)
{
    FrameReader reader;
    std::vector<std::string> frames;
    const std::string bytes = asFrame(std::string(longestFrame, 'x'));
    EXPECT_TRUE(read(reader, std::string_view(bytes).substr(0, 1000), frames));
    EXPECT_TRUE(read(reader, std::string_view(bytes).substr(1000), frames));
    ASSERT_EQ(frames.size(), 1U);
    EXPECT_LT(reader.heldBytes(), 64U);
}

// If every piece moved all earlier bytes, this would move half a terabyte.
TEST(FrameReader, PutsALargeFrameTogetherFromSingleBytesInReasonableTime)
{
    FrameReader reader;
    std::vector<std::string> frames;
    const std::string bytes = asFrame(std::string(longestFrame, 'x'));
    for (const char byte : bytes)
        ASSERT_TRUE(read(reader, std::string_view(&byte, 1), frames));
    ASSERT_EQ(frames.size(), 1U);
    EXPECT_EQ(frames[0].size(), longestFrame);
}

RC_GTEST_PROP(FrameReader, GivesTheSameFramesHoweverTheStreamIsCut, (const std::vector<std::string>& sent))
{
    std::string stream;
    for (const std::string& frame : sent)
        appendFrame(frame, stream);
    FrameReader reader;
    std::vector<std::string> received;
    std::string_view rest = stream;
    while (!rest.empty()) {
        const auto count = *rc::gen::inRange<std::size_t>(1, rest.size() + 1);
        const std::string piece(rest.substr(0, count)); // a copy, so that a sanitizer detects reading past its end
        RC_ASSERT(read(reader, piece, received));
        rest.remove_prefix(count);
    }
    RC_ASSERT(received == sent);
    RC_ASSERT(!reader.isInsideFrame());
}

} // namespace
} // namespace platform
