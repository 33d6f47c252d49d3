// SPDX-License-Identifier: Apache-2.0
// The identity of strings, and the table of UTF-8.
#include "foundation/values/String.h"

#include <array>
#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace foundation {
namespace {

using namespace std::string_view_literals;

TEST(String, HoldsAnyCharacters)
{
    EXPECT_EQ(String("Playback").view(), "Playback");
    EXPECT_EQ(String("a\0b"sv).view(), "a\0b"sv);
    EXPECT_EQ(String(std::string(100'000, 'x')).view(), std::string(100'000, 'x'));
    EXPECT_TRUE(String().empty());
    EXPECT_TRUE(String("").empty());
    EXPECT_FALSE(String("x").empty());
}

TEST(String, ACopyIsTheSameObjectAndEqualCharactersAreNot)
{
    const String original("ktrace");
    const String copy = original; // NOLINT(performance-unnecessary-copy-initialization): the copy is what is tested
    const String anew("ktrace");
    EXPECT_TRUE(copy.isSameObject(original));
    EXPECT_FALSE(anew.isSameObject(original));
    EXPECT_EQ(anew, original);
    EXPECT_EQ(anew, "ktrace"sv);
    EXPECT_NE(original, String("ktrac"));
}

TEST(String, AllEmptyStringsAreOneObject)
{
    EXPECT_TRUE(String().isSameObject(String("")));
    EXPECT_EQ(String(), String(""));
}

TEST(String, AssignmentKeepsTheObjectAliveAsLongAsSomeoneHasIt)
{
    String kept;
    {
        String original("kept beyond its first owner");
        kept = original;
        original = String("another");
        EXPECT_EQ(original.view(), "another");
    }
    EXPECT_EQ(kept.view(), "kept beyond its first owner");
    String& alias = kept;
    kept = alias;
    EXPECT_EQ(kept.view(), "kept beyond its first owner");
}

// The thread sanitizer checks this, and the address sanitizer checks that the last owner releases exactly once.
TEST(String, IsSharedByThreads)
{
    const String shared("shared");
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([copy = shared] {
            for (int turn = 0; turn < 1000; ++turn) {
                const String another = copy; // NOLINT(performance-unnecessary-copy-initialization): counts up and down
                ASSERT_EQ(another.view(), "shared");
            }
        });
}

struct Utf8Case {
    std::string_view bytes;
    bool valid;
    std::string_view why;
};

constexpr std::array utf8Cases{
    Utf8Case{"", true, "nothing"},
    Utf8Case{"plain ASCII, longer than a word", true, "ASCII"},
    Utf8Case{"\0"sv, true, "NUL is a character"},
    Utf8Case{"\x7F", true, "the last of one byte"},
    Utf8Case{"\xC2\x80", true, "the first of two bytes"},
    Utf8Case{"\xDF\xBF", true, "the last of two bytes"},
    Utf8Case{"\xE0\xA0\x80", true, "the first of three bytes"},
    Utf8Case{"\xED\x9F\xBF", true, "the last before the surrogates"},
    Utf8Case{"\xEE\x80\x80", true, "the first after the surrogates"},
    Utf8Case{"\xEF\xBF\xBF", true, "the last of three bytes"},
    Utf8Case{"\xF0\x90\x80\x80", true, "the first of four bytes"},
    Utf8Case{"\xF4\x8F\xBF\xBF", true, "U+10FFFF"},
    Utf8Case{"\x80", false, "a continuation alone"},
    Utf8Case{"\xBF", false, "the last continuation alone"},
    Utf8Case{"\xC0\x80", false, "overlong NUL"},
    Utf8Case{"\xC1\xBF", false, "overlong in two bytes"},
    Utf8Case{"\xE0\x80\xAF", false, "overlong in three bytes"},
    Utf8Case{"\xE0\x9F\xBF", false, "the last overlong in three bytes"},
    Utf8Case{"\xF0\x80\x80\xAF", false, "overlong in four bytes"},
    Utf8Case{"\xF0\x8F\xBF\xBF", false, "the last overlong in four bytes"},
    Utf8Case{"\xED\xA0\x80", false, "the first surrogate"},
    Utf8Case{"\xED\xBF\xBF", false, "the last surrogate"},
    Utf8Case{"\xF4\x90\x80\x80", false, "the first above U+10FFFF"},
    Utf8Case{"\xF5\x80\x80\x80", false, "a first byte that never is"},
    Utf8Case{"\xFE", false, "0xFE"},
    Utf8Case{"\xFF", false, "0xFF"},
    Utf8Case{"\xC2", false, "two bytes, one there"},
    Utf8Case{"\xE2\x82", false, "three bytes, two there"},
    Utf8Case{"\xF0\x9F\x98", false, "four bytes, three there"},
    Utf8Case{"\xC2\x41", false, "ASCII where a continuation belongs"},
    Utf8Case{"\xE2\x82\x41", false, "ASCII for the third byte"},
    Utf8Case{"\xF0\x9F\x98\xC0", false, "a first byte for the fourth"},
};

TEST(Utf8, TheTable)
{
    for (const Utf8Case& given : utf8Cases)
        EXPECT_EQ(isValidUtf8(given.bytes), given.valid) << given.why;
}

// Text is checked eight characters at a time, so an error must be found at every position.
TEST(Utf8, TheTableAtEveryPlaceInALongerText)
{
    for (const Utf8Case& given : utf8Cases)
        for (std::size_t before = 0; before < 17; ++before)
            for (const std::size_t after : {0U, 1U, 7U, 8U, 9U}) {
                const std::string text = std::string(before, 'a') + std::string(given.bytes) + std::string(after, 'z');
                EXPECT_EQ(isValidUtf8(text), given.valid) << given.why << " at " << before << " before " << after;
            }
}

std::string replaced(std::string text)
{
    replaceWhatIsNotUtf8(text);
    return text;
}

TEST(Utf8, EachByteThatIsNoCharacterBecomesAQuestionMark)
{
    EXPECT_EQ(replaced(""), "");
    EXPECT_EQ(replaced("Größe 音量 😀"), "Größe 音量 😀");
    EXPECT_EQ(replaced("a\xFF\xFE"
                       "b"),
              "a??b");
    EXPECT_EQ(replaced("cut in two \xC3"), "cut in two ?");
    EXPECT_EQ(replaced("\xED\xA0\x80"), "???") << "half of a surrogate pair";
    EXPECT_EQ(replaced("\xC0\xAF"), "??") << "an overlong form";
}

TEST(Utf8, CutsBetweenCharacters)
{
    EXPECT_EQ(cutBetweenCharacters("abc", 3), "abc");
    EXPECT_EQ(cutBetweenCharacters("abcd", 3), "abc");
    EXPECT_EQ(cutBetweenCharacters("aé", 2), "a");
    EXPECT_EQ(cutBetweenCharacters("aé", 3), "aé");
    EXPECT_EQ(cutBetweenCharacters("😀", 3), "");
    EXPECT_EQ(cutBetweenCharacters("\x80\x80\x80", 2), "") << "the cut ends even in text that is not UTF-8";
    EXPECT_EQ(cutBetweenCharacters("", 0), "");
}

} // namespace
} // namespace foundation
