// SPDX-License-Identifier: Apache-2.0
// All errors of foreign bytes; none of them costs more than it may.
#include "foundation/cbor/Cbor.h"

#include "foundation/LargestAllocation.h"
#include "foundation/cbor/Hex.h"
#include "foundation/values/GeneratedValues.h"

#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace foundation {
namespace {

std::expected<Value, CborError> decode(std::string_view bytes)
{
    CborDecoder decoder;
    return decoder.decode(bytes);
}

void expectError(std::string_view hex, CborError error)
{
    const auto read = decode(fromHex(hex));
    ASSERT_FALSE(read) << hex << " is " << read->text();
    EXPECT_EQ(read.error(), error) << hex << ": " << description(read.error());
}

TEST(CborError, Truncated)
{
    // A head that misses bytes of its own, content shorter than its length, containers with items missing, and
    // indefinite lengths without a break.
    for (const std::string_view hex : {"",       "18",      "19",         "1901",     "1a010203", "1b01020304050607",
                                       "38",     "f9",      "f900",       "fa000000", "d8",       "fb00000000000000",
                                       "41",     "6261",    "5affffffff", "81",       "8200",     "818181818181818181",
                                       "a1",     "a16161",  "a2616100",   "c1",       "c11a514b", "9f8180",
                                       "5f",     "5f4100",  "7f6161",     "9f",       "9f01",     "bf",
                                       "bf6161", "bf616101"})
        expectError(hex, CborError::Truncated);
}

TEST(CborError, TrailingBytes)
{
    for (const std::string_view hex : {"0000", "f600", "8000", "8100a1", "a000", "6161ff", "9fffff", "c10000", "00ff"})
        expectError(hex, CborError::TrailingBytes);
}

TEST(CborError, TooDeep)
{
    const std::string deepest = std::string(cborMaximumDepth, '\x81') + '\xF6';
    EXPECT_TRUE(decode(deepest));
    EXPECT_EQ(decode('\x81' + deepest).error(), CborError::TooDeep);

    std::string maps;
    for (unsigned depth = 0; depth < cborMaximumDepth; ++depth)
        maps += "\xA1\x61k";
    EXPECT_TRUE(decode(maps + '\xF6'));
    EXPECT_EQ(decode(maps + "\xA0").error(), CborError::TooDeep);
    EXPECT_EQ(decode(maps + "\x80").error(), CborError::TooDeep);
    EXPECT_EQ(decode(std::string(cborMaximumDepth + 1, '\x9F')).error(), CborError::TooDeep);
}

TEST(CborError, TheDepthIsTheCallersToChoose)
{
    CborDecoder decoder;
    EXPECT_TRUE(decoder.decode("\x01", 0));
    EXPECT_EQ(decoder.decode("\x80", 0).error(), CborError::TooDeep);
    EXPECT_TRUE(decoder.decode("\x81\xA0", 2));
    EXPECT_EQ(decoder.decode("\x81\x81\xA0", 2).error(), CborError::TooDeep);
}

// A million nested tags would overflow the stack of a recursive reader.
TEST(CborError, TagsDoNotNest)
{
    EXPECT_EQ(decode(std::string(1 << 20, '\xC1')).error(), CborError::Malformed);
}

TEST(CborError, Malformed)
{
    for (unsigned major = 0; major < 8; ++major)
        for (unsigned reserved = 28; reserved <= 30; ++reserved)
            expectError(toHex(std::string(1, static_cast<char>(major << 5 | reserved))), CborError::Malformed);
    // Lengths that cannot be indefinite, breaks where nothing can end.
    for (const std::string_view hex :
         {"1f", "3f", "df", "ff", "81ff", "8200ff", "a1ff", "a16161ff", "bf6161ff", "c1ff", "9fc1ffff"})
        expectError(hex, CborError::Malformed);
    // Chunks of another type, of an indefinite length, or not strings at all.
    for (const std::string_view hex :
         {"5f6100ff", "7f4100ff", "5f00ff", "7f00ff", "5f5f4100ffff", "7f7f6161ffff", "5f8000ff", "5fc000ff", "5ff6ff"})
        expectError(hex, CborError::Malformed);
    // Simple values that have a shorter head.
    for (const std::string_view hex : {"f800", "f814", "f818", "f81f"})
        expectError(hex, CborError::Malformed);
    // Dates with content that is not a number.
    for (const std::string_view hex : {"c1f5", "c1f6", "c16130", "c1420000", "c180", "c1a0", "c1c100"})
        expectError(hex, CborError::Malformed);
}

TEST(CborError, InvalidUtf8)
{
    for (const std::string_view hex : {"61ff", "62c080", "63eda080", "64f4908080", "61c3", "a161ff00", "7f61ffff",
                                       "7f61c361bcff"}) // a character cut in two by chunks
        expectError(hex, CborError::InvalidUtf8);
}

TEST(CborError, KeyNotText)
{
    for (const std::string_view hex : {"a10000", "a12000", "a1416100", "a18000", "a1a000", "a1c10000", "a1f600",
                                       "a1fa0000000000", "bf0000ff", "a2616100f400"})
        expectError(hex, CborError::KeyNotText);
}

TEST(CborError, Unsupported)
{
    for (const std::string_view hex : {"f7", "e0", "f3", "f820", "f8ff", "c000", "c24100", "d9d9f700", "81f7", "c1f7"})
        expectError(hex, CborError::Unsupported);
}

TEST(CborError, IntegerOutOfRange)
{
    EXPECT_EQ(*decode(fromHex("3b7fffffffffffffff")), Value(std::numeric_limits<std::int64_t>::min()));
    for (const std::string_view hex : {"3b8000000000000000", "3bffffffffffffffff", "c13bffffffffffffffff"})
        expectError(hex, CborError::IntegerOutOfRange);
}

TEST(CborError, EachHasWordsOfItsOwn)
{
    std::set<std::string_view> all;
    for (const CborError error :
         {CborError::Truncated, CborError::TrailingBytes, CborError::TooDeep, CborError::Malformed,
          CborError::InvalidUtf8, CborError::KeyNotText, CborError::Unsupported, CborError::IntegerOutOfRange})
        all.insert(description(error));
    EXPECT_EQ(all.size(), 8U);
    EXPECT_EQ(description(CborError::InvalidUtf8), "text is not valid UTF-8");
}

RC_GTEST_PROP(CborErrorProperty, CutAtAnyByteAnItemIsTruncatedAndNothingElse, ())
{
    std::string encoded;
    appendCbor(*generated::value(), encoded);
    CborDecoder decoder;
    for (std::size_t size = 0; size < encoded.size(); ++size) {
        const auto read = decoder.decode(std::string_view(encoded).substr(0, size));
        RC_ASSERT(!read);
        RC_ASSERT(read.error() == CborError::Truncated);
    }
}

RC_GTEST_PROP(CborErrorProperty, AByteThatFollowsIsNeverOverlooked, (char follower))
{
    std::string encoded;
    appendCbor(*generated::value(), encoded);
    encoded.push_back(follower);
    RC_ASSERT(decode(encoded).error() == CborError::TrailingBytes);
}

// None of 2^64 claimed bytes, elements or entries is allocated before it has arrived.
TEST(CborError, AClaimOfLengthCostsNothing)
{
    constexpr std::size_t modest = 8192;
    for (const unsigned major : {2U, 3U, 4U, 5U})
        for (const std::string_view length : {"1affffffff", "1b7fffffffffffffff", "1bffffffffffffffff"}) {
            std::string bytes = fromHex(length);
            bytes.front() = static_cast<char>(major << 5 | (static_cast<unsigned>(bytes.front()) & 0x1F));
            for (const std::string_view before : {"", "\x81", "\xA1\x61k", "\x9F", "\x5F", "\x7F"}) {
                const std::string hostile = std::string(before) + bytes;
                forgetAllocations();
                const auto read = decode(hostile);
                EXPECT_LE(largestAllocation(), modest) << toHex(hostile);
                EXPECT_FALSE(read);
            }
        }
}

// The cheapest element is one byte. It may cost only a value's 16 bytes, without an object.
TEST(CborError, EmptyContainersCostNoMoreThanTheirPlace)
{
    constexpr std::size_t count = 1'000'000;
    for (const char empty : {'\x80', '\xA0', '\x60', '\x40'}) {
        const std::string bytes = '\x9F' + std::string(count, empty) + '\xFF';
        forgetAllocations();
        const auto read = decode(bytes);
        EXPECT_LE(largestAllocation(), 2 * count * sizeof(Value)) << "while they are gathered";
        ASSERT_TRUE(read);
        EXPECT_EQ(read->array()->size(), count);
        forgetAllocations();
        const Array copy(std::vector<Value>(read->array()->begin(), read->array()->end()));
        EXPECT_EQ(largestAllocation(), sizeof(ArrayObject) + count * sizeof(Value));
    }
}

} // namespace
} // namespace foundation
