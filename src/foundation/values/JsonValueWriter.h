// SPDX-License-Identifier: Apache-2.0
// How values become JSON, for the writers of this folder: RapidJSON escapes text and keeps commas and indents,
// numbers come from `Number`, data and dates from `Value`.
//
// RapidJSON appends character by character; numbers and texts without escapes, which are nearly all, are appended
// whole: that takes a third of the time.
#pragma once

#include "foundation/values/Value.h"

#include <algorithm>
#include <cmath>
#include <rapidjson/prettywriter.h>
#include <rapidjson/writer.h>
#include <string>
#include <string_view>

namespace foundation {

// The stream to which RapidJSON writes.
struct JsonStringStream {
    using Ch = char;
    std::string& out;
    void Put(char character) { out.push_back(character); }
    static void Flush() { }
};
// RapidJSON calls it for its indents.
inline void PutN(JsonStringStream& stream, char character, std::size_t count)
{
    stream.out.append(count, character);
}

template <typename RapidWriter> class JsonValueWriter : public RapidWriter {
public:
    // A strict writer refuses NaN and infinity.
    JsonValueWriter(std::string& out, bool strict) : RapidWriter(stream_), stream_{out}, strict_(strict) { }

    bool write(const Value& value)
    {
        switch (value.kind()) {
        case Value::Kind::Null: return this->Null();
        case Value::Kind::Number: return writeNumber(*value.number());
        case Value::Kind::String: return writeText(value.stringView());
        case Value::Kind::Array: return writeArray(*value.array());
        case Value::Kind::Dictionary: return writeDictionary(*value.dictionary());
        case Value::Kind::Data:
        case Value::Kind::Date: return writeText(value.text());
        }
        return false;
    }

    bool writeText(std::string_view text)
    {
        if (needsEscapes(text))
            return this->String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
        prefix(rapidjson::kStringType);
        stream_.out.append(1, '"').append(text).append(1, '"');
        return this->EndValue(true);
    }

    bool writeNumber(Number number)
    {
        if (number.kind() == Number::Kind::Boolean)
            return this->Bool(number.booleanValue());
        if (strict_ && !std::isfinite(number.doubleValue()))
            return false;
        prefix(rapidjson::kNumberType);
        number.appendText(stream_.out);
        return this->EndValue(true);
    }

    // A member of an object by its text, the key and the value.
    bool writeMember(std::string_view text)
    {
        prefix(rapidjson::kStringType);
        ++this->level_stack_.template Top<typename RapidWriter::Level>()->valueCount; // the text is a whole member
        stream_.out.append(text);
        return this->EndValue(true);
    }

private:
    void prefix(rapidjson::Type type)
    {
        if constexpr (requires { this->PrettyPrefix(type); })
            this->PrettyPrefix(type);
        else
            this->Prefix(type);
    }

    // Whether JSON has to write some character of the text as an escape.
    static bool needsEscapes(std::string_view text)
    {
        return std::ranges::any_of(text, [](char character) {
            return static_cast<unsigned char>(character) < 0x20 || character == '"' || character == '\\';
        });
    }

    template <typename Elements> bool writeArray(const Elements& elements)
    {
        this->StartArray();
        for (const auto& element : elements)
            if (!write(element))
                return false;
        return this->EndArray();
    }

    bool writeDictionary(const Dictionary& dictionary)
    {
        this->StartObject();
        for (const auto& [key, value] : dictionary)
            if (!writeText(key) || !write(value))
                return false;
        return this->EndObject();
    }

    JsonStringStream stream_;
    bool strict_;
};

} // namespace foundation
