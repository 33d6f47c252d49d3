// SPDX-License-Identifier: Apache-2.0
// Views of encoded values compared with decoded values.
#include "foundation/cbor/CborView.h"

#include "foundation/cbor/Cbor.h"
#include "foundation/values/GeneratedValues.h"

#include <array>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>

namespace {

using foundation::Array;
using foundation::CborItem;
using foundation::CborItems;
using foundation::Dictionary;
using foundation::Number;
using foundation::Value;

std::string encoded(const Value& value)
{
    std::string bytes;
    foundation::appendCbor(value, bytes);
    return bytes;
}

Value decoded(std::string_view bytes)
{
    return foundation::CborDecoder().decode(bytes, 100).value();
}

// Comparing texts distinguishes the kinds of numbers, too, and works for NaN.
void expectSame(CborItem item, const Value& value)
{
    EXPECT_EQ(item.kind(), value.kind());
    EXPECT_EQ(item.value().text(), value.text());
    EXPECT_EQ(item.text(), value.text());
    EXPECT_EQ(item.stringView(), value.stringView());
    ASSERT_EQ(item.number().has_value(), value.number().has_value());
    if (value.number()) {
        EXPECT_EQ(item.number()->kind(), value.number()->kind());
        EXPECT_EQ(item.number()->text(), value.number()->text());
    }
}

void expectSameThroughout(CborItem item, const Value& value)
{
    expectSame(item, value);
    if (const auto array = value.array()) {
        auto element = array->begin();
        for (const CborItem each : CborItems(item)) {
            ASSERT_NE(element, array->end());
            expectSameThroughout(each, *element++);
        }
        EXPECT_EQ(element, array->end());
    }
    if (const auto dictionary = value.dictionary()) {
        auto entry = dictionary->begin();
        bool isKey = true;
        for (const CborItem each : CborItems(item)) {
            ASSERT_NE(entry, dictionary->end());
            if (isKey)
                EXPECT_EQ(each.stringView(), entry->key.view());
            else
                expectSameThroughout(each, entry++->value);
            isKey = !isKey;
        }
        EXPECT_TRUE(isKey);
        EXPECT_EQ(entry, dictionary->end());
    }
}

RC_GTEST_PROP(CborView, SeesWhatDecodingGives, ())
{
    const Value value = *generated::value();
    const std::string bytes = encoded(value);
    expectSameThroughout(CborItem(bytes), decoded(bytes));
}

RC_GTEST_PROP(CborView, FindsTheEndOfAnItem, ())
{
    const std::string bytes = encoded(*generated::value());
    const std::string followed = bytes + "what follows";
    RC_ASSERT(CborItem::at(followed.data()).bytes() == bytes);
}

RC_GTEST_PROP(CborView, TellsWhereEachItemStands, ())
{
    const auto values = *rc::gen::container<std::vector<Value>>(generated::value(1));
    const std::string bytes = encoded(Array(values));
    std::string together;
    for (const CborItem item : CborItems(CborItem(bytes)))
        together += item.bytes();
    RC_ASSERT(CborItem(bytes).content() == together);
}

TEST(CborView, SeesNumbersAtTheEndsOfEveryWidth)
{
    constexpr std::uint64_t one = 1;
    for (const int bits : {5, 8, 16, 32, 63, 64})
        for (const std::uint64_t offset : {one, one + 1, std::uint64_t{0}}) {
            const std::uint64_t number = (bits == 64 ? 0 : one << bits) - offset;
            expectSame(CborItem(encoded(number)), decoded(encoded(number)));
            const auto negative = -static_cast<std::int64_t>(number >> 1) - 1;
            expectSame(CborItem(encoded(negative)), decoded(encoded(negative)));
        }
    for (const Value& number :
         {Value(0), Value(23), Value(24), Value(-1), Value(-24), Value(-25), Value(true), Value(false),
          Value(std::numeric_limits<std::int64_t>::min()), Value(std::numeric_limits<float>::denorm_min()), Value(-0.0),
          Value(std::numeric_limits<double>::max()), Value(std::numeric_limits<double>::infinity()),
          Value(std::numeric_limits<float>::quiet_NaN())}) {
        const std::string bytes = encoded(number);
        expectSame(CborItem(bytes), decoded(bytes));
    }
}

TEST(CborView, SeesStringsOfEveryWidthOfLength)
{
    for (const std::size_t size : {0U, 23U, 24U, 255U, 256U, 65'535U, 65'536U}) {
        const std::string text(size, 'x');
        const std::string bytes = encoded(text);
        EXPECT_EQ(CborItem(bytes).stringView(), text);
        EXPECT_EQ(CborItem::at(bytes.data()).bytes().size(), bytes.size());
        const std::string data = encoded(foundation::Data{foundation::String(text)});
        EXPECT_EQ(CborItem(data).content(), text);
        EXPECT_EQ(CborItem(data).stringView(), "") << "which is not text";
    }
}

TEST(CborView, SeesNoElementsInEmptyContainers)
{
    EXPECT_TRUE(CborItems(CborItem(encoded(Array{}))).begin() == CborItems::end());
    EXPECT_TRUE(CborItems(CborItem(encoded(Dictionary{}))).begin() == CborItems::end());
}

TEST(CborView, GoesOverContainersAsDeepAsTheyAre)
{
    Value deep = 1;
    for (int level = 0; level < 500; ++level)
        deep = Array{deep, Dictionary{{"k", foundation::Date{1}}}};
    const std::string bytes = encoded(Array{deep, "end"});
    std::vector<Value::Kind> kinds;
    for (const CborItem item : CborItems(CborItem(bytes)))
        kinds.push_back(item.kind());
    EXPECT_EQ(kinds, (std::vector{Value::Kind::Array, Value::Kind::String}));
    EXPECT_EQ(CborItem(bytes).value(), Value(Array{deep, "end"}));
}

TEST(CborView, IsSameAsAnItemOfTheSameBytesWhereverTheyStand)
{
    const std::string bytes = "\x61\x61\x61\x61\x61\x62\x01"; // "a", "a", "b", 1
    const char* const place = bytes.data();
    EXPECT_TRUE(CborItem::at(place).isSameAs(CborItem::at(place)));
    EXPECT_TRUE(CborItem::at(place).isSameAs(CborItem::at(place + 2)));
    EXPECT_FALSE(CborItem::at(place).isSameAs(CborItem::at(place + 4)));
    EXPECT_FALSE(CborItem::at(place).isSameAs(CborItem::at(place + 6)));
    EXPECT_FALSE(CborItem::at(place).isSameAs(CborItem()));
}

TEST(CborView, HasNoBytesWhereNothingWasPut)
{
    EXPECT_TRUE(CborItem().bytes().empty());
}

} // namespace
