// SPDX-License-Identifier: Apache-2.0
// Which entries the reader gives, and that an unchanged entry is the same item as before.
#include "session/EntryReader.h"

#include "session/AllocatedBytes.h"
#include "session/GeneratedMessages.h"
#include "session/StoredMessages.h"

#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace {

using foundation::CborItem;
using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;

struct Entry {
    std::string key;
    CborItem item;
};

// All entries of a store, payload after payload. The note of a key is the key.
class Reading {
public:
    explicit Reading(const session::MessageStore& store)
    {
        for (session::MessageStore::Cursor cursor(store); cursor.next();) {
            payloads_.emplace_back();
            const auto learn = [this](std::string_view key) {
                learnt_.emplace_back(key);
                return std::string(key);
            };
            reader_.read(cursor.kind(), cursor.payload(), learn,
                         [this](const std::string& key, CborItem item) { payloads_.back().push_back({key, item}); });
        }
    }

    [[nodiscard]] const std::vector<std::vector<Entry>>& payloads() const { return payloads_; }
    // The keys for which the reader asked for a note.
    [[nodiscard]] const std::vector<std::string>& learnt() const { return learnt_; }
    [[nodiscard]] std::vector<std::string> texts() const
    {
        std::vector<std::string> texts;
        for (const auto& payload : payloads_) {
            Dictionary::Entries entries;
            for (const auto& [key, item] : payload)
                entries.push_back({foundation::String(key), item.value()});
            texts.push_back(Value(Dictionary(std::move(entries))).text());
        }
        return texts;
    }

private:
    session::EntryReader<std::string> reader_;
    std::vector<std::vector<Entry>> payloads_;
    std::vector<std::string> learnt_;
};

TEST(EntryReader, GivesAnEntryThatIsAsBeforeAsTheItemThatItWas)
{
    const auto store = storeOf({{{"a", 1}, {"b", "x"}}, {{"a", 1}, {"b", "y"}}, {{"a", 1}, {"b", "y"}}});
    const Reading reading(*store);
    const auto& [first, second, third] = std::tie(reading.payloads()[0], reading.payloads()[1], reading.payloads()[2]);
    EXPECT_EQ(second[0].item.bytes().data(), first[0].item.bytes().data());
    EXPECT_EQ(third[0].item.bytes().data(), first[0].item.bytes().data());
    EXPECT_EQ(third[1].item.bytes().data(), second[1].item.bytes().data());
    EXPECT_TRUE(third[1].item.isSameAs(second[1].item));
    EXPECT_FALSE(second[1].item.isSameAs(first[1].item));
}

TEST(EntryReader, TakesTheSameValueUnderAnotherKeyForAnotherEntry)
{
    const auto store = storeOf({{{"a", 1}}, {{"b", 1}}, {{"a", 2}}});
    EXPECT_THAT(Reading(*store).texts(), ElementsAre(R"({"a":1})", R"({"b":1})", R"({"a":2})"));
}

TEST(EntryReader, AsksForTheNoteOfAKeyOnceWhileItStaysAtItsPlace)
{
    const auto store = storeOf({{{"a", 1}, {"b", 1}}, {{"a", 2}, {"b", 1}}, {{"a", 2}, {"c", 1}}});
    EXPECT_THAT(Reading(*store).learnt(), ElementsAre("a", "b", "c"));
}

TEST(EntryReader, ComparesWithThePayloadOfTheSameKind)
{
    session::MessageStore store(std::make_shared<session::StorageBudget>(std::size_t{1} << 20));
    for (const int number : {1, 2})
        for (const auto& [type, key] : {std::pair(1, "a"), std::pair(2, "b")})
            EXPECT_EQ(store.record(AudioEventCategoryError, type, {{key, number}}),
                      session::MessageStore::Outcome::Recorded);
    const Reading reading(store);
    EXPECT_THAT(reading.texts(), ElementsAre(R"({"a":1})", R"({"b":1})", R"({"a":2})", R"({"b":2})"));
    EXPECT_THAT(reading.learnt(), ElementsAre("a", "b"));
}

TEST(EntryReader, ReadsLargePayloadsWithoutACopy)
{
    const std::string large(std::size_t{2} << 20, 'x');
    const auto store = storeOf({{{"a", large}, {"b", 1}}, {{"a", 2}, {"b", 1}}});
    const auto before = allocatedBytes();
    forgetMostAllocatedBytes();
    const Reading reading(*store);
    EXPECT_LT(mostAllocatedBytes() - before, std::ptrdiff_t{1} << 20);
    EXPECT_EQ(reading.payloads()[0][0].item.stringView(), large);
    EXPECT_THAT(reading.payloads()[1], testing::SizeIs(2));
    EXPECT_EQ(reading.payloads()[1][0].item.number()->int64Value(), 2);
    EXPECT_TRUE(reading.payloads()[1][1].item.isSameAs(reading.payloads()[0][1].item));
}

// Also with more entries than the reader remembers.
TEST(EntryReader, ReadsPayloadsOfManyEntries)
{
    Messages payloads;
    for (const int first : {0, 1, 0}) {
        Dictionary::Entries entries;
        for (int number = 0; number < 100; ++number)
            entries.push_back({foundation::String("key " + std::to_string(number)), first + number});
        payloads.emplace_back(std::move(entries));
    }
    EXPECT_EQ(Reading(*storeOf(payloads)).texts(), textsOf(payloads));
}

RC_GTEST_PROP(EntryReader, ReadsAnyPayloadsAsTheyAreKept, ())
{
    for (const Messages& payloads : *generated::manyPayloads(10)) {
        const auto store = storeOf(payloads);
        Messages kept;
        for (session::MessageStore::Cursor cursor(*store); cursor.next();)
            kept.push_back(cursor.payload().dictionary());
        RC_ASSERT(Reading(*store).texts() == textsOf(kept));
    }
}

} // namespace
