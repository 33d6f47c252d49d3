// SPDX-License-Identifier: Apache-2.0
// The written bytes, and the text.
#include "foundation/protobuf/ProtobufWriter.h"
#include "foundation/protobuf/ProtobufTextFormatter.h"

#include <gtest/gtest.h>

namespace foundation {
namespace {

using namespace std::string_literals;

std::string varint(std::uint32_t field, std::uint64_t value)
{
    std::string out;
    ProtobufWriter(out).writeVarint(field, value);
    return out;
}

TEST(ProtobufWriter, WritesNumbersInAsFewBytesAsTheyTake)
{
    EXPECT_EQ(varint(1, 0), "\x08\x00"s);
    EXPECT_EQ(varint(1, 127), "\x08\x7F"s);
    EXPECT_EQ(varint(1, 128), "\x08\x80\x01"s);
    EXPECT_EQ(varint(2, 150), "\x10\x96\x01"s);
    EXPECT_EQ(varint(15, 1), "\x78\x01"s);
    EXPECT_EQ(varint(16, 1), "\x80\x01\x01"s);
    EXPECT_EQ(varint((1U << 29) - 1, UINT64_MAX), "\xF8\xFF\xFF\xFF\x0F\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"s);
}

TEST(ProtobufWriter, WritesTextBehindItsLength)
{
    std::string out;
    ProtobufWriter writer(out);
    writer.writeString(3, "");
    writer.writeString(4, "a\0b"s);
    EXPECT_EQ(out, "\x1A\x00\x22\x03"s + "a\0b"s);
    out.clear();
    writer.writeString(1, std::string(300, 'x'));
    EXPECT_EQ(out, "\x0A\xAC\x02"s + std::string(300, 'x'));
}

TEST(ProtobufWriter, AppendsToWhatIsThere)
{
    std::string out = "before";
    ProtobufWriter writer(out);
    writer.reserve(1000);
    EXPECT_EQ(out, "before");
    writer.writeVarint(1, 1);
    EXPECT_EQ(out, "before\x08\x01");
}

TEST(ProtobufTextFormatter, WritesAFieldALineAndObjectsIndented)
{
    std::string out;
    ProtobufTextFormatter formatter(out);
    formatter.beginObject("outer");
    formatter.format("number", UINT64_MAX);
    formatter.beginObject("inner");
    formatter.format("text", "plain");
    formatter.endObject();
    formatter.endObject();
    EXPECT_EQ(out,
              "outer {\n"
              "  number: 18446744073709551615\n"
              "  inner {\n"
              "    text: \"plain\"\n"
              "  }\n"
              "}\n");
}

TEST(ProtobufTextFormatter, EscapesWhatIsNotPlainText)
{
    std::string out;
    ProtobufTextFormatter(out).format("text", "\"a\\b\nc\0001\x7F\xC3\xA9"s);
    EXPECT_EQ(out, "text: \"\\\"a\\\\b\\nc\\0001\\177\\303\\251\"\n");
}

} // namespace
} // namespace foundation
