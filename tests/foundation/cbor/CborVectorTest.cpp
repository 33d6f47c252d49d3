// SPDX-License-Identifier: Apache-2.0
// All examples of RFC 8949, appendix A: those that a `Value` can express are read and written; other encodings of the
// same values are read; the others must be refused.
#include "foundation/cbor/Cbor.h"

#include "foundation/cbor/Hex.h"
#include "foundation/values/GeneratedValues.h"

#include <cmath>
#include <gtest/gtest.h>
#include <limits>
#include <string_view>
#include <vector>

namespace foundation {
namespace {

struct Example {
    std::string_view hex;
    Value value;
};

constexpr float infinity32 = std::numeric_limits<float>::infinity();
constexpr double infinity64 = std::numeric_limits<double>::infinity();

Array oneTo25()
{
    std::vector<Value> values;
    for (int number = 1; number <= 25; ++number)
        values.emplace_back(number);
    return values;
}

// The same value of the same kind, and zeros of the same sign.
void expectSame(const Value& read, const Value& expected, std::string_view hex)
{
    EXPECT_EQ(read, expected) << hex;
    ASSERT_EQ(read.kind(), expected.kind()) << hex;
    if (const auto number = expected.number()) {
        EXPECT_EQ(read.number()->kind(), number->kind()) << hex;
        EXPECT_EQ(std::signbit(read.asDouble()), std::signbit(number->doubleValue())) << hex;
    }
}

TEST(CborVectors, AreReadAndWritten)
{
    const std::vector<Example> examples{
        {"00", 0},
        {"01", 1},
        {"0a", 10},
        {"17", 23},
        {"1818", 24},
        {"1819", 25},
        {"1864", 100},
        {"1903e8", 1000},
        {"1a000f4240", 1000000},
        {"1b000000e8d4a51000", 1000000000000},
        {"1bffffffffffffffff", 18446744073709551615U},
        {"20", -1},
        {"29", -10},
        {"3863", -100},
        {"3903e7", -1000},
        {"fb3ff199999999999a", 1.1},
        {"fa47c35000", 100000.0F},
        {"fa7f7fffff", 3.4028234663852886e+38F},
        {"fb7e37e43c8800759c", 1.0e+300},
        {"fbc010666666666666", -4.1},
        {"fa7f800000", infinity32},
        {"faff800000", -infinity32},
        {"fb7ff0000000000000", infinity64},
        {"fbfff0000000000000", -infinity64},
        {"f4", false},
        {"f5", true},
        {"f6", Value()},
        {"c1fb41d452d9ec200000", Date{1363896240.5}},
        {"40", Data{}},
        {"4401020304", Data{"\x01\x02\x03\x04"}},
        {"60", ""},
        {"6161", "a"},
        {"6449455446", "IETF"},
        {"62225c", "\"\\"},
        {"62c3bc", "\u00fc"},
        {"63e6b0b4", "\u6c34"},
        {"64f0908591", "\U00010151"},
        {"80", Array{}},
        {"83010203", Array{1, 2, 3}},
        {"8301820203820405", Array{1, Array{2, 3}, Array{4, 5}}},
        {"98190102030405060708090a0b0c0d0e0f101112131415161718181819", oneTo25()},
        {"a0", Dictionary{}},
        {"a26161016162820203", Dictionary{{"a", 1}, {"b", Array{2, 3}}}},
        {"826161a161626163", Array{"a", Dictionary{{"b", "c"}}}},
        {"a56161614161626142616361436164614461656145",
         Dictionary{{"a", "A"}, {"b", "B"}, {"c", "C"}, {"d", "D"}, {"e", "E"}}},
    };
    CborDecoder decoder;
    for (const auto& [hex, value] : examples) {
        const auto read = decoder.decode(fromHex(hex));
        ASSERT_TRUE(read) << hex << ": " << description(read.error());
        expectSame(*read, value, hex);
        std::string written;
        appendCbor(value, written);
        EXPECT_EQ(toHex(written), hex);
    }
}

TEST(CborVectors, OtherSpellingsAreRead)
{
    const std::vector<Example> examples{
        {"f90000", 0.0F},
        {"f98000", -0.0F},
        {"f93c00", 1.0F},
        {"f93e00", 1.5F},
        {"f97bff", 65504.0F},
        {"f90001", 5.960464477539063e-8F},
        {"f90400", 0.00006103515625F},
        {"f9c400", -4.0F},
        {"f97c00", infinity32},
        {"f9fc00", -infinity32},
        {"c11a514b67b0", Date{1363896240}},
        {"5f42010243030405ff", Data{"\x01\x02\x03\x04\x05"}},
        {"7f657374726561646d696e67ff", "streaming"},
        {"9fff", Array{}},
        {"9f018202039f0405ffff", Array{1, Array{2, 3}, Array{4, 5}}},
        {"9f01820203820405ff", Array{1, Array{2, 3}, Array{4, 5}}},
        {"83018202039f0405ff", Array{1, Array{2, 3}, Array{4, 5}}},
        {"83019f0203ff820405", Array{1, Array{2, 3}, Array{4, 5}}},
        {"9f0102030405060708090a0b0c0d0e0f101112131415161718181819ff", oneTo25()},
        {"bf61610161629f0203ffff", Dictionary{{"a", 1}, {"b", Array{2, 3}}}},
        {"826161bf61626163ff", Array{"a", Dictionary{{"b", "c"}}}},
        {"bf6346756ef563416d7421ff", Dictionary{{"Fun", true}, {"Amt", -2}}},
    };
    CborDecoder decoder;
    for (const auto& [hex, value] : examples) {
        const auto read = decoder.decode(fromHex(hex));
        ASSERT_TRUE(read) << hex << ": " << description(read.error());
        expectSame(*read, value, hex);
    }
}

TEST(CborVectors, NotANumberIsReadInEveryWidth)
{
    CborDecoder decoder;
    for (const auto& [hex, kind] : {std::pair("f97e00", Number::Kind::Float32),
                                    {"fa7fc00000", Number::Kind::Float32},
                                    {"fb7ff8000000000000", Number::Kind::Float64}}) {
        const auto read = decoder.decode(fromHex(hex));
        ASSERT_TRUE(read) << hex;
        EXPECT_TRUE(std::isnan(read->asDouble())) << hex;
        EXPECT_EQ(read->number()->kind(), kind) << hex;
    }
}

TEST(CborVectors, WhatMessagesDoNotHaveIsRefused)
{
    CborDecoder decoder;
    for (const auto& [hex, error] : std::vector<std::pair<std::string_view, CborError>>{
             {"c249010000000000000000", CborError::Unsupported}, // 2^64
             {"c349010000000000000000", CborError::Unsupported}, // -2^64 - 1
             {"3bffffffffffffffff", CborError::IntegerOutOfRange}, // -2^64
             {"f7", CborError::Unsupported}, // undefined
             {"f0", CborError::Unsupported}, // simple(16)
             {"f8ff", CborError::Unsupported}, // simple(255)
             {"c074323031332d30332d32315432303a30343a30305a", CborError::Unsupported}, // a date as text
             {"d74401020304", CborError::Unsupported},
             {"d818456449455446", CborError::Unsupported},
             {"d82076687474703a2f2f7777772e6578616d706c652e636f6d", CborError::Unsupported},
             {"a201020304", CborError::KeyNotText}, // {1: 2, 3: 4}
         }) {
        const auto read = decoder.decode(fromHex(hex));
        ASSERT_FALSE(read) << hex;
        EXPECT_EQ(read.error(), error) << hex << ": " << description(read.error());
    }
}

} // namespace
} // namespace foundation
