// SPDX-License-Identifier: Apache-2.0
// The room of values: numbers, texts, arrays and dictionaries, how they compare, and their JSON text. It uses no other
// room.
//
// The one data type of messages, configurations and preferences: null, number, string, array,
// dictionary, and the data and dates that property lists have.
//
// A value is immutable, 16 bytes, and cheap to copy: strings, arrays and dictionaries are shared. So it is safe to hand
// a payload to the store's thread while the session keeps it too.
#pragma once

#include "foundation/values/DictionaryShape.h"
#include "foundation/values/Number.h"
#include "foundation/values/Reference.h"
#include "foundation/values/String.h"

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace foundation {

class Array;
class Dictionary;

// Bytes that are not text. Any thread.
struct Data {
    String bytes;
    friend bool operator==(const Data&, const Data&) = default;
};

// A point in time, in seconds since 1970 UTC.
struct Date {
    double secondsSince1970 = 0;
    friend bool operator==(const Date&, const Date&) = default;
};

// Any thread; different threads may use distinct copies at the same time.
class Value {
public:
    enum class Kind : std::uint8_t { Null, Number, String, Array, Dictionary, Data, Date };

    constexpr Value() noexcept = default;
    constexpr Value(Number number) noexcept : kind_(Kind::Number), numberKind_(number.kind_), scalar_(number.bits_) { }
    constexpr Value(std::integral auto number) noexcept : Value(Number(number)) { }
    constexpr Value(std::floating_point auto number) noexcept : Value(Number(number)) { }
    Value(String text) noexcept;
    Value(std::string_view text) : Value(String(text)) { }
    Value(const std::string& text) : Value(String(text)) { }
    Value(const char* text) : Value(String(text)) { }
    Value(Array array) noexcept;
    Value(Dictionary dictionary) noexcept;
    Value(Data data) noexcept;
    Value(Date date) noexcept;

    Value(const Value& other) noexcept : kind_(other.kind_), numberKind_(other.numberKind_), scalar_(other.scalar_)
    {
        if (isShared())
            object_->retain();
    }
    Value(Value&& other) noexcept
        : kind_(std::exchange(other.kind_, Kind::Null)),
          numberKind_(other.numberKind_),
          scalar_(std::exchange(other.scalar_, 0))
    {
    }
    Value& operator=(Value other) noexcept
    {
        std::swap(kind_, other.kind_);
        std::swap(numberKind_, other.numberKind_);
        std::swap(scalar_, other.scalar_);
        return *this;
    }
    ~Value()
    {
        if (isShared() && object_->release())
            destroyObject();
    }

    [[nodiscard]] Kind kind() const noexcept { return kind_; }
    [[nodiscard]] bool isNull() const noexcept { return kind_ == Kind::Null; }

    // The value as that type, or nothing if it has another kind.
    [[nodiscard]] std::optional<Number> number() const noexcept;
    [[nodiscard]] std::optional<String> string() const noexcept;
    [[nodiscard]] std::optional<Array> array() const noexcept;
    [[nodiscard]] std::optional<Dictionary> dictionary() const noexcept;
    [[nodiscard]] std::optional<Data> data() const noexcept;
    [[nodiscard]] std::optional<Date> date() const noexcept;

    // The number as an integer of that type, or nothing if it does not have an integer kind or is out of range.
    template <std::integral Integer> [[nodiscard]] std::optional<Integer> exactly() const noexcept
    {
        return kind_ == Kind::Number ? numberUnchecked().exactly<Integer>() : std::nullopt;
    }

    // The characters of a string, without sharing it; nothing of other kinds.
    [[nodiscard]] std::string_view stringView() const noexcept
    {
        return kind_ == Kind::String ? bytesUnchecked() : std::string_view();
    }

    // The value as a number: text counts as its leading number, and a value that is neither number nor text as 0.
    [[nodiscard]] double asDouble() const noexcept;
    // As a truth value: a number that is not 0, or text that begins with Y, y, T, t or a number that is not
    // 0 (after blanks, a sign and zeros); anything else is false.
    [[nodiscard]] bool asBoolean() const noexcept;

    // A string as it is, a number's decimal text, the compact JSON of an array or a dictionary, "(null)"
    // for null, the base64 of data and the ISO 8601 text of a date.
    [[nodiscard]] std::string text() const;
    void appendText(std::string& out) const;

    // A rough size of its memory, for limits; shared parts count in full.
    [[nodiscard]] std::size_t roughBytes() const noexcept;

    // By content; numbers by value, for all kinds.
    friend bool operator==(const Value& left, const Value& right) noexcept;

private:
    [[nodiscard]] bool isShared() const noexcept
    {
        return kind_ >= Kind::String && kind_ <= Kind::Data && object_ != nullptr;
    }
    void destroyObject() noexcept;
    [[nodiscard]] Number numberUnchecked() const noexcept { return {numberKind_, scalar_}; }
    [[nodiscard]] std::string_view bytesUnchecked() const noexcept;
    template <typename Object> [[nodiscard]] const Object* objectAs() const noexcept;
    template <typename Object> [[nodiscard]] Reference<Object> shareAs() const noexcept;

    Kind kind_ = Kind::Null;
    Number::Kind numberKind_ = Number::Kind::Signed64;
    union {
        std::uint64_t scalar_ = 0;
        double date_;
        const ReferenceCounted* object_; // of strings, data, arrays and dictionaries; null is the empty one
    };
};

// A shared object with values right behind it, in one allocation.
class ArrayObject : public ReferenceCounted {
public:
    // Moves the values; null without values.
    static const ArrayObject* create(std::span<Value> values);
    static void destroy(const ArrayObject* object) noexcept;

    [[nodiscard]] std::span<const Value> values() const noexcept
    {
        return {reinterpret_cast<const Value*>(this + 1), size_};
    }

private:
    explicit ArrayObject(std::size_t size) noexcept : size_(size) { }

    std::size_t size_;
};

// An immutable, shared list of values. Any thread.
class Array {
public:
    Array() noexcept = default;
    // Moves the values.
    explicit Array(std::span<Value> values) : object_(Reference<ArrayObject>::adopt(ArrayObject::create(values))) { }
    Array(std::vector<Value> values) : Array(std::span(values)) { }
    Array(std::initializer_list<Value> values) : Array(std::vector<Value>(values)) { }

    [[nodiscard]] std::span<const Value> values() const noexcept
    {
        return object_ ? object_->values() : std::span<const Value>();
    }
    [[nodiscard]] std::size_t size() const noexcept { return values().size(); }
    [[nodiscard]] bool empty() const noexcept { return values().empty(); }
    const Value& operator[](std::size_t index) const noexcept { return values()[index]; }
    [[nodiscard]] auto begin() const noexcept { return values().begin(); }
    [[nodiscard]] auto end() const noexcept { return values().end(); }

    friend bool operator==(const Array& left, const Array& right) noexcept;

private:
    friend class Value;
    explicit Array(Reference<ArrayObject> object) noexcept : object_(std::move(object)) { }
    Reference<ArrayObject> object_;
};

// One entry of a dictionary that is being made.
struct DictionaryEntry {
    String key;
    Value value;
};

// What a dictionary shares: a shape, and values right behind the object, in one allocation.
class DictionaryObject : public ReferenceCounted {
public:
    // Moves the values, as many as the shape has keys; null without values.
    static const DictionaryObject* create(Reference<DictionaryShape> shape, std::span<Value> values);
    static void destroy(const DictionaryObject* object) noexcept;

    [[nodiscard]] const Reference<DictionaryShape>& shape() const noexcept { return shape_; }
    [[nodiscard]] std::span<const String> keys() const noexcept { return shape_->keys(); }
    [[nodiscard]] std::span<const Value> values() const noexcept
    {
        return {reinterpret_cast<const Value*>(this + 1), keys().size()};
    }

private:
    explicit DictionaryObject(Reference<DictionaryShape> shape) noexcept : shape_(std::move(shape)) { }

    Reference<DictionaryShape> shape_;
};

// An immutable, shared dictionary in the order of insertion. Any thread.
//
// Made from a list of entries, in which the last value of a repeated key takes the place of its first; or from existing
// keys or an existing shape. To change a dictionary, make a new one; to add many entries, collect them in a vector.
class Dictionary {
public:
    using Entries = std::vector<DictionaryEntry>;

    // An entry, for iteration over a dictionary.
    struct Entry {
        const String& key;
        const Value& value;
        operator DictionaryEntry() const { return {key, value}; }
    };
    class Iterator;
    using value_type = Entry;
    using const_iterator = Iterator;

    Dictionary() noexcept = default;
    Dictionary(Entries entries);
    Dictionary(std::initializer_list<DictionaryEntry> entries) : Dictionary(Entries(entries)) { }
    // From keys, which may repeat, and as many values, which are moved.
    Dictionary(std::vector<String> keys, std::span<Value> values);
    // From a shape and a value for each of its keys; the values are moved.
    Dictionary(Reference<DictionaryShape> shape, std::span<Value> values)
        : object_(Reference<DictionaryObject>::adopt(DictionaryObject::create(std::move(shape), values)))
    {
    }

    // The shape; null for the empty dictionary.
    [[nodiscard]] Reference<DictionaryShape> shape() const noexcept
    {
        return object_ ? object_->shape() : Reference<DictionaryShape>();
    }
    [[nodiscard]] std::span<const String> keys() const noexcept
    {
        return object_ ? object_->keys() : std::span<const String>();
    }
    // In the order of the keys.
    [[nodiscard]] std::span<const Value> values() const noexcept
    {
        return object_ ? object_->values() : std::span<const Value>();
    }
    [[nodiscard]] std::size_t size() const noexcept { return keys().size(); }
    [[nodiscard]] bool empty() const noexcept { return object_.get() == nullptr; }
    [[nodiscard]] Iterator begin() const noexcept;
    [[nodiscard]] Iterator end() const noexcept;

    // The value of the key, or null. Valid as long as a copy of this dictionary exists.
    [[nodiscard]] const Value* find(std::string_view key) const noexcept;
    [[nodiscard]] bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }

    // Copies with one entry set, with one entry removed, and with all entries of another dictionary set.
    [[nodiscard]] Dictionary with(String key, Value value) const;
    [[nodiscard]] Dictionary without(std::string_view key) const;
    [[nodiscard]] Dictionary mergedWith(const Dictionary& other) const;

    // As `Value::roughBytes`.
    [[nodiscard]] std::size_t roughBytes() const noexcept;

    // Whether both are one object. They are then equal, unless they hold NaN, which does not equal itself.
    [[nodiscard]] bool isSameObject(const Dictionary& other) const noexcept
    {
        return object_.get() == other.object_.get();
    }
    // Equal if the entries under these keys are ignored on both sides.
    [[nodiscard]] bool isEqualIgnoring(const Dictionary& other, std::span<const std::string_view> keys) const noexcept;

    // The same keys with equal values, in any order.
    friend bool operator==(const Dictionary& left, const Dictionary& right) noexcept
    {
        return left.isEqualIgnoring(right, {});
    }

private:
    friend class Value;
    explicit Dictionary(Reference<DictionaryObject> object) noexcept : object_(std::move(object)) { }
    Reference<DictionaryObject> object_;
};

class Dictionary::Iterator {
public:
    using value_type = Entry;
    using difference_type = std::ptrdiff_t;

    Iterator() noexcept = default;
    Iterator(const String* key, const Value* value) noexcept : key_(key), value_(value) { }

    Entry operator*() const noexcept { return {*key_, *value_}; }
    struct Pointer {
        Entry entry;
        const Entry* operator->() const noexcept { return &entry; }
    };
    Pointer operator->() const noexcept { return {**this}; }
    Iterator& operator++() noexcept
    {
        ++key_;
        ++value_;
        return *this;
    }
    Iterator operator++(int) noexcept { return {key_++, value_++}; }
    friend bool operator==(const Iterator& left, const Iterator& right) noexcept { return left.key_ == right.key_; }

private:
    const String* key_ = nullptr;
    const Value* value_ = nullptr;
};

inline Dictionary::Iterator Dictionary::begin() const noexcept
{
    return {keys().data(), values().data()};
}

inline Dictionary::Iterator Dictionary::end() const noexcept
{
    return {keys().data() + size(), values().data() + size()};
}

// --- Short functions, inline so that they cost no call.

inline Value::Value(String text) noexcept : kind_(Kind::String), object_(text.object_.leak()) { }
inline Value::Value(Array array) noexcept : kind_(Kind::Array), object_(array.object_.leak()) { }
inline Value::Value(Dictionary dictionary) noexcept : kind_(Kind::Dictionary), object_(dictionary.object_.leak()) { }
inline Value::Value(Data data) noexcept : kind_(Kind::Data), object_(data.bytes.object_.leak()) { }
inline Value::Value(Date date) noexcept : kind_(Kind::Date), date_(date.secondsSince1970) { }

template <typename Object> const Object* Value::objectAs() const noexcept
{
    return static_cast<const Object*>(object_);
}

template <typename Object> Reference<Object> Value::shareAs() const noexcept
{
    if (object_ == nullptr)
        return {};
    object_->retain();
    return Reference<Object>::adopt(objectAs<Object>());
}

inline std::string_view Value::bytesUnchecked() const noexcept
{
    return object_ == nullptr ? std::string_view() : objectAs<StringObject>()->view();
}

inline std::optional<Number> Value::number() const noexcept
{
    return kind_ == Kind::Number ? std::optional(numberUnchecked()) : std::nullopt;
}

inline std::optional<String> Value::string() const noexcept
{
    return kind_ == Kind::String ? std::optional(String(shareAs<StringObject>())) : std::nullopt;
}

inline std::optional<Array> Value::array() const noexcept
{
    return kind_ == Kind::Array ? std::optional(Array(shareAs<ArrayObject>())) : std::nullopt;
}

inline std::optional<Dictionary> Value::dictionary() const noexcept
{
    return kind_ == Kind::Dictionary ? std::optional(Dictionary(shareAs<DictionaryObject>())) : std::nullopt;
}

inline std::optional<Data> Value::data() const noexcept
{
    return kind_ == Kind::Data ? std::optional(Data{String(shareAs<StringObject>())}) : std::nullopt;
}

inline std::optional<Date> Value::date() const noexcept
{
    return kind_ == Kind::Date ? std::optional(Date{date_}) : std::nullopt;
}

} // namespace foundation
