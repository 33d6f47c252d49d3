// SPDX-License-Identifier: Apache-2.0
// Dictionaries compared with their simplest form: a list of pairs that is searched from the front.
#include "foundation/values/GeneratedValues.h"
#include "foundation/values/Value.h"

#include <algorithm>
#include <array>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>
#include <string>
#include <vector>

namespace foundation {
namespace {

using testing::ElementsAre;

std::vector<std::string> keysOf(const Dictionary& dictionary)
{
    std::vector<std::string> keys;
    for (const auto& entry : dictionary)
        keys.emplace_back(entry.key.view());
    return keys;
}

Dictionary numbered(int count)
{
    Dictionary::Entries entries;
    for (int number = 0; number < count; ++number)
        entries.push_back({String("key " + std::to_string(number * 7919 % count)), number});
    return entries;
}

TEST(Dictionary, KeepsTheOrderOfInsertion)
{
    EXPECT_THAT(keysOf({{"z", 1}, {"a", 2}, {"m", 3}}), ElementsAre("z", "a", "m"));
}

TEST(Dictionary, AReplacedEntryKeepsItsPlace)
{
    const Dictionary dictionary{{"z", 1}, {"a", 2}, {"z", 3}, {"b", 4}, {"z", 5}};
    EXPECT_THAT(keysOf(dictionary), ElementsAre("z", "a", "b"));
    EXPECT_EQ(*dictionary.find("z"), Value(5));
    EXPECT_EQ(dictionary.size(), 3U);
}

TEST(Dictionary, OneWithAnotherValueHasTheSameShape)
{
    const Dictionary dictionary{{"z", 1}, {"a", 2}};
    const Dictionary changed = dictionary.with("a", 3);
    EXPECT_EQ(changed.shape().get(), dictionary.shape().get());
    EXPECT_EQ(changed, (Dictionary{{"z", 1}, {"a", 3}}));
    EXPECT_EQ(dictionary, (Dictionary{{"z", 1}, {"a", 2}}));
    const Dictionary longer = dictionary.with("b", 3);
    EXPECT_THAT(keysOf(longer), ElementsAre("z", "a", "b"));
    EXPECT_EQ(Dictionary().with("b", 3), (Dictionary{{"b", 3}}));
}

TEST(Dictionary, TheEmptyOneHasNoShape)
{
    EXPECT_EQ(Dictionary().shape().get(), nullptr);
    EXPECT_EQ(Dictionary(Dictionary::Entries()).shape().get(), nullptr);
    EXPECT_EQ(Dictionary{}.begin(), Dictionary{}.end());
}

TEST(Dictionary, OneOfAShapeHasItsKeysAndTheGivenValues)
{
    const Dictionary dictionary{{"z", 1}, {"a", 2}};
    std::vector<Value> values{"first", Array{2}};
    EXPECT_EQ(Dictionary(dictionary.shape(), values), (Dictionary{{"z", "first"}, {"a", Array{2}}}));
}

TEST(DictionaryShape, IsSmallUpToThirtyTwoShortKeys)
{
    const auto shapeOf = [](int count) { return numbered(count).shape(); };
    EXPECT_TRUE(shapeOf(32)->isSmall());
    EXPECT_FALSE(shapeOf(33)->isSmall());
    EXPECT_TRUE((Dictionary{{String(std::string(64, 'k')), 1}}.shape()->isSmall()));
    EXPECT_FALSE((Dictionary{{String(std::string(65, 'k')), 1}}.shape()->isSmall()));
}

TEST(Dictionary, FindsAmongTenAndAmongTenThousand)
{
    for (const int count : {0, 1, 10, 16, 17, 10'000}) {
        const Dictionary dictionary = numbered(count);
        ASSERT_EQ(dictionary.size(), static_cast<std::size_t>(count));
        for (int number = 0; number < count; ++number) {
            const Value* found = dictionary.find("key " + std::to_string(number * 7919 % count));
            ASSERT_NE(found, nullptr);
            EXPECT_EQ(*found, Value(number));
        }
        EXPECT_EQ(dictionary.find("key"), nullptr);
        EXPECT_EQ(dictionary.find("key 10000"), nullptr);
        EXPECT_EQ(dictionary.find(""), nullptr);
        EXPECT_FALSE(dictionary.contains("zzz"));
    }
}

// The same entries, found by a search: each key once, with its last value in its first place.
Dictionary::Entries naivelyFolded(const Dictionary::Entries& entries)
{
    Dictionary::Entries folded;
    for (const auto& entry : entries) {
        const auto earlier = std::ranges::find(folded, entry.key, &DictionaryEntry::key);
        if (earlier == folded.end())
            folded.push_back(entry);
        else
            earlier->value = entry.value;
    }
    return folded;
}

bool sameEntries(const Dictionary& dictionary, const Dictionary::Entries& entries)
{
    return std::ranges::equal(dictionary, entries, [](const auto& left, const auto& right) {
        return left.key == right.key && left.value == right.value;
    });
}

RC_GTEST_PROP(DictionaryProperty, FoldsRepeatedKeysAsAWalkWould, ())
{
    const auto entries = *generated::entries(0);
    const Dictionary dictionary = entries;
    const auto folded = naivelyFolded(entries);
    RC_CLASSIFY(entries.size() > 16, "indexed");
    RC_ASSERT(sameEntries(dictionary, folded));
    for (const auto& entry : folded)
        RC_ASSERT(*dictionary.find(entry.key) == entry.value);
}

TEST(Dictionary, DoesNotEqualItselfWhenItHoldsNaN)
{
    const Dictionary dictionary{{"a", std::numeric_limits<double>::quiet_NaN()}};
    EXPECT_NE(dictionary, dictionary);
    EXPECT_NE(Value(dictionary), Value(dictionary));
}

RC_GTEST_PROP(DictionaryProperty, IsEqualInAnyOrder, ())
{
    const Dictionary dictionary = *generated::entries(1);
    Dictionary::Entries shuffled(dictionary.begin(), dictionary.end());
    std::ranges::reverse(shuffled);
    if (!shuffled.empty())
        std::ranges::rotate(shuffled, shuffled.begin() + *rc::gen::inRange<std::ptrdiff_t>(0, std::ssize(shuffled)));
    RC_ASSERT(Dictionary(shuffled) == dictionary);
    shuffled.push_back({"not among the generated", 1});
    RC_ASSERT(Dictionary(shuffled) != dictionary);
    RC_ASSERT(dictionary != Dictionary(shuffled));
}

RC_GTEST_PROP(DictionaryProperty, IsEqualIgnoringAsWithoutThoseKeys, ())
{
    const Dictionary left = *generated::entries(0);
    Dictionary right =
        *rc::gen::oneOf(generated::entries(0), rc::gen::just(Dictionary::Entries(left.begin(), left.end())));
    const auto ignored = *rc::gen::container<std::vector<String>>(generated::key());
    for (const String& key : ignored)
        if (*rc::gen::arbitrary<bool>())
            right = right.with(key, *generated::scalar());
    const std::vector<std::string_view> keys(ignored.begin(), ignored.end());

    Dictionary leftWithout = left;
    Dictionary rightWithout = right;
    for (const auto key : keys) {
        leftWithout = leftWithout.without(key);
        rightWithout = rightWithout.without(key);
    }
    RC_CLASSIFY(leftWithout == rightWithout, "equal");
    RC_ASSERT(left.isEqualIgnoring(right, keys) == (leftWithout == rightWithout));
    RC_ASSERT(right.isEqualIgnoring(left, keys) == (leftWithout == rightWithout));
}

TEST(Dictionary, IgnoredKeysCountOnNeitherSide)
{
    constexpr std::array<std::string_view, 2> ignored{"time", "uptime"};
    const Dictionary first{{"gain", 1}, {"time", 100}, {"uptime", 5}};
    EXPECT_TRUE(first.isEqualIgnoring({{"time", 200}, {"gain", true}}, ignored));
    EXPECT_TRUE(first.isEqualIgnoring({{"gain", 1}}, ignored));
    EXPECT_FALSE(first.isEqualIgnoring({{"gain", 2}, {"time", 100}, {"uptime", 5}}, ignored));
    EXPECT_FALSE(first.isEqualIgnoring({{"time", 100}, {"uptime", 5}}, ignored));
    EXPECT_FALSE(first.isEqualIgnoring({{"gain", 1}, {"mute", 0}}, ignored));
    EXPECT_TRUE(Dictionary().isEqualIgnoring({{"time", 1}}, ignored));
}

TEST(Dictionary, AKeyWithNullIsNotAMissingKey)
{
    EXPECT_NE((Dictionary{{"a", Value()}}), (Dictionary{{"b", Value()}}));
    EXPECT_NE((Dictionary{{"a", Value()}}), Dictionary());
    EXPECT_TRUE((Dictionary{{"a", Value()}}.contains("a")));
}

TEST(Dictionary, WithSetsOneEntryAndLeavesTheOriginal)
{
    const Dictionary original{{"a", 1}, {"b", 2}};
    const Dictionary changed = original.with("a", 10).with("c", 3);
    EXPECT_THAT(keysOf(changed), ElementsAre("a", "b", "c"));
    EXPECT_EQ(*changed.find("a"), Value(10));
    EXPECT_EQ(*original.find("a"), Value(1));
    EXPECT_EQ(original.size(), 2U);
}

TEST(Dictionary, WithoutTakesOneEntryOutOrIsTheSameObject)
{
    const Dictionary original{{"a", 1}, {"b", 2}};
    EXPECT_THAT(keysOf(original.without("a")), ElementsAre("b"));
    EXPECT_TRUE(original.without("z").isSameObject(original));
    EXPECT_EQ(original.without("a").without("b"), Dictionary());
}

TEST(Dictionary, MergingSetsTheOthersEntries)
{
    const Dictionary merged = Dictionary{{"a", 1}, {"b", 2}}.mergedWith({{"c", 3}, {"a", 4}});
    EXPECT_THAT(keysOf(merged), ElementsAre("a", "b", "c"));
    EXPECT_EQ(*merged.find("a"), Value(4));
}

TEST(Dictionary, CopiesAreTheSameObject)
{
    const Dictionary original{{"a", 1}};
    const Dictionary copy = original; // NOLINT(performance-unnecessary-copy-initialization): the copy is what is tested
    EXPECT_TRUE(copy.isSameObject(original));
    EXPECT_TRUE(Value(original).dictionary()->isSameObject(original));
    EXPECT_FALSE((Dictionary{{"a", 1}}.isSameObject(original)));
}

} // namespace
} // namespace foundation
