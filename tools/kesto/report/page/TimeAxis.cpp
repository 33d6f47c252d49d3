// SPDX-License-Identifier: Apache-2.0
// A step is 1, 2 or 5 times a power of ten.
#include "kesto/report/page/TimeAxis.h"

#include <cmath>
#include <fmt/format.h>

TimeAxis::TimeAxis(double longestSeconds, const Frame& frame)
    : frame_(frame),
      unit_(unitFor(longestSeconds)),
      steps_(stepsUpTo(longestSeconds / unit_.seconds))
{
}

void TimeAxis::draw(Svg& svg) const
{
    svg.text("ax", 0, 11, Svg::Anchor::Start, unit_.name);
    for (int step = 0; step <= steps_.count; ++step) {
        const double value = steps_.step * step;
        const double y = frame_.bottom - heightOf(value * unit_.seconds);
        svg.line(step == 0 ? "zero" : "grid", frame_.left, y, frame_.right, y);
        svg.text("ax", frame_.left - 8, y + 4, Svg::Anchor::End, fmt::format("{:.6g}", value));
    }
}

double TimeAxis::heightOf(double seconds) const
{
    return (frame_.bottom - frame_.top) * valueOf(seconds) / (steps_.step * steps_.count);
}

TimeAxis::Unit TimeAxis::unitFor(double longestSeconds)
{
    constexpr double minute = 60;
    constexpr double hour = 60 * minute;
    if (longestSeconds > 2 * hour)
        return {"hours", hour};
    if (longestSeconds > 2 * minute)
        return {"minutes", minute};
    return {"seconds", 1};
}

TimeAxis::Steps TimeAxis::stepsUpTo(double longest)
{
    constexpr int most = 5;
    if (!(longest > 0))
        return {};
    const double power = std::pow(10, std::floor(std::log10(longest / most)));
    for (const double factor : {1, 2, 5, 10})
        if (const double count = std::ceil(longest / (power * factor) - 1e-9); count <= most)
            return {power * factor, static_cast<int>(count)};
    return {power * 10, 1};
}
