// The text for a terminal, and its width.
#include "kesto/Terminal.h"
#include "support/EnvironmentVariable.h"

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

TEST(ShowsUTF8, GoesByTheEnvironment)
{
    const support::EnvironmentVariable all("LC_ALL", "C.UTF-8");
    EXPECT_TRUE(showsUTF8());
    const support::EnvironmentVariable none("LC_ALL", "C");
    EXPECT_FALSE(showsUTF8());
    const support::EnvironmentVariable unknown("LC_ALL", "no_SUCH.UTF-8");
    EXPECT_FALSE(showsUTF8());
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
