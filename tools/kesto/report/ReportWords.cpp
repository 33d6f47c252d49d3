// SPDX-License-Identifier: Apache-2.0
// English, in every locale.
#include "kesto/report/ReportWords.h"

#include <array>
#include <fmt/format.h>

std::string countText(std::size_t count, std::string_view noun)
{
    return fmt::format("{} {}{}", count, noun, count == 1 ? "" : "s");
}

std::string_view weekdayName(std::chrono::year_month_day date)
{
    constexpr std::array<std::string_view, 7> names{"Sun", "Mon", "Tue", "Wed", "Thu", "Fri", "Sat"};
    return names[std::chrono::weekday(std::chrono::sys_days(date)).c_encoding()];
}
