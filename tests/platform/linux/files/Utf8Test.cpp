// Text that ends up valid, whatever it was.
#include "platform/linux/files/Utf8.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

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
    EXPECT_EQ(replaced("\xC0\xAF"), "??") << "longer than it needs to be";
}

TEST(Utf8, CutsBetweenCharacters)
{
    EXPECT_EQ(cutBetweenCharacters("abc", 3), "abc");
    EXPECT_EQ(cutBetweenCharacters("abcd", 3), "abc");
    EXPECT_EQ(cutBetweenCharacters("aé", 2), "a");
    EXPECT_EQ(cutBetweenCharacters("aé", 3), "aé");
    EXPECT_EQ(cutBetweenCharacters("😀", 3), "");
    EXPECT_EQ(cutBetweenCharacters("\x80\x80\x80", 2), "") << "what is no text ends, too";
    EXPECT_EQ(cutBetweenCharacters("", 0), "");
}

} // namespace
} // namespace platform
