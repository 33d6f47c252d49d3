// SPDX-License-Identifier: Apache-2.0
// The sessions that kept up worst, each with its course: when it played on which device, and where its faults were.
#include "kesto/report/ReportWords.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"
#include "kesto/report/page/Svg.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>
#include <limits>
#include <set>
#include <string_view>
#include <vector>

namespace {

constexpr double width = 200;
constexpr double height = 20;
constexpr double barTop = 6;
constexpr double barHeight = 8;
constexpr double tickTop = 1;
constexpr double tickBottom = 19;
constexpr std::size_t mostSingleMarks = 16; // of one kind; more are drawn together, step by step

class Timeline {
public:
    Timeline(const WorstSession& worst, const TimeSpan& span, const PageWords& words)
        : worst_(worst),
          words_(words),
          steps_(words.hasNotes ? 200 : 50),
          svg_(width, height,
               fmt::format("{} in {}", countText(worst.played.faults, "fault"), durationText(worst.played.seconds)),
               "line")
    {
        double first = std::numeric_limits<double>::infinity();
        double last = -first;
        for (const PlayedStretch& stretch : worst.stretches) {
            first = std::min(first, stretch.began);
            last = std::max(last, stretch.began + stretch.seconds);
        }
        from_ = std::max(first, span.from);
        until_ = std::min(last, span.until);
    }

    std::string draw()
    {
        svg_.bar("track", 0, height / 2 - 1, width, 2);
        if (from_ < until_) {
            drawStretches();
            drawFaults();
        }
        return svg_.end();
    }

private:
    [[nodiscard]] double xOf(double moment) const
    {
        return width * std::clamp((moment - from_) / (until_ - from_), 0.0, 1.0);
    }
    [[nodiscard]] std::string clock(double moment) const { return pageMoment(moment, words_.isUTC, "{:%H:%M:%S}"); }
    [[nodiscard]] const char* classOf(const PlayedStretch& stretch) const
    {
        return stretch.device == worst_.stretches.front().device ? "s1" : "s2";
    }

    void drawStretches()
    {
        if (!words_.hasNotes || worst_.stretches.size() > mostSingleMarks) {
            for (const char* className : {"s1", "s2"})
                drawTogether(className);
            return;
        }
        for (const PlayedStretch& stretch : worst_.stretches) {
            constexpr double least = 0.6;
            const double x = xOf(stretch.began);
            svg_.bar(classOf(stretch), x, barTop, std::max(least, xOf(stretch.began + stretch.seconds) - x), barHeight,
                     noteOf(stretch));
        }
    }

    void drawTogether(std::string_view className)
    {
        std::vector<bool> isCovered(steps_);
        for (const PlayedStretch& stretch : worst_.stretches)
            if (classOf(stretch) == className) {
                const auto first = stepAt(stretch.began);
                std::fill(isCovered.begin() + first, isCovered.begin() + stepAt(stretch.began + stretch.seconds) + 1,
                          true);
            }
        std::vector<Svg::Range> ranges;
        const double step = width / static_cast<double>(steps_);
        for (std::size_t index = 0; index < steps_; ++index)
            if (isCovered[index]) {
                const double from = step * static_cast<double>(index);
                if (index == 0 || !isCovered[index - 1])
                    ranges.push_back({from, from});
                ranges.back().until += step;
            }
        svg_.bars(className, ranges, barTop, barHeight);
    }

    [[nodiscard]] std::ptrdiff_t stepAt(double moment) const
    {
        return std::min(static_cast<std::ptrdiff_t>(xOf(moment) * static_cast<double>(steps_) / width),
                        static_cast<std::ptrdiff_t>(steps_) - 1);
    }

    [[nodiscard]] std::string noteOf(const PlayedStretch& stretch) const
    {
        std::string note = fmt::format("{} to {}, {}", clock(stretch.began), clock(stretch.began + stretch.seconds),
                                       htmlDevices(stretch.device, longestShortName));
        if (stretch.volume)
            note += *stretch.volume > 0 ? fmt::format(", volume {} %", std::lround(*stretch.volume * 100)) : ", muted";
        return note;
    }

    void drawFaults()
    {
        if (!words_.hasNotes || worst_.faults.size() > mostSingleMarks) {
            std::set<std::ptrdiff_t> found;
            for (const Fault& fault : worst_.faults)
                found.insert(stepAt(fault.happened));
            std::vector<double> ticks;
            ticks.reserve(found.size());
            for (const auto step : found)
                ticks.push_back((static_cast<double>(step) + 0.5) * width / static_cast<double>(steps_));
            svg_.ticks("tick", ticks, tickTop, tickBottom);
            return;
        }
        for (const Fault& fault : worst_.faults)
            drawTick(xOf(fault.happened),
                     fmt::format("{}: {}", clock(fault.happened),
                                 countText(static_cast<std::size_t>(std::max<std::int64_t>(0, fault.lateCycles)),
                                           "missed cycle")));
    }

    void drawTick(double x, const std::string& note)
    {
        constexpr double edge = 0.8; // half of the line's width
        x = std::clamp(x, edge, width - edge);
        svg_.line("tick", x, tickTop, x, tickBottom, note);
    }

    const WorstSession& worst_;
    const PageWords& words_;
    const std::size_t steps_; // fewer where the page would be too large
    Svg svg_;
    double from_ = 0;
    double until_ = 0;
};

constexpr std::string_view dayAndTime = "{:%a %e %b, %H:%M}";

// The year only if it is another than that of the report's end.
std::string dayAndTimeText(double moment, const TimeSpan& span, bool isUTC)
{
    const auto yearOf = [isUTC](double time) { return pageMoment(time, isUTC, "{:%Y}"); };
    return pageMoment(moment, isUTC, yearOf(moment) == yearOf(span.until) ? dayAndTime : "{:%a %e %b %Y, %H:%M}");
}

// The day only if it is another than that on which it began.
std::string endTime(double began, double ended, const TimeSpan& span, bool isUTC)
{
    const auto dayOf = [isUTC](double moment) { return pageMoment(moment, isUTC, "{:%F}"); };
    return dayOf(began) == dayOf(ended) ? pageMoment(ended, isUTC, "{:%H:%M}") : dayAndTimeText(ended, span, isUTC);
}

std::string endOf(const WorstSession& worst, const TimeSpan& span, const PageWords& words)
{
    return worst.isRunning    ? words.isRecording ? "still records" : "still plays"
        : worst.hasVanished   ? "vanished"
        : worst.session.ended ? endTime(worst.session.began, *worst.session.ended, span, words.isUTC)
                              : "not told";
}

std::string who(const HistorySession& session)
{
    std::string html = "<bdi>" + htmlName(session.application, longestShortName) + "</bdi>";
    if (session.process.empty() && !session.processID)
        return html;
    html += "<br><span class=sub><bdi>"
        + (session.process.empty() ? "process" : htmlText(session.process, longestShortName)) + "</bdi>";
    if (session.processID)
        html += fmt::format(" {}", *session.processID);
    return html + "</span>";
}

std::string rowOf(const WorstSession& worst, const TimeSpan& span, const PageWords& words)
{
    const std::string unit =
        worst.unit.empty() ? "" : fmt::format("<br><span class=sub>{}</span>", htmlText(worst.unit, longestName));
    return fmt::format("<tr><th scope=row>{}{}<td class=l>{}<td class=l>{}<td class=l><bdi>{}</bdi><td>{}<td>{}<td>{}"
                       "<td>{}<td class=l>{}<td class=l>{}",
                       worst.session.id, unit, dayAndTimeText(worst.session.began, span, words.isUTC),
                       who(worst.session), htmlDevices(worst.devices, longestLabel), durationText(worst.played.seconds),
                       worst.played.faults, worst.lateCycles, rateText(worst.played.faultsAnHour()),
                       Timeline(worst, span, words).draw(), endOf(worst, span, words));
}

} // namespace

std::string worstSection(const Report& report, const PageWords& words)
{
    if (report.worst.empty())
        return "<section><h2>Worst sessions</h2><p class=none>No session had a fault.</section>";
    std::string html = fmt::format(
        "<section><h2>Worst sessions</h2><p class=sub>Those that missed most cycles: {} of {} with faults</p>"
        "<ul class=legend><li><svg class=key viewBox=\"0 0 10 10\" aria-hidden=true><rect class=s1 width=10 height=10 "
        "rx=2 "
        "/></svg>on its first device<li><svg class=key viewBox=\"0 0 10 10\" aria-hidden=true><rect class=s2 width=10 "
        "height=10 rx=2 /></svg>on another<li><svg class=key viewBox=\"0 0 10 10\" aria-hidden=true><path class=tick "
        "d=\"M5 0v10\"/></svg>fault</ul>"
        "<div class=scroll tabindex=0><table class=worst><thead><tr><th scope=col>Session<th scope=col>Began"
        "<th scope=col>Application<th scope=col>Devices<th scope=col class=n>{}<th scope=col class=n>Faults"
        "<th scope=col class=n>Missed<br>cycles<th scope=col class=n>Faults<br>an hour<th scope=col>Course"
        "<th scope=col>End<tbody>",
        report.worst.size(), report.withFaults, words.isRecording ? "Recorded" : "Played");
    for (const WorstSession& worst : report.worst)
        html += rowOf(worst, report.span, words);
    return html + "</table></div></section>";
}
