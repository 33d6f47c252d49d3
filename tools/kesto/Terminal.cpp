// Characters are counted by their first bytes in UTF-8, even if the other bytes are wrong.
#include "kesto/Terminal.h"

#include "foundation/values/Json.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <cstdlib>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

constexpr std::size_t narrowest = 40;

// The first byte of a character in UTF-8.
bool isFirstByte(char byte)
{
    return (static_cast<unsigned char>(byte) & 0xC0U) != 0x80U;
}

std::size_t columnsOf(std::string_view text)
{
    return static_cast<std::size_t>(std::ranges::count_if(text, isFirstByte));
}

} // namespace

std::string printable(std::string_view text)
{
    std::string shown;
    shown.reserve(text.size());
    for (std::size_t index = 0; index < text.size(); ++index) {
        const auto byte = static_cast<unsigned char>(text[index]);
        const auto next = index + 1 < text.size() ? static_cast<unsigned char>(text[index + 1]) : 0U;
        const bool isHighControl = byte == 0xC2 && next >= 0x80 && next < 0xA0;
        shown += byte < 0x20 || byte == 0x7F || isHighControl ? '?' : text[index];
        index += isHighControl ? 1 : 0;
    }
    return shown;
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

std::size_t outputWidth()
{
    winsize size{};
    if (::isatty(STDOUT_FILENO) != 0 && ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0)
        return size.ws_col;
    if (const std::string columns = platform::environment("COLUMNS"); !columns.empty())
        return std::max<std::size_t>(narrowest, std::strtoul(columns.c_str(), nullptr, 10));
    return std::string::npos; // not a terminal: lines are not cut
}

std::size_t columnsBehind(std::size_t used, std::size_t width)
{
    constexpr std::size_t least = 8;
    if (width == std::string::npos)
        return width;
    return width > used + least ? width - used : least;
}

std::string shownText(const foundation::Value& value)
{
    if (value.kind() != foundation::Value::Kind::Number)
        return value.text();
    std::string text; // "true", where `text` has 1
    foundation::appendJsonText(value, text);
    return text;
}
