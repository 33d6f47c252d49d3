// SPDX-License-Identifier: Apache-2.0
// JSON as values: whole, and a list element by element.
#include "kesto/files/JsonReader.h"
#include "support/PrintValues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <memory>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::HasSubstr;

std::string nested(unsigned depth)
{
    return std::string(depth, '[') + std::string(depth, ']');
}

TEST(ParseJson, KeepsKindsAndOrder)
{
    const auto value = parseJson(R"({"b": [true, null, -1, 18446744073709551615, 0.1, "ä\n"], "a": {"x": []}})");
    EXPECT_EQ(value,
              Value(Dictionary{{"b", Array{true, Value(), -1, std::uint64_t(-1), 0.1, "ä\n"}},
                               {"a", Dictionary{{"x", Array{}}}}}));
    ASSERT_TRUE(value);
    EXPECT_EQ(value->dictionary()->keys()[0].view(), "b");
    EXPECT_EQ(parseJson("5"), Value(5));
}

TEST(ParseJson, RefusesAnythingButExactlyOne)
{
    for (const char* text : {"", " ", "{", "[1,]", "1 2", "{\"a\" 1}", "nan", "\"\xFF\"", "'a'", "1e999"})
        EXPECT_EQ(parseJson(text), std::nullopt) << text;
}

TEST(ParseJson, RefusesWhatIsNestedDeeperThanTheServiceTakes)
{
    EXPECT_TRUE(parseJson(nested(40)));
    EXPECT_FALSE(parseJson(nested(41)));
    EXPECT_FALSE(parseJson(nested(1'000'000)));
}

// The elements that were visited, and the error.
struct Elements {
    std::vector<Value> visited;
    std::string error;
};

Elements elementsOf(const std::string& text, std::size_t most = 1000)
{
    const std::unique_ptr<std::FILE, decltype(&std::fclose)> file(std::tmpfile(), &std::fclose);
    std::fwrite(text.data(), 1, text.size(), file.get());
    std::rewind(file.get());
    Elements elements;
    const auto read = forEachJsonElement(file.get(), [&](const Value& element) {
        elements.visited.push_back(element);
        return elements.visited.size() < most;
    });
    if (!read)
        elements.error = read.error();
    return elements;
}

TEST(JsonElements, AreVisitedInOrder)
{
    const Elements elements = elementsOf(R"([1, [2, [3]], {"a": [4]}, "x", []])");
    EXPECT_THAT(elements.visited,
                testing::ElementsAre(Value(1), Value(Array{2, Array{3}}), Value(Dictionary{{"a", Array{4}}}),
                                     Value("x"), Value(Array{})));
    EXPECT_EQ(elements.error, "");
    EXPECT_THAT(elementsOf("[]").visited, testing::IsEmpty());
    EXPECT_EQ(elementsOf("[]").error, "");
}

TEST(JsonElements, EndWhereTheVisitorSaysSo)
{
    const Elements elements = elementsOf("[1, 2, 3, oops", 2);
    EXPECT_THAT(elements.visited, testing::ElementsAre(Value(1), Value(2)));
    EXPECT_EQ(elements.error, "");
}

TEST(JsonElements, AreOfListsOnly)
{
    for (const char* text : {"{\"a\": 1}", "{}", "5", "\"x\"", "null"}) {
        EXPECT_EQ(elementsOf(text).error, "it is not a list") << text;
        EXPECT_THAT(elementsOf(text).visited, testing::IsEmpty()) << text;
    }
}

TEST(JsonElements, AreVisitedUpToWhereTheTextBreaks)
{
    const Elements elements = elementsOf("[1, 2, x]");
    EXPECT_THAT(elements.visited, testing::ElementsAre(Value(1), Value(2)));
    EXPECT_THAT(elements.error, HasSubstr("not JSON"));
    EXPECT_THAT(elements.error, HasSubstr("(at byte 8)"));
    EXPECT_EQ(elementsOf(nested(100'000)).error, "it is nested too deep");
}

TEST(JsonElements, AreReadFromFilesOfAnySize)
{
    std::string text = "[0";
    for (int number = 1; number < 100'000; ++number)
        text += "," + std::to_string(number);
    const Elements elements = elementsOf(text + "]", 1'000'000);
    ASSERT_EQ(elements.visited.size(), 100'000U);
    EXPECT_EQ(elements.visited.back(), Value(99'999));
}

} // namespace
