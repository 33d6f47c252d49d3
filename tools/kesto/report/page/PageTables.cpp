// What sections share: the table behind a picture, and the steps of an axis.
#include "kesto/report/page/PageSections.h"

#include <cmath>
#include <fmt/format.h>

std::string tableHTML(const PageTable& table)
{
    std::string html =
        fmt::format("<details><summary>{}</summary><div class=scroll tabindex=0><table><thead><tr>", table.summary);
    for (const std::string& cell : table.head)
        html += "<th scope=col>" + cell;
    html += "<tbody>";
    for (const auto& row : table.rows) {
        html += "<tr><th scope=row>" + row.front();
        for (std::size_t column = 1; column < row.size(); ++column)
            html += "<td>" + row[column];
    }
    return html + "</table></div></details>";
}

AxisSteps stepsUpTo(double largest)
{
    constexpr int most = 5;
    if (!(largest > 0))
        return {};
    const double power = std::pow(10, std::floor(std::log10(largest / most)));
    for (const double factor : {1, 2, 5, 10})
        if (const double count = std::ceil(largest / (power * factor) - 1e-9); count <= most)
            return {power * factor, static_cast<int>(count)};
    return {power * 10, 1};
}

TimeUnit unitFor(double largestSeconds)
{
    constexpr double minute = 60;
    constexpr double hour = 60 * minute;
    if (largestSeconds > 2 * hour)
        return {"hours", hour};
    if (largestSeconds > 2 * minute)
        return {"minutes", minute};
    return {"seconds", 1};
}
