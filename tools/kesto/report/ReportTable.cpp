// SPDX-License-Identifier: Apache-2.0
// What the forms of a report have in common.
#include "kesto/report/ReportTable.h"

#include <array>
#include <fmt/format.h>

std::string_view name(ReportBy by)
{
    constexpr std::array<std::string_view, 9> names{"day",   "application", "device",  "volume", "format",
                                                    "fault", "model",       "version", "unit"};
    return names[static_cast<std::size_t>(by)];
}

const std::vector<ReportLine>& linesOf(const Report& report, ReportBy by)
{
    switch (by) {
    case ReportBy::Device: return report.devices;
    case ReportBy::Format: return report.formats;
    case ReportBy::Fault: return report.faultKinds;
    case ReportBy::Model: return report.fleet.value().models;
    case ReportBy::Version: return report.fleet.value().versions;
    case ReportBy::Unit: return report.fleet.value().units;
    default: return report.applications;
    }
}

std::size_t numberOf(const std::vector<ReportLine>& lines)
{
    const std::size_t others = lines.empty() ? 0 : lines.back().others;
    return lines.size() + (others == 0 ? 0 : others - 1);
}

std::vector<VolumeStep> volumeSteps(const Report& report)
{
    std::vector<VolumeStep> steps;
    steps.reserve(report.secondsAtVolume.size());
    for (const double seconds : report.secondsAtVolume)
        steps.push_back(
            {.upTo = static_cast<double>(steps.size() + 1) / double{Report::volumeSteps}, .seconds = seconds});
    return steps;
}

std::string dateText(std::chrono::year_month_day date)
{
    return fmt::format("{:04}-{:02}-{:02}", int{date.year()}, unsigned{date.month()}, unsigned{date.day()});
}

std::string decimalText(double number, int decimals)
{
    std::string text = fmt::format("{:.{}f}", number, decimals);
    const std::size_t last = text.find_last_not_of('0');
    text.resize(last + (text[last] == '.' ? 2 : 1));
    return text;
}
