// SPDX-License-Identifier: Apache-2.0
// A character behind a backslash stands for itself, in a literal and in a regular expression.
#include "kesto/report/fleet/SqlText.h"

namespace {

void appendLiteral(char character, std::string& expression)
{
    const bool isWord = (character >= '0' && character <= '9') || (character >= 'a' && character <= 'z')
        || (character >= 'A' && character <= 'Z') || character == '_' || static_cast<unsigned char>(character) >= 0x80;
    if (!isWord)
        expression += '\\';
    expression += character;
}

// The bytes of the character that begins there.
std::string_view characterAt(std::string_view text, std::size_t place)
{
    std::size_t end = place + 1;
    while (end < text.size() && (static_cast<unsigned char>(text[end]) & 0xc0) == 0x80)
        ++end;
    return text.substr(place, end - place);
}

void appendCharacter(std::string_view character, std::string& expression)
{
    for (const char byte : character)
        appendLiteral(byte, expression);
}

// The set behind a "[" at that place, which moves behind its "]". Empty if it has no end: then nothing matches.
std::string setAt(std::string_view glob, std::size_t& place)
{
    std::string set = "[";
    const auto isAt = [&](char character) { return place < glob.size() && glob[place] == character; };
    if (isAt('^')) {
        set += '^';
        ++place;
    }
    std::string_view before; // may begin a range
    for (bool isFirst = true; place < glob.size(); isFirst = false) {
        if (glob[place] == ']' && !isFirst) {
            ++place;
            return set + ']';
        }
        const bool isRange = glob[place] == '-' && !before.empty() && place + 1 < glob.size() && glob[place + 1] != ']';
        place += isRange ? 1 : 0;
        const std::string_view character = characterAt(glob, place);
        place += character.size();
        if (!isRange) {
            appendCharacter(character, set);
            before = character;
            continue;
        }
        if (before <= character) { // bytes of UTF-8 are in the order of their characters
            set += '-';
            appendCharacter(character, set);
        }
        before = {};
    }
    return {};
}

} // namespace

std::string sqlText(std::string_view text)
{
    std::string literal = "'";
    for (const char character : text) {
        if (character == '\'' || character == '\\')
            literal += '\\';
        literal += character;
    }
    return literal + '\'';
}

std::string regularExpression(std::string_view glob)
{
    std::string expression = "^";
    for (std::size_t place = 0; place < glob.size();) {
        const std::string_view character = characterAt(glob, place);
        place += character.size();
        if (character == "*")
            expression += "(.|\\n)*";
        else if (character == "?")
            expression += "(.|\\n)";
        else if (character != "[")
            appendCharacter(character, expression);
        else if (const std::string set = setAt(glob, place); !set.empty())
            expression += set;
        else
            return "^$a"; // nothing
    }
    return expression + '$';
}
