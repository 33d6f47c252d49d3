// SPDX-License-Identifier: Apache-2.0
// The text for a terminal, and its width.
#include "kesto/Terminal.h"
#include "support/EnvironmentVariable.h"

#include <cmath>
#include <cstdlib>
#include <gtest/gtest.h>

namespace {

TEST(Printable, LeavesTextAlone)
{
    EXPECT_EQ(printable("Küche ☕ 日本 \xC2\xA0!"), "Küche ☕ 日本 \xC2\xA0!");
    EXPECT_EQ(printable(""), "");
}

TEST(Printable, ReplacesWhatMovesTheCursorOrChangesColours)
{
    EXPECT_EQ(printable("a\x1B[31mb\nc\rd\te\x7F"), "a?[31mb?c?d?e?");
    EXPECT_EQ(printable(std::string_view("a\0b", 3)), "a?b");
    EXPECT_EQ(printable("a\xC2\x9B"
                        "31mb\xC2\x80\xC2\x9F"),
              "a?31mb??");
    EXPECT_EQ(printable("cut \xC2"
                        "a \xC2"),
              "cut \xC2"
              "a \xC2"); // parts of characters; terminals can show them
}

TEST(Printable, ReplacesWhatChangesTheDirectionOfText)
{
    EXPECT_EQ(printable("a\u202Ab\u202Bc\u202Cd\u202De\u202Ef"), "a?b?c?d?e?f");
    EXPECT_EQ(printable("a\u2066b\u2067c\u2068d\u2069e"), "a?b?c?d?e");
    EXPECT_EQ(printable("\u200E\u200F\u061C"), "???");
    EXPECT_EQ(printable("\u200D\u2010\u2029\u202F\u2065\u206A\u061B\u061D"),
              "\u200D\u2010\u2029\u202F\u2065\u206A\u061B\u061D");
    EXPECT_EQ(printable("cut \xE2\x80"), "cut \xE2\x80");
}

TEST(AlignedRight, CountsCharacters)
{
    EXPECT_EQ(alignedRight("äö", 4), "  äö");
    EXPECT_EQ(alignedRight("abcde", 4), "abcde");
}

TEST(Bar, HasEighthsOfAColumn)
{
    EXPECT_EQ(bar(1, 4, true), "████");
    EXPECT_EQ(bar(0.5, 4, true), "██");
    EXPECT_EQ(bar(0.5, 1, true), "▌");
    EXPECT_EQ(bar(0.46, 4, true), "█▉");
    EXPECT_EQ(bar(0.0001, 4, true), "▏");
    EXPECT_EQ(bar(0, 4, true), "");
    EXPECT_EQ(bar(7, 4, true), "████");
    EXPECT_EQ(bar(std::nan(""), 4, true), "");
}

TEST(Bar, IsOfAsciiWhereTheTerminalHasNoOther)
{
    EXPECT_EQ(bar(1, 4, false), "####");
    EXPECT_EQ(bar(0.6, 4, false), "##");
    EXPECT_EQ(bar(0.0001, 4, false), "#");
    EXPECT_EQ(bar(0, 4, false), "");
}

class ShowsUTF8 : public testing::Test {
protected:
    void SetUp() override { TearDown(); }
    void TearDown() override
    {
        for (const char* name : {"LC_ALL", "LC_CTYPE", "LANG"})
            ::unsetenv(name);
    }
};

TEST_F(ShowsUTF8, IsSaidByTheFirstVariableThatIsSet)
{
    EXPECT_FALSE(showsUTF8());
    ::setenv("LANG", "de_DE.UTF-8", 1);
    EXPECT_TRUE(showsUTF8());
    ::setenv("LC_CTYPE", "C.utf8", 1);
    ::setenv("LANG", "C", 1);
    EXPECT_TRUE(showsUTF8());
    ::setenv("LC_ALL", "POSIX", 1);
    EXPECT_FALSE(showsUTF8());
}

TEST(Fitted, CutsBetweenCharacters)
{
    EXPECT_EQ(fitted("abc", 3), "abc");
    EXPECT_EQ(fitted("abcd", 3), "ab…");
    EXPECT_EQ(fitted("äöüß", 3), "äö…");
    EXPECT_EQ(fitted("äöü", 3), "äöü");
    EXPECT_EQ(fitted("abc", std::string::npos), "abc");
}

TEST(Padded, CountsCharacters)
{
    EXPECT_EQ(padded("ab", 4), "ab  ");
    EXPECT_EQ(padded("äö", 4), "äö  ");
    EXPECT_EQ(padded("abcde", 4), "abcde");
}

TEST(ColumnsBehind, LeavesSomethingOfANarrowTerminal)
{
    EXPECT_EQ(columnsBehind(60, 100), 40U);
    EXPECT_EQ(columnsBehind(60, 61), 8U);
    EXPECT_EQ(columnsBehind(60, 10), 8U);
    EXPECT_EQ(columnsBehind(60, std::string::npos), std::string::npos);
}

TEST(AsciiText, KeepsTheColumns)
{
    EXPECT_EQ(asciiText("plain"), "plain");
    EXPECT_EQ(asciiText("Küche ☕…"), "K?che ?~");
    EXPECT_EQ(asciiText("\x9B"
                        "31m"),
              "31m"); // no character at all
}

TEST(SizeText, HasAUnit)
{
    EXPECT_EQ(sizeText(999), "999 B");
    EXPECT_EQ(sizeText(4'000), "4 kB");
    EXPECT_EQ(sizeText(35'249'999), "35.2 MB");
}

TEST(ShownText, IsTextAsItIsAndElseJson)
{
    EXPECT_EQ(shownText("a\"b"), "a\"b");
    EXPECT_EQ(shownText(true), "true");
    EXPECT_EQ(shownText(0.6F), "0.6");
    EXPECT_EQ(shownText({}), "(null)");
    EXPECT_EQ(shownText(foundation::Array{1, "x", false}), R"([1,"x",false])");
    EXPECT_EQ(shownText(foundation::Date{0}), "1970-01-01T00:00:00Z");
}

} // namespace
