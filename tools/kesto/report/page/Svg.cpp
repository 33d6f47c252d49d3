// SPDX-License-Identifier: Apache-2.0
// Bars and lines are paths, which take half the bytes of other shapes. A tenth of a pixel is fine enough.
#include "kesto/report/page/Svg.h"

#include <cmath>
#include <fmt/format.h>

namespace {

double rounded(double number)
{
    return std::round(number * 10) / 10 + 0.0; // never -0
}

std::string barPath(double x, double y, double width, double height)
{
    const double w = rounded(width);
    return fmt::format("M{} {}h{}v{}h{}z", rounded(x), rounded(y), w, rounded(height), -w);
}

} // namespace

Svg::Svg(double width, double height, std::string_view label, std::string_view className)
    : text_(fmt::format("<svg{} viewBox=\"0 0 {} {}\" role=img aria-label=\"{}\">",
                        className.empty() ? "" : fmt::format(" class={} preserveAspectRatio=none", className), width,
                        height, label))
{
}

void Svg::shape(std::string_view className, const std::string& path, std::string_view note)
{
    text_ += fmt::format("<path class={} d=\"{}\"", className, path);
    text_ += note.empty() ? "/>" : fmt::format("><title>{}</title></path>", note);
}

void Svg::bar(std::string_view className, double x, double y, double width, double height, std::string_view note)
{
    shape(className, barPath(x, y, width, height), note);
}

void Svg::bars(std::string_view className, const std::vector<Range>& ranges, double y, double height)
{
    std::string path;
    for (const auto& [from, until] : ranges)
        path += barPath(from, y, until - from, height);
    if (!path.empty())
        shape(className, path, {});
}

void Svg::line(std::string_view className, double x1, double y1, double x2, double y2, std::string_view note)
{
    shape(className, fmt::format("M{} {}L{} {}", rounded(x1), rounded(y1), rounded(x2), rounded(y2)), note);
}

void Svg::ticks(std::string_view className, const std::vector<double>& places, double top, double bottom)
{
    std::string path;
    for (const double x : places)
        path += fmt::format("M{} {}V{}", rounded(x), rounded(top), rounded(bottom));
    shape(className, path, {});
}

void Svg::text(std::string_view className, double x, double y, Anchor anchor, std::string_view text)
{
    constexpr const char* anchors[] = {"", " text-anchor=middle", " text-anchor=end"};
    text_ += fmt::format("<text class=\"{}\" x={} y={}{}>{}</text>", className, rounded(x), rounded(y),
                         anchors[static_cast<int>(anchor)], text);
}

void Svg::beginGroup(std::string_view note)
{
    text_ += note.empty() ? "<g>" : fmt::format("<g><title>{}</title>", note);
}
