// SPDX-License-Identifier: Apache-2.0
// Characters are counted by their first bytes in UTF-8, even if the other bytes are wrong.
#include "kesto/Terminal.h"

#include "foundation/text/LocalTime.h"
#include "foundation/values/Json.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <cstdlib>
#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

constexpr std::size_t narrowest = 40;

// The first byte of a character in UTF-8.
bool isFirstByte(char byte)
{
    return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U;
}

// How many bytes the control character at the beginning of the text has; 0 if there is none. Others than those of ASCII
// have two or three bytes in UTF-8.
std::size_t controlBytes(std::string_view text)
{
    const auto byteAt = [text](std::size_t index) {
        return index < text.size() ? static_cast<unsigned char>(text[index]) : 0U;
    };
    const auto isWithin = [](unsigned byte, unsigned first, unsigned last) { return byte >= first && byte <= last; };
    const unsigned first = byteAt(0);
    const unsigned second = byteAt(1);
    const unsigned third = byteAt(2);
    if (first < 0x20 || first == 0x7F)
        return 1;
    if ((first == 0xC2 && isWithin(second, 0x80, 0x9F)) || (first == 0xD8 && second == 0x9C))
        return 2; // U+0080 to U+009F; U+061C
    const bool isMarkOrEmbedding = second == 0x80 && (isWithin(third, 0x8E, 0x8F) || isWithin(third, 0xAA, 0xAE));
    const bool isIsolate = second == 0x81 && isWithin(third, 0xA6, 0xA9);
    return first == 0xE2 && (isMarkOrEmbedding || isIsolate) ? 3
                                                             : 0; // U+200E, U+200F, U+202A to U+202E; U+2066 to U+2069
}

// Zeros if standard output is no terminal, or one that does not tell.
winsize outputSize()
{
    winsize size{};
    return ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 ? size : winsize{};
}

} // namespace

std::string printable(std::string_view text)
{
    std::string shown;
    shown.reserve(text.size());
    while (!text.empty()) {
        const std::size_t bytes = controlBytes(text);
        shown += bytes == 0 ? text.front() : '?';
        text.remove_prefix(std::max<std::size_t>(bytes, 1));
    }
    return shown;
}

std::size_t columnsOf(std::string_view text)
{
    return static_cast<std::size_t>(std::ranges::count_if(text, isFirstByte));
}

std::string fitted(std::string_view text, std::size_t columns)
{
    if (columnsOf(text) <= columns)
        return std::string(text);
    std::size_t seen = 0;
    const auto* cut = std::ranges::find_if(text, [&](char byte) { return isFirstByte(byte) && ++seen == columns; });
    return std::string(text.begin(), cut) + "…";
}

std::string padded(std::string text, std::size_t columns)
{
    const std::size_t width = columnsOf(text);
    return std::move(text) + std::string(columns > width ? columns - width : 0, ' ');
}

std::string alignedRight(std::string_view text, std::size_t columns)
{
    const std::size_t width = columnsOf(text);
    return std::string(columns > width ? columns - width : 0, ' ').append(text);
}

std::string momentText(double secondsSince1970)
{
    return foundation::localTimeText(secondsSince1970, "{:%Y-%m-%d %H:%M:%S}");
}

std::size_t outputWidth()
{
    if (const winsize size = outputSize(); size.ws_col > 0)
        return size.ws_col;
    if (const std::string columns = platform::environment("COLUMNS"); !columns.empty())
        return std::max<std::size_t>(narrowest, std::strtoul(columns.c_str(), nullptr, 10));
    return std::string::npos; // not a terminal: lines are not cut
}

std::size_t outputHeight()
{
    const winsize size = outputSize();
    return size.ws_row > 0 ? size.ws_row : std::string::npos;
}

bool showsUTF8()
{
    for (const char* name : {"LC_ALL", "LC_CTYPE", "LANG"}) {
        std::string locale = platform::environment(name);
        std::ranges::transform(locale, locale.begin(), [](unsigned char letter) { return std::tolower(letter); });
        if (!locale.empty())
            return locale.contains("utf-8") || locale.contains("utf8");
    }
    return false;
}

std::string bar(double share, std::size_t columns, bool isUTF8)
{
    if (!(share > 0))
        return {};
    constexpr std::array<std::string_view, 8> eighths{"", "▏", "▎", "▍", "▌", "▋", "▊", "▉"};
    const double steps = isUTF8 ? eighths.size() : 1;
    const double most = static_cast<double>(columns) * steps;
    const auto length = static_cast<std::size_t>(std::clamp(std::round(share * most), 1.0, most));
    if (!isUTF8)
        return std::string(length, '#');
    std::string text;
    for (std::size_t full = 0; full < length / eighths.size(); ++full)
        text += "█";
    return text.append(eighths[length % eighths.size()]);
}

std::size_t columnsBehind(std::size_t used, std::size_t width)
{
    constexpr std::size_t least = 8;
    if (width == std::string::npos)
        return width;
    return width > used + least ? width - used : least;
}

std::string asciiText(std::string_view text)
{
    constexpr std::string_view cut = "…";
    std::string ascii;
    for (std::size_t index = 0; index < text.size(); ++index)
        if (static_cast<unsigned char>(text[index]) < 0x80)
            ascii += text[index];
        else if (isFirstByte(text[index]))
            ascii += text.substr(index).starts_with(cut) ? '~' : '?';
    return ascii;
}

std::string sizeText(std::uint64_t bytes)
{
    constexpr double kilobyte = 1'000;
    constexpr double megabyte = 1'000'000;
    const auto size = static_cast<double>(bytes);
    if (size < kilobyte)
        return fmt::format("{} B", bytes);
    return size < megabyte ? fmt::format("{:.0f} kB", size / kilobyte) : fmt::format("{:.1f} MB", size / megabyte);
}

std::string shownText(const foundation::Value& value)
{
    if (value.kind() != foundation::Value::Kind::Number)
        return value.text();
    std::string text; // "true", where `text` has 1
    foundation::appendJsonText(value, text);
    return text;
}
