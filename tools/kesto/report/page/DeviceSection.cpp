// SPDX-License-Identifier: Apache-2.0
// Which device had which share of the time.
#include "kesto/report/ReportTable.h"
#include "kesto/report/ReportWords.h"
#include "kesto/report/page/PageColumns.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"
#include "kesto/report/page/Svg.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

namespace {

// Sums of seconds and faults; sessions are left out, because one session may be in several lines.
ReportLine othersOf(const std::vector<ReportLine>& lines, std::size_t named)
{
    ReportLine others;
    for (std::size_t index = named; index < lines.size(); ++index) {
        const Played& played = lines[index].played;
        others.played.seconds += played.seconds;
        others.played.mutedSeconds += played.mutedSeconds;
        others.played.noVolumeSeconds += played.noVolumeSeconds;
        others.played.volumeSeconds += played.volumeSeconds;
        others.played.faults += played.faults;
    }
    return others;
}

std::string shareRow(const std::string& name, const Played& played, double whole)
{
    constexpr double width = 400;
    constexpr double height = 10;
    Svg svg(width, height, percentText(played.seconds, whole), "share");
    svg.bar("track", 0, 0, width, height);
    if (played.seconds > 0)
        svg.bar("s1", 0, 0, std::max(1.0, width * std::min(1.0, played.seconds / whole)), height);
    return fmt::format("<li><span><bdi>{}</bdi><span><b>{}</b> {}{}</span></span>{}", name,
                       percentText(played.seconds, whole), durationText(played.seconds),
                       played.sessions == 0 ? "" : ", " + countText(played.sessions, "session"), svg.end());
}

std::string volumeText(const Played& played)
{
    const auto mean = played.meanVolume();
    return mean ? fmt::format("{} %", std::lround(*mean * 100)) : "–";
}

std::vector<std::string> rowOf(const std::string& name, const Played& played, double whole)
{
    return {name,
            hoursText(played.seconds),
            percentText(played.seconds, whole),
            played.sessions == 0 ? "–" : fmt::format("{}", played.sessions),
            fmt::format("{}", played.faults),
            rateText(played.faultsAnHour()),
            volumeText(played)};
}

std::string tableOf(const std::vector<ReportLine>& lines, std::size_t named, double whole, std::string summary,
                    std::string heading)
{
    PageTable table{
        .summary = std::move(summary),
        .head = {std::move(heading), "Hours", "Share", "Sessions", "Faults", "Faults an hour", "Mean volume"},
        .rows = {}};
    for (std::size_t index = 0; index < named; ++index)
        table.rows.push_back(rowOf("<bdi>" + htmlDevices(lines[index].key) + "</bdi>", lines[index].played, whole));
    if (lines.size() > named)
        table.rows.push_back(rowOf(othersText(numberOf(lines), named), othersOf(lines, named).played, whole));
    return tableHTML(table);
}

} // namespace

std::string deviceSection(const Report& report, const PageWords& words)
{
    const std::size_t named = namedOf(report.devices.size(), mostNamedDevices);
    const double whole = report.all.seconds;
    std::string html = fmt::format(
        "<section><h2>Devices</h2><p class=sub>Shares of the time that was {}</p><ul class=shares>", words.played());
    for (std::size_t index = 0; index < named; ++index)
        html += shareRow(htmlDevices(report.devices[index].key, longestLabel), report.devices[index].played, whole);
    if (report.devices.size() > named)
        html += shareRow(othersText(numberOf(report.devices), named), othersOf(report.devices, named).played, whole);
    html += "</ul>" + tableOf(report.devices, named, whole, "Devices as a table", "Device");
    const auto tableOfNamed = [&](const std::vector<ReportLine>& lines, const char* summary, const char* heading) {
        return lines.empty() ? std::string()
                             : tableOf(lines, namedOf(lines.size(), mostNamedDevices), whole, summary, heading);
    };
    html += tableOfNamed(report.applications, "Applications as a table", "Application");
    return html + tableOfNamed(report.formats, "Formats as a table", "Format") + "</section>";
}
