// SPDX-License-Identifier: Apache-2.0
// The XML form. pugixml cuts the document into elements and texts; this file interprets them.
//
// pugixml skips the document type without reading it, and leaves references as they are: this file resolves XML's own
// five and character numbers, and refuses all others. So a document cannot include anything from outside, and yields no
// more text than it has bytes in UTF-8.
#include "foundation/plist/PropertyListReader.h"
#include "foundation/text/Format.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <new>
#include <pugixml.hpp>
#include <vector>

namespace foundation {
namespace {

using enum PropertyListError;

constexpr std::string_view blanks = " \t\r\n";

std::string_view trimmed(std::string_view text)
{
    text.remove_prefix(std::min(text.find_first_not_of(blanks), text.size()));
    return text.substr(0, text.find_last_not_of(blanks) + 1);
}

// The number that is the whole text, in a base other than ten if there is one.
template <typename Kind, typename... Base> std::optional<Kind> parseWhole(std::string_view text, Base... base)
{
    Kind value = 0;
    const char* const end = text.data() + text.size();
    const auto parsed = std::from_chars(text.data(), end, value, base...);
    if (parsed.ec != std::errc() || parsed.ptr != end)
        return std::nullopt;
    return value;
}

// Decimal, or hexadecimal behind "0x".
std::optional<Number> parseInteger(std::string_view text)
{
    const bool isNegative = text.starts_with('-');
    if (isNegative || text.starts_with('+'))
        text.remove_prefix(1);
    const bool isHexadecimal = text.starts_with("0x") || text.starts_with("0X");
    const auto magnitude =
        isHexadecimal ? parseWhole<std::uint64_t>(text.substr(2), 16) : parseWhole<std::uint64_t>(text);
    constexpr std::uint64_t mostBelowZero = std::uint64_t{1} << 63;
    if (!magnitude || (isNegative && *magnitude > mostBelowZero))
        return std::nullopt;
    return isNegative ? Number(static_cast<std::int64_t>(0 - *magnitude)) : propertyListInteger(*magnitude);
}

// Also "nan", "inf" and "infinity", with a sign or without.
std::optional<Number> parseReal(std::string_view text)
{
    if (text.starts_with('+') && !text.starts_with("+-"))
        text.remove_prefix(1); // from_chars knows no plus
    const auto value = parseWhole<double>(text);
    return value ? std::optional(Number(*value)) : std::nullopt;
}

// "2026-03-01T12:30:00Z"; the last parts may be missing, down to the year alone.
std::optional<Date> parseDate(std::string_view text)
{
    constexpr std::string_view separators = "--T::";
    std::array<unsigned, 6> parts{0, 1, 1, 0, 0, 0};
    if (!text.ends_with('Z'))
        return std::nullopt;
    text.remove_suffix(1);
    for (std::size_t index = 0;; ++index) {
        const std::size_t width = index == 0 ? 4 : 2;
        const auto part = parseWhole<unsigned>(text.substr(0, width));
        if (text.size() < width || !part)
            return std::nullopt;
        parts[index] = *part;
        text.remove_prefix(width);
        if (text.empty())
            break;
        if (index == separators.size() || text.front() != separators[index])
            return std::nullopt;
        text.remove_prefix(1);
    }
    const auto [year, month, day, hour, minute, second] = parts;
    const std::chrono::year_month_day date(std::chrono::year(static_cast<int>(year)), std::chrono::month(month),
                                           std::chrono::day(day));
    if (!date.ok() || hour > 23 || minute > 59 || second > 59)
        return std::nullopt;
    const auto time = std::chrono::sys_days(date) + std::chrono::hours(hour) + std::chrono::minutes(minute)
        + std::chrono::seconds(second);
    return Date{static_cast<double>(time.time_since_epoch().count())};
}

// With blanks anywhere.
std::optional<Data> parseBase64(std::string_view text)
{
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string bytes;
    std::uint32_t group = 0;
    std::size_t digits = 0;
    std::size_t padding = 0;
    for (const char character : text) {
        if (blanks.contains(character))
            continue;
        const std::size_t digit = character == '=' ? 0 : alphabet.find(character);
        padding += character == '=' ? 1 : 0;
        if (digit == std::string_view::npos || (padding > 0 && character != '='))
            return std::nullopt;
        group = group << 6 | static_cast<std::uint32_t>(digit);
        if (++digits % 4 == 0)
            for (const unsigned shift : {16U, 8U, 0U})
                bytes.push_back(static_cast<char>(group >> shift & 0xFF));
    }
    if (digits % 4 != 0 || padding > 2)
        return std::nullopt;
    bytes.resize(bytes.size() - padding);
    return Data{String(bytes)};
}

// The value that the element's name gives, if the element is empty.
template <bool value> std::optional<Number> parseNothing(std::string_view text)
{
    return text.empty() ? std::optional(Number(value)) : std::nullopt;
}

// Appends the character of the reference, which is given without "&" and ";".
bool appendReferred(std::string_view reference, std::string& out)
{
    if (reference.starts_with('#')) {
        const bool isHexadecimal = reference.starts_with("#x");
        const auto character = isHexadecimal ? parseWhole<std::uint32_t>(reference.substr(2), 16)
                                             : parseWhole<std::uint32_t>(reference.substr(1));
        return character && *character != 0 && appendUtf8(*character, out);
    }
    constexpr std::array<std::pair<std::string_view, char>, 5> named{
        {{"amp", '&'}, {"lt", '<'}, {"gt", '>'}, {"quot", '"'}, {"apos", '\''}}};
    const auto found = std::ranges::find(named, reference, [](const auto& entry) { return entry.first; });
    if (found == named.end())
        return false;
    out.push_back(found->second);
    return true;
}

class XmlPropertyListReader : private PropertyListReader {
public:
    XmlPropertyListReader(std::string_view bytes, const PropertyListLimits& limits)
        : PropertyListReader(limits),
          bytes_(bytes)
    {
    }

    std::expected<Value, PropertyListFailure> read()
    {
        // pugixml takes a NUL for the end and does not check the encoding.
        if (!isValidUtf8(bytes_) || bytes_.contains('\0'))
            return outcome(failWith(InvalidText, "the file is not text in UTF-8 or UTF-16"));
        pugi::xml_document document;
        // pugixml keeps blanks, and text outside of the document's element, which this reader then refuses.
        constexpr unsigned options = pugi::parse_cdata | pugi::parse_eol | pugi::parse_ws_pcdata | pugi::parse_fragment;
        const auto parsed = document.load_buffer(bytes_.data(), bytes_.size(), options, pugi::encoding_utf8);
        if (parsed.status == pugi::status_out_of_memory)
            throw std::bad_alloc();
        if (!parsed)
            return outcome(failAt(parsed.offset, Malformed, format("not well-formed XML: {}", parsed.description())));
        return outcome(readDocument(document));
    }

private:
    // Adds the line of the error, counted from 1.
    Value failAt(std::ptrdiff_t offset, PropertyListError error, std::string_view what)
    {
        if (failed()) // of several failures the first counts, and only it gets a text
            return {};
        const auto before = bytes_.substr(0, static_cast<std::size_t>(std::max<std::ptrdiff_t>(offset, 0)));
        return failWith(error, format("line {}: {}", 1 + std::ranges::count(before, '\n'), what));
    }
    Value fail(pugi::xml_node node, PropertyListError error, std::string_view what)
    {
        return failAt(node.offset_debug(), error, what);
    }

    Value readDocument(pugi::xml_node document)
    {
        const pugi::xml_node list = onlyElement(document);
        if (nameOf(list) != "plist")
            return fail(list, Malformed, "the document is not a property list");
        const pugi::xml_node value = onlyElement(list);
        return failed() ? Value() : readValue(value, limits_.depth);
    }

    static std::string_view nameOf(pugi::xml_node element) { return element.name(); }

    // Calls `take` with the elements inside, between which there are only blanks.
    template <typename Take> void forEachElement(pugi::xml_node parent, Take take)
    {
        for (const pugi::xml_node child : parent.children()) {
            const std::size_t text = std::string_view(child.value()).find_first_not_of(blanks);
            if (child.type() == pugi::node_element)
                take(child);
            else if (text != std::string_view::npos)
                failAt(child.offset_debug() + static_cast<std::ptrdiff_t>(text), Malformed,
                       "text where only elements can stand");
            if (failed())
                return;
        }
    }

    // Null after a failure.
    pugi::xml_node onlyElement(pugi::xml_node parent)
    {
        pugi::xml_node only;
        forEachElement(parent, [&](pugi::xml_node element) {
            if (only)
                fail(element, Malformed, "a second element where only one can stand");
            only = element;
        });
        if (!only)
            fail(parent, Malformed, "an element is missing");
        return failed() ? pugi::xml_node() : only;
    }

    Value readValue(pugi::xml_node element, unsigned depth)
    {
        if (!spendObjects(1))
            return failForTooMany(element);
        const std::string_view name = nameOf(element);
        if (name == "dict" || name == "array") {
            if (depth == 0)
                return fail(element, TooDeep, format("more than {} containers inside each other", limits_.depth));
            return name == "dict" ? readDictionary(element, depth - 1) : readArray(element, depth - 1);
        }
        return readScalar(element, name);
    }

    Value failForTooMany(pugi::xml_node element)
    {
        return fail(element, TooManyObjects, format("more than {} objects", limits_.objects));
    }

    Value readArray(pugi::xml_node element, unsigned depth)
    {
        std::vector<Value> values;
        forEachElement(element, [&](pugi::xml_node child) { values.push_back(readValue(child, depth)); });
        return Array(std::move(values));
    }

    Value readDictionary(pugi::xml_node element, unsigned depth)
    {
        Dictionary::Entries entries;
        bool awaitsValue = false;
        forEachElement(element, [&](pugi::xml_node child) {
            const bool isKey = nameOf(child) == "key";
            if (isKey == awaitsValue)
                fail(child, Malformed, isKey ? "the key before has no value" : "a value without a key");
            else if (isKey)
                entries.push_back({readKey(child), Value()});
            else
                entries.back().value = readValue(child, depth);
            awaitsValue = isKey;
        });
        if (awaitsValue)
            fail(element, Malformed, "the last key of the dictionary has no value");
        return Dictionary(std::move(entries));
    }

    String readKey(pugi::xml_node element)
    {
        if (!spendObjects(1))
            failForTooMany(element);
        return String(readText(element));
    }

    // All texts inside, joined.
    std::string readText(pugi::xml_node element)
    {
        std::string text;
        for (const pugi::xml_node child : element.children()) {
            if (child.type() == pugi::node_element)
                fail(child, Malformed, "an element where only text can stand");
            else if (child.type() == pugi::node_cdata)
                text += child.value();
            else if (!appendResolved(child.value(), text))
                fail(child, InvalidText, "a reference that is not to a character");
        }
        return text;
    }

    static bool appendResolved(std::string_view raw, std::string& out)
    {
        while (true) {
            const std::size_t ampersand = raw.find('&');
            out += raw.substr(0, ampersand);
            if (ampersand == std::string_view::npos)
                return true;
            raw.remove_prefix(ampersand + 1);
            const std::size_t end = raw.find(';');
            if (end == std::string_view::npos || !appendReferred(raw.substr(0, end), out))
                return false;
            raw.remove_prefix(end + 1);
        }
    }

    Value readScalar(pugi::xml_node element, std::string_view name)
    {
        if (name == "string")
            return String(readText(element));
        if (name == "integer")
            return readParsed(element, parseInteger, "not an integer of 64 bits");
        if (name == "real")
            return readParsed(element, parseReal, "not a real number that 64 bits can hold");
        if (name == "date")
            return readParsed(element, parseDate, "not a date such as 2026-03-01T12:30:00Z");
        if (name == "data")
            return readParsed(element, parseBase64, "data that is not in base64");
        if (name == "true")
            return readParsed(element, parseNothing<true>, "a truth value with text in it");
        if (name == "false")
            return readParsed(element, parseNothing<false>, "a truth value with text in it");
        return fail(element, Unsupported, "an element that property lists do not have there");
    }

    template <typename Parse> Value readParsed(pugi::xml_node element, Parse parse, std::string_view whatElse)
    {
        const std::string text = readText(element);
        const auto parsed = parse(trimmed(text));
        return parsed ? Value(*parsed) : fail(element, InvalidValue, whatElse);
    }

    const std::string_view bytes_;
};

} // namespace

std::expected<Value, PropertyListFailure> readXmlPropertyList(std::string_view bytes, const PropertyListLimits& limits)
{
    return XmlPropertyListReader(bytes, limits).read();
}

} // namespace foundation
