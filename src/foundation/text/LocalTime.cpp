// SPDX-License-Identifier: Apache-2.0
// The time zone is read each time, because a device travels while the service runs.
#include "foundation/text/LocalTime.h"

#include "foundation/values/Number.h"

#include <cmath>
#include <ctime>
#include <fmt/chrono.h>

namespace foundation {

std::string localTimeText(double secondsSince1970, std::string_view format)
{
    constexpr double firstSecondOfYear1 = -62135596800;
    constexpr double firstSecondOfYear10000 = 253402300800;
    if (!(secondsSince1970 >= firstSecondOfYear1 && secondsSince1970 < firstSecondOfYear10000))
        return Number(secondsSince1970).text();
    ::tzset(); // the device may have travelled
    const std::tm time = fmt::localtime(static_cast<std::time_t>(std::floor(secondsSince1970)));
    return fmt::format(fmt::runtime(format), time);
}

} // namespace foundation
