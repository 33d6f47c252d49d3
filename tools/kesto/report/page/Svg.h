// SPDX-License-Identifier: Apache-2.0
// A drawing of the page: SVG, whose colours and fonts come from the page's style by class.
#pragma once

#include <string>
#include <string_view>
#include <vector>

class Svg {
public:
    // The label is what those hear who do not see the drawing. One with a class has the size that the style gives it.
    Svg(double width, double height, std::string_view label, std::string_view className = {});

    // Notes are what a pointer shows. Texts are HTML already.
    void bar(std::string_view className, double x, double y, double width, double height, std::string_view note = {});
    struct Range {
        double from = 0;
        double until = 0;
    };
    // Many in one mark, side by side.
    void bars(std::string_view className, const std::vector<Range>& ranges, double y, double height);
    void line(std::string_view className, double x1, double y1, double x2, double y2, std::string_view note = {});
    // Upright lines in one mark.
    void ticks(std::string_view className, const std::vector<double>& places, double top, double bottom);
    enum class Anchor { Start, Middle, End };
    void text(std::string_view className, double x, double y, Anchor anchor, std::string_view text);
    // What stands between the two shares a note.
    void beginGroup(std::string_view note);
    void endGroup() { text_ += "</g>"; }

    [[nodiscard]] std::string end() const { return text_ + "</svg>"; }

private:
    void shape(std::string_view className, const std::string& path, std::string_view note);

    std::string text_;
};
