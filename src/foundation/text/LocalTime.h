// SPDX-License-Identifier: Apache-2.0
// Local time as text, for names and tables that people read.
#pragma once

#include <string>
#include <string_view>

namespace foundation {

// The moment in the device's time zone, by a chrono format of {fmt} such as "{:%H:%M:%S}". If the year has not one to
// four digits, the text is the number of seconds. Any thread.
[[nodiscard]] std::string localTimeText(double secondsSince1970, std::string_view format);

} // namespace foundation
