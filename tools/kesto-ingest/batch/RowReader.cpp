// SPDX-License-Identifier: Apache-2.0
// RapidJSON reads a copy of the line and leaves its texts there, without their escapes; the handler keeps where they
// are, and writes the payload again without spaces.
#include "kesto-ingest/batch/RowReader.h"

#include "foundation/values/String.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/reader.h>
#include <rapidjson/stream.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <optional>
#include <system_error>
#include <utility>

namespace kesto_ingest {

namespace {

constexpr unsigned deepest = 48; // of objects and lists in each other; devices send up to 40

template <typename Number> std::optional<Number> numberIn(std::string_view text) noexcept
{
    Number number{};
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    return error == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

// A line that RapidJSON reads in place. When it begins with a text, what needs no change there is behind it at once.
class LineStream : public rapidjson::InsituStringStream {
public:
    explicit LineStream(std::string& line) : rapidjson::InsituStringStream(line.data()), end_(line.data() + line.size())
    {
    }

    char* PutBegin()
    {
        char* const begin = src_;
        src_ += plainLength({src_, end_});
        dst_ = src_;
        return begin;
    }

private:
    char* end_;
};

// Called by RapidJSON for each part of the line. A function that returns false stops it.
class EntryHandler {
public:
    EntryHandler(std::array<RowEntry, keyCount>& entries, EmbeddedJson& payload) : entries_(entries), payload_(payload)
    {
    }

    [[nodiscard]] const std::string& reason() const noexcept { return reason_; }

    bool Null() { return addValue(ValueKind::Null, "null"); }
    bool Bool(bool value) { return value ? addValue(ValueKind::True, "true") : addValue(ValueKind::False, "false"); }
    bool RawNumber(const char* text, rapidjson::SizeType length, bool)
    {
        return addValue(ValueKind::Number, {text, length});
    }
    bool String(const char* text, rapidjson::SizeType length, bool)
    {
        return addValue(ValueKind::Text, {text, length});
    }
    bool Key(const char* text, rapidjson::SizeType length, bool)
    {
        const std::string_view key(text, length);
        if (depth_ == 1)
            return beginEntry(key);
        if (isInPayload_) {
            payload_.addKey(key);
            next_ = depth_ == 2 ? factNamed(key) : nullptr;
        }
        return true;
    }
    bool StartObject() { return open(ValueKind::Object, '{'); }
    bool EndObject(rapidjson::SizeType) { return close('}'); }
    bool StartArray() { return open(ValueKind::List, '['); }
    bool EndArray(rapidjson::SizeType) { return close(']'); }

    // Numbers come as their text.
    static bool Int(int) { return false; }
    static bool Uint(unsigned) { return false; }
    static bool Int64(std::int64_t) { return false; }
    static bool Uint64(std::uint64_t) { return false; }
    static bool Double(double) { return false; }

private:
    [[nodiscard]] RowEntry* entryOf(std::optional<kesto_ingest::Key> key)
    {
        return key ? &entries_[static_cast<std::size_t>(*key)] : nullptr;
    }
    bool beginEntry(std::string_view key)
    {
        const auto known = keyNamed(key);
        next_ = entryOf(known);
        if (next_ != nullptr && next_->kind != ValueKind::Absent)
            return refuse(fmt::format("the key {} is there twice", key));
        isInPayload_ = known == kesto_ingest::Key::Payload;
        return true;
    }
    // What the payload tells itself, and not an object inside. Null if it is nothing, or was told before.
    RowEntry* factNamed(std::string_view key)
    {
        RowEntry* const fact = entryOf(payloadKeyNamed(key));
        return fact != nullptr && fact->kind <= ValueKind::Null ? fact : nullptr;
    }
    bool refuse(std::string reason)
    {
        reason_ = std::move(reason);
        return false;
    }
    bool addValue(ValueKind kind, std::string_view text)
    {
        if (depth_ == 0)
            return refuse("it is no JSON object");
        if (isInPayload_ && kind == ValueKind::Text)
            payload_.addText(text);
        else if (isInPayload_)
            payload_.addWord(text);
        const bool isBoolean = kind == ValueKind::True || kind == ValueKind::False;
        RowEntry* const entry = std::exchange(next_, nullptr);
        if (entry != nullptr && isBoolean && depth_ > 1) // numbers there, as for SQLite, by which devices read theirs
            *entry = {.kind = ValueKind::Number, .text = kind == ValueKind::True ? "1" : "0"};
        else if (entry != nullptr)
            *entry = {.kind = kind, .text = text};
        return true;
    }
    bool open(ValueKind kind, char bracket)
    {
        if (depth_ == 0 && kind != ValueKind::Object)
            return refuse("it is no JSON object");
        if (++depth_ > deepest)
            return refuse(fmt::format("its objects and lists are nested deeper than {}", deepest));
        if (isInPayload_)
            payload_.open(bracket);
        RowEntry* const entry = std::exchange(next_, nullptr);
        if (entry != nullptr && depth_ == 2)
            entry->kind = kind;
        return true;
    }
    bool close(char bracket)
    {
        const bool isRow = --depth_ == 0;
        if (isInPayload_ && !isRow)
            payload_.close(bracket);
        return true;
    }

    std::array<RowEntry, keyCount>& entries_;
    EmbeddedJson& payload_;
    unsigned depth_ = 0;
    RowEntry* next_ = nullptr; // takes the next value; null: no entry does
    bool isInPayload_ = false;
    std::string reason_;
};

bool isDigits(std::string_view text)
{
    return text.size() == 32 && std::ranges::all_of(text, [](char digit) {
               return (digit >= '0' && digit <= '9') || (digit >= 'a' && digit <= 'f');
           });
}

// Keeps the number in the entry.
bool isNumberBetween(RowEntry& entry, double least, double most)
{
    const auto number = entry.kind == ValueKind::Number ? numberIn<double>(entry.text) : std::nullopt;
    entry.number = number.value_or(0);
    return number && *number >= least && *number <= most;
}

template <typename Integer> bool isInteger(const RowEntry& entry)
{
    return entry.kind == ValueKind::Number && numberIn<Integer>(entry.text).has_value();
}

// What the type demands; empty if the entry has it.
std::string_view lacking(RowEntry& entry, FieldType type)
{
    constexpr double largest = std::numeric_limits<double>::max();
    const bool isText = entry.kind == ValueKind::Text;
    switch (type) {
    case FieldType::Digits: return isText && isDigits(entry.text) ? "" : "32 hexadecimal digits, in lower case";
    case FieldType::Identity:
        return isInteger<std::int64_t>(entry) && entry.text[0] != '-' ? "" : "an integer from 0 to 2^63 - 1";
    case FieldType::Integer: return isInteger<std::int64_t>(entry) ? "" : "an integer of 64 bits";
    case FieldType::Count: return isInteger<std::uint32_t>(entry) ? "" : "an integer from 0 to 2^32 - 1";
    case FieldType::Moment:
    case FieldType::Length:
        return isNumberBetween(entry, 0, latestMoment) ? "" : "a number of seconds from 0 to 2^32 - 1";
    case FieldType::Number:
    case FieldType::Share: return isNumberBetween(entry, -largest, largest) ? "" : "a number";
    case FieldType::Flag: return entry.kind == ValueKind::False || entry.kind == ValueKind::True ? "" : "true or false";
    case FieldType::Label: return isText && entry.text.size() <= longestLabel ? "" : "a text of at most 128 bytes";
    case FieldType::Name: return isText || entry.kind == ValueKind::Number ? "" : "a text";
    case FieldType::Text: return isText && entry.text.size() <= longestText ? "" : "a text of at most 16384 bytes";
    case FieldType::Object: return entry.kind == ValueKind::Object ? "" : "an object";
    }
    return "of a known type";
}

} // namespace

} // namespace kesto_ingest

template <> struct rapidjson::StreamTraits<kesto_ingest::LineStream> {
    enum { copyOptimization = 1 }; // as for its base; texts of numbers come only so
};

namespace kesto_ingest {

std::expected<void, std::string> RowReader::parse(std::string_view line)
{
    constexpr unsigned flags = rapidjson::kParseInsituFlag | rapidjson::kParseNumbersAsStringsFlag;
    for (RowEntry& entry : entries_)
        entry.kind = ValueKind::Absent;
    payload_.clear();
    if (!foundation::isValidUtf8(line)) // quicker than RapidJSON's own check of each text
        return std::unexpected("it is no UTF-8");
    line_ = line;
    EntryHandler handler(entries_, payload_);
    rapidjson::Reader reader;
    LineStream stream(line_);
    const auto result = reader.Parse<flags>(stream, handler);
    if (!handler.reason().empty())
        return std::unexpected(handler.reason());
    if (result.IsError())
        return std::unexpected(fmt::format("it is no JSON from byte {} on: {}", result.Offset(),
                                           rapidjson::GetParseError_En(result.Code())));
    if (stream.Tell() != line.size()) // a NUL ended it
        return std::unexpected("it is no JSON: it has a NUL");
    entries_[static_cast<std::size_t>(Key::Payload)].text = payload_.content();
    return {};
}

std::expected<void, std::string> RowReader::checkFields()
{
    for (const Field& field : kind_->fields) {
        RowEntry& entry = entries_[static_cast<std::size_t>(field.key)];
        const bool isTold = entry.kind > ValueKind::Null;
        if (!isTold && field.isRequired)
            return std::unexpected(fmt::format("the key {} is missing", name(field.key)));
        if (!isTold)
            continue;
        const std::string_view what = lacking(entry, field.type);
        if (what.empty())
            continue;
        if (field.isRequired)
            return std::unexpected(fmt::format("{} is not {}", name(field.key), what));
        entry.kind = ValueKind::Null;
    }
    return {};
}

std::expected<void, std::string> RowReader::read(std::string_view line)
{
    if (auto parsed = parse(line); !parsed)
        return parsed;
    const RowEntry* const kind = find(Key::Kind);
    if (kind == nullptr || kind->kind != ValueKind::Text)
        return std::unexpected("it has no kind");
    kind_ = kindNamed(kind->text);
    if (kind_ == nullptr)
        return std::unexpected(fmt::format("there are no rows of kind {}", kind->text.substr(0, 64)));
    return checkFields();
}

std::string_view RowReader::text(Key key) const noexcept
{
    const RowEntry* const entry = find(key);
    return entry == nullptr ? std::string_view() : entry->text;
}

double RowReader::number(Key key) const noexcept
{
    const RowEntry* const entry = find(key);
    return entry == nullptr ? 0 : entry->number;
}

std::uint64_t RowReader::identity(Key key) const noexcept
{
    return numberIn<std::uint64_t>(text(key)).value_or(0);
}

} // namespace kesto_ingest
