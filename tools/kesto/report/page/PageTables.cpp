// SPDX-License-Identifier: Apache-2.0
// A table behind a picture opens without a script.
#include "kesto/report/page/PageSections.h"

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
