// SPDX-License-Identifier: Apache-2.0
// The forms are tried one after the other; the first that matches the whole text counts.
#include "kesto/results/MomentText.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <ctime>
#include <string>

namespace {

double now()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

std::optional<double> parseAgo(std::string_view text)
{
    double amount = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), amount);
    if (error != std::errc() || end + 1 != text.data() + text.size() || !(amount >= 0) || !std::isfinite(amount))
        return std::nullopt;
    switch (*end) {
    case 's': return now() - amount;
    case 'm': return now() - amount * 60;
    case 'h': return now() - amount * 3600;
    case 'd': return now() - amount * 86400;
    default: return std::nullopt;
    }
}

bool isDay(const std::tm& time)
{
    using namespace std::chrono;
    return (year(time.tm_year + 1900) / (time.tm_mon + 1) / time.tm_mday).ok();
}

std::optional<double> parseTime(const std::string& text)
{
    for (const char* format :
         std::array{"%Y-%m-%dT%H:%M:%S", "%Y-%m-%d %H:%M:%S", "%Y-%m-%dT%H:%M", "%Y-%m-%d %H:%M", "%Y-%m-%d"}) {
        std::tm time{};
        time.tm_isdst = -1; // the system finds out whether summer time holds
        const char* end = ::strptime(text.c_str(), format, &time);
        if (end == nullptr || !isDay(time))
            continue;
        if (*end == '\0')
            return static_cast<double>(std::mktime(&time));
        end = ::strptime(end, "%z", &time);
        if (end == nullptr || *end != '\0')
            continue;
        const auto offset = time.tm_gmtoff; // `timegm` resets it
        return static_cast<double>(::timegm(&time) - offset);
    }
    return std::nullopt;
}

} // namespace

std::optional<double> parseMoment(std::string_view text)
{
    if (const auto ago = parseAgo(text))
        return ago;
    return parseTime(std::string(text));
}
