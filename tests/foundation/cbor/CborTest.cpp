// SPDX-License-Identifier: Apache-2.0
// Written values are read back unchanged; and heads that callers write by hand match those of values.
#include "foundation/cbor/Cbor.h"

#include "foundation/LargestAllocation.h"
#include "foundation/cbor/Hex.h"
#include "foundation/values/GeneratedValues.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <string>
#include <string_view>
#include <vector>

namespace foundation {
namespace {

std::string encoded(const Value& value)
{
    std::string bytes;
    appendCbor(value, bytes);
    return bytes;
}

RC_GTEST_PROP(CborProperty, WhatIsWrittenIsReadBackByteForByte, ())
{
    const Value value = *generated::value();
    const std::string bytes = encoded(value);
    CborDecoder decoder;
    const auto read = decoder.decode(bytes);
    RC_ASSERT(read.has_value());
    RC_ASSERT(*read == value);
    RC_ASSERT(encoded(*read) == bytes); // equality forgives the kind of a number; this does not
    RC_ASSERT(decoder.mostMemory() >= read->roughBytes());
}

RC_GTEST_PROP(CborProperty, AnythingAtAllIsReadOrRefused, (const std::string& bytes))
{
    CborDecoder decoder;
    if (const auto read = decoder.decode(bytes)) {
        const std::string again = encoded(*read);
        RC_ASSERT(encoded(*decoder.decode(again)) == again);
    }
}

// Random bytes are seldom close to CBOR, so this changes one byte of an item.
RC_GTEST_PROP(CborProperty, AnItemWithOneByteChangedIsReadOrRefused, (char byte))
{
    std::string bytes = encoded(*generated::value());
    bytes[*rc::gen::inRange<std::size_t>(0, bytes.size())] = byte;
    CborDecoder decoder;
    if (const auto read = decoder.decode(bytes)) {
        const std::string again = encoded(*read);
        RC_ASSERT(encoded(*decoder.decode(again)) == again);
    }
}

TEST(Cbor, HeadsAreTheShortest)
{
    for (const auto& [value, hex] : std::initializer_list<std::pair<std::uint64_t, std::string_view>>{
             {23, "17"},
             {24, "1818"},
             {255, "18ff"},
             {256, "190100"},
             {65535, "19ffff"},
             {65536, "1a00010000"},
             {4294967295, "1affffffff"},
             {4294967296, "1b0000000100000000"},
         }) {
        EXPECT_EQ(toHex(encoded(value)), hex);
        EXPECT_EQ(toHex(encoded(static_cast<std::int64_t>(value))), hex);
        std::string integer;
        appendCborInteger(value, integer);
        EXPECT_EQ(toHex(integer), hex);
    }
    EXPECT_EQ(toHex(encoded(std::numeric_limits<std::int64_t>::min())), "3b7fffffffffffffff");
}

TEST(Cbor, LongerHeadsAreReadAllTheSame)
{
    CborDecoder decoder;
    EXPECT_EQ(*decoder.decode(fromHex("1b0000000000000001")), Value(1));
    EXPECT_EQ(*decoder.decode(fromHex("9a00000001190001")), Value(Array{1}));
    EXPECT_EQ(*decoder.decode(fromHex("b9000178016101")), Value(Dictionary{{"a", 1}}));
}

TEST(Cbor, AMessageWrittenByHandIsTheMessageWrittenAsAValue)
{
    std::string bytes;
    appendCborArrayHead(3, bytes);
    appendCborInteger(7, bytes);
    appendCborNull(bytes);
    appendCborMapHead(1, bytes);
    appendCborText("mute", bytes);
    appendCborText("no", bytes);
    EXPECT_EQ(bytes, encoded(Array{7U, Value(), Dictionary{{"mute", "no"}}}));
}

RC_GTEST_PROP(CborProperty, SizeIsThatOfTheEncoding, ())
{
    const Dictionary dictionary{{"gain", 0.5F}, {"value", *generated::value()}};
    RC_ASSERT(cborSize(dictionary) == encoded(dictionary).size());
}

TEST(Cbor, SizeIsThatOfTheShortestHeads)
{
    const auto sizeOf = [](const Value& value) { return cborSize({{"a", value}}) - cborSize({{"a", Value()}}) + 1; };
    EXPECT_EQ(sizeOf(23), 1U);
    EXPECT_EQ(sizeOf(24), 2U);
    EXPECT_EQ(sizeOf(-24), 1U);
    EXPECT_EQ(sizeOf(-257), 3U);
    EXPECT_EQ(sizeOf(0xFFFF), 3U);
    EXPECT_EQ(sizeOf(0x10000), 5U);
    EXPECT_EQ(sizeOf(0xFFFFFFFFU), 5U);
    EXPECT_EQ(sizeOf(std::numeric_limits<std::uint64_t>::max()), 9U);
    EXPECT_EQ(sizeOf(true), 1U);
    EXPECT_EQ(sizeOf(0.5F), 5U);
    EXPECT_EQ(sizeOf(0.5), 9U);
    EXPECT_EQ(sizeOf(Date{0}), 10U);
    EXPECT_EQ(sizeOf(Data{std::string_view("abc")}), 4U);
    EXPECT_EQ(sizeOf(std::string(24, 'x')), 26U);
    EXPECT_EQ(sizeOf(Dictionary{{"b", Array{1}}}), 5U);
}

TEST(Cbor, AsksForNoMoreMemoryThanTheEncodingTakes)
{
    const Value numbers = Array(std::vector<Value>(100'000, Value(1)));
    std::string bytes;
    forgetAllocations();
    appendCbor(numbers, bytes);
    EXPECT_EQ(bytes.size(), 100'005U);
    EXPECT_LE(largestAllocation(), 100'006U);
}

TEST(Cbor, IsAppended)
{
    std::string bytes = "before";
    appendCbor(Dictionary{{"a", 1}}, bytes);
    EXPECT_EQ(bytes, "before\xA1\x61\x61\x01");
}

TEST(Cbor, OfRepeatedKeysTheLaterWinsInTheFirstPlace)
{
    CborDecoder decoder;
    const auto read = decoder.decode(fromHex("a3616101616202616103"));
    ASSERT_TRUE(read);
    EXPECT_EQ(toHex(encoded(*read)), "a2616103616202");
}

TEST(Cbor, IndefiniteLengthsNest)
{
    CborDecoder decoder;
    const auto read = decoder.decode(fromHex("bf7f616b6131ff9f5f4101ff7fff5fffffff"));
    ASSERT_TRUE(read) << description(read.error());
    EXPECT_EQ(*read, Value(Dictionary{{"k1", Array{Data{"\x01"}, "", Data{}}}}));
}

TEST(Cbor, TheKeysOfLaterMessagesAreTheSameObjects)
{
    CborDecoder decoder;
    const std::string bytes = encoded(Dictionary{{"PomoSessionVolume", "PomoSessionVolume"}});
    const Dictionary first = *decoder.decode(bytes)->dictionary();
    const Dictionary second = *decoder.decode(bytes)->dictionary();
    EXPECT_TRUE(first.keys()[0].isSameObject(second.keys()[0]));
    EXPECT_FALSE(first.values()[0].string()->isSameObject(second.keys()[0])) << "values are not keys";
}

TEST(Cbor, LaterMessagesOfTheSameKeysHaveTheSameShape)
{
    CborDecoder decoder;
    const auto shapeOf = [&decoder](std::string_view hex) {
        return decoder.decode(fromHex(hex))->dictionary()->shape();
    };
    const auto definite = shapeOf("a2616101616202");
    const auto indefinite = shapeOf("bf616101616202ff");
    EXPECT_EQ(shapeOf("a26161f661626178").get(), definite.get());
    EXPECT_EQ(shapeOf("bf6161f661626178ff").get(), indefinite.get());
    EXPECT_NE(shapeOf("a2616201616102").get(), definite.get());
    EXPECT_EQ(shapeOf("a2616101616202").get(), definite.get()) << "a map that begins differently has another place";
    EXPECT_NE(shapeOf("a2616101616302").get(), definite.get());
    EXPECT_NE(shapeOf("a2616101616202").get(), definite.get()) << "a map that begins like it took its place";
}

TEST(Cbor, MapsInsideMapsHaveTheirShapesToo)
{
    CborDecoder decoder;
    const std::string bytes = encoded(Dictionary{{"a", Dictionary{{"a", Dictionary{{"b", 1}}}}}, {"c", 2}});
    const Dictionary first = *decoder.decode(bytes)->dictionary();
    const Dictionary second = *decoder.decode(bytes)->dictionary();
    EXPECT_EQ(first, second);
    EXPECT_EQ(first.shape().get(), second.shape().get());
    EXPECT_EQ(first.find("a")->dictionary()->shape().get(), second.find("a")->dictionary()->shape().get());
}

TEST(Cbor, MoreOrFewerKeysThanBeforeAreReadRight)
{
    CborDecoder decoder;
    for (const std::string_view hex : {"bf616101616202616303ff", "bf616101616202ff", "bf616101616202616303616404ff",
                                       "bf616101ff", "bf616101616201616103ff", "bfff", "bf616101616202616303ff"})
        EXPECT_EQ(encoded(*decoder.decode(fromHex(hex))), encoded(*CborDecoder().decode(fromHex(hex)))) << hex;
}

TEST(Cbor, LargeShapesAreNotRemembered)
{
    CborDecoder decoder;
    Dictionary::Entries many;
    for (int number = 0; number < 33; ++number)
        many.push_back({String("key" + std::to_string(number)), number});
    const Dictionary withALongKey{{String(std::string(65, 'k')), 1}};
    for (const Dictionary& dictionary : {withALongKey, Dictionary(many)}) {
        const Dictionary first = *decoder.decode(encoded(dictionary))->dictionary();
        const Dictionary second = *decoder.decode(encoded(dictionary))->dictionary();
        EXPECT_EQ(first, second);
        EXPECT_NE(first.shape().get(), second.shape().get());
    }
}

// The decoder's cache makes it faster and does not change the result.
RC_GTEST_PROP(CborProperty, OneDecoderReadsWhatAFreshOneDoesEachTime, ())
{
    CborDecoder decoder;
    for (const Value& value : *rc::gen::container<std::vector<Value>>(generated::value())) {
        std::string bytes = encoded(value);
        if (*rc::gen::arbitrary<bool>())
            bytes[*rc::gen::inRange<std::size_t>(0, bytes.size())] = *rc::gen::arbitrary<char>();
        for (int round = 0; round < 2; ++round) {
            const auto fresh = CborDecoder().decode(bytes);
            const auto read = decoder.decode(bytes);
            RC_ASSERT(read.has_value() == fresh.has_value());
            if (read)
                RC_ASSERT(encoded(*read) == encoded(*fresh));
            else
                RC_ASSERT(read.error() == fresh.error());
        }
    }
}

TEST(Cbor, ManyKeysAndLongOnesAreReadRightThoughNotRemembered)
{
    CborDecoder decoder;
    Dictionary::Entries entries{{String(std::string(5000, 'k')), 1}, {"", 2}};
    for (int number = 0; number < 3000; ++number)
        entries.push_back({String("key" + std::to_string(number)), number});
    const Dictionary dictionary(std::move(entries));
    for (int turn = 0; turn < 2; ++turn)
        EXPECT_EQ(*decoder.decode(encoded(dictionary)), Value(dictionary));
}

TEST(Cbor, KeysThatComeInAnotherOrderThanBeforeAreReadRight)
{
    CborDecoder decoder;
    std::vector<std::string> keys{"", "a", "b", "key", std::string(65, 'k')};
    do {
        Dictionary::Entries entries;
        for (const std::string& key : keys)
            entries.push_back({String(key), static_cast<int>(entries.size())});
        const Dictionary dictionary(std::move(entries));
        EXPECT_EQ(encoded(*decoder.decode(encoded(dictionary))), encoded(dictionary));
    } while (std::ranges::next_permutation(keys).found);
}

TEST(Cbor, AKeyThatIsNoTextIsRefusedAgainAndAgainWhereAnotherIsExpected)
{
    CborDecoder decoder;
    const Dictionary usual{{"a", 1}, {"b", 2}};
    for (int turn = 0; turn < 3; ++turn) {
        EXPECT_EQ(*decoder.decode(encoded(usual)), Value(usual));
        EXPECT_EQ(decoder.decode("\xA2\x61\x61\x01\x61\xFF\x02").error(), CborError::InvalidUtf8);
    }
}

TEST(Cbor, ADecoderGoesOnAfterAnError)
{
    CborDecoder decoder;
    EXPECT_FALSE(decoder.decode("\x7F\x61\x61"));
    EXPECT_EQ(*decoder.decode(fromHex("7f6162ff")), Value("b"));
}

TEST(Cbor, ADecoderKnowsHowMuchMemoryAValueTakesAtMost)
{
    CborDecoder decoder;
    EXPECT_TRUE(decoder.decode(encoded(Dictionary{{"a", 1}})));
    EXPECT_EQ(decoder.mostMemory(), 196U) << "4 bytes and 3 items of 64";
    const std::vector<Value> empty(1000, Value(Array()));
    const auto list = decoder.decode(encoded(Array(empty)));
    ASSERT_TRUE(list);
    EXPECT_EQ(decoder.mostMemory(), 65'067U) << "1,003 bytes and 1,001 items of 64";
    EXPECT_EQ(list->roughBytes(), 64'064U);
}

} // namespace
} // namespace foundation
