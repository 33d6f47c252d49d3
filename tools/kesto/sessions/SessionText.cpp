// SPDX-License-Identifier: Apache-2.0
// Names in JSON stand as clients sent them; in tables, what would move a terminal's cursor is replaced.
#include "kesto/sessions/SessionText.h"

#include "foundation/text/LocalTime.h"
#include "foundation/text/NumberFormatter.h"
#include "foundation/values/Json.h"
#include "foundation/values/Value.h"
#include "kesto/JsonValues.h"
#include "kesto/Terminal.h"
#include "kesto/report/ReportCsv.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <utility>

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

namespace {

constexpr unsigned secondDecimals = 3;
constexpr unsigned volumeDecimals = 4;

std::string decimal(double number, unsigned most)
{
    return foundation::formatDecimal(number, 1, most);
}

// ISO 8601 in UTC; empty for a time that no calendar has.
std::string utcText(double seconds)
{
    constexpr double latest = 253'402'300'800; // the year 10000
    if (!(seconds >= 0 && seconds < latest))
        return {};
    constexpr std::int64_t millisecondsASecond = 1000;
    const auto milliseconds = static_cast<std::int64_t>(std::floor(seconds * millisecondsASecond));
    const std::chrono::sys_seconds second(std::chrono::seconds(milliseconds / millisecondsASecond));
    return fmt::format("{:%Y-%m-%dT%H:%M:%S}.{:03}Z", second, milliseconds % millisecondsASecond);
}

Dictionary::Entries entries(const SessionLine& line)
{
    const auto& [session, played, devices, end] = line;
    return {{"session", session.id},
            {"began", session.began},
            {"ended", valueOf(session.ended)},
            {"application", known(session.application)},
            {"service", known(session.service)},
            {"user", valueOf(session.user)},
            {"process", known(session.process)},
            {"process_id", valueOf(session.processID)},
            {"seconds", played.seconds},
            {"muted_seconds", played.mutedSeconds},
            {"no_volume_seconds", played.noVolumeSeconds},
            {"device", known(devices)},
            {"mean_volume", valueOf(played.meanVolume())},
            {"faults", played.faults},
            {"end", known(name(end))}};
}

std::string lineOf(Dictionary::Entries entries)
{
    std::string text;
    foundation::appendJsonText(Dictionary(std::move(entries)), text);
    return text + '\n';
}

// Empty for a change as for a stop.
std::string_view endText(const PlayedStretch& stretch)
{
    const SessionEnd end = endOf(stretch);
    return end == SessionEnd::Stopped ? "" : name(end);
}

std::string_view endText(const SessionLine& line)
{
    return line.end == SessionEnd::Unknown ? "-" : name(line.end);
}

} // namespace

std::string clockText(double seconds)
{
    constexpr std::int64_t minute = 60;
    constexpr std::int64_t hour = 60 * minute;
    constexpr double longest = 1e9;
    const auto whole = static_cast<std::int64_t>(std::clamp(seconds, 0.0, longest));
    return fmt::format("{}:{:02}:{:02}", whole / hour, whole % hour / minute, whole % minute);
}

std::string volumeText(const Played& played)
{
    constexpr double percent = 100;
    if (const auto volume = played.meanVolume())
        return fmt::format("{:.0f} %", *volume * percent);
    return played.mutedSeconds > 0 ? "muted" : "-";
}

std::string sessionsText(const std::vector<SessionLine>& lines, std::size_t width)
{
    constexpr std::size_t fixed = 51; // with the blanks, without names and ends
    constexpr std::size_t mostForNames = 50;
    std::size_t longestEnd = std::string_view("END").size();
    for (const SessionLine& line : lines)
        longestEnd = std::max(longestEnd, endText(line).size());
    const std::size_t forNames = std::min(columnsBehind(fixed + longestEnd, width), mostForNames);
    const auto name = [columns = forNames / 2](std::string_view text) {
        return padded(fitted(text.empty() ? "-" : printable(text), columns), columns);
    };
    std::string text;
    const auto add = [&](std::string_view number, std::string_view began, std::string_view who, std::string_view length,
                         std::string_view volume, std::string_view faults, std::string_view where,
                         std::string_view end) {
        (text += fitted(fmt::format("{:>7} {:<16} {} {:>9} {:>6} {:>6} {} {}", number, began, name(who), length, volume,
                                    faults, name(where), end),
                        width)) += '\n';
    };
    add("SESSION", "BEGAN", "APPLICATION", "PLAYED", "VOLUME", "FAULTS", "DEVICE", "END");
    for (const SessionLine& line : lines)
        add(std::to_string(line.session.id), foundation::localTimeText(line.session.began, "{:%Y-%m-%d %H:%M}"),
            line.session.application, clockText(line.played.seconds), volumeText(line.played),
            std::to_string(line.played.faults), line.devices, endText(line));
    return text;
}

std::string sessionsCsv(const std::vector<SessionLine>& lines)
{
    std::string text = "session,began,application,seconds,device,mean_volume,faults,end\n";
    for (const auto& [session, played, devices, end] : lines) {
        const auto volume = played.meanVolume();
        text += fmt::format("{},{},{},{},{},{},{},{}\n", session.id, utcText(session.began),
                            csvField(session.application), decimal(played.seconds, secondDecimals), csvField(devices),
                            volume ? decimal(*volume, volumeDecimals) : "", played.faults, name(end));
    }
    return text;
}

std::string sessionsJson(const std::vector<SessionLine>& lines)
{
    std::string text;
    for (const SessionLine& line : lines)
        text += lineOf(entries(line));
    return text;
}

std::string sessionCsv(const History& history)
{
    std::string text = "began,seconds,device,format,volume,end\n";
    for (const PlayedStretch& stretch : history.stretches)
        text += fmt::format("{},{},{},{},{},{}\n", utcText(stretch.began), decimal(stretch.seconds, secondDecimals),
                            csvField(stretch.device), csvField(stretch.format),
                            stretch.volume ? decimal(*stretch.volume, volumeDecimals) : "", endText(stretch));
    return text;
}

std::string sessionJson(const SessionLine& line, const History& history)
{
    std::vector<Value> stretches;
    stretches.reserve(history.stretches.size());
    for (const PlayedStretch& stretch : history.stretches)
        stretches.emplace_back(Dictionary{{"began", stretch.began},
                                          {"seconds", stretch.seconds},
                                          {"device", known(stretch.device)},
                                          {"format", known(stretch.format)},
                                          {"volume", valueOf(stretch.volume)},
                                          {"end", known(endText(stretch))}});
    std::vector<Value> faults;
    faults.reserve(history.faults.size());
    for (const Fault& fault : history.faults)
        faults.emplace_back(Dictionary{{"happened", fault.happened},
                                       {"kind", fault.kind},
                                       {"device", known(fault.device)},
                                       {"late_cycles", fault.lateCycles}});
    Dictionary::Entries all = entries(line);
    all.push_back({"stretches", Array(std::move(stretches))});
    all.push_back({"fault_list", Array(std::move(faults))});
    return lineOf(std::move(all));
}
