// SPDX-License-Identifier: Apache-2.0
// Writes property lists in both forms as other programs do, for tests of the readers; and malformed binary ones, from
// parts that are given byte for byte.
#pragma once

#include "foundation/values/Value.h"

#include <bit>
#include <cmath>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace support {

// --- Binary

inline std::string bigEndian(std::uint64_t value, std::size_t size)
{
    std::string bytes;
    for (std::size_t left = size; left-- > 0;)
        bytes.push_back(left < sizeof value ? static_cast<char>(value >> (8 * left)) : '\0');
    return bytes;
}

// Objects as they stand in the file, in the order of their numbers.
struct BinaryPropertyList {
    std::vector<std::string> objects;
    std::uint64_t top = 0;
    std::size_t offsetSize = 4;
    std::size_t referenceSize = 1;
    std::string header = "bplist00";

    [[nodiscard]] std::string bytes() const
    {
        std::string file = header;
        std::string offsets;
        for (const std::string& object : objects) {
            offsets += bigEndian(file.size(), offsetSize);
            file += object;
        }
        const std::size_t table = file.size();
        return file + offsets + trailer(objects.size(), table);
    }
    [[nodiscard]] std::string trailer(std::uint64_t count, std::uint64_t table) const
    {
        return std::string(6, '\0') + bigEndian(offsetSize, 1) + bigEndian(referenceSize, 1) + bigEndian(count, 8)
            + bigEndian(top, 8) + bigEndian(table, 8);
    }
};

// A marker, with the length behind it if it does not fit into the marker.
inline std::string binaryHead(unsigned type, std::uint64_t count)
{
    const auto marker = [type](std::uint64_t detail) { return std::string(1, static_cast<char>(type << 4 | detail)); };
    return count < 15 ? marker(count) : marker(15) + '\x13' + bigEndian(count, 8);
}

// UTF-8 text, which must be valid, in units of 16 bits.
inline std::u16string utf16(std::string_view text)
{
    std::u16string units;
    for (std::size_t at = 0; at < text.size();) {
        const auto first = static_cast<std::uint8_t>(text[at++]);
        const std::size_t following = first < 0xC0 ? 0 : first < 0xE0 ? 1 : first < 0xF0 ? 2 : 3;
        std::uint32_t character = following == 0 ? first : first & (0x3FU >> following);
        for (std::size_t index = 0; index < following; ++index)
            character = character << 6 | (static_cast<std::uint8_t>(text[at++]) & 0x3FU);
        if (character >= 0x10000) {
            units.push_back(static_cast<char16_t>(0xD800 + ((character - 0x10000) >> 10)));
            character = 0xDC00 + ((character - 0x10000) & 0x3FF);
        }
        units.push_back(static_cast<char16_t>(character));
    }
    return units;
}

// The same as bytes in that order.
inline std::string utf16Bytes(std::string_view text, std::endian order)
{
    std::string bytes;
    for (const char16_t unit : utf16(text)) {
        const char high = static_cast<char>(unit >> 8);
        const char low = static_cast<char>(unit & 0xFF);
        bytes += order == std::endian::big ? std::string{high, low} : std::string{low, high};
    }
    return bytes;
}

// Every value is an object of its own, and containers stand behind their elements.
class BinaryPropertyListWriter {
public:
    static std::string write(const foundation::Value& value)
    {
        BinaryPropertyListWriter writer;
        writer.list_.referenceSize = referenceSize;
        writer.list_.top = writer.add(value);
        return writer.list_.bytes();
    }

private:
    using Value = foundation::Value;
    static constexpr std::size_t referenceSize = 3;

    std::uint64_t add(const Value& value)
    {
        std::string object = encode(value);
        list_.objects.push_back(std::move(object));
        return list_.objects.size() - 1;
    }

    std::string encode(const Value& value)
    {
        switch (value.kind()) {
        case Value::Kind::Null: return std::string(1, '\0');
        case Value::Kind::Number: return encode(*value.number());
        case Value::Kind::String: return encodeText(value.stringView());
        case Value::Kind::Data: {
            const std::string bytes(value.data()->bytes.view());
            return binaryHead(0x4, bytes.size()) + bytes;
        }
        case Value::Kind::Date: return '\x33' + encodeDouble(value.date()->secondsSince1970 - 978307200);
        case Value::Kind::Array: return encode(*value.array());
        case Value::Kind::Dictionary: return encode(*value.dictionary());
        }
        return {};
    }

    static std::string encodeDouble(double value) { return bigEndian(std::bit_cast<std::uint64_t>(value), 8); }

    static std::string encode(foundation::Number number)
    {
        switch (number.kind()) {
        case foundation::Number::Kind::Boolean: return number.booleanValue() ? "\x09" : "\x08";
        case foundation::Number::Kind::Float32:
            return '\x22' + bigEndian(std::bit_cast<std::uint32_t>(static_cast<float>(number.doubleValue())), 4);
        case foundation::Number::Kind::Float64: return '\x23' + encodeDouble(number.doubleValue());
        case foundation::Number::Kind::Signed64:
            return '\x13' + bigEndian(static_cast<std::uint64_t>(number.int64Value()), 8);
        case foundation::Number::Kind::Unsigned64:
            return '\x14' + bigEndian(0, 8) + bigEndian(*number.exactly<std::uint64_t>(), 8);
        }
        return {};
    }

    static std::string encodeText(std::string_view text)
    {
        const std::u16string units = utf16(text);
        if (units.size() == text.size())
            return binaryHead(0x5, text.size()) + std::string(text);
        std::string bytes = binaryHead(0x6, units.size());
        for (const char16_t unit : units)
            bytes += bigEndian(unit, 2);
        return bytes;
    }

    std::string encode(const foundation::Array& array)
    {
        std::string references;
        for (const Value& value : array)
            references += bigEndian(add(value), referenceSize);
        return binaryHead(0xA, array.size()) + references;
    }

    std::string encode(const foundation::Dictionary& dictionary)
    {
        std::string keys;
        std::string values;
        for (const auto& [key, value] : dictionary) {
            keys += bigEndian(add(key), referenceSize);
            values += bigEndian(add(value), referenceSize);
        }
        return binaryHead(0xD, dictionary.size()) + keys + values;
    }

    BinaryPropertyList list_;
};

inline std::string binaryPropertyList(const foundation::Value& value)
{
    return BinaryPropertyListWriter::write(value);
}

// --- XML

// The document around the elements.
inline std::string xmlDocument(std::string_view elements)
{
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
           "<!DOCTYPE plist SYSTEM \"PropertyList-1.0.dtd\">\n"
           "<plist version=\"1.0\">\n"
        + std::string(elements) + "\n</plist>\n";
}

inline std::string xmlEscaped(std::string_view text)
{
    std::string escaped;
    for (const char character : text) {
        switch (character) {
        case '&': escaped += "&amp;"; break;
        case '<': escaped += "&lt;"; break;
        case '>': escaped += "&gt;"; break;
        case '\r': escaped += "&#13;"; break;
        default: escaped += character;
        }
    }
    return escaped;
}

// Of null, which XML does not have, an empty string.
inline std::string xmlElement(const foundation::Value& value)
{
    using foundation::Number;
    using foundation::Value;
    switch (value.kind()) {
    case Value::Kind::Null: return "<string/>";
    case Value::Kind::Number:
        if (value.number()->kind() == Number::Kind::Boolean)
            return value.asBoolean() ? "<true/>" : "<false/>";
        if (value.number()->isFloat())
            return "<real>" + Number(value.asDouble()).text() + "</real>";
        return "<integer>" + value.text() + "</integer>";
    case Value::Kind::String: return "<string>" + xmlEscaped(value.stringView()) + "</string>";
    case Value::Kind::Data: return "<data>\n" + value.text() + "\n</data>";
    case Value::Kind::Date: return "<date>" + value.text() + "</date>";
    case Value::Kind::Array: {
        std::string elements;
        for (const foundation::Array array = *value.array(); const Value& element : array)
            elements += "\t" + xmlElement(element) + "\n";
        return "<array>\n" + elements + "</array>";
    }
    case Value::Kind::Dictionary: {
        std::string elements;
        for (const foundation::Dictionary dictionary = *value.dictionary(); const auto& [key, element] : dictionary)
            elements += "<key>" + xmlEscaped(key) + "</key>\n" + xmlElement(element) + "\n";
        return "<dict>\n" + elements + "</dict>";
    }
    }
    return {};
}

inline std::string xmlPropertyList(const foundation::Value& value)
{
    return xmlDocument(xmlElement(value));
}

} // namespace support
