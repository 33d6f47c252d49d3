// SPDX-License-Identifier: Apache-2.0
// The wire's own decoder reads the content of a message, which must have the shortest encoding.
#include "wire/MessageEncoder.h"

#include "foundation/cbor/Cbor.h"
#include "foundation/values/GeneratedValues.h"
#include "kesto/kesto.hpp"
#include "sdk/Allocations.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <limits>
#include <rapidcheck/gtest.h>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

std::string encoded(const kesto::Message& message)
{
    std::string bytes;
    foundation::appendCborMapHead(message.get()->encoder.entryCount(), bytes);
    bytes += message.get()->encoder.entries();
    return bytes;
}

Value decoded(const kesto::Message& message)
{
    foundation::CborDecoder decoder;
    return decoder.decode(encoded(message)).value();
}

// The value as messages can hold it: without bytes and dates.
Value sendable(const Value& value)
{
    if (const auto array = value.array()) {
        std::vector<Value> values;
        std::ranges::transform(*array, std::back_inserter(values), sendable);
        return Array(std::move(values));
    }
    if (const auto dictionary = value.dictionary()) {
        Dictionary::Entries entries;
        for (const auto& [key, entry] : *dictionary)
            entries.push_back({key, sendable(entry)});
        return Dictionary(std::move(entries));
    }
    return value.data() || value.date() ? Value() : value;
}

void add(kesto::Message& message, const Value& value);

void addEntries(kesto::Message& message, const Dictionary& dictionary)
{
    for (const auto& [key, value] : dictionary) {
        kesto_message_key(message.get(), key.view().data(), key.view().size());
        add(message, value);
    }
}

void addNumber(kesto::Message& message, foundation::Number number)
{
    switch (number.kind()) {
    case foundation::Number::Kind::Boolean: message.append(number.booleanValue()); break;
    case foundation::Number::Kind::Signed64: message.append(number.int64Value()); break;
    case foundation::Number::Kind::Unsigned64: message.append(*number.exactly<std::uint64_t>()); break;
    case foundation::Number::Kind::Float32: message.append(static_cast<float>(number.doubleValue())); break;
    case foundation::Number::Kind::Float64: message.append(number.doubleValue()); break;
    }
}

void add(kesto::Message& message, const Value& value)
{
    if (value.isNull()) {
        message.append(nullptr);
    } else if (const auto number = value.number()) {
        addNumber(message, *number);
    } else if (const auto text = value.string()) {
        message.append(text->view());
    } else if (const auto array = value.array()) {
        message.beginArray();
        for (const Value& element : *array)
            add(message, element);
        message.end();
    } else {
        message.beginDictionary();
        addEntries(message, *value.dictionary());
        message.end();
    }
}

RC_GTEST_PROP(Message, IsEncodedAsTheWireHasItWhateverItHolds, ())
{
    const Dictionary dictionary = *sendable(Dictionary(*rc::gen::scale(0.5, generated::entries()))).dictionary();
    kesto::Message message;
    addEntries(message, dictionary);
    std::string expected;
    foundation::appendCbor(dictionary, expected);
    RC_ASSERT(message.status() == kesto::Status::Ok);
    RC_ASSERT(encoded(message) == expected);
}

TEST(Message, HoldsEveryKindOfValue)
{
    kesto::Message message;
    message.add("null", nullptr)
        .add("yes", true)
        .add("small", -5)
        .add("big", std::numeric_limits<std::uint64_t>::max())
        .add("float", 0.5F)
        .add("double", 0.1)
        .add("literal", "text")
        .add("string", std::string("more"))
        .add("numbers", {1, 2, 3})
        .add("names", std::vector<std::string>{"a", "b"})
        .add("flags", std::vector<bool>{true, false});
    message.beginDictionary("inner").add("depth", 1).end();
    EXPECT_EQ(decoded(message),
              Value(Dictionary{{"null", Value()},
                               {"yes", true},
                               {"small", -5},
                               {"big", std::numeric_limits<std::uint64_t>::max()},
                               {"float", 0.5F},
                               {"double", 0.1},
                               {"literal", "text"},
                               {"string", "more"},
                               {"numbers", Array{1, 2, 3}},
                               {"names", Array{"a", "b"}},
                               {"flags", Array{true, false}},
                               {"inner", Dictionary{{"depth", 1}}}}));
}

TEST(Message, KeepsTheKindOfNumbers)
{
    kesto::Message message;
    message.add("float", 0.5F).add("double", 0.5).add("integer", 1).add("boolean", true);
    const Dictionary dictionary = *decoded(message).dictionary();
    EXPECT_EQ(dictionary.find("float")->number()->kind(), foundation::Number::Kind::Float32);
    EXPECT_EQ(dictionary.find("double")->number()->kind(), foundation::Number::Kind::Float64);
    EXPECT_EQ(dictionary.find("integer")->number()->kind(), foundation::Number::Kind::Signed64);
    EXPECT_EQ(dictionary.find("boolean")->number()->kind(), foundation::Number::Kind::Boolean);
}

// Heads of containers grow with their content, and move what follows.
TEST(Message, TakesContainersOfAnySize)
{
    for (const int count : {0, 1, 23, 24, 255, 256, 65535, 65536}) {
        kesto::Message message;
        message.beginArray("before").append("x").end();
        message.beginArray("values");
        for (int index = 0; index < count; ++index)
            message.append(index % 2 == 0);
        message.end().add("after", 1);
        const Dictionary dictionary = *decoded(message).dictionary();
        EXPECT_EQ(dictionary.find("values")->array()->size(), static_cast<std::size_t>(count));
        EXPECT_EQ(*dictionary.find("after"), Value(1));
    }
}

TEST(Message, CountsWithItsLaterValueWhenAKeyIsAddedTwice)
{
    kesto::Message message;
    message.add("key", 1).add("other", 2).add("key", 3);
    EXPECT_EQ(decoded(message), Value(Dictionary{{"key", 3}, {"other", 2}}));
}

TEST(Message, RefusesTextThatIsNotUtf8)
{
    kesto::Message value;
    EXPECT_EQ(value.add("key", "\xFF\xFE").status(), kesto::Status::InvalidUtf8);
    kesto::Message key;
    EXPECT_EQ(key.add("\xC0\x80", 1).status(), kesto::Status::InvalidUtf8);
    kesto::Message surrogate;
    EXPECT_EQ(surrogate.add("key", "\xED\xA0\x80").status(), kesto::Status::InvalidUtf8);
}

TEST(Message, RefusesContainersTooDeepInsideEachOther)
{
    kesto::Message message;
    for (int depth = 0; depth < KESTO_DEEPEST_NESTING; ++depth)
        message.beginDictionary("inner");
    message.add("key", 1);
    for (int depth = 0; depth < KESTO_DEEPEST_NESTING; ++depth)
        message.end();
    ASSERT_EQ(message.status(), kesto::Status::Ok);
    EXPECT_NE(decoded(message).dictionary(), std::nullopt);

    message.clear();
    for (int depth = 0; depth <= KESTO_DEEPEST_NESTING; ++depth)
        message.beginDictionary("inner");
    EXPECT_EQ(message.status(), kesto::Status::TooDeep);
}

TEST(Message, RefusesMoreThanFitsInAFrame)
{
    const std::string text(100'000, 'x');
    kesto::Message message;
    for (int count = 0; count < 10; ++count)
        message.add(std::to_string(count), text);
    ASSERT_EQ(message.status(), kesto::Status::Ok);
    EXPECT_EQ(message.add("one too many", text).status(), kesto::Status::TooLarge);
    EXPECT_LE(message.size(), std::size_t{KESTO_LARGEST_MESSAGE});
    EXPECT_EQ(kesto::Message().reserve(KESTO_LARGEST_MESSAGE + 1), kesto::Status::TooLarge);
}

TEST(Message, RefusesWhatDoesNotNest)
{
    const auto statusAfter = [](auto build) {
        kesto::Message message;
        build(message);
        return message.status();
    };
    using kesto::Message;
    EXPECT_EQ(statusAfter([](Message& m) { m.append(1); }), kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) { m.end(); }), kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) { m.beginArray("list"); }), kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) { m.beginArray("list").add("key", 1); }), kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) { kesto_message_key(m.get(), "key", 3); }), kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) {
                  kesto_message_key(m.get(), "key", 3);
                  m.add("another", 1);
              }),
              kesto::Status::Misnested);
    EXPECT_EQ(statusAfter([](Message& m) {
                  m.beginDictionary("inner");
                  kesto_message_key(m.get(), "key", 3);
                  m.end();
              }),
              kesto::Status::Misnested);
}

TEST(Message, KeepsItsFirstFailureUntilItIsCleared)
{
    kesto::Message message;
    message.add("bad", "\xFF").append(1).add("good", 1);
    EXPECT_EQ(message.status(), kesto::Status::InvalidUtf8);
    message.clear().add("good", 1);
    EXPECT_EQ(message.status(), kesto::Status::Ok);
    EXPECT_EQ(decoded(message), Value(Dictionary{{"good", 1}}));
}

TEST(Message, AllocatesNothingOnceItHasSeenItsLargestContent)
{
    kesto::Message message;
    const auto fill = [&message](std::int64_t number) {
        message.clear().add("number", number).add("text", "some text that is longer than a small string holds");
        message.beginDictionary("inner").add("volume", 0.5).beginArray("devices").append("Speaker").end().end();
    };
    fill(std::numeric_limits<std::int64_t>::max());
    const std::size_t before = sdk_test::allocations();
    for (std::int64_t number = 0; number < 1000; ++number)
        fill(number);
    EXPECT_EQ(sdk_test::allocations(), before);
    EXPECT_EQ(message.status(), kesto::Status::Ok);
}

TEST(Message, ReservesSoThatTheFirstContentAllocatesNothingEither)
{
    kesto::Message message;
    ASSERT_EQ(message.reserve(256), kesto::Status::Ok);
    const std::size_t before = sdk_test::allocations();
    for (int index = 0; index < 10; ++index)
        message.add("a key", 1.5);
    EXPECT_EQ(sdk_test::allocations(), before);
}

TEST(Message, LooksAfterNullPointers)
{
    EXPECT_EQ(kesto_message_add_int64(nullptr, "key", 1), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_message_end(nullptr), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(kesto_message_status(nullptr), KESTO_OUT_OF_MEMORY);
    EXPECT_EQ(kesto_message_size(nullptr), 0U);
    kesto_message_clear(nullptr);
    kesto_message_free(nullptr);
    kesto_message* message = kesto_message_create();
    EXPECT_EQ(kesto_message_add_string(message, "key", nullptr), KESTO_OK) << "null is the empty text";
    EXPECT_EQ(kesto_message_add_text(message, "key", nullptr, 3), KESTO_INVALID_ARGUMENT);
    kesto_message_free(message);
}

} // namespace
