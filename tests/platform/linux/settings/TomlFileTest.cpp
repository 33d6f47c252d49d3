// SPDX-License-Identifier: Apache-2.0
// TOML as values, and files that are broken for a while.
#include "platform/linux/settings/TomlFile.h"

#include "support/PrintValues.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace platform {
namespace {

using foundation::Array;
using foundation::Date;
using foundation::Dictionary;
using foundation::Number;
using foundation::Value;
using testing::AllOf;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;

Value parsedValue(std::string_view text)
{
    const auto values = parseToml(std::string("key = ").append(text));
    if (!values) {
        ADD_FAILURE() << values.error().reason;
        return {};
    }
    return *values->find("key");
}

TEST(ParseTomlTest, NumbersKeepTheirKind)
{
    EXPECT_EQ(parsedValue("42").number()->kind(), Number::Kind::Signed64);
    EXPECT_EQ(parsedValue("-9223372036854775808"), Value(std::numeric_limits<std::int64_t>::min()));
    EXPECT_EQ(parsedValue("0x10"), Value(16));
    EXPECT_EQ(parsedValue("42.0").number()->kind(), Number::Kind::Float64);
    EXPECT_EQ(parsedValue("0.6"), Value(0.6));
    EXPECT_EQ(parsedValue("inf"), Value(std::numeric_limits<double>::infinity()));
    EXPECT_EQ(parsedValue("true").number()->kind(), Number::Kind::Boolean);
    EXPECT_EQ(parsedValue("false"), Value(false));
}

TEST(ParseTomlTest, TextIsText)
{
    EXPECT_EQ(parsedValue("\"Küche \\u00e9\\n\""), Value("Küche é\n"));
    EXPECT_EQ(parsedValue("'C:\\path'"), Value("C:\\path"));
    EXPECT_EQ(parsedValue("\"\""), Value(""));
}

TEST(ParseTomlTest, ArraysAndTablesNest)
{
    const auto values =
        parseToml("b = [1, [2.5, \"x\"], {y = true}]\na.c.d = 1\n[z]\n[[list]]\nn = 1\n[[list]]\nn = 2\n");
    ASSERT_TRUE(values);
    EXPECT_EQ(*values,
              (Dictionary{{"a", Dictionary{{"c", Dictionary{{"d", 1}}}}},
                          {"b", Array{1, Array{2.5, "x"}, Dictionary{{"y", true}}}},
                          {"list", Array{Dictionary{{"n", 1}}, Dictionary{{"n", 2}}}},
                          {"z", Dictionary()}}));
}

TEST(ParseTomlTest, KeysStandInLines)
{
    const auto document =
        parseTomlWithLines("a = 1\n\n[t]\nb = 2\n[t.\"x.y\"]\nc = { d = 3 }\nf.g = 4\n[[l]]\nm = 5\n");
    ASSERT_TRUE(document);
    EXPECT_EQ(document->values.find("a")->text(), "1");
    EXPECT_EQ(document->lines,
              (TomlLines{{{"a"}, 1},
                         {{"t"}, 3},
                         {{"t", "b"}, 4},
                         {{"t", "x.y"}, 5},
                         {{"t", "x.y", "c"}, 6},
                         {{"t", "x.y", "c", "d"}, 6},
                         {{"t", "x.y", "f"}, 7},
                         {{"t", "x.y", "f", "g"}, 7},
                         {{"l"}, 8}}));
    EXPECT_EQ(parseTomlWithLines("a = 1\nb = ").error().line, 2U);
}

TEST(ParseTomlTest, DatesAreMomentsInUtcUnlessTheyNameAnOffset)
{
    EXPECT_EQ(parsedValue("1970-01-02"), Value(Date{86400}));
    EXPECT_EQ(parsedValue("1970-01-01T00:01:00Z"), Value(Date{60}));
    EXPECT_EQ(parsedValue("1970-01-01T00:01:00.25"), Value(Date{60.25}));
    EXPECT_EQ(parsedValue("1970-01-01T02:00:00+02:00"), Value(Date{0}));
    EXPECT_EQ(parsedValue("1969-12-31T23:00:00-01:30"), Value(Date{1800}));
    EXPECT_EQ(parsedValue("9999-12-31T23:59:59Z"), Value(Date{253402300799}));
    EXPECT_EQ(parsedValue("0001-01-01"), Value(Date{-62135596800}));
}

TEST(ParseTomlTest, ATimeOfDayStaysText)
{
    EXPECT_EQ(parsedValue("07:32:00"), Value("07:32:00"));
}

TEST(ParseTomlTest, AnErrorNamesItsPlace)
{
    const auto values = parseToml("a = 1\nb = = 2\n");
    ASSERT_FALSE(values);
    EXPECT_EQ(values.error().line, 2U);
    EXPECT_EQ(values.error().column, 5U);
    EXPECT_FALSE(values.error().reason.empty());
}

TEST(ParseTomlTest, WhatIsNotTomlIsAnErrorAndNothingWorse)
{
    EXPECT_FALSE(parseToml("a = 1\na = 2"));
    EXPECT_FALSE(parseToml("a = \"\xff\""));
    EXPECT_FALSE(parseToml(std::string_view("a = \0", 5)));
    EXPECT_FALSE(parseToml("a = 99999999999999999999"));
    EXPECT_FALSE(parseToml("a = 2026-02-30"));
    EXPECT_FALSE(parseToml("[a"));
    EXPECT_FALSE(parseToml("[.a]"));
    EXPECT_FALSE(parseToml("[[.a]]"));
    EXPECT_FALSE(parseToml("größe = 1"));
    EXPECT_FALSE(parseToml("a.ϻ = 1"));
    EXPECT_FALSE(parseToml(std::string(100'000, '[')));
    EXPECT_FALSE(parseToml("a = " + std::string(100'000, '[')));
    EXPECT_TRUE(parseToml(""));
}

class TomlFileTest : public testing::Test {
protected:
    std::vector<support::LogLine> takeLines() { return log.take(); }

    support::TemporaryDirectory directory;
    const std::filesystem::path path = directory.path() / "some.toml";
    support::FakeLog log;
    TomlFile file{path, ProviderLog(log)};
};

TEST_F(TomlFileTest, AMissingFileHasNoValues)
{
    EXPECT_FALSE(file.reload());
    EXPECT_TRUE(file.values().empty());
    EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(TomlFileTest, TellsWhetherTheValuesChanged)
{
    support::writeFile(path, "a = 1");
    EXPECT_TRUE(file.reload());
    EXPECT_EQ(file.values(), (Dictionary{{"a", 1}}));
    EXPECT_FALSE(file.reload());
    support::writeFile(path, "a = 1 # the same, with a remark");
    EXPECT_FALSE(file.reload());
    support::writeFile(path, "a = 2");
    EXPECT_TRUE(file.reload());
    std::filesystem::remove(path);
    EXPECT_TRUE(file.reload());
    EXPECT_TRUE(file.values().empty());
}

TEST_F(TomlFileTest, ABrokenFileKeepsTheLastGoodValuesUntilItIsRepaired)
{
    support::writeFile(path, "a = 1");
    EXPECT_TRUE(file.reload());
    support::writeFile(path, "a = 2\nb = ?\n");
    EXPECT_FALSE(file.reload());
    EXPECT_EQ(file.values(), (Dictionary{{"a", 1}}));
    EXPECT_THAT(takeLines(),
                ElementsAre(AllOf(
                    Field(&support::LogLine::level, LogLevel::Error),
                    Field(&support::LogLine::message,
                          AllOf(testing::StartsWith(path.string() + ":2:5: "),
                                HasSubstr("the file's earlier content stays in force until this is corrected"))))));
    support::writeFile(path, "a = 2\nb = 3\n");
    EXPECT_TRUE(file.reload());
    EXPECT_EQ(file.values(), (Dictionary{{"a", 2}, {"b", 3}}));
    EXPECT_THAT(takeLines(), IsEmpty());
}

TEST_F(TomlFileTest, ComplainsOnceAboutTheSameFault)
{
    support::writeFile(path, "broken");
    EXPECT_FALSE(file.reload());
    EXPECT_FALSE(file.reload());
    const auto lines = takeLines();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_THAT(lines[0].message, testing::EndsWith("; the defaults apply until this is corrected"))
        << "it never had a content";
}

TEST_F(TomlFileTest, AFileThatIsTooLargeIsNotRead)
{
    support::writeFile(path, "a = 1");
    EXPECT_TRUE(file.reload());
    support::writeFile(path, "a = 2\n#" + std::string(TomlFile::largest, 'x'));
    EXPECT_FALSE(file.reload());
    EXPECT_EQ(file.values(), (Dictionary{{"a", 1}}));
    EXPECT_THAT(
        takeLines(),
        ElementsAre(Field(&support::LogLine::message,
                          path.string()
                              + " cannot be read: File too large; the file's earlier content stays in force until this "
                                "is corrected")));
}

TEST_F(TomlFileTest, AFileOfTheLargestSizeIsRead)
{
    std::string text = "a = 2\n#";
    text.resize(TomlFile::largest, 'x');
    support::writeFile(path, text);
    EXPECT_TRUE(file.reload());
}

TEST_F(TomlFileTest, APipeInItsPlaceDoesNotHoldUpTheService)
{
    ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
    EXPECT_FALSE(file.reload());
    EXPECT_THAT(takeLines(), ElementsAre(Field(&support::LogLine::message, HasSubstr("cannot be read"))));
}

TEST_F(TomlFileTest, ADirectoryInItsPlaceIsAFault)
{
    std::filesystem::create_directory(path);
    EXPECT_FALSE(file.reload());
    EXPECT_THAT(takeLines(), ElementsAre(Field(&support::LogLine::message, HasSubstr("cannot be read"))));
}

} // namespace
} // namespace platform
