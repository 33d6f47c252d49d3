// SPDX-License-Identifier: Apache-2.0
// The head allows the page's own style and nothing else; a browser refuses whatever a client might have smuggled in.
#include "kesto/report/page/ReportPage.h"

#include "kesto/report/ReportWords.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageStyle.h"
#include "kesto/report/page/PageText.h"

#include <algorithm>
#include <fmt/format.h>

namespace {

constexpr std::size_t longestPath = 200;

std::string daysOf(const Report& report)
{
    return report.days.empty() ? "no day" : daysText(report.days.front().date, report.days.back().date);
}

std::string_view titleOf(const Report& report)
{
    if (report.fleet)
        return report.isRecording ? "Report of a fleet's recordings" : "Audio report of a fleet";
    return report.isRecording ? "Report of recordings" : "Audio report";
}

std::string headOf(const Report& report, const PageHead& head)
{
    return fmt::format(
        "<!doctype html>\n<html lang=en><head><meta charset=utf-8>"
        "<meta http-equiv=Content-Security-Policy content=\"default-src 'none'; style-src 'sha256-{}'; base-uri "
        "'none'; "
        "form-action 'none'\">"
        "<meta name=viewport content=\"width=device-width, initial-scale=1\"><meta name=referrer content=no-referrer>"
        "<title>{}, {}, {}</title><style>{}</style></head>\n",
        pageStyleHash, titleOf(report), daysOf(report), htmlText(head.host, longestName), pageStyle());
}

std::string tile(const std::string& figure, const std::string& words)
{
    return fmt::format("<div><dt>{}</dt><dd>{}</dd></div>", words, figure);
}

double daysIn(const Report& report)
{
    constexpr double day = 86400;
    double seconds = 0;
    for (const ReportDay& each : report.days)
        seconds += each.span.until - each.span.from;
    return seconds / day;
}

std::string tiles(const Report& report, const PageWords& words)
{
    const Played& all = report.all;
    const double days = daysIn(report);
    const std::string aDay = days > 1.5 ? fmt::format(", {} a day", durationText(all.seconds / days)) : std::string();
    std::string html = "<dl class=tiles>" + tile(durationText(all.seconds), fmt::format("{}{}", words.played(), aDay));
    html +=
        tile(fmt::format("{}", all.sessions),
             fmt::format("session{}{}", all.sessions == 1 ? "" : "s",
                         report.running == 0 ? std::string()
                             : report.running == 1
                             ? fmt::format(", 1 still {}s", words.isRecording ? "record" : "play")
                             : fmt::format(", {} still {}", report.running, words.isRecording ? "record" : "play")));
    const auto rate = all.faultsAnHour();
    html += tile(fmt::format("{}", all.faults),
                 fmt::format("fault{}{}", all.faults == 1 ? "" : "s",
                             rate ? fmt::format(", {} an hour of {}", rateText(rate), words.playing()) : ""));
    html += tile(
        all.sessions == 0 ? "–" : percentText(static_cast<double>(report.faultless), static_cast<double>(all.sessions)),
        "of sessions without a fault");
    return html + "</dl>";
}

std::string sections(const Report& report, const PageWords& words)
{
    if (report.all.seconds <= 0 && report.all.faults == 0)
        return fmt::format("<section><h2>Nothing was {}</h2><p class=sub>The {} has nothing of this time.</p>"
                           "</section>",
                           words.played(), report.fleet ? "database" : "event store");
    return timeSection(report, words) + fleetSection(report, words) + "<div class=two>" + deviceSection(report, words)
        + volumeSection(report, words) + "</div>" + faultSection(report, words) + worstSection(report, words);
}

std::string footer(const Report& report, const PageHead& head, const PageWords& words)
{
    std::string html = "<footer>";
    if (report.vanished > 0)
        html +=
            fmt::format("<p>{} vanished: the connection of the client ended without a word. What was told until then "
                        "counts.</p>",
                        countText(report.vanished, "session"));
    if (report.all.noVolumeSeconds > 0)
        html += fmt::format("<p>{} were {} by streams that told no volume: Volume leaves them out.</p>",
                            durationText(report.all.noVolumeSeconds), words.played());
    if (report.isOverlapping)
        html +=
            "<p>Some streams ran at the same time, and each counts: a day can have more hours of sound than of time."
            "</p>";
    if (report.running > 0)
        html += fmt::format("<p>{} still {}: what was {} so far counts.</p>", countText(report.running, "session"),
                            report.running == 1 ? (words.isRecording ? "records" : "plays")
                                                : (words.isRecording ? "record" : "play"),
                            words.played());
    return html
        + fmt::format(
               "<p>Made by kesto report from <bdi>{}</bdi> on {}. This page runs no script and loads nothing.</p>"
               "</footer>",
               htmlText(head.database, longestPath), pageMoment(head.made, head.isUTC, "{:%e %B %Y, %H:%M}"));
}

std::string pageWith(const Report& report, const PageHead& head, bool hasNotes)
{
    const PageWords words{.isUTC = head.isUTC, .hasNotes = hasNotes, .isRecording = report.isRecording};
    return headOf(report, head)
        + fmt::format("<body><main><h1>{}</h1><p class=sub><bdi>{}</bdi> · {} · days as in <bdi>{}</bdi></p>",
                      titleOf(report), htmlText(head.host, longestName), daysOf(report),
                      htmlText(head.timeZone, longestName))
        + tiles(report, words) + sections(report, words) + footer(report, head, words) + "</main></body></html>\n";
}

} // namespace

std::string reportPage(const Report& report, const PageHead& head)
{
    const std::string page = pageWith(report, head, true);
    return page.size() <= mostBytesOfPage ? page : pageWith(report, head, false);
}
