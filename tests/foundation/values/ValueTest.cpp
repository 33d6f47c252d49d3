// SPDX-License-Identifier: Apache-2.0
// The kinds of values, their conversions, and the sharing of copies.
#include "foundation/values/Value.h"

#include "foundation/values/GeneratedValues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <utility>

namespace foundation {
namespace {

using namespace std::string_view_literals;
using Kind = Value::Kind;

TEST(Value, KnowsWhatItIs)
{
    EXPECT_EQ(Value().kind(), Kind::Null);
    EXPECT_TRUE(Value().isNull());
    EXPECT_EQ(Value(true).kind(), Kind::Number);
    EXPECT_EQ(Value(true).number()->kind(), Number::Kind::Boolean);
    EXPECT_EQ(Value(0.6F).number()->kind(), Number::Kind::Float32);
    EXPECT_EQ(Value("text").kind(), Kind::String);
    EXPECT_EQ(Value(Array{1, 2}).kind(), Kind::Array);
    EXPECT_EQ(Value(Dictionary{{"key", 1}}).kind(), Kind::Dictionary);
    EXPECT_EQ(Value(Data{"bytes"}).kind(), Kind::Data);
    EXPECT_EQ(Value(Date{1.5}).kind(), Kind::Date);
}

TEST(Value, GivesItselfAsItsOwnKindOnly)
{
    const Value text("7");
    EXPECT_EQ(*text.string(), "7"sv);
    EXPECT_FALSE(text.number());
    EXPECT_FALSE(text.array());
    EXPECT_FALSE(text.dictionary());
    EXPECT_FALSE(text.data());
    EXPECT_FALSE(text.date());
    EXPECT_FALSE(Value(Data{"7"}).string());
    EXPECT_FALSE(Value(7).string());
    EXPECT_EQ(Value(Date{1.5}).date()->secondsSince1970, 1.5);
    EXPECT_EQ(Value(Data{"\xFF"}).data()->bytes.view(), "\xFF");
}

TEST(Value, ContainersMayBeEmpty)
{
    EXPECT_EQ(Value(Array()).array()->size(), 0U);
    EXPECT_EQ(Value(Dictionary()).dictionary()->size(), 0U);
    EXPECT_EQ(Value(String()).string()->view(), "");
    EXPECT_EQ(Value(Array()), Value(Array{}));
    EXPECT_NE(Value(Array()), Value(Dictionary()));
    EXPECT_NE(Value(), Value(""));
}

TEST(Value, IsSixteenBytes)
{
    EXPECT_EQ(sizeof(Value), 16U);
}

TEST(Value, CopiesShareTheirString)
{
    const String original("shared");
    const Value value = original;
    const Value copy = value; // NOLINT(performance-unnecessary-copy-initialization): the copy is what is tested
    EXPECT_TRUE(copy.string()->isSameObject(original));
    EXPECT_FALSE(Value("shared").string()->isSameObject(original));
}

TEST(Value, MovingLeavesNull)
{
    Value from(Array{1, "two"});
    const Value to = std::move(from);
    EXPECT_TRUE(from.isNull()); // NOLINT(bugprone-use-after-move): promised
    EXPECT_EQ(to.array()->size(), 2U);
}

TEST(Value, AssignmentReplacesAndSurvivesItself)
{
    Value value(Dictionary{{"key", "value"}});
    value = Value(3);
    EXPECT_EQ(value, Value(3));
    value = Array{"a"};
    const Value& alias = value;
    value = alias;
    EXPECT_EQ(value, Value(Array{"a"}));
    value = value.array()->values()[0]; // the new value is a part of the old one, which is destroyed
    EXPECT_EQ(value, Value("a"));
}

TEST(Value, EqualityIsByContent)
{
    EXPECT_EQ(Value(1), Value(true));
    EXPECT_EQ(Value(Array{1, 2.0}), Value(Array{1.0F, 2U}));
    EXPECT_NE(Value(Array{1, 2}), Value(Array{2, 1}));
    EXPECT_NE(Value(Array{1}), Value(Array{1, 1}));
    EXPECT_NE(Value("1"), Value(1));
    EXPECT_NE(Value("a"), Value(Data{"a"}));
    EXPECT_EQ(Value(Data{"a"}), Value(Data{"a"}));
    EXPECT_EQ(Value(Date{5}), Value(Date{5}));
    EXPECT_NE(Value(Date{5}), Value(5));
}

RC_GTEST_PROP(ValueProperty, EqualsItsCopyAndIsEqualBothWays, ())
{
    const Value left = *generated::value();
    const Value right = *generated::value();
    const Value copy = left; // NOLINT(performance-unnecessary-copy-initialization): the copy is what is tested
    RC_ASSERT(copy == left);
    RC_ASSERT((left == right) == (right == left));
}

struct NumberOfText {
    std::string_view text;
    double number;
    bool truth;
};

TEST(Value, TextCountsAsItsLeadingNumber)
{
    for (const auto& [text, number, truth] : std::vector<NumberOfText>{
             {"", 0, false},     {"42", 42, true},     {" \t\n42 apples", 42, true},
             {"+7", 7, true},    {"-7.5", -7.5, true}, {"1e3x", 1000, true},
             {".5", 0.5, false}, {"0.5", 0.5, false},  {"000", 0, false},
             {"007", 7, true},   {"-0", 0, false},     {"-01", -1, true},
             {"+-5", 0, false},  {"0x10", 0, false},   {"apples 42", 0, false},
             {"inf", 0, false},  {"nan", 0, false},    {"yes", 0, true},
             {"Y", 0, true},     {"true", 0, true},    {"T", 0, true},
             {"no", 0, false},   {"false", 0, false},  {"  +0Yes", 0, true},
             {"1,5", 1, true},   {"1e400", 0, true},   {"1e-400", 0, true},
             {"\0"sv, 0, false},
         }) {
        EXPECT_EQ(Value(text).asDouble(), number) << '"' << text << '"';
        EXPECT_EQ(Value(text).asBoolean(), truth) << '"' << text << '"';
    }
}

TEST(Value, NumbersCountAsThemselvesAndAllElseAsNothing)
{
    EXPECT_EQ(Value(2.5F).asDouble(), 2.5);
    EXPECT_TRUE(Value(0.1).asBoolean());
    EXPECT_FALSE(Value(0).asBoolean());
    for (const Value& other :
         {Value(), Value(Array{1}), Value(Dictionary{{"1", 1}}), Value(Data{"1"}), Value(Date{1})}) {
        EXPECT_EQ(other.asDouble(), 0);
        EXPECT_FALSE(other.asBoolean());
    }
}

TEST(Value, TextOfEveryKind)
{
    EXPECT_EQ(Value().text(), "(null)");
    EXPECT_EQ(Value(true).text(), "1");
    EXPECT_EQ(Value(0.6F).text(), "0.6");
    EXPECT_EQ(Value("as it is, \"quoted\"").text(), "as it is, \"quoted\"");
    EXPECT_EQ(Value(Array{true, "x", Value()}).text(), R"([true,"x",null])");
    EXPECT_EQ(Value(Dictionary{{"gain", 0.5F}}).text(), R"({"gain":0.5})");
    EXPECT_EQ(Value(Array{std::numeric_limits<double>::infinity()}).text(), "[inf]");
}

TEST(Value, TextOfDataIsBase64) // the vectors of RFC 4648
{
    const auto text = [](std::string_view bytes) { return Value(Data{String(bytes)}).text(); };
    EXPECT_EQ(text(""), "");
    EXPECT_EQ(text("f"), "Zg==");
    EXPECT_EQ(text("fo"), "Zm8=");
    EXPECT_EQ(text("foo"), "Zm9v");
    EXPECT_EQ(text("foob"), "Zm9vYg==");
    EXPECT_EQ(text("fooba"), "Zm9vYmE=");
    EXPECT_EQ(text("foobar"), "Zm9vYmFy");
    EXPECT_EQ(text("\xFB\xEF\xFF"), "++//");
}

TEST(Value, TextOfADateIsIso8601ToTheSecond)
{
    const auto text = [](double seconds) { return Value(Date{seconds}).text(); };
    EXPECT_EQ(text(0), "1970-01-01T00:00:00Z");
    EXPECT_EQ(text(951'782'400), "2000-02-29T00:00:00Z");
    EXPECT_EQ(text(1'700'000'000.9), "2023-11-14T22:13:20Z");
    EXPECT_EQ(text(-0.5), "1969-12-31T23:59:59Z");
    EXPECT_EQ(text(-62'167'219'200), "0000-01-01T00:00:00Z");
    EXPECT_EQ(text(253'402'300'799), "9999-12-31T23:59:59Z");
    EXPECT_EQ(text(253'402'300'800), "253402300800");
    EXPECT_EQ(text(-62'167'219'201), "-62167219201");
    EXPECT_EQ(text(std::numeric_limits<double>::quiet_NaN()), "nan");
}

TEST(Value, TextIsAppended)
{
    std::string text = "route: ";
    Value("Speaker").appendText(text);
    EXPECT_EQ(text, "route: Speaker");
}

TEST(Array, IsAList)
{
    const Array array{1, "two", Array{3}};
    EXPECT_EQ(array.size(), 3U);
    EXPECT_EQ(array[1], Value("two"));
    EXPECT_THAT(array.values(), testing::ElementsAre(Value(1), Value("two"), Value(Array{3})));
    EXPECT_TRUE(Array().empty());
    EXPECT_EQ(Array(), Array(std::vector<Value>()));
}

} // namespace
} // namespace foundation
