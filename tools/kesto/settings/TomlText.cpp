// SPDX-License-Identifier: Apache-2.0
// The parser, not a search, finds the statements: each is parsed separately, which gives its key. Only ends of lines
// that may end a statement are tried.
#include "kesto/settings/TomlText.h"

#include "foundation/values/Json.h"
#include "platform/linux/settings/TomlFile.h"

#include <algorithm>
#include <iterator>
#include <optional>
#include <ranges>
#include <vector>

namespace {

// Lines of the text that form one statement, or one line without a statement.
struct Statement {
    std::string text; // with the line's end
    std::optional<std::string> key; // the key that it sets outside of tables: its own or its table's
    bool isTable = false; // begins a table
};

char firstCharacter(std::string_view text)
{
    const std::size_t place = text.find_first_not_of(" \t\r\n");
    return place == std::string_view::npos ? '\n' : text[place];
}

// Values over many lines end in one of these.
bool mayEndValue(std::string_view line)
{
    return line.contains(']') || line.contains(R"(""")") || line.contains("'''");
}

std::string_view firstStatement(std::string_view text)
{
    for (std::size_t begin = 0, end = 0; end != text.size(); begin = end) {
        end = std::min(text.find('\n', begin), text.size() - 1) + 1;
        const bool isPossible = begin == 0 || mayEndValue(text.substr(begin, end - begin));
        if (isPossible && platform::parseToml(text.substr(0, end)))
            return text.substr(0, end);
    }
    return text;
}

std::vector<Statement> statementsOf(std::string_view toml)
{
    constexpr std::string_view byteOrderMark = "\xEF\xBB\xBF"; // without meaning; only allowed at the beginning
    toml.remove_prefix(toml.starts_with(byteOrderMark) ? byteOrderMark.size() : 0);
    std::vector<Statement> statements;
    std::optional<std::string> table;
    while (!toml.empty()) {
        const std::string_view text = firstStatement(toml);
        toml.remove_prefix(text.size());
        Statement statement;
        statement.text = text;
        const auto said = platform::parseToml(text);
        if (said && !said->empty()) {
            statement.key = std::string(said->keys().front().view());
            statement.isTable = firstCharacter(text) == '[';
            if (statement.isTable)
                table = statement.key;
            else if (table)
                statement.key = table;
        }
        statements.push_back(std::move(statement));
    }
    return statements;
}

std::string textOf(const std::vector<Statement>& statements)
{
    std::string text;
    for (const Statement& statement : statements) {
        if (!text.empty() && !text.ends_with('\n'))
            text += '\n';
        text += statement.text;
    }
    return text;
}

// The text behind the value: it begins at the first "#" that can be removed, with the rest of its line, without a
// change of the statement's meaning.
std::string tailOf(const std::string& statement)
{
    const auto meaning = [](std::string_view text) {
        const auto values = platform::parseToml(text);
        return values ? foundation::Value(*values).text() : std::string();
    };
    const std::string all = meaning(statement);
    for (std::size_t place = statement.find('#'); place != std::string::npos; place = statement.find('#', place + 1))
        if (meaning(std::string_view(statement).substr(0, place)) == all)
            return " " + statement.substr(place);
    return "\n";
}

std::string tomlKey(std::string_view key)
{
    constexpr std::string_view bare = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
    const bool isBare = !key.empty() && key.find_first_not_of(bare) == std::string_view::npos;
    return isBare ? std::string(key) : tomlString(key);
}

} // namespace

std::optional<foundation::Value> tomlValue(std::string_view text)
{
    // After the first form comments and further keys could follow; inside the second, other members of the braces. A
    // text that is valid in both forms has neither.
    const auto alone = platform::parseToml("value = " + std::string(text));
    const auto enclosed = platform::parseToml("table = {value = " + std::string(text) + "}");
    if (!alone || !enclosed)
        return std::nullopt;
    return *alone->find("value");
}

std::string tomlString(std::string_view text)
{
    constexpr std::string_view hexDigits = "0123456789ABCDEF";
    std::string json; // TOML has its escapes, too; but it does not escape control characters beyond the first 32
    foundation::appendJsonText(text, json);
    std::string toml;
    for (std::size_t index = 0; index < json.size(); ++index) {
        const auto byte = static_cast<unsigned char>(json[index]);
        const auto next = index + 1 < json.size() ? static_cast<unsigned char>(json[index + 1]) : 0U;
        if (byte == 0x7F)
            toml += "\\u007F";
        else if (byte == 0xC2 && next >= 0x80 && next < 0xA0) {
            toml += next < 0x90 ? "\\u008" : "\\u009";
            toml += hexDigits[next % 16];
            ++index;
        } else
            toml += json[index];
    }
    return toml;
}

std::string withTomlKey(std::string_view toml, std::string_view key, std::string_view value)
{
    std::vector<Statement> statements = statementsOf(toml);
    const auto isComment = [](const Statement& statement) { return firstCharacter(statement.text) == '#'; };
    const auto isAbout = [key](const Statement& statement) { return statement.key == key; };
    const auto hasKey = [](const Statement& statement) { return statement.key.has_value(); };

    const auto firstTable = std::ranges::find_if(statements, &Statement::isTable);
    auto place = std::find_if(statements.begin(), firstTable, isAbout);
    std::string line = tomlKey(key) + " = " + std::string(value);
    if (place != firstTable) {
        line += tailOf(place->text);
    } else {
        line += '\n';
        const auto behindLastKey = std::find_if(std::reverse_iterator(firstTable), statements.rend(), hasKey).base();
        place = firstTable;
        if (behindLastKey != statements.begin())
            place = behindLastKey;
        else if (firstTable != statements.end()) {
            while (place != statements.begin() && isComment(*std::prev(place)))
                --place; // this statement belongs to the table
            line += '\n';
        }
        place = statements.insert(place, Statement());
    }
    place->text = std::move(line);
    place->key.reset();
    std::erase_if(statements, isAbout);
    return textOf(statements);
}

std::string withoutTomlKey(std::string_view toml, std::string_view key)
{
    std::vector<Statement> statements = statementsOf(toml);
    std::erase_if(statements, [key](const Statement& statement) { return statement.key == key; });
    return textOf(statements);
}
