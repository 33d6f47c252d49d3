// SPDX-License-Identifier: Apache-2.0
// How long it was how loud: by time, not by the number of changes.
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"
#include "kesto/report/page/Svg.h"
#include "kesto/report/page/TimeAxis.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

namespace {

constexpr double width = 500;
constexpr double height = 250;
constexpr double left = 40;
constexpr double top = 40;
constexpr double bottom = 200;
constexpr double mutedWidth = 24;
constexpr double slider = 104; // where its position 0 is
constexpr double end = 488;

constexpr double percentOfStep = 100.0 / Report::volumeSteps;

std::string stepText(std::size_t step)
{
    return fmt::format("{:.4g} to {:.4g} %", percentOfStep * static_cast<double>(step),
                       percentOfStep * static_cast<double>(step + 1));
}

class Histogram {
public:
    Histogram(const Report& report, const PageWords& words)
        : report_(report),
          hasNotes_(words.hasNotes),
          svg_(width, height, "Bars of how long it was how loud; the table below has the figures"),
          axis_(std::max(report.all.mutedSeconds, std::ranges::max(report.secondsAtVolume)),
                {.left = left, .right = width, .top = top, .bottom = bottom})
    {
    }

    std::string draw()
    {
        axis_.draw(svg_);
        drawScale();
        drawBar("c0", (slider + left) / 2 - mutedWidth / 2 - 6, mutedWidth, report_.all.mutedSeconds, "muted");
        const double pitch = (end - slider) / Report::volumeSteps;
        for (std::size_t step = 0; step < Report::volumeSteps; ++step)
            drawBar("s1", slider + pitch * static_cast<double>(step) + 1, pitch - 2, report_.secondsAtVolume[step],
                    stepText(step));
        drawMean();
        return svg_.end();
    }

private:
    // Below the bars.
    void drawScale()
    {
        svg_.text("ax", (slider + left) / 2 - 6, bottom + 18, Svg::Anchor::Middle, "muted");
        for (const int percent : {0, 25, 50, 75, 100})
            svg_.text("ax", slider + (end - slider) * percent / 100, bottom + 18, Svg::Anchor::Middle,
                      fmt::format("{}", percent));
        svg_.text("ax", (slider + end) / 2, bottom + 40, Svg::Anchor::Middle, "position of the slider in per cent");
    }

    void drawBar(const char* className, double x, double barWidth, double seconds, const std::string& name)
    {
        if (seconds > 0)
            svg_.bar(className, x, bottom - axis_.heightOf(seconds), barWidth, axis_.heightOf(seconds),
                     hasNotes_ ? fmt::format("{}: {}", name, durationText(seconds)) : std::string());
    }

    void drawMean()
    {
        const auto mean = report_.all.meanVolume();
        if (!mean)
            return;
        const double x = slider + (end - slider) * *mean;
        const bool isRight = *mean > 0.75;
        svg_.line("mean", x, top - 16, x, bottom);
        svg_.text("val", x + (isRight ? -6 : 6), top - 8, isRight ? Svg::Anchor::End : Svg::Anchor::Start,
                  fmt::format("mean {} %", std::lround(*mean * 100)));
    }

    const Report& report_;
    const bool hasNotes_;
    Svg svg_;
    const TimeAxis axis_;
};

} // namespace

std::string volumeSection(const Report& report, const PageWords& words)
{
    std::string html = "<section><h2>Volume</h2><p class=sub>How long it was how loud</p>";
    const Played& all = report.all;
    if (all.seconds - all.noVolumeSeconds <= 0)
        return html + "<p class=none>No stream told its volume.</section>";
    html += Histogram(report, words).draw();
    PageTable table{.summary = "Volume as a table", .head = {"Volume", "Hours"}, .rows = {}};
    table.rows.push_back({"muted", hoursText(all.mutedSeconds)});
    for (std::size_t step = 0; step < Report::volumeSteps; ++step)
        table.rows.push_back({stepText(step), hoursText(report.secondsAtVolume[step])});
    if (all.noVolumeSeconds > 0)
        table.rows.push_back({"not told", hoursText(all.noVolumeSeconds)});
    return html + tableHTML(table) + "</section>";
}
