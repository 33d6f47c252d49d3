// SPDX-License-Identifier: Apache-2.0
// A name is read character by character before anything is escaped: so nothing can hide in bytes that a browser reads
// in another way.
#include "kesto/report/page/PageText.h"

#include "foundation/text/LocalTime.h"
#include "kesto/report/ReportWords.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <ctime>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <vector>

namespace chrono = std::chrono;

namespace {

constexpr char32_t replacement = 0xFFFD;

struct CharacterRange {
    char32_t first;
    char32_t last;
};

// Controls, and what is not seen: marks of direction, joiners, fillers, byte order marks, tags.
constexpr std::array unseen{
    CharacterRange{0, 0x1F},          CharacterRange{0x7F, 0x9F},       CharacterRange{0xAD, 0xAD},
    CharacterRange{0x61C, 0x61C},     CharacterRange{0x115F, 0x1160},   CharacterRange{0x180E, 0x180E},
    CharacterRange{0x200B, 0x200F},   CharacterRange{0x2028, 0x202E},   CharacterRange{0x2060, 0x206F},
    CharacterRange{0x3164, 0x3164},   CharacterRange{0xD800, 0xF8FF},   CharacterRange{0xFEFF, 0xFEFF},
    CharacterRange{0xFFA0, 0xFFA0},   CharacterRange{0xFFF0, 0xFFFB},   CharacterRange{0xFFFE, 0xFFFF},
    CharacterRange{0xE0000, 0xE0FFF}, CharacterRange{0xF0000, 0x1FFFFF}};

bool isUnseen(char32_t character)
{
    return std::ranges::any_of(
        unseen, [=](const CharacterRange& range) { return character >= range.first && character <= range.last; });
}

// Reads a character and moves behind it; behind a single byte if that begins none.
char32_t readCharacter(std::string_view& text)
{
    const auto byte = [&](std::size_t index) { return static_cast<unsigned char>(text[index]); };
    const unsigned first = byte(0);
    const std::size_t size = first < 0x80 ? 1 : first >= 0xF0 ? 4 : first >= 0xE0 ? 3 : 2;
    constexpr std::array<char32_t, 5> least{0, 0, 0x80, 0x800, 0x10000};
    constexpr std::array<unsigned, 5> bitsOfFirst{0, 0x7F, 0x1F, 0x0F, 0x07};
    const bool canBegin = first < 0x80 || (first >= 0xC2 && first < 0xF5);
    char32_t character = first & bitsOfFirst[size];
    bool isWhole = canBegin && text.size() >= size;
    for (std::size_t index = 1; isWhole && index < size; ++index) {
        isWhole = (byte(index) & 0xC0U) == 0x80;
        character = character << 6U | (byte(index) & 0x3FU);
    }
    isWhole = isWhole && character >= least[size];
    text.remove_prefix(isWhole ? size : 1);
    return isWhole && !isUnseen(character) ? character : replacement;
}

void appendCharacter(char32_t character, std::string& out)
{
    const auto add = [&out](char32_t byte) { out += static_cast<char>(byte); };
    if (character < 0x80) {
        add(character);
    } else if (character < 0x800) {
        add(0xC0U | character >> 6U);
        add(0x80U | (character & 0x3FU));
    } else if (character < 0x10000) {
        add(0xE0U | character >> 12U);
        add(0x80U | (character >> 6U & 0x3FU));
        add(0x80U | (character & 0x3FU));
    } else {
        add(0xF0U | character >> 18U);
        add(0x80U | (character >> 12U & 0x3FU));
        add(0x80U | (character >> 6U & 0x3FU));
        add(0x80U | (character & 0x3FU));
    }
}

void appendEscaped(char32_t character, std::string& out)
{
    switch (character) {
    case '&': out += "&amp;"; break;
    case '<': out += "&lt;"; break;
    case '>': out += "&gt;"; break;
    case '"': out += "&quot;"; break;
    case '\'': out += "&#39;"; break;
    default: appendCharacter(character, out);
    }
}

constexpr std::array<std::string_view, 12> months{"January",   "February", "March",    "April",
                                                  "May",       "June",     "July",     "August",
                                                  "September", "October",  "November", "December"};

unsigned dayOf(chrono::year_month_day date)
{
    return static_cast<unsigned>(date.day());
}

} // namespace

std::string htmlText(std::string_view text, std::size_t mostCharacters)
{
    std::vector<char32_t> characters;
    while (!text.empty())
        characters.push_back(readCharacter(text));
    if (characters.size() > mostCharacters) {
        constexpr char32_t ellipsis = 0x2026;
        const std::size_t behind = (mostCharacters - 1) / 2;
        const std::size_t before = mostCharacters - 1 - behind;
        characters[before] = ellipsis;
        characters.erase(characters.begin() + static_cast<std::ptrdiff_t>(before) + 1,
                         characters.end() - static_cast<std::ptrdiff_t>(behind));
    }
    std::string out;
    for (const char32_t character : characters)
        appendEscaped(character, out);
    return out;
}

std::string htmlName(std::string_view key, std::size_t mostCharacters)
{
    return key.empty() ? "not told" : htmlText(key, mostCharacters);
}

std::string htmlDevices(std::string_view key, std::size_t mostCharacters)
{
    constexpr std::size_t leastOfEach = 8;
    const auto count = static_cast<std::size_t>(std::ranges::count(key, ',')) + 1;
    const std::size_t ofEach = mostCharacters / count;
    if (count == 1 || key.size() <= mostCharacters || ofEach < leastOfEach)
        return htmlName(key, mostCharacters);
    std::string html;
    for (std::size_t from = 0; from <= key.size();) {
        const std::size_t until = std::min(key.find(',', from), key.size());
        html += (html.empty() ? "" : ",") + htmlText(key.substr(from, until - from), ofEach - 1);
        from = until + 1;
    }
    return html;
}

std::string durationText(double seconds)
{
    constexpr long minute = 60;
    constexpr long hour = 60 * minute;
    constexpr long longestWithMinutes = 100 * hour;
    if (seconds > 0 && seconds < 0.5)
        return "below 1 s";
    if (std::lround(seconds) < minute)
        return fmt::format("{} s", std::lround(seconds));
    const long minutes = std::lround(seconds / minute);
    if (minutes < minute)
        return fmt::format("{} min", minutes);
    if (minutes * minute < longestWithMinutes)
        return fmt::format("{} h {} min", minutes / minute, minutes % minute);
    return fmt::format("{} h", std::lround(seconds / hour));
}

std::string hoursText(double seconds)
{
    const double hours = seconds / 3600;
    return seconds <= 0 ? "0" : hours < 0.005 ? "&lt;0.01" : fmt::format("{:.2f}", hours);
}

std::string percentText(double part, double whole)
{
    if (part <= 0 || whole <= 0)
        return "0 %";
    const double percent = 100 * part / whole;
    if (percent < 1)
        return percent < 0.1 ? "&lt;0.1 %" : fmt::format("{:.1f} %", percent);
    // Nearly all is not all.
    if (percent > 99 && part < whole)
        return fmt::format("{:.1f} %", std::min(std::floor(percent * 10) / 10, 99.9));
    return fmt::format("{:.0f} %", percent);
}

std::string rateText(const std::optional<double>& rate)
{
    return !rate ? "–" : *rate > 0 && *rate < 0.005 ? "&lt;0.01" : fmt::format("{:.2f}", *rate);
}

std::string_view monthName(chrono::year_month_day date)
{
    return months[static_cast<unsigned>(date.month()) - 1];
}

bool isWeekend(chrono::year_month_day date)
{
    const chrono::weekday weekday{chrono::sys_days(date)};
    return weekday == chrono::Saturday || weekday == chrono::Sunday;
}

std::string dayText(chrono::year_month_day date)
{
    return fmt::format("{} {} {}", weekdayName(date), dayOf(date), monthName(date).substr(0, 3));
}

std::string daysText(chrono::year_month_day first, chrono::year_month_day last)
{
    std::string end = fmt::format("{} {} {}", dayOf(last), monthName(last), static_cast<int>(last.year()));
    if (first == last)
        return end;
    if (first.year() != last.year())
        return fmt::format("{} {} {} to {}", dayOf(first), monthName(first), static_cast<int>(first.year()), end);
    if (first.month() != last.month())
        return fmt::format("{} {} to {}", dayOf(first), monthName(first), end);
    return fmt::format("{} to {}", dayOf(first), end);
}

std::string pageMoment(double secondsSince1970, bool isUTC, std::string_view format)
{
    if (!isUTC)
        return foundation::localTimeText(secondsSince1970, format);
    constexpr double longest = 1e11; // as far as years have four digits
    if (!(std::abs(secondsSince1970) < longest))
        return fmt::format("{}", secondsSince1970);
    return fmt::format(fmt::runtime(format), fmt::gmtime(static_cast<std::time_t>(std::floor(secondsSince1970))));
}
