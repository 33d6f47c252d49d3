// SPDX-License-Identifier: Apache-2.0
// A report filled by hand, for tests of what draws one: its figures follow simple rules, and nothing counted them.
#pragma once

#include "kesto/report/Report.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <string>

namespace kesto_tool {

struct MadeReportWish {
    std::chrono::year_month_day first{std::chrono::year(2026), std::chrono::month(11), std::chrono::day(8)};
    std::size_t days = 14;
    std::size_t applications = 5;
    std::size_t devices = 4;
    std::size_t formats = 1;
    std::size_t kinds = 1;
    std::size_t worst = 3;
    std::size_t marks = 6; // stretches, and faults, of each of the worst
    std::string name = {}; // behind the number of each application and device, and behind formats and kinds of faults
};

inline Played madePlayed(double seconds, std::size_t faults)
{
    return {.seconds = seconds,
            .mutedSeconds = seconds / 20,
            .noVolumeSeconds = seconds / 10,
            .volumeSeconds = seconds * 0.85 * 0.5, // so the mean is 0.5
            .sessions = 2,
            .faults = faults};
}

inline WorstSession madeWorst(std::size_t index, const MadeReportWish& wish, double from)
{
    WorstSession worst;
    worst.session = {.id = static_cast<std::int64_t>(500 + index),
                     .application = "application 1" + wish.name,
                     .service = "generic",
                     .process = "process" + wish.name,
                     .user = 1000,
                     .processID = 4321,
                     .began = from,
                     .ended = from + 7200};
    worst.played = madePlayed(5400, wish.marks);
    worst.lateCycles = static_cast<std::int64_t>(100 - index);
    worst.devices = "device 1" + wish.name;
    const double pitch = 7200 / static_cast<double>(std::max<std::size_t>(1, wish.marks));
    for (std::size_t mark = 0; mark < wish.marks; ++mark) {
        const double began = from + pitch * static_cast<double>(mark);
        worst.stretches.push_back({.session = worst.session.id,
                                   .began = began,
                                   .seconds = pitch * 0.75,
                                   .device = (mark % 3 == 2 ? "device 2" : "device 1") + wish.name,
                                   .format = "S16LE/44100/2",
                                   .volume = 0.42});
        worst.faults.push_back({.session = worst.session.id,
                                .happened = began + pitch / 2,
                                .kind = "IssueDetector",
                                .device = "device 1" + wish.name,
                                .lateCycles = 7});
    }
    return worst;
}

// Each application plays an hour a day divided by its place from 1, each device the same; every third day has a fault
// on the first device, and the last device is used on the first day only.
inline Report madeReport(const MadeReportWish& wish = {})
{
    constexpr double hour = 3600;
    constexpr double day = 24 * hour;
    Report report;
    const std::chrono::sys_days first(wish.first);
    const double from = static_cast<double>(first.time_since_epoch().count()) * day;
    report.span = {.from = from, .until = from + day * static_cast<double>(wish.days)};
    for (std::size_t index = 0; index < wish.days; ++index) {
        ReportDay made{.date = first + std::chrono::days(index),
                       .span = {from + day * static_cast<double>(index), from + day * static_cast<double>(index + 1)},
                       .played = {},
                       .byApplication = {},
                       .byDevice = {}};
        for (std::size_t application = 0; application < wish.applications; ++application)
            made.byApplication.push_back(hour / static_cast<double>(application + 1));
        for (std::size_t device = 0; device < wish.devices; ++device) {
            const bool isUsed = device + 1 < wish.devices || device == 0 || index == 0;
            made.byDevice.push_back(
                madePlayed(isUsed ? hour / static_cast<double>(device + 1) : 0, device == 0 && index % 3 == 0 ? 2 : 0));
        }
        for (const double seconds : made.byApplication)
            made.played.seconds += seconds;
        made.played.faults = index % 3 == 0 ? 2 : 0;
        report.all.seconds += made.played.seconds;
        report.all.faults += made.played.faults;
        report.days.push_back(made);
    }
    const auto days = static_cast<double>(wish.days);
    for (std::size_t index = 0; index < wish.applications; ++index)
        report.applications.push_back({"application " + std::to_string(index + 1) + wish.name,
                                       madePlayed(days * hour / static_cast<double>(index + 1), 0)});
    for (std::size_t index = 0; index < wish.devices; ++index)
        report.devices.push_back(
            {"device " + std::to_string(index + 1) + wish.name,
             madePlayed(days * hour / static_cast<double>(index + 1), index == 0 ? report.all.faults : 0)});
    for (std::size_t index = 0; index < wish.formats; ++index)
        report.formats.push_back({"S16LE/44100/2" + wish.name, madePlayed(report.all.seconds, report.all.faults)});
    for (std::size_t index = 0; index < wish.kinds; ++index)
        report.faultKinds.push_back({"IssueDetector" + wish.name, {.sessions = 3, .faults = report.all.faults}});
    const std::size_t faults = report.all.faults;
    report.all = madePlayed(report.all.seconds, faults);
    report.all.sessions = 50;
    report.withFaults = 4;
    report.faultless = 46;
    for (std::size_t step = 0; step < Report::volumeSteps; ++step)
        report.secondsAtVolume[step] = hour * static_cast<double>(8 - std::min(step > 7 ? step - 7 : 7 - step, 8UL));
    for (std::size_t index = 0; index < wish.worst; ++index)
        report.worst.push_back(madeWorst(index, wish, from + hour));
    return report;
}

} // namespace kesto_tool
