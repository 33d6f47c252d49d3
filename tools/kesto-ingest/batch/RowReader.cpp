// SPDX-License-Identifier: Apache-2.0
// RapidJSON reads the text; the handler keeps the entries of the row, and writes the object inside again without
// spaces.
#include "kesto-ingest/batch/RowReader.h"

#include "foundation/values/String.h"

#include <fmt/format.h>
#include <rapidjson/error/en.h>
#include <rapidjson/memorystream.h>
#include <rapidjson/reader.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <optional>
#include <span>
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

// Called by RapidJSON for each part of the line. A function that returns false stops it.
class EntryHandler {
public:
    EntryHandler(std::span<RowEntry> entries, std::size_t& size) : entries_(entries), size_(size) { }

    [[nodiscard]] const std::string& reason() const noexcept { return reason_; }

    bool Null()
    {
        fact_ = nullptr;
        return isInside() ? writer_.Null() : set(ValueKind::Null, {});
    }
    bool Bool(bool value)
    {
        note(ValueKind::Number, value ? "1" : "0");
        return isInside() ? writer_.Bool(value) : set(value ? ValueKind::True : ValueKind::False, {});
    }
    bool RawNumber(const char* text, rapidjson::SizeType length, bool)
    {
        note(ValueKind::Number, {text, length});
        return isInside() ? writer_.RawValue(text, length, rapidjson::kNumberType)
                          : set(ValueKind::Number, {text, length});
    }
    bool String(const char* text, rapidjson::SizeType length, bool)
    {
        note(ValueKind::Text, {text, length});
        return isInside() ? writer_.String(text, length) : set(ValueKind::Text, {text, length});
    }
    bool Key(const char* text, rapidjson::SizeType length, bool)
    {
        const std::string_view key(text, length);
        if (isInside()) {
            fact_ = factNamed(key);
            return writer_.Key(text, length);
        }
        isIgnored_ = !hasField(key);
        if (isIgnored_)
            return true;
        for (const RowEntry& entry : entries_.first(size_))
            if (entry.key == key)
                return refuse(fmt::format("the key {} is there twice", key.substr(0, 64)));
        if (size_ == entries_.size())
            return refuse(fmt::format("it has more than {} keys", entries_.size()));
        entries_[size_++].key = key;
        return true;
    }
    bool StartObject() { return open(ValueKind::Object) && (depth_ <= 1 || writer_.StartObject()); }
    bool EndObject(rapidjson::SizeType) { return (depth_ <= 1 || writer_.EndObject()) && close(ValueKind::Object); }
    bool StartArray() { return open(ValueKind::List) && (depth_ <= 1 || writer_.StartArray()); }
    bool EndArray(rapidjson::SizeType) { return (depth_ <= 1 || writer_.EndArray()) && close(ValueKind::List); }

    // Numbers come as their text.
    static bool Int(int) { return false; }
    static bool Uint(unsigned) { return false; }
    static bool Int64(std::int64_t) { return false; }
    static bool Uint64(std::uint64_t) { return false; }
    static bool Double(double) { return false; }

private:
    // What the payload tells itself, and not an object inside. Booleans are numbers there, as for SQLite, by which
    // devices read theirs.
    struct Fact {
        std::string_view field;
        ValueKind kind = ValueKind::Null;
        std::string text{};
    };

    [[nodiscard]] bool isInside() const noexcept { return depth_ > 1; }

    // Null if it is none, or was told before.
    Fact* factNamed(std::string_view key)
    {
        if (depth_ != 2 || isIgnored_ || entries_[size_ - 1].key != "payload")
            return nullptr;
        const auto fact = std::ranges::find_if(facts_, [key](const Fact& each) {
            return each.field.substr(std::string_view("payload.").size()) == key && each.kind == ValueKind::Null;
        });
        return fact == facts_.end() ? nullptr : &*fact;
    }
    void note(ValueKind kind, std::string_view text)
    {
        if (Fact* const fact = std::exchange(fact_, nullptr)) {
            fact->kind = kind;
            fact->text = text;
        }
    }
    // As entries of the row.
    bool addFacts()
    {
        for (Fact& fact : facts_) {
            if (fact.kind != ValueKind::Null && size_ < entries_.size())
                entries_[size_++] = {std::string(fact.field), fact.kind, std::move(fact.text)};
            fact.kind = ValueKind::Null;
        }
        return true;
    }

    bool refuse(std::string reason)
    {
        reason_ = std::move(reason);
        return false;
    }
    bool set(ValueKind kind, std::string_view text)
    {
        if (depth_ == 0)
            return refuse("it is no JSON object");
        if (isIgnored_)
            return true;
        entries_[size_ - 1].kind = kind;
        entries_[size_ - 1].text = text;
        return true;
    }
    bool open(ValueKind kind)
    {
        fact_ = nullptr;
        if (depth_ == 0 && kind != ValueKind::Object)
            return refuse("it is no JSON object");
        if (++depth_ > deepest)
            return refuse(fmt::format("its objects and lists are nested deeper than {}", deepest));
        if (depth_ == 2) {
            buffer_.Clear();
            writer_.Reset(buffer_);
        }
        return true;
    }
    bool close(ValueKind kind)
    {
        return --depth_ != 1 || (set(kind, {buffer_.GetString(), buffer_.GetSize()}) && addFacts());
    }

    std::span<RowEntry> entries_;
    std::size_t& size_;
    unsigned depth_ = 0;
    std::array<Fact, 2> facts_{{{.field = "payload.active_devices"}, {.field = "payload.late_cycles"}}};
    Fact* fact_ = nullptr; // whose value comes next
    bool isIgnored_ = false; // the key that was read last, outside of objects and lists
    std::string reason_;
    rapidjson::StringBuffer buffer_;
    rapidjson::Writer<rapidjson::StringBuffer> writer_{buffer_};
};

bool isDigits(std::string_view text)
{
    return text.size() == 32 && std::ranges::all_of(text, [](char digit) {
               return (digit >= '0' && digit <= '9') || (digit >= 'a' && digit <= 'f');
           });
}

bool isNumberBetween(const RowEntry& entry, double least, double most)
{
    const auto number = entry.kind == ValueKind::Number ? numberIn<double>(entry.text) : std::nullopt;
    return number && *number >= least && *number <= most;
}

template <typename Integer> bool isInteger(const RowEntry& entry)
{
    return entry.kind == ValueKind::Number && numberIn<Integer>(entry.text).has_value();
}

// What the type demands; empty if the entry has it.
std::string_view lacking(const RowEntry& entry, FieldType type)
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

std::expected<void, std::string> RowReader::parse(std::string_view line)
{
    constexpr unsigned flags = rapidjson::kParseNumbersAsStringsFlag | rapidjson::kParseIterativeFlag;
    size_ = 0;
    if (!foundation::isValidUtf8(line)) // quicker than RapidJSON's own check of each text
        return std::unexpected("it is no UTF-8");
    EntryHandler handler(entries_, size_);
    rapidjson::Reader reader;
    rapidjson::MemoryStream stream(line.data(), line.size());
    const auto result = reader.Parse<flags>(stream, handler);
    if (!handler.reason().empty())
        return std::unexpected(handler.reason());
    if (result.IsError())
        return std::unexpected(fmt::format("it is no JSON from byte {} on: {}", result.Offset(),
                                           rapidjson::GetParseError_En(result.Code())));
    if (stream.Tell() != line.size()) // a NUL ended it
        return std::unexpected("it is no JSON: it has a NUL");
    return {};
}

std::expected<void, std::string> RowReader::checkFields()
{
    const auto entries = std::span(entries_).first(size_);
    for (const Field& field : kind_->fields) {
        const auto place = std::ranges::find(entries, field.key, &RowEntry::key);
        RowEntry* const entry = place == entries.end() || place->kind == ValueKind::Null ? nullptr : &*place;
        if (entry == nullptr && field.isRequired)
            return std::unexpected(fmt::format("the key {} is missing", field.key));
        if (entry == nullptr)
            continue;
        const std::string_view what = lacking(*entry, field.type);
        if (what.empty())
            continue;
        if (!field.isRequired)
            entry->kind = ValueKind::Null;
        else
            return std::unexpected(fmt::format("{} is not {}", field.key, what));
    }
    return {};
}

std::expected<void, std::string> RowReader::read(std::string_view line)
{
    if (auto parsed = parse(line); !parsed)
        return parsed;
    const RowEntry* const kind = find("kind");
    if (kind == nullptr || kind->kind != ValueKind::Text)
        return std::unexpected("it has no kind");
    kind_ = kindNamed(kind->text);
    if (kind_ == nullptr)
        return std::unexpected(fmt::format("there are no rows of kind {}", kind->text.substr(0, 64)));
    return checkFields();
}

const RowEntry* RowReader::find(std::string_view key) const noexcept
{
    for (const RowEntry& entry : std::span(entries_).first(size_))
        if (entry.key == key)
            return entry.kind == ValueKind::Null ? nullptr : &entry;
    return nullptr;
}

std::string_view RowReader::text(std::string_view key) const noexcept
{
    const RowEntry* const entry = find(key);
    return entry == nullptr ? std::string_view() : std::string_view(entry->text);
}

double RowReader::number(std::string_view key) const noexcept
{
    return numberIn<double>(text(key)).value_or(0);
}

std::uint64_t RowReader::identity(std::string_view key) const noexcept
{
    return numberIn<std::uint64_t>(text(key)).value_or(0);
}

} // namespace kesto_ingest
