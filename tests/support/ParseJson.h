// SPDX-License-Identifier: Apache-2.0
// Reads JSON with a library that the service does not use for reading, as other programs do.
#pragma once

#include "foundation/values/Value.h"
#include "support/PrintValues.h"

#include <optional>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <string_view>
#include <vector>

namespace support {

// Builds a value from RapidJSON's events.
class JsonValueBuilder {
public:
    [[nodiscard]] foundation::Value take() { return std::move(values_.back()); }

    bool Null() { return add({}); }
    bool Bool(bool value) { return add(value); }
    bool Int(int value) { return add(value); }
    bool Uint(unsigned value) { return add(static_cast<std::int64_t>(value)); }
    bool Int64(std::int64_t value) { return add(value); }
    bool Uint64(std::uint64_t value) { return add(value); }
    bool Double(double value) { return add(value); }
    bool RawNumber(const char*, rapidjson::SizeType, bool) { return false; }
    bool String(const char* text, rapidjson::SizeType size, bool) { return add(std::string_view(text, size)); }
    bool Key(const char* text, rapidjson::SizeType size, bool) { return add(std::string_view(text, size)); }
    bool StartObject() { return true; }
    bool StartArray() { return true; }

    bool EndObject(rapidjson::SizeType count)
    {
        foundation::Dictionary::Entries entries;
        for (auto value = values_.end() - 2 * static_cast<std::ptrdiff_t>(count); value != values_.end(); value += 2)
            entries.push_back({*value->string(), value[1]});
        values_.resize(values_.size() - 2 * std::size_t{count});
        return add(foundation::Dictionary(std::move(entries)));
    }

    bool EndArray(rapidjson::SizeType count)
    {
        foundation::Array array(std::span<foundation::Value>(values_).last(count));
        values_.resize(values_.size() - count);
        return add(std::move(array));
    }

private:
    bool add(foundation::Value value)
    {
        values_.push_back(std::move(value));
        return true;
    }

    std::vector<foundation::Value> values_; // those that are not in a container yet; keys, too
};

// Nothing if the text is not exactly one JSON value.
inline std::optional<foundation::Value> parseJson(std::string_view text)
{
    rapidjson::MemoryStream stream(text.data(), text.size());
    rapidjson::Reader reader;
    JsonValueBuilder builder;
    constexpr unsigned flags = rapidjson::kParseFullPrecisionFlag | rapidjson::kParseValidateEncodingFlag;
    if (reader.Parse<flags>(stream, builder).IsError())
        return std::nullopt;
    return builder.take();
}

} // namespace support
