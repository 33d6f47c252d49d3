// SPDX-License-Identifier: Apache-2.0
// The tables of a report: by what they are, and what their rows are called.
#pragma once

#include "kesto/report/Report.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// The last three are those of a fleet.
enum class ReportBy : std::uint8_t { Day, Application, Device, Volume, Format, Fault, Model, Version, Unit };

// The words of the command line, and the first columns of CSV.
[[nodiscard]] std::string_view name(ReportBy by);

// The lines of a table of applications, devices, formats or kinds of fault; of a fleet also of models, releases or
// units.
[[nodiscard]] const std::vector<ReportLine>& linesOf(const Report& report, ReportBy by);

// How many lines there are, with those for which the last one may stand.
[[nodiscard]] std::size_t numberOf(const std::vector<ReportLine>& lines);

// The time at a step of the slider.
struct VolumeStep {
    double upTo = 0; // with it
    double seconds = 0;
};
[[nodiscard]] std::vector<VolumeStep> volumeSteps(const Report& report);

// "2026-11-08"
[[nodiscard]] std::string dateText(std::chrono::year_month_day date);
// With a point and at least one decimal, at most so many: "3600.0".
[[nodiscard]] std::string decimalText(double number, int decimals);
