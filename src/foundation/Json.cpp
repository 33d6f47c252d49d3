#include "foundation/Json.h"

#include <cmath>
#include <ctime>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <rapidjson/writer.h>

namespace foundation {
namespace {

// What RapidJSON writes to.
struct StringStream {
    using Ch = char;
    std::string& out;
    void Put(char character) { out.push_back(character); }
    static void Flush() { }
};

std::string base64(std::string_view bytes)
{
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string text;
    text.reserve((bytes.size() + 2) / 3 * 4);
    for (std::size_t at = 0; at < bytes.size(); at += 3) {
        std::uint32_t group = 0;
        for (std::size_t index = 0; index < 3; ++index)
            group = group << 8 | (at + index < bytes.size() ? static_cast<std::uint8_t>(bytes[at + index]) : 0U);
        for (std::size_t index = 0; index < 4; ++index)
            text.push_back(at + index > bytes.size() ? '=' : alphabet[group >> (18 - 6 * index) & 63]);
    }
    return text;
}

std::string iso8601(Date date)
{
    constexpr double firstSecondOfYear10000 = 253402300800;
    if (!(std::abs(date.secondsSince1970) < firstSecondOfYear10000))
        return Number(date.secondsSince1970).text();
    return fmt::format("{:%Y-%m-%dT%H:%M:%SZ}",
                       fmt::gmtime(static_cast<std::time_t>(std::floor(date.secondsSince1970))));
}

class JsonWriter {
public:
    JsonWriter(std::string& out, bool strict) : stream_{out}, writer_(stream_), strict_(strict) { }

    bool write(const Value& value)
    {
        switch (value.kind()) {
        case Value::Kind::Null: return writer_.Null();
        case Value::Kind::Number: return write(*value.number());
        case Value::Kind::String: return writeText(*value.string());
        case Value::Kind::Array: return write(*value.array());
        case Value::Kind::Dictionary: return write(*value.dictionary());
        case Value::Kind::Data: return writeText(base64(value.data()->bytes));
        case Value::Kind::Date: return writeText(iso8601(*value.date()));
        }
        return false;
    }

private:
    bool write(Number number)
    {
        if (number.kind() == Number::Kind::Boolean)
            return writer_.Bool(number.booleanValue());
        if (strict_ && !std::isfinite(number.doubleValue()))
            return false;
        scratch_.clear();
        number.appendText(scratch_);
        return writer_.RawValue(scratch_.data(), scratch_.size(), rapidjson::kNumberType);
    }

    bool writeText(std::string_view text)
    {
        return writer_.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
    }

    bool write(const Array& array)
    {
        writer_.StartArray();
        for (const Value& value : array)
            if (!write(value))
                return false;
        return writer_.EndArray();
    }

    bool write(const Dictionary& dictionary)
    {
        writer_.StartObject();
        for (const auto& [key, value] : dictionary) {
            const std::string_view name = key;
            writer_.Key(name.data(), static_cast<rapidjson::SizeType>(name.size()));
            if (!write(value))
                return false;
        }
        return writer_.EndObject();
    }

    StringStream stream_;
    rapidjson::Writer<StringStream, rapidjson::UTF8<>, rapidjson::UTF8<>, rapidjson::CrtAllocator> writer_;
    std::string scratch_;
    bool strict_;
};

} // namespace

bool appendJson(const Value& value, std::string& out)
{
    const std::size_t before = out.size();
    if (JsonWriter(out, true).write(value))
        return true;
    out.resize(before);
    return false;
}

void appendJsonText(const Value& value, std::string& out)
{
    JsonWriter(out, false).write(value);
}

} // namespace foundation
