// SPDX-License-Identifier: Apache-2.0
// The axis at the left of bars of time: its unit and its marks follow from the longest bar.
#pragma once

#include "kesto/report/page/Svg.h"

#include <string_view>

class TimeAxis {
public:
    // Where in the picture bars stand.
    struct Frame {
        double left = 0;
        double right = 0;
        double top = 0;
        double bottom = 0;
    };

    TimeAxis(double longestSeconds, const Frame& frame);

    // Lines across the frame, and what each stands for.
    void draw(Svg& svg) const;
    [[nodiscard]] double heightOf(double seconds) const;
    // In the unit of the axis.
    [[nodiscard]] double valueOf(double seconds) const { return seconds / unit_.seconds; }

private:
    struct Unit {
        std::string_view name; // "hours"
        double seconds = 1;
    };
    // A round step, so that at most five marks lie above 0 and the last is not below the longest bar.
    struct Steps {
        double step = 1;
        int count = 1;
    };
    static Unit unitFor(double longestSeconds);
    static Steps stepsUpTo(double longest);

    Frame frame_;
    Unit unit_;
    Steps steps_;
};
