// SPDX-License-Identifier: Apache-2.0
// Pretty JSON against RapidJSON's own pretty writer, byte by byte.
#include "foundation/text/PrettyJsonWriter.h"

#include "foundation/cbor/Cbor.h"
#include "foundation/values/GeneratedValues.h"
#include "foundation/values/Json.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>

namespace {

using foundation::Array;
using foundation::CborItem;
using foundation::Dictionary;
using foundation::PrettyJsonWriter;
using foundation::Value;

constexpr double nan = std::numeric_limits<double>::quiet_NaN();

// The written pieces.
class Pieces {
public:
    [[nodiscard]] PrettyJsonWriter::Sink sink()
    {
        return [this](std::string_view text) { pieces_.emplace_back(text); };
    }
    [[nodiscard]] const std::vector<std::string>& pieces() const { return pieces_; }
    [[nodiscard]] std::string text() const
    {
        std::string text;
        for (const auto& piece : pieces_)
            text += piece;
        return text;
    }

private:
    std::vector<std::string> pieces_;
};

std::string encoded(const Value& value)
{
    std::string bytes;
    foundation::appendCbor(value, bytes);
    return bytes;
}

std::string pretty(const Value& value)
{
    Pieces pieces;
    PrettyJsonWriter(pieces.sink()).write(value);
    return pieces.text();
}

// The same with RapidJSON alone, from reading to writing.
std::string rapidJsonPretty(const std::string& compact)
{
    rapidjson::MemoryStream stream(compact.data(), compact.size());
    rapidjson::StringBuffer buffer;
    rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
    EXPECT_FALSE(rapidjson::Reader().Parse(stream, writer).IsError()) << compact;
    return {buffer.GetString(), buffer.GetSize()};
}

// Texts instead of numbers, because the writer formats numbers itself.
Value withNumbersAsTexts(const Value& value)
{
    if (const auto number = value.number())
        return number->kind() == foundation::Number::Kind::Boolean ? value : Value(number->text());
    if (const auto array = value.array()) {
        std::vector<Value> values;
        for (const Value& element : *array)
            values.push_back(withNumbersAsTexts(element));
        return Array(std::move(values));
    }
    if (const auto dictionary = value.dictionary()) {
        Dictionary::Entries entries;
        for (const auto& [key, element] : *dictionary)
            entries.push_back({key, withNumbersAsTexts(element)});
        return Dictionary(std::move(entries));
    }
    return value;
}

RC_GTEST_PROP(PrettyJsonWriter, WritesAsRapidJsonWrites, ())
{
    const Value value = withNumbersAsTexts(*generated::value());
    std::string compact;
    RC_ASSERT(foundation::appendJson(value, compact));
    RC_ASSERT(pretty(value) == rapidJsonPretty(compact));
}

RC_GTEST_PROP(PrettyJsonWriter, WritesWhatCompactJsonSaysBetweenItsBlanks, ())
{
    const Value value = *generated::value();
    const std::string text = pretty(value);
    std::string compact;
    RC_ASSERT(foundation::appendJson(value, compact));
    std::string squeezed;
    bool isInText = false;
    for (std::size_t at = 0; at < text.size(); ++at) {
        if (text[at] == '"')
            isInText = !isInText;
        if (isInText && text[at] == '\\')
            squeezed += text[at++];
        if (isInText || (text[at] != ' ' && text[at] != '\n'))
            squeezed += text[at];
    }
    RC_ASSERT(squeezed == compact);
}

RC_GTEST_PROP(PrettyJsonWriter, WritesEncodedValuesAsItWritesThemDecoded, ())
{
    const Value value = *generated::value();
    const std::string bytes = encoded(value);
    Pieces pieces;
    PrettyJsonWriter(pieces.sink()).write(CborItem(bytes));
    RC_ASSERT(pieces.text() == pretty(foundation::CborDecoder().decode(bytes, 100).value()));
}

TEST(PrettyJsonWriter, IndentsOneMemberALine)
{
    Pieces pieces;
    {
        PrettyJsonWriter writer(pieces.sink());
        writer.beginArray();
        writer.beginObject();
        writer.key("a \"quoted\" key");
        writer.write(Value(0.6F));
        writer.key("list");
        writer.write(Value(Array{1, Array{}, Dictionary{}}));
        writer.endObject();
        writer.beginObject();
        writer.endObject();
        writer.endArray();
        EXPECT_TRUE(writer.isWhole());
    }
    EXPECT_EQ(pieces.text(), R"([
    {
        "a \"quoted\" key": 0.6,
        "list": [
            1,
            [],
            {}
        ]
    },
    {}
])");
}

RC_GTEST_PROP(PrettyJsonWriter, WritesAMemberAgainByItsText, ())
{
    const std::string key = *generated::text();
    const std::string bytes = encoded(*generated::value());
    const auto write = [](auto writeMember) {
        Pieces pieces;
        {
            PrettyJsonWriter writer(pieces.sink());
            writer.beginArray();
            for (int object = 0; object < 2; ++object) {
                writer.beginObject();
                for (int member = 0; member < 3; ++member)
                    writeMember(writer, member);
                writer.endObject();
            }
            writer.endArray();
        }
        return pieces.text();
    };
    std::string text;
    const std::string again = write([&](PrettyJsonWriter& writer, int member) {
        if (member == 1 || text.empty())
            writer.writeMember(key, CborItem(bytes), text);
        else
            writer.writeMember(text);
    });
    RC_ASSERT(again == write([&](PrettyJsonWriter& writer, int) {
                  writer.key(key);
                  writer.write(CborItem(bytes));
              }));
}

TEST(PrettyJsonWriter, HandsLongTextOnInPieces)
{
    Pieces pieces;
    std::string expected = "[";
    {
        PrettyJsonWriter writer(pieces.sink());
        writer.beginArray();
        for (int number = 0; number < 50'000; ++number) {
            writer.write(Value(number));
            expected += (number == 0 ? "\n    " : ",\n    ") + std::to_string(number);
        }
        writer.endArray();
    }
    EXPECT_EQ(pieces.text(), expected + "\n]");
    EXPECT_GT(pieces.pieces().size(), 5U);
    for (const auto& piece : pieces.pieces())
        EXPECT_LT(piece.size(), (std::size_t{64} << 10) + 100);
}

TEST(PrettyJsonWriter, WritesNothingMoreAfterWhatJsonCannotSay)
{
    for (const Value& impossible : {Value(nan), Value(std::numeric_limits<float>::infinity()), Value(Array{1, nan, 2}),
                                    Value(Dictionary{{"a", Array{Dictionary{{"b", -nan}}}}})})
        for (const bool isEncoded : {false, true}) {
            const std::string bytes = encoded(impossible);
            Pieces pieces;
            {
                PrettyJsonWriter writer(pieces.sink());
                writer.beginArray();
                writer.beginObject();
                writer.key("before");
                writer.write(Value(true));
                EXPECT_TRUE(writer.isWhole());
                writer.key("impossible");
                if (isEncoded)
                    writer.write(CborItem(bytes));
                else
                    writer.write(impossible);
                EXPECT_FALSE(writer.isWhole());
                writer.key("after");
                writer.write(Value(true));
                writer.endObject();
                writer.endArray();
                writer.endArray(); // even a wrong call has no effect
                EXPECT_FALSE(writer.isWhole());
            }
            EXPECT_THAT(pieces.text(), testing::Not(testing::HasSubstr("after")));
        }
}

TEST(PrettyJsonWriter, EscapesWhatJsonEscapes)
{
    std::string all;
    for (int character = 0; character < 0x80; ++character)
        all.push_back(static_cast<char>(character));
    std::string compact;
    ASSERT_TRUE(foundation::appendJson(Value(all), compact));
    EXPECT_EQ(pretty(all), compact);
    EXPECT_EQ(pretty(all), rapidJsonPretty(compact));
}

} // namespace
