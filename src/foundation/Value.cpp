// How values are shared, found, compared and read as something else.
//
// Empty strings, arrays and dictionaries have no object: a frame of a million empty arrays, which a hostile
// client sends in a megabyte, costs no allocation an element.
#include "foundation/Value.h"

#include "foundation/Json.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <ctime>
#include <fmt/chrono.h>
#include <iterator>
#include <numeric>

namespace foundation {

// --- Value

void Value::destroyObject() noexcept
{
    switch (kind_) {
    case Kind::Array: return ArrayObject::destroy(objectAs<ArrayObject>());
    case Kind::Dictionary: return DictionaryObject::destroy(objectAs<DictionaryObject>());
    default: return StringObject::destroy(objectAs<StringObject>());
    }
}

namespace {

std::string_view withoutLeading(std::string_view text, std::string_view characters) noexcept
{
    return text.substr(std::min(text.find_first_not_of(characters), text.size()));
}

constexpr std::string_view blanks = " \t\n\v\f\r";

double leadingNumber(std::string_view text) noexcept
{
    text = withoutLeading(text, blanks);
    if (text.starts_with('+') && !text.starts_with("+-"))
        text.remove_prefix(1); // from_chars knows no plus
    double number = 0;
    std::from_chars(text.data(), text.data() + text.size(), number);
    return std::isfinite(number) ? number : 0; // "inf" and "nan" are words, not numbers
}

bool leadingTruth(std::string_view text) noexcept
{
    text = withoutLeading(text, blanks);
    if (text.starts_with('+') || text.starts_with('-'))
        text.remove_prefix(1);
    text = withoutLeading(text, "0");
    return !text.empty() && std::string_view("YyTt123456789").contains(text.front());
}

void appendBase64(std::string_view bytes, std::string& out)
{
    constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    for (std::size_t at = 0; at < bytes.size(); at += 3) {
        std::uint32_t group = 0;
        for (std::size_t index = 0; index < 3; ++index)
            group = group << 8 | (at + index < bytes.size() ? static_cast<std::uint8_t>(bytes[at + index]) : 0U);
        for (std::size_t index = 0; index < 4; ++index)
            out.push_back(at + index > bytes.size() ? '=' : alphabet[group >> (18 - 6 * index) & 63]);
    }
}

// To the second. Years that do not have four digits are left as the number of seconds.
void appendIso8601(double secondsSince1970, std::string& out)
{
    constexpr double firstSecondOfYear0 = -62167219200;
    constexpr double firstSecondOfYear10000 = 253402300800;
    if (!(secondsSince1970 >= firstSecondOfYear0 && secondsSince1970 < firstSecondOfYear10000))
        return Number(secondsSince1970).appendText(out);
    const auto seconds = static_cast<std::time_t>(std::floor(secondsSince1970));
    fmt::format_to(std::back_inserter(out), "{:%Y-%m-%dT%H:%M:%SZ}", fmt::gmtime(seconds));
}

} // namespace

double Value::asDouble() const noexcept
{
    if (kind_ == Kind::Number)
        return numberUnchecked().doubleValue();
    return kind_ == Kind::String ? leadingNumber(bytesUnchecked()) : 0;
}

bool Value::asBoolean() const noexcept
{
    if (kind_ == Kind::Number)
        return numberUnchecked().booleanValue();
    return kind_ == Kind::String && leadingTruth(bytesUnchecked());
}

std::string Value::text() const
{
    std::string text;
    appendText(text);
    return text;
}

void Value::appendText(std::string& out) const
{
    switch (kind_) {
    case Kind::Null: out += "(null)"; break;
    case Kind::Number: numberUnchecked().appendText(out); break;
    case Kind::String: out += bytesUnchecked(); break;
    case Kind::Array:
    case Kind::Dictionary: appendJsonText(*this, out); break;
    case Kind::Data: appendBase64(bytesUnchecked(), out); break;
    case Kind::Date: appendIso8601(date_, out); break;
    }
}

namespace {
constexpr std::size_t bytesOfAnObject = 48; // what a shared object takes beside its content
}

std::size_t Value::roughBytes() const noexcept
{
    switch (kind_) {
    case Kind::String:
    case Kind::Data: return sizeof *this + bytesOfAnObject + bytesUnchecked().size();
    case Kind::Dictionary: return sizeof *this + dictionary()->roughBytes();
    case Kind::Array: {
        const Array elements = *array();
        return std::accumulate(elements.begin(), elements.end(), sizeof *this + bytesOfAnObject,
                               [](std::size_t bytes, const Value& each) { return bytes + each.roughBytes(); });
    }
    default: return sizeof *this;
    }
}

std::size_t Dictionary::roughBytes() const noexcept
{
    std::size_t bytes = bytesOfAnObject;
    for (const auto& [key, value] : *this)
        bytes += bytesOfAnObject + key.view().size() + value.roughBytes();
    return bytes;
}

bool operator==(const Value& left, const Value& right) noexcept
{
    if (left.kind_ != right.kind_)
        return false;
    switch (left.kind_) {
    case Value::Kind::Null: return true;
    case Value::Kind::Number: return left.numberUnchecked() == right.numberUnchecked();
    case Value::Kind::Date: return left.date_ == right.date_;
    case Value::Kind::Array: return *left.array() == *right.array();
    case Value::Kind::Dictionary: return *left.dictionary() == *right.dictionary();
    default: return left.object_ == right.object_ || left.bytesUnchecked() == right.bytesUnchecked();
    }
}

// --- Array

Array::Array(std::vector<Value> values)
    : object_(Reference<ArrayObject>::adopt(values.empty() ? nullptr : new ArrayObject(std::move(values))))
{
}

bool operator==(const Array& left, const Array& right) noexcept
{
    return std::ranges::equal(left.values(), right.values());
}

// --- Dictionary

DictionaryObject::DictionaryObject(std::vector<DictionaryEntry> given) : entries_(std::move(given))
{
    // Up to here comparing the keys one by one beats any index.
    constexpr std::size_t mostUnindexed = 16;
    if (entries_.size() <= mostUnindexed)
        foldRepetitions();
    else
        indexAndFoldRepetitions();
}

const Value* DictionaryObject::find(std::string_view key) const noexcept
{
    if (byKey_.empty()) {
        const auto found = std::ranges::find(entries_, key, [](const auto& entry) { return entry.key.view(); });
        return found == entries_.end() ? nullptr : &found->value;
    }
    const auto found = std::ranges::lower_bound(byKey_, key, {}, [this](auto position) { return keyAt(position); });
    return found == byKey_.end() || keyAt(*found) != key ? nullptr : &entries_[*found].value;
}

namespace {

// Tells most keys apart without looking at all of their characters: a number below 64.
unsigned fingerprint(std::string_view key) noexcept
{
    if (key.empty())
        return 0;
    const auto at = [key](std::size_t index) { return static_cast<std::uint8_t>(key[index]); };
    return (static_cast<unsigned>(key.size()) + 5U * at(0) + 11U * at(key.size() / 2) + 23U * at(key.size() - 1)) % 64;
}

} // namespace

// Nearly always nothing is repeated, and the fingerprints show it.
void DictionaryObject::foldRepetitions()
{
    std::uint64_t seen = 0;
    auto kept = entries_.begin();
    for (auto entry = entries_.begin(); entry != entries_.end(); ++entry) {
        const std::uint64_t bit = std::uint64_t{1} << fingerprint(entry->key);
        const auto earlier = (seen & bit) == 0
            ? kept
            : std::find_if(entries_.begin(), kept, [&](const auto& other) { return other.key == entry->key; });
        seen |= bit;
        if (earlier != kept)
            earlier->value = std::move(entry->value);
        else if (kept++ != entry)
            *std::prev(kept) = std::move(*entry);
    }
    entries_.erase(kept, entries_.end());
}

void DictionaryObject::indexKeys()
{
    byKey_.resize(entries_.size());
    std::iota(byKey_.begin(), byKey_.end(), 0U);
    std::ranges::sort(byKey_, {}, [this](auto position) { return std::pair(keyAt(position), position); });
}

void DictionaryObject::indexAndFoldRepetitions()
{
    indexKeys();
    std::vector<bool> repeats(entries_.size());
    bool any = false;
    for (std::size_t first = 0, next = 1; next < byKey_.size(); ++next) {
        if (keyAt(byKey_[next]) != keyAt(byKey_[first])) {
            first = next;
            continue;
        }
        entries_[byKey_[first]].value = std::move(entries_[byKey_[next]].value);
        any = repeats[byKey_[next]] = true;
    }
    if (!any)
        return;
    std::vector<DictionaryEntry> distinct;
    for (std::size_t position = 0; position < entries_.size(); ++position)
        if (!repeats[position])
            distinct.push_back(std::move(entries_[position]));
    entries_ = std::move(distinct);
    indexKeys();
}

Dictionary::Dictionary(Entries entries)
    : object_(Reference<DictionaryObject>::adopt(entries.empty() ? nullptr : new DictionaryObject(std::move(entries))))
{
}

Dictionary Dictionary::with(String key, Value value) const
{
    const auto place = std::ranges::find(entries(), key, &Entry::key);
    Entries changed;
    changed.reserve(size() + 1);
    changed.assign(begin(), end());
    if (place == end())
        changed.push_back({std::move(key), std::move(value)});
    else
        changed[static_cast<std::size_t>(place - begin())].value = std::move(value);
    return changed;
}

Dictionary Dictionary::without(std::string_view key) const
{
    if (!contains(key))
        return *this;
    Entries kept;
    kept.reserve(size());
    std::ranges::copy_if(*this, std::back_inserter(kept), [key](const Entry& entry) { return entry.key != key; });
    return kept;
}

Dictionary Dictionary::mergedWith(const Dictionary& other) const
{
    Entries all;
    all.reserve(size() + other.size());
    all.assign(begin(), end());
    all.insert(all.end(), other.begin(), other.end());
    return all;
}

// As long as both have the same keys in the same places, only what differs is asked whether it counts.
bool Dictionary::isEqualIgnoring(const Dictionary& other, std::span<const std::string_view> keys) const noexcept
{
    const auto counts = [keys](const Entry& entry) { return std::ranges::find(keys, entry.key.view()) == keys.end(); };
    auto ours = entries();
    auto theirs = other.entries();
    while (!ours.empty() && !theirs.empty() && ours.front().key == theirs.front().key) {
        if (ours.front().value != theirs.front().value && counts(ours.front()))
            return false;
        ours = ours.subspan(1);
        theirs = theirs.subspan(1);
    }
    std::size_t counted = 0;
    for (const Entry& entry : ours) {
        if (!counts(entry))
            continue;
        ++counted;
        const Value* const value = other.find(entry.key);
        if (value == nullptr || *value != entry.value)
            return false;
    }
    return counted == static_cast<std::size_t>(std::ranges::count_if(theirs, counts));
}

} // namespace foundation
