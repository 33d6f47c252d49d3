// SPDX-License-Identifier: Apache-2.0
// The text of a channel's file: its meaning, and its errors.
#include "platform/linux/channels/ChannelFile.h"

#include <gmock/gmock.h>
#include <string>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::Field;

std::uint8_t number(ChannelFormat format)
{
    return static_cast<std::uint8_t>(format);
}

void expectError(std::string_view text, ChannelFileError error)
{
    const auto channel = parseChannelFile(text);
    ASSERT_FALSE(channel) << text;
    EXPECT_EQ(channel.error(), error) << text << ": " << description(channel.error());
}

TEST(ChannelFile, HoldsASimpleValue)
{
    EXPECT_EQ(parseChannelFile("simple\n1234\n")->format, number(ChannelFormat::Simple));
    EXPECT_EQ(parseChannelFile("simple\n1234\n")->value, 1234);
    EXPECT_EQ(parseChannelFile("simple\n-9223372036854775808\n")->value, INT64_MIN);
    EXPECT_EQ(parseChannelFile("simple\n9223372036854775807\n")->value, INT64_MAX);
}

TEST(ChannelFile, HoldsAHistogramWithItsUnit)
{
    const auto channel = parseChannelFile("histogram ms\n3 37\n0 10 5\n10 20 0\n20 30 2\n");
    ASSERT_TRUE(channel);
    EXPECT_EQ(channel->format, number(ChannelFormat::Histogram));
    EXPECT_EQ(channel->unit, "ms");
    EXPECT_EQ(channel->minimum, 3);
    EXPECT_EQ(channel->maximum, 37);
    ASSERT_EQ(channel->buckets.size(), 3U);
    EXPECT_EQ(channel->buckets[2].lower, 20);
    EXPECT_EQ(channel->buckets[2].upper, 30);
    EXPECT_EQ(channel->buckets[2].hits, 2);
    EXPECT_EQ(channel->buckets[2].boundsError, 0);
}

TEST(ChannelFile, HoldsAHistogramWithoutUnitOrBuckets)
{
    const auto channel = parseChannelFile("histogram\n0 0\n");
    ASSERT_TRUE(channel);
    EXPECT_EQ(channel->unit, std::nullopt);
    EXPECT_TRUE(channel->buckets.empty());
    EXPECT_EQ(parseChannelFile("histogram frames a second\n0 0\n")->unit, "frames a second");
    EXPECT_EQ(parseChannelFile("histogram\n-5 -1\n-10 0 1\n")->buckets[0].lower, -10);
}

TEST(ChannelFile, HoldsStatesWhoseNamesMayHaveBlanks)
{
    const auto channel = parseChannelFile("state\nRunning 12 88000 0.880000\nLow Power 11 12000 0.120000\n");
    ASSERT_TRUE(channel);
    EXPECT_EQ(channel->format, number(ChannelFormat::State));
    EXPECT_THAT(channel->states,
                ElementsAre(Field(&StateResidency::name, "Running"), Field(&StateResidency::name, "Low Power")));
    EXPECT_EQ(channel->states[1].transitions, 11U);
    EXPECT_EQ(channel->states[1].residency, 12'000U);
    EXPECT_DOUBLE_EQ(channel->states[1].dutyCycle, 0.12);
    EXPECT_EQ(parseChannelFile("state\nOn 18446744073709551615 18446744073709551615 1\n")->states[0].residency,
              UINT64_MAX);
    EXPECT_TRUE(parseChannelFile("state\n")->states.empty());
}

TEST(ChannelFile, IsRefusedWhereverItIsCutInsideALine)
{
    for (const std::string whole : {"simple\n1234\n", "histogram ms\n3 37\n0 10 5\n10 20 0\n",
                                    "state\nRunning 12 88000 0.880000\nIdle 11 12000 0.120000\n"}) {
        ASSERT_TRUE(parseChannelFile(whole));
        for (std::size_t length = 0; length < whole.size(); ++length) {
            if (length == 0 || whole[length - 1] != '\n')
                expectError(whole.substr(0, length), ChannelFileError::Unfinished);
        }
    }
    expectError("simple\n", ChannelFileError::Malformed);
    expectError("histogram ms\n", ChannelFileError::Malformed);
}

TEST(ChannelFile, IsOneOfThreeKinds)
{
    for (const char* text : {"\n", "simpel\n1\n", "Simple\n1\n", "simple \n1\n", " simple\n1\n", "histogramms\n0 0\n",
                             "state On\nOn 1 1 1\n", "1234\n"})
        expectError(text, ChannelFileError::UnknownKind);
}

TEST(ChannelFile, HasNothingButNumbersWhereNumbersBelong)
{
    for (const char* text : {"simple\n\n",
                             "simple\nx\n",
                             "simple\n+1\n",
                             "simple\n 1\n",
                             "simple\n1 \n",
                             "simple\n1\n\n",
                             "simple\n1\n2\n",
                             "simple\n1.5\n",
                             "simple\n0x10\n",
                             "simple\n9223372036854775808\n",
                             "simple\n1\r\n",
                             "histogram\n1\n",
                             "histogram\n1 2 3\n",
                             "histogram\n1 2\n0 10\n",
                             "histogram\n1 2\n0 10 5 5\n",
                             "histogram\n1 2\n0  10 5\n",
                             "histogram\n1 2\n\n",
                             "histogram\n1 2\n0 10 -1\n",
                             "histogram\n1 2\n0 ten 5\n",
                             "state\nOn 1 1\n",
                             "state\n 1 1 1\n",
                             "state\nOn -1 1 1\n",
                             "state\nOn 1 -1 1\n",
                             "state\nOn 1 1 nan\n",
                             "state\nOn 1 1 inf\n",
                             "state\nOn 1 1 -0.5\n",
                             "state\nOn 1 1 1,0\n",
                             "state\nOn 1 18446744073709551616 1\n",
                             "state\n\n",
                             "state\nOn 1 1 1 \n"})
        expectError(text, ChannelFileError::Malformed);
}

TEST(ChannelFile, HasNoMoreBucketsAndStatesThanAChannelMay)
{
    std::string histogram = "histogram\n0 0\n";
    for (std::size_t count = 0; count < mostChannelBuckets; ++count)
        histogram += "0 1 1\n";
    EXPECT_EQ(parseChannelFile(histogram)->buckets.size(), mostChannelBuckets);
    expectError(histogram + "0 1 1\n", ChannelFileError::TooManyLines);

    std::string states = "state\n";
    for (std::size_t count = 0; count < mostChannelStates; ++count)
        states += "s" + std::to_string(count) + " 1 1 1\n";
    EXPECT_EQ(parseChannelFile(states)->states.size(), mostChannelStates);
    expectError(states + "s 1 1 1\n", ChannelFileError::TooManyLines);
}

TEST(ChannelFile, HasNoTwoStatesOfOneName)
{
    expectError("state\nOn 1 1 1\nOff 1 1 1\nOn 1 1 1\n", ChannelFileError::RepeatedState);
    EXPECT_TRUE(parseChannelFile("state\nOn 1 1 1\non 1 1 1\nOn  1 1 1\n")) << "blanks count";
}

TEST(ChannelFile, IsUtf8)
{
    EXPECT_EQ(parseChannelFile("histogram µs\n0 0\n")->unit, "µs");
    expectError("histogram \xB5s\n0 0\n", ChannelFileError::NotUtf8);
    expectError("state\nOn\xFF 1 1 1\n", ChannelFileError::NotUtf8);
}

TEST(ChannelFile, SaysInWordsWhatIsWrongWithIt)
{
    EXPECT_EQ(description(ChannelFileError::Unfinished), "it is not finished");
    EXPECT_EQ(description(ChannelFileError::TooManyLines), "it has too many buckets or states");
}

} // namespace
} // namespace platform
