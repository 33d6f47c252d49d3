// SPDX-License-Identifier: Apache-2.0
// Faults by device and day. Their colour is their number for each hour of playing: a busy day is no bad day.
#include "kesto/report/ReportTable.h"
#include "kesto/report/page/PageColumns.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"

#include <fmt/format.h>

namespace chrono = std::chrono;

namespace {

constexpr std::size_t mostColumns = 35;

// Faults an hour.
const char* heatOf(double rate)
{
    return rate < 0.5 ? "h1" : rate < 1 ? "h2" : rate < 2 ? "h3" : "h4";
}

std::string cell(const PageColumn::Device& device, const PageWords& words)
{
    constexpr double hour = 3600;
    const bool isPlayed = device.seconds > 0;
    const std::string note =
        words.hasNotes && isPlayed ? fmt::format(" title=\"in {}\"", durationText(device.seconds)) : std::string();
    if (device.faults == 0)
        return isPlayed ? fmt::format("<td{}>0", note) : "<td class=no>–";
    const char* const heat = isPlayed ? heatOf(static_cast<double>(device.faults) * hour / device.seconds) : "h4";
    return fmt::format("<td class={}{}>{}", heat, note, device.faults);
}

constexpr std::size_t mostWideColumns = 16;

bool isCrowded(const PageColumns& columns)
{
    return columns.columns.size() > mostWideColumns;
}

std::string columnHead(const PageColumns& columns, const PageColumn& column)
{
    const std::string name = columns.name(column);
    if (columns.unit == ColumnUnit::Year || columns.unit == ColumnUnit::Decade)
        return "<th scope=col>" + name;
    const auto month = monthName(column.first).substr(0, 3);
    if (columns.unit == ColumnUnit::Month)
        return fmt::format("<th scope=col>{}<br>{}", month, static_cast<int>(column.first.year()));
    const auto number = static_cast<unsigned>(column.first.day());
    if (columns.unit == ColumnUnit::Week)
        return fmt::format("<th scope=col>{}<br>{}", number, month);
    return fmt::format("<th scope=col{}>{}<br>{}", isWeekend(column.first) ? " class=we" : "",
                       name.substr(0, isCrowded(columns) ? 2 : 3), number);
}

std::string row(const std::string& name, std::size_t index, const PageColumns& columns, const PageWords& words)
{
    Played all;
    std::string html = fmt::format("<tr><th scope=row><bdi>{}</bdi>", name);
    for (const PageColumn& column : columns.columns) {
        html += cell(column.byDevice[index], words);
        all.seconds += column.byDevice[index].seconds;
        all.faults += column.byDevice[index].faults;
    }
    return html + fmt::format("<td class=sum>{}<td class=sum>{}", all.faults, rateText(all.faultsAnHour()));
}

std::string heatTable(const Report& report, const PageColumns& columns, const PageWords& words)
{
    const std::size_t named = namedOf(report.devices.size(), mostNamedDevices);
    constexpr std::size_t fewColumns = 8;
    const char* const className = isCrowded(columns) ? "heat many"
        : columns.columns.size() < fewColumns        ? "heat few"
                                                     : "heat";
    const std::size_t roomForName = isCrowded(columns) ? longestShortName : longestLabel;
    std::string html =
        fmt::format("<div class=scroll tabindex=0><table class=\"{}\"><thead><tr><th scope=col>Device", className);
    for (const PageColumn& column : columns.columns)
        html += columnHead(columns, column);
    html += "<th scope=col class=sum>All<th scope=col class=sum>An<br>hour<tbody>";
    for (std::size_t index = 0; index < named; ++index)
        html += row(htmlDevices(report.devices[index].key, roomForName), index, columns, words);
    if (report.devices.size() > named)
        html += row(othersText(numberOf(report.devices), named), named, columns, words);
    return html + "</table></div>";
}

// Where and when there were most.
std::string summaryOf(const Report& report, const PageColumns& columns)
{
    const PageColumn::Device* most = nullptr;
    std::string where;
    for (const PageColumn& column : columns.columns)
        for (std::size_t index = 0; index < column.byDevice.size() && index < mostNamedDevices; ++index)
            if (column.byDevice[index].faults > (most == nullptr ? 0 : most->faults)) {
                most = &column.byDevice[index];
                where = fmt::format("<bdi>{}</bdi>, {}", htmlDevices(report.devices[index].key, longestShortName),
                                    columns.name(column));
            }
    return most == nullptr ? "None"
                           : fmt::format("Most: {}, {} in {}", where, most->faults, durationText(most->seconds));
}

std::string kindsOf(const Report& report)
{
    constexpr std::size_t mostKinds = 8;
    if (report.faultKinds.empty())
        return {};
    const std::size_t named = namedOf(report.faultKinds.size(), mostKinds);
    std::string html = "<p class=note>Kinds: ";
    for (std::size_t index = 0; index < named; ++index)
        html +=
            fmt::format("{}<bdi>{}</bdi> {}", index == 0 ? "" : ", ",
                        htmlName(report.faultKinds[index].key, longestLabel), report.faultKinds[index].played.faults);
    return html + (report.faultKinds.size() > named ? ", " + othersText(numberOf(report.faultKinds), named) : "");
}

} // namespace

std::string faultSection(const Report& report, const PageWords& words)
{
    const PageColumns columns = columnsOf(report, mostColumns);
    std::string html = fmt::format("<section><h2>Faults by device</h2><p class=sub>{}</p>", summaryOf(report, columns));
    if (report.devices.empty())
        return html + "</section>";
    html += heatTable(report, columns, words);
    html += fmt::format("<p class=\"note keys\">Coloured by faults for each hour of {}: <span class=h0>none</span> "
                        "<span class=h1>below 0.5</span> <span class=h2>0.5 to 1</span> <span class=h3>1 to 2</span> "
                        "<span class=h4>2 and more</span> <span class=no>– not used</span>",
                        words.playing());
    return html + kindsOf(report) + "</section>";
}
