// Characters are counted by their first bytes in UTF-8, even if the other bytes are wrong.
#include "kesto/Terminal.h"

#include "foundation/values/Json.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <cstdlib>
#include <fmt/format.h>
#include <langinfo.h>
#include <locale.h>
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

std::size_t columnsBehind(std::size_t used, std::size_t width)
{
    constexpr std::size_t least = 8;
    if (width == std::string::npos)
        return width;
    return width > used + least ? width - used : least;
}

bool showsUTF8()
{
    const locale_t locale = ::newlocale(LC_CTYPE_MASK, "", nullptr);
    if (locale == nullptr)
        return false;
    const bool isUTF8 = std::string_view(::nl_langinfo_l(CODESET, locale)) == "UTF-8";
    ::freelocale(locale);
    return isUTF8;
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
