// SPDX-License-Identifier: Apache-2.0
// The arithmetic looks at the eight bytes of a word at once: taking 1 from a byte sets its highest bit if it was 0.
#include "kesto-ingest/batch/JsonText.h"

#include <fmt/format.h>

#include <bit>
#include <cstdint>
#include <cstring>
#include <iterator>

namespace kesto_ingest {

namespace {

constexpr std::uint64_t everyByte = 0x0101010101010101;
constexpr std::uint64_t highBits = 0x8080808080808080;
constexpr unsigned char firstPrintable = 0x20;

// The first eight characters, of which the first is in the lowest byte.
std::uint64_t wordAt(const char* text) noexcept
{
    std::uint64_t word = 0;
    std::memcpy(&word, text, sizeof word);
    return std::endian::native == std::endian::little ? word : std::byteswap(word);
}

// The highest bit of each byte that is escaped. Bytes above such a one may have it, too.
std::uint64_t escapedIn(std::uint64_t word) noexcept
{
    const std::uint64_t quotes = word ^ (everyByte * '"');
    const std::uint64_t backslashes = word ^ (everyByte * '\\');
    return (((word - everyByte * firstPrintable) & ~word) | ((quotes - everyByte) & ~quotes)
            | ((backslashes - everyByte) & ~backslashes))
        & highBits;
}

bool isEscaped(char character) noexcept
{
    return static_cast<unsigned char>(character) < firstPrintable || character == '"' || character == '\\';
}

// `escape` appends a character that is escaped.
template <typename Escape> void appendEscaped(std::string_view text, std::string& json, Escape escape)
{
    for (;;) {
        const std::size_t plain = plainLength(text);
        json += text.substr(0, plain);
        if (plain == text.size())
            return;
        escape(text[plain], json);
        text.remove_prefix(plain + 1);
    }
}

void escapeOnce(char character, std::string& json)
{
    if (static_cast<unsigned char>(character) < firstPrintable)
        fmt::format_to(std::back_inserter(json), "\\u{:04x}", static_cast<unsigned>(character));
    else
        (json += '\\') += character;
}

// Escaped within the inner JSON, and what that gave within the outer one.
void escapeTwice(char character, std::string& json)
{
    switch (character) {
    case '"': json += R"(\\\")"; break;
    case '\\': json += R"(\\\\)"; break;
    case '\b': json += R"(\\b)"; break;
    case '\f': json += R"(\\f)"; break;
    case '\n': json += R"(\\n)"; break;
    case '\r': json += R"(\\r)"; break;
    case '\t': json += R"(\\t)"; break;
    default: fmt::format_to(std::back_inserter(json), R"(\\u{:04X})", static_cast<unsigned>(character)); break;
    }
}

} // namespace

std::size_t plainLength(std::string_view text) noexcept
{
    std::size_t length = 0;
    for (; length + sizeof(std::uint64_t) <= text.size(); length += sizeof(std::uint64_t))
        if (const std::uint64_t escaped = escapedIn(wordAt(text.data() + length)); escaped != 0)
            return length + static_cast<std::size_t>(std::countr_zero(escaped)) / 8;
    while (length < text.size() && !isEscaped(text[length]))
        ++length;
    return length;
}

void appendText(std::string_view text, std::string& json)
{
    json += '"';
    appendEscaped(text, json, escapeOnce);
    json += '"';
}

void EmbeddedJson::addText(std::string_view text)
{
    separate();
    content_ += R"(\")";
    appendEscaped(text, content_, escapeTwice);
    content_ += R"(\")";
}

} // namespace kesto_ingest
