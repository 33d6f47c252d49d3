// SPDX-License-Identifier: Apache-2.0
// How the units of a fleet differ: by model, by release, and those that went worst.
#include "kesto/report/ReportTable.h"
#include "kesto/report/ReportWords.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"

#include <algorithm>
#include <fmt/format.h>

namespace {

constexpr std::size_t mostLines = 12;

std::string distributionText(const Distribution& of, std::string_view unit)
{
    return fmt::format("median {:.2f}{}, 90 % up to {:.2f}{}, most {:.2f}{}", of.median, unit, of.ninetieth, unit,
                       of.most, unit);
}

std::string figuresOf(const Played& played)
{
    return fmt::format("<td>{}<td>{}<td>{}<td>{}", durationText(played.seconds), played.sessions, played.faults,
                       rateText(played.faultsAnHour()));
}

std::string headOf(std::string_view first, std::string_view more, const PageWords& words)
{
    return fmt::format("<div class=scroll tabindex=0><table><thead><tr><th scope=col>{}{}<th scope=col>{}<th scope=col>"
                       "Sessions<th scope=col>Faults<th scope=col>Faults<br>an hour",
                       first, more, words.isRecording ? "Recorded" : "Played");
}

std::string tableOf(std::string_view name, const std::vector<ReportLine>& lines, const PageWords& words)
{
    std::string html =
        headOf(name, "<th scope=col>Units", words) + "<th scope=col>Median<th scope=col>90 %<th scope=col>Worst<tbody>";
    for (std::size_t index = 0; index < std::min(lines.size(), mostLines); ++index) {
        const OverUnits of = lines[index].overUnits.value_or(OverUnits());
        html += fmt::format("<tr><th scope=row><bdi>{}</bdi><td>{}{}", htmlName(lines[index].key, longestLabel),
                            of.units, figuresOf(lines[index].played));
        const Distribution rates = of.faultsAnHour.value_or(Distribution());
        for (const double rate : {rates.median, rates.ninetieth, rates.most})
            html += "<td>" + rateText(of.faultsAnHour ? std::optional(rate) : std::nullopt);
    }
    html += "</table></div>";
    if (lines.size() > mostLines)
        html += fmt::format("<p class=note>and {} more", numberOf(lines) - mostLines);
    return html;
}

std::string worstOf(const std::vector<WorstUnit>& units, const PageWords& words)
{
    std::string html = "<section><h2>Worst units</h2><p class=sub>Those with most faults an hour</p>"
        + headOf("Unit", "<th scope=col>Model<th scope=col>Release", words) + "<tbody>";
    for (const WorstUnit& each : units)
        html += fmt::format("<tr><th scope=row>{}<td><bdi>{}</bdi><td><bdi>{}</bdi>{}",
                            htmlText(each.unit, longestName), htmlName(each.model, longestShortName),
                            htmlName(each.version, longestShortName), figuresOf(each.played));
    return html + "</table></div></section>";
}

} // namespace

std::string fleetSection(const Report& report, const PageWords& words)
{
    if (!report.fleet || !report.fleet->hours)
        return {};
    const FleetPart& fleet = *report.fleet;
    std::string html =
        fmt::format("<section><h2>{}</h2><p class=sub>Hours {} by a unit: {}", countText(fleet.overUnits.units, "unit"),
                    words.played(), distributionText(*fleet.hours, " h"));
    if (const auto& rates = fleet.overUnits.faultsAnHour)
        html += fmt::format("<p class=sub>Faults an hour of a unit: {}; of {} that {} an hour or more",
                            distributionText(*rates, ""), fleet.overUnits.compared, words.played());
    html += tableOf("Model", fleet.models, words) + tableOf("Release", fleet.versions, words) + "</section>";
    return fleet.worst.empty() ? html : html + worstOf(fleet.worst, words);
}
