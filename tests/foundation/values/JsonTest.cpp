// SPDX-License-Identifier: Apache-2.0
// JSON text in the form of the store and the tools.
#include "foundation/values/Json.h"

#include "foundation/values/GeneratedValues.h"

#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <rapidjson/document.h>
#include <string>

namespace foundation {
namespace {

using namespace std::string_view_literals;

std::string json(const Value& value)
{
    std::string text;
    EXPECT_TRUE(appendJson(value, text));
    return text;
}

TEST(Json, WritesEveryKindCompactly)
{
    EXPECT_EQ(json(Value()), "null");
    EXPECT_EQ(json(true), "true");
    EXPECT_EQ(json(false), "false");
    EXPECT_EQ(json(-7), "-7");
    EXPECT_EQ(json(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
    EXPECT_EQ(json("text"), R"("text")");
    EXPECT_EQ(json(Array{1, Array{}, Dictionary{}}), "[1,[],{}]");
    EXPECT_EQ(json(Dictionary{{"z", 1}, {"a", Array{true}}}), R"({"z":1,"a":[true]})");
    EXPECT_EQ(json(Data{"\x01\x02"}), R"("AQI=")");
    EXPECT_EQ(json(Date{0}), R"("1970-01-01T00:00:00Z")");
}

TEST(Json, FloatsOfThirtyTwoBitsStayShort)
{
    EXPECT_EQ(json(0.6F), "0.6");
    EXPECT_EQ(json(static_cast<double>(0.6F)), "0.6000000238418579");
    EXPECT_EQ(json(1e16), "1e+16");
    EXPECT_EQ(json(-0.0), "-0");
}

TEST(Json, EscapesWhatMustBeAndLeavesTheRest)
{
    EXPECT_EQ(json("\"\\/\b\f\n\r\t\x01\x1F\x7F"), "\"\\\"\\\\/\\b\\f\\n\\r\\t\\u0001\\u001F\x7F\"");
    EXPECT_EQ(json("a\0b"sv), R"("a\u0000b")");
    EXPECT_EQ(json("é€😀"), "\"é€😀\"");
    EXPECT_EQ(json(Dictionary{{"a \"key\"", 1}}), R"({"a \"key\"":1})");
}

TEST(Json, RefusesWhatItCannotSayAndLeavesTheOutputAsItWas)
{
    constexpr double infinity = std::numeric_limits<double>::infinity();
    for (const Value& number : {Value(infinity), Value(-infinity), Value(std::numeric_limits<double>::quiet_NaN()),
                                Value(std::numeric_limits<float>::quiet_NaN())})
        for (const Value& value :
             {number, Value(Array{"before", number}), Value(Dictionary{{"a", Array{1, number}}})}) {
            std::string text = "untouched";
            EXPECT_FALSE(appendJson(value, text));
            EXPECT_EQ(text, "untouched");
        }
}

TEST(Json, ForPeopleSaysItAllTheSame)
{
    std::string text = "event: ";
    appendJsonText(Dictionary{{"a", std::numeric_limits<double>::quiet_NaN()},
                              {"b", Array{-std::numeric_limits<float>::infinity()}}},
                   text);
    EXPECT_EQ(text, R"(event: {"a":nan,"b":[-inf]})");
}

TEST(Json, IsAppended)
{
    std::string text = "{\"payload\":";
    EXPECT_TRUE(appendJson(Array{1}, text));
    EXPECT_EQ(text, "{\"payload\":[1]");
}

bool readsAs(const rapidjson::Value& read, const Value& value)
{
    switch (value.kind()) {
    case Value::Kind::Null: return read.IsNull();
    case Value::Kind::Number: {
        const Number number = *value.number();
        if (number.kind() == Number::Kind::Boolean)
            return read.IsBool() && read.GetBool() == number.booleanValue();
        if (number.kind() == Number::Kind::Float32)
            return read.IsNumber() && static_cast<float>(read.GetDouble()) == static_cast<float>(number.doubleValue());
        if (number.isFloat())
            return read.IsNumber() && read.GetDouble() == number.doubleValue();
        return read.IsInt64() ? Number(read.GetInt64()) == number : Number(read.GetUint64()) == number;
    }
    case Value::Kind::String:
    case Value::Kind::Data:
    case Value::Kind::Date:
        return read.IsString() && std::string_view(read.GetString(), read.GetStringLength()) == value.text();
    case Value::Kind::Array: {
        const Array array = *value.array();
        if (!read.IsArray() || read.Size() != array.size())
            return false;
        for (rapidjson::SizeType index = 0; index < read.Size(); ++index)
            if (!readsAs(read[index], array[index]))
                return false;
        return true;
    }
    case Value::Kind::Dictionary: {
        const Dictionary dictionary = *value.dictionary();
        if (!read.IsObject() || read.MemberCount() != dictionary.size())
            return false;
        auto member = read.MemberBegin();
        for (const auto& entry : dictionary) {
            if (std::string_view(member->name.GetString(), member->name.GetStringLength()) != entry.key.view()
                || !readsAs(member->value, entry.value))
                return false;
            ++member;
        }
        return true;
    }
    }
    return false;
}

RC_GTEST_PROP(JsonProperty, AParserReadsBackWhatWasWritten, ())
{
    const Value value = *generated::value();
    std::string text;
    RC_ASSERT(appendJson(value, text));
    rapidjson::Document document;
    document.Parse<rapidjson::kParseFullPrecisionFlag | rapidjson::kParseValidateEncodingFlag>(text.data(),
                                                                                               text.size());
    RC_ASSERT(!document.HasParseError());
    RC_ASSERT(readsAs(document, value));
}

} // namespace
} // namespace foundation
