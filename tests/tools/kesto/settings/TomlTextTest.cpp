// SPDX-License-Identifier: Apache-2.0
// Changing single keys of a TOML text that a person wrote.
#include "kesto/settings/TomlText.h"

#include "platform/linux/settings/TomlFile.h"
#include "support/PrintValues.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::Optional;

// --- values

TEST(TomlValue, IsOneValueOfAnyKind)
{
    EXPECT_THAT(tomlValue("true"), Optional(Value(true)));
    EXPECT_THAT(tomlValue("-5"), Optional(Value(-5)));
    EXPECT_THAT(tomlValue("0x1F"), Optional(Value(31)));
    EXPECT_THAT(tomlValue("0.5"), Optional(Value(0.5)));
    EXPECT_THAT(tomlValue("\"a\""), Optional(Value("a")));
    EXPECT_THAT(tomlValue("'a\\b'"), Optional(Value("a\\b")));
    EXPECT_THAT(tomlValue("\"\"\"a\nb\"\"\""), Optional(Value("a\nb")));
    EXPECT_THAT(tomlValue("[1,\n 2]"), Optional(Value(Array{1, 2})));
    EXPECT_THAT(tomlValue("{a = 1}"), Optional(Value(Dictionary{{"a", 1}})));
    EXPECT_THAT(tomlValue("1970-01-01T00:00:01Z"), Optional(Value(foundation::Date{1})));
}

TEST(TomlValue, IsNothingElse)
{
    for (const char* text : {"",
                             " ",
                             "Kitchen radio",
                             "1 2",
                             "1, 2",
                             "1,",
                             "5 # five",
                             "1}#",
                             "1]#",
                             "1\nb = 2",
                             "\n1",
                             "1}\nb={c=1",
                             "01",
                             "yes",
                             "True",
                             "\"a",
                             "[1",
                             "{a = 1",
                             "99999999999999999999",
                             "\"\xFF\""})
        EXPECT_EQ(tomlValue(text), std::nullopt) << text;
}

RC_GTEST_PROP(TomlString, ReadsBackAsTheText, ())
{
    // Characters of all kinds, mostly those with a meaning in TOML.
    const auto characters = *rc::gen::container<std::vector<std::string>>(rc::gen::element<std::string>(
        "a", "\"", "'", "\\", "\n", "\r", "\t", "\x01", "\x1B", "\x7F", "#", "=", "[", "é", "\xC2\x80", "\xC2\x8F",
        "\xC2\x90", "\xC2\x9B", "\xC2\x9F", "\xC2\xA0", "😀"));
    std::string text;
    for (const std::string& character : characters)
        text += character;
    const std::string toml = tomlString(text);
    RC_ASSERT(tomlValue(toml) == Value(text));
    for (const char* raw : {"\n", "\x1B", "\x7F", "\xC2\x80", "\xC2\x9B"})
        RC_ASSERT(!toml.contains(raw));
}

// --- setting

TEST(WithTomlKey, BeginsAText)
{
    EXPECT_EQ(withTomlKey("", "name", "5"), "name = 5\n");
}

TEST(WithTomlKey, ComesBehindTheLastKeyAndLeavesTheRestAlone)
{
    EXPECT_EQ(withTomlKey("# head\n\na=1 # one\n\n# of the table\n[t]\nb = 2\n", "name", "5"),
              "# head\n\na=1 # one\nname = 5\n\n# of the table\n[t]\nb = 2\n");
    EXPECT_EQ(withTomlKey("# only words\n# a = 1\n", "name", "5"), "# only words\n# a = 1\nname = 5\n");
    EXPECT_EQ(withTomlKey("a = 1", "name", "5"), "a = 1\nname = 5\n");
    EXPECT_EQ(withTomlKey("a = [\n 1,\n]\n", "name", "5"), "a = [\n 1,\n]\nname = 5\n");
}

TEST(WithTomlKey, StandsBeforeTablesAndWhatIsSaidAboutThem)
{
    EXPECT_EQ(withTomlKey("# head\n\n# of the table\n[t]\nb = 2\n", "name", "5"),
              "# head\n\nname = 5\n\n# of the table\n[t]\nb = 2\n");
    EXPECT_EQ(withTomlKey("[[t]]\n[[t]]\n", "name", "5"), "name = 5\n\n[[t]]\n[[t]]\n");
}

TEST(WithTomlKey, TakesThePlaceOfTheValueAndKeepsTheWordsBehindIt)
{
    EXPECT_EQ(withTomlKey("a = 1\nname = \"x # y\" # who\nb = 2\n", "name", "5"), "a = 1\nname = 5 # who\nb = 2\n");
    EXPECT_EQ(withTomlKey("\"name\"   =\"#\"\nb = 2\n", "name", "5"), "name = 5\nb = 2\n");
    EXPECT_EQ(withTomlKey("name = [ # first\n 1, # one ]\n] # last\nb = 2\n", "name", "5"), "name = 5 # last\nb = 2\n");
    EXPECT_EQ(withTomlKey("name = \"\"\"\n]\n# no comment\n\"\"\"\nb = 2\n", "name", "5"), "name = 5\nb = 2\n");
    EXPECT_EQ(withTomlKey("name = 1", "name", "5"), "name = 5\n");
}

TEST(WithTomlKey, TakesThePlaceOfTablesOfThatName)
{
    EXPECT_EQ(withTomlKey("name.a = 1\nb = 2\nname.c = 3\n", "name", "5"), "name = 5\nb = 2\n");
    EXPECT_EQ(withTomlKey("a = 1\n[name]\nb = 2\n[name.c]\nd = 1\n[e]\nname = 7\n", "name", "5"),
              "a = 1\nname = 5\n[e]\nname = 7\n");
}

TEST(WithTomlKey, IsNotAKeyOfATable)
{
    EXPECT_EQ(withTomlKey("[t]\nname = 1\n", "name", "5"), "name = 5\n\n[t]\nname = 1\n");
}

TEST(WithTomlKey, QuotesAKeyThatNeedsIt)
{
    EXPECT_EQ(withTomlKey("", "a b", "5"), "\"a b\" = 5\n");
    EXPECT_EQ(withTomlKey("", "a.b", "5"), "\"a.b\" = 5\n");
    EXPECT_EQ(withTomlKey("", "", "5"), "\"\" = 5\n");
    EXPECT_EQ(withTomlKey("", "ä\n", "5"), "\"ä\\n\" = 5\n");
    EXPECT_EQ(withTomlKey("\"a.b\" = 1\n", "a.b", "5"), "\"a.b\" = 5\n");
}

TEST(WithTomlKey, KeepsForeignLineEndsAndDropsAByteOrderMark)
{
    EXPECT_EQ(withTomlKey("a = 1\r\nname = 2 # x\r\nb = 3\r\n", "name", "5"), "a = 1\r\nname = 5 # x\r\nb = 3\r\n");
    EXPECT_EQ(withTomlKey("\xEF\xBB\xBF[t]\na = 1\n", "name", "5"), "name = 5\n\n[t]\na = 1\n");
}

// --- removing

TEST(WithoutTomlKey, LeavesTheRestAlone)
{
    EXPECT_EQ(withoutTomlKey("# head\na = 1\n# of name\nname = 5 # who\n\nb = 2\n", "name"),
              "# head\na = 1\n# of name\n\nb = 2\n");
    EXPECT_EQ(withoutTomlKey("name.a = 1\nb = 1\n[name.c]\nd = 1\n# about e\n[e]\nname = 1\n", "name"),
              "b = 1\n# about e\n[e]\nname = 1\n");
    EXPECT_EQ(withoutTomlKey("name = [\n1,\n2]\n", "name"), "");
    EXPECT_EQ(withoutTomlKey("a = 1\n", "name"), "a = 1\n");
}

// --- any text

// Statements that may stand in one text, each about a key of its own.
rc::Gen<std::string> text()
{
    static const std::vector<std::string> parts{
        "a = 1\n",
        "b = \"x # y\" # words = 1\n",
        "c = [ # [\n  1, # ]\n  2\n]\n",
        "d = \"\"\"\n[no.table]\nb = 2\n]\n\"\"\"\n",
        "e = '''\n'' ] '''\n",
        "f.g = {h = [1, 2], i = \"}\"}\n",
        "\"j k\" = 1979-05-27T07:32:00Z\n",
        "# a = comment\n",
        "\n",
        "  \t\n",
        "f.l = inf\n",
    };
    static const std::vector<std::string> tables{"[t]\na = 1\n\n", "# words\n[u.v] # of u\nb = [\n]\n",
                                                 "[[w]]\nx = 1\n[[w]]\nx = 2\n", "[u]\na.b = 1\n"};
    const auto some = [](const std::vector<std::string>& all) {
        return rc::gen::map(rc::gen::container<std::vector<bool>>(all.size(), rc::gen::arbitrary<bool>()),
                            [&all](const std::vector<bool>& chosen) {
                                std::string joined;
                                for (std::size_t index = 0; index < all.size(); ++index)
                                    joined += chosen[index] ? all[index] : "";
                                return joined;
                            });
    };
    return rc::gen::apply(std::plus<std::string>(), some(parts), some(tables));
}

rc::Gen<std::string> key()
{
    return rc::gen::element<std::string>("a", "b", "c", "d", "e", "f", "j k", "t", "u", "w", "new", "");
}

Dictionary read(const std::string& toml)
{
    const auto values = platform::parseToml(toml);
    RC_ASSERT(values.has_value());
    return *values;
}

std::size_t commentLines(const std::string& toml)
{
    std::size_t count = 0;
    for (const std::string line : {"# a = comment\n", "# words\n"})
        count += toml.contains(line) ? 1 : 0;
    return count;
}

RC_GTEST_PROP(AnyTomlText, SaysTheSameButForTheKeyThatIsSet, ())
{
    const std::string before = *text();
    const std::string name = *key();
    const std::string value = *rc::gen::element<std::string>("5", "\"#\"", "[\n1]", "{a = 1}");
    const std::string after = withTomlKey(before, name, value);
    RC_ASSERT(read(after).without(name) == read(before).without(name));
    const Dictionary values = read(after);
    RC_ASSERT(values.find(name) != nullptr);
    RC_ASSERT(*values.find(name) == *tomlValue(value));
    RC_ASSERT(commentLines(after) == commentLines(before));
    RC_ASSERT(withTomlKey(after, name, value) == after);
}

RC_GTEST_PROP(AnyTomlText, SaysTheSameButForTheKeyThatIsRemoved, ())
{
    const std::string before = *text();
    const std::string name = *key();
    const std::string after = withoutTomlKey(before, name);
    RC_ASSERT(read(after) == read(before).without(name));
    RC_ASSERT(commentLines(after) == commentLines(before));
    if (!read(before).contains(name))
        RC_ASSERT(after == before);
}

} // namespace
