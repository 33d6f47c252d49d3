#include "foundation/LocalTime.h"

#include <cmath>
#include <ctime>
#include <fmt/chrono.h>

namespace foundation {

std::string localTimeText(double secondsSince1970, std::string_view format)
{
    const std::tm time = fmt::localtime(static_cast<std::time_t>(std::floor(secondsSince1970)));
    return fmt::format(fmt::runtime(format), time);
}

} // namespace foundation
