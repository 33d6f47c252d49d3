// SPDX-License-Identifier: Apache-2.0
// How values are shared, found, compared and converted.
//
// Empty strings, arrays and dictionaries have no object: a frame of a million empty arrays, which a hostile
// client sends in a megabyte, costs no allocation an element.
#include "foundation/values/Value.h"

#include "foundation/values/Json.h"

#include <algorithm>
#include <cassert>
#include <charconv>
#include <cmath>
#include <ctime>
#include <fmt/chrono.h>
#include <iterator>
#include <memory>
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
constexpr std::size_t bytesOfAnObject = 48; // memory of a shared object besides its content
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

// --- Values behind an object

namespace {

// Allocates memory for the object and moves the values to their place behind it.
template <typename Object> void* allocateWith(std::span<Value> values)
{
    static_assert(sizeof(Object) % alignof(Value) == 0);
    void* const memory = ::operator new(sizeof(Object) + values.size_bytes());
    std::uninitialized_move(values.begin(), values.end(), reinterpret_cast<Value*>(static_cast<Object*>(memory) + 1));
    return memory;
}

template <typename Object> void destroyWithValues(const Object* object) noexcept
{
    std::ranges::destroy(object->values());
    object->~Object();
    ::operator delete(const_cast<Object*>(object));
}

} // namespace

const ArrayObject* ArrayObject::create(std::span<Value> values)
{
    return values.empty() ? nullptr : new (allocateWith<ArrayObject>(values)) ArrayObject(values.size());
}

void ArrayObject::destroy(const ArrayObject* object) noexcept
{
    destroyWithValues(object);
}

const DictionaryObject* DictionaryObject::create(Reference<DictionaryShape> shape, std::span<Value> values)
{
    assert(values.size() == (shape ? shape->keys().size() : 0));
    return values.empty() ? nullptr : new (allocateWith<DictionaryObject>(values)) DictionaryObject(std::move(shape));
}

void DictionaryObject::destroy(const DictionaryObject* object) noexcept
{
    destroyWithValues(object);
}

bool operator==(const Array& left, const Array& right) noexcept
{
    return std::ranges::equal(left.values(), right.values());
}

// --- Dictionary

Dictionary::Dictionary(std::vector<String> keys, std::span<Value> values)
{
    if (keys.empty())
        return;
    auto shape = DictionaryShape::fold(std::move(keys), values);
    *this = Dictionary(std::move(shape), values);
}

Dictionary::Dictionary(Entries entries)
{
    std::vector<String> keys;
    std::vector<Value> values;
    keys.reserve(entries.size());
    values.reserve(entries.size());
    for (auto& [key, value] : entries) {
        keys.push_back(std::move(key));
        values.push_back(std::move(value));
    }
    *this = Dictionary(std::move(keys), values);
}

const Value* Dictionary::find(std::string_view key) const noexcept
{
    const auto position = object_ ? object_->shape()->positionOf(key) : std::nullopt;
    return position ? &values()[*position] : nullptr;
}

Dictionary Dictionary::with(String key, Value value) const
{
    std::vector<Value> changed;
    changed.reserve(size() + 1);
    changed.assign(values().begin(), values().end());
    if (const auto position = object_ ? object_->shape()->positionOf(key) : std::nullopt) {
        changed[*position] = std::move(value);
        return {object_->shape(), changed};
    }
    changed.push_back(std::move(value));
    std::vector<String> longer;
    longer.reserve(changed.size());
    longer.assign(keys().begin(), keys().end());
    longer.push_back(std::move(key));
    return {DictionaryShape::make(std::move(longer)), changed};
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

// If both have the same keys in the same places, only entries that differ are checked against the ignored keys.
bool Dictionary::isEqualIgnoring(const Dictionary& other, std::span<const std::string_view> ignored) const noexcept
{
    const auto counts = [ignored](const String& key) {
        return std::ranges::find(ignored, key.view()) == ignored.end();
    };
    const auto ours = keys();
    const auto theirs = other.keys();
    const bool areSameKeys = ours.data() == theirs.data();
    std::size_t position = 0;
    for (; position < std::min(ours.size(), theirs.size()); ++position) {
        if (!areSameKeys && ours[position] != theirs[position])
            break;
        if (values()[position] != other.values()[position] && counts(ours[position]))
            return false;
    }
    const auto countOfOthers = std::ranges::count_if(theirs.subspan(position), counts);
    std::ptrdiff_t counted = 0;
    for (; position < ours.size(); ++position) {
        if (!counts(ours[position]))
            continue;
        ++counted;
        const Value* const value = other.find(ours[position]);
        if (value == nullptr || *value != values()[position])
            return false;
    }
    return counted == countOfOthers;
}

} // namespace foundation
