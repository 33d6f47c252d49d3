// SPDX-License-Identifier: Apache-2.0
// The wire format by hand: every wire type, all errors, and no reading beyond the last byte.
#include "foundation/protobuf/ProtobufReader.h"

#include "foundation/GuardedBytes.h"
#include "foundation/LargestAllocation.h"

#include <gmock/gmock.h>
#include <ostream>
#include <string>
#include <vector>

namespace foundation {

// How failures show fields.
inline void PrintTo(const ProtobufField& field, std::ostream* out)
{
    *out << field.number << " of type " << static_cast<int>(field.wireType) << ": " << field.integer << " \""
         << field.bytes << '"';
}

namespace {

using namespace std::string_literals;
using enum ProtobufWireType;
using testing::ElementsAre;
using testing::IsEmpty;

struct Read {
    std::vector<ProtobufField> fields;
    std::optional<ProtobufError> error;
};

// All fields; their bytes become invalid with the guard, so a test may only use members that do not need them.
Read readAll(std::string_view bytes)
{
    ProtobufReader reader(bytes);
    Read read;
    while (const auto field = reader.next())
        read.fields.push_back(*field);
    EXPECT_EQ(reader.next(), std::nullopt) << "the end stays the end";
    if (const auto result = reader.result(); !result)
        read.error = result.error();
    return read;
}

std::optional<ProtobufError> errorOf(const std::string& bytes)
{
    return readAll(GuardedBytes(bytes).view()).error;
}

MATCHER_P3(IsInteger, number, wireType, integer, "")
{
    return arg.number == static_cast<std::uint32_t>(number) && arg.wireType == wireType
        && arg.integer == static_cast<std::uint64_t>(integer) && arg.bytes.empty();
}

MATCHER_P3(HasBytes, number, wireType, bytes, "")
{
    return arg.number == static_cast<std::uint32_t>(number) && arg.wireType == wireType && arg.bytes == bytes;
}

TEST(ProtobufReader, AnEmptyMessageHasNoField)
{
    const Read read = readAll({});
    EXPECT_THAT(read.fields, IsEmpty());
    EXPECT_EQ(read.error, std::nullopt);
}

TEST(ProtobufReader, ReadsEveryWireType)
{
    const std::string bytes = "\x08\x96\x01" // 1: 150
                              "\x11\x01\x02\x03\x04\x05\x06\x07\x88" // 2: eight bytes, the lowest first
                              "\x1A\x03"
                              "abc" // 3: "abc"
                              "\x25\x01\x02\x03\x84"s; // 4: four bytes
    const Read read = readAll(bytes);
    EXPECT_THAT(read.fields,
                ElementsAre(IsInteger(1, Varint, 150), IsInteger(2, Fixed64, 0x8807060504030201),
                            HasBytes(3, LengthDelimited, "abc"), IsInteger(4, Fixed32, 0x84030201)));
    EXPECT_EQ(read.error, std::nullopt);
}

TEST(ProtobufReader, PassesAGroupAsOneFieldThatHoldsItsFields)
{
    const std::string bytes = "\x0B\x10\x05\x1B\x1C\x0C\x20\x07"s; // group 1 {2: 5, group 3 {}}, 4: 7
    const Read read = readAll(bytes);
    EXPECT_THAT(read.fields, ElementsAre(HasBytes(1, Group, "\x10\x05\x1B\x1C"), IsInteger(4, Varint, 7)));
    EXPECT_EQ(read.error, std::nullopt);
}

TEST(ProtobufReader, ReadsNumbersOfAllLengths)
{
    EXPECT_THAT(readAll("\x08\x00"s).fields, ElementsAre(IsInteger(1, Varint, 0)));
    EXPECT_THAT(readAll("\x08\x7F"s).fields, ElementsAre(IsInteger(1, Varint, 127)));
    EXPECT_THAT(readAll("\x08\x80\x01"s).fields, ElementsAre(IsInteger(1, Varint, 128)));
    EXPECT_THAT(readAll("\x08\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"s).fields,
                ElementsAre(IsInteger(1, Varint, UINT64_MAX)));
    EXPECT_THAT(readAll("\xF8\xFF\xFF\xFF\x0F\x01"s).fields, ElementsAre(IsInteger((1U << 29) - 1, Varint, 1)));
}

TEST(ProtobufReader, ANumberMayBeWrittenLongerThanItNeedsToBe)
{
    EXPECT_THAT(readAll("\x88\x80\x00\x81\x80\x80\x80\x80\x80\x80\x80\x80\x00"s).fields,
                ElementsAre(IsInteger(1, Varint, 1)));
}

TEST(ProtobufReader, RefusesANumberOfMoreThanTenBytes)
{
    EXPECT_EQ(errorOf("\x08\x80\x80\x80\x80\x80\x80\x80\x80\x80\x80\x00"s), ProtobufError::VarintTooLong);
    EXPECT_EQ(errorOf("\x08"s + std::string(10, '\xFF')), ProtobufError::VarintTooLong)
        << "an eleventh byte is announced";
    EXPECT_EQ(errorOf("\x08"s + std::string(100'000, '\x80')), ProtobufError::VarintTooLong);
}

TEST(ProtobufReader, RefusesANumberOfMoreThan64Bits)
{
    EXPECT_EQ(errorOf("\x08\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x02"s), ProtobufError::VarintTooLong);
}

TEST(ProtobufReader, RefusesATagOrALengthOfMoreThan32Bits)
{
    EXPECT_EQ(errorOf("\x88\x80\x80\x80\x10\x01"s), ProtobufError::VarintTooLong);
    EXPECT_EQ(errorOf("\x88\x80\x80\x80\x80\x00\x01"s), ProtobufError::VarintTooLong);
    EXPECT_EQ(errorOf("\x0A\x80\x80\x80\x80\x10"s), ProtobufError::VarintTooLong);
    EXPECT_EQ(errorOf("\x0A\x81\x80\x80\x80\x80\x00\x61"s), ProtobufError::VarintTooLong);
}

TEST(ProtobufReader, RefusesAFieldWithoutANumberOrOfAnUnknownWireType)
{
    EXPECT_EQ(errorOf("\x00\x01"s), ProtobufError::InvalidTag);
    EXPECT_EQ(errorOf("\x02\x00"s), ProtobufError::InvalidTag);
    EXPECT_EQ(errorOf("\x03\x04"s), ProtobufError::InvalidTag);
    EXPECT_EQ(errorOf("\x0E\x01"s), ProtobufError::InvalidTag);
    EXPECT_EQ(errorOf("\x0F\x01"s), ProtobufError::InvalidTag);
}

TEST(ProtobufReader, EveryTruncationIsRefusedAndReadsNothingBeyondTheEnd)
{
    for (const std::string& whole :
         {"\x08\x96\x01"s, "\x11\x01\x02\x03\x04\x05\x06\x07\x08"s, "\x1A\x03"s + "abc", "\x25\x01\x02\x03\x04"s,
          "\x0B\x10\x05\x1B\x1C\x0C"s, "\xF8\xFF\xFF\xFF\x0F\x01"s}) {
        ASSERT_EQ(errorOf(whole), std::nullopt);
        for (std::size_t length = 1; length < whole.size(); ++length)
            EXPECT_EQ(errorOf(whole.substr(0, length)), ProtobufError::Truncated) << length;
    }
}

TEST(ProtobufReader, ALengthBeyondTheRestIsRefusedAndNotBelieved)
{
    EXPECT_EQ(errorOf("\x0A\x01"s), ProtobufError::Truncated);
    EXPECT_EQ(errorOf("\x0A\x04"s + "abc"), ProtobufError::Truncated);
    const std::string claim = "\x0A\xFF\xFF\xFF\xFF\x0F"s; // 4 GiB
    forgetAllocations();
    ProtobufReader reader(claim);
    EXPECT_EQ(reader.next(), std::nullopt);
    EXPECT_EQ(largestAllocation(), 0U);
    EXPECT_EQ(reader.result().error(), ProtobufError::Truncated);
}

TEST(ProtobufReader, ReadingAllocatesNothing)
{
    const std::string bytes = "\x08\x96\x01\x1A\x03"s + "abc" + "\x0B\x10\x05\x0C"s;
    forgetAllocations();
    ProtobufReader reader(bytes);
    int fields = 0;
    while (reader.next())
        ++fields;
    EXPECT_EQ(largestAllocation(), 0U);
    EXPECT_EQ(fields, 3);
}

TEST(ProtobufReader, RefusesTheEndOfAGroupThatDidNotBegin)
{
    EXPECT_EQ(errorOf("\x0C"s), ProtobufError::UnmatchedEndGroup);
    EXPECT_EQ(errorOf("\x0B\x14"s), ProtobufError::UnmatchedEndGroup) << "the end of another group";
    EXPECT_EQ(errorOf("\x0B\x13\x0C\x14"s), ProtobufError::UnmatchedEndGroup) << "crossed";
    EXPECT_EQ(errorOf("\x0B\x0C\x0C"s), ProtobufError::UnmatchedEndGroup) << "one too many";
}

TEST(ProtobufReader, RefusesWhatIsBrokenInsideAGroup)
{
    EXPECT_EQ(errorOf("\x0B\x00\x0C"s), ProtobufError::InvalidTag);
    EXPECT_EQ(errorOf("\x0B\x12\x7F\x0C"s), ProtobufError::Truncated);
}

TEST(ProtobufReader, GroupsNestAsDeepAsAllowedAndNoDeeper)
{
    const auto nested = [](unsigned depth) { return std::string(depth, '\x0B') + std::string(depth, '\x0C'); };
    EXPECT_EQ(errorOf(nested(ProtobufReader::deepestGroup)), std::nullopt);
    EXPECT_EQ(errorOf(nested(ProtobufReader::deepestGroup + 1)), ProtobufError::TooDeep);
    EXPECT_EQ(errorOf(std::string(10'000'000, '\x0B')), ProtobufError::TooDeep);
}

TEST(ProtobufReader, FieldsBeforeWhatIsBrokenAreRead)
{
    const Read read = readAll("\x08\x01\x10\x02\x1A\x05"s + "abc");
    EXPECT_THAT(read.fields, ElementsAre(IsInteger(1, Varint, 1), IsInteger(2, Varint, 2)));
    EXPECT_EQ(read.error, ProtobufError::Truncated);
}

TEST(ProtobufReader, EveryErrorHasWords)
{
    std::vector<std::string_view> words;
    for (const auto error : {ProtobufError::Truncated, ProtobufError::VarintTooLong, ProtobufError::InvalidTag,
                             ProtobufError::UnmatchedEndGroup, ProtobufError::TooDeep})
        words.push_back(description(error));
    EXPECT_THAT(words,
                ElementsAre("the message ends inside a field", "a number is too long",
                            "a field has no valid number or wire type", "a group ends that did not begin",
                            "groups are nested too deep"));
}

} // namespace
} // namespace foundation
