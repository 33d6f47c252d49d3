// SPDX-License-Identifier: Apache-2.0
// Words that the tables and the page of a report share.
#pragma once

#include <chrono>
#include <cstddef>
#include <string>
#include <string_view>

// "1 session", "2 sessions".
[[nodiscard]] std::string countText(std::size_t count, std::string_view noun);
// "Sun".
[[nodiscard]] std::string_view weekdayName(std::chrono::year_month_day date);
