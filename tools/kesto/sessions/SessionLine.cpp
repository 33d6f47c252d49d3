// SPDX-License-Identifier: Apache-2.0
// Stretches, faults and sessions are each gone through once: a store may hold a hundred thousand sessions.
#include "kesto/sessions/SessionLine.h"

#include <algorithm>
#include <span>
#include <unordered_map>
#include <utility>

namespace {

// Those of one session.
using StretchesOfOne = std::span<const PlayedStretch>;

std::string devicesOf(StretchesOfOne stretches)
{
    std::vector<std::pair<std::string_view, double>> devices; // few
    for (const PlayedStretch& stretch : stretches) {
        const auto known = std::ranges::find(devices, stretch.device, &std::pair<std::string_view, double>::first);
        if (known != devices.end())
            known->second += stretch.seconds;
        else if (!stretch.device.empty())
            devices.emplace_back(stretch.device, stretch.seconds);
    }
    std::ranges::stable_sort(devices, std::ranges::greater(), &std::pair<std::string_view, double>::second);
    std::string text;
    for (const auto& [device, seconds] : devices)
        (text += text.empty() ? "" : "; ") += device;
    return text;
}

// If the clock was set back meanwhile, the one that runs is not the last.
SessionEnd endOfAll(StretchesOfOne stretches)
{
    return std::ranges::any_of(stretches, &PlayedStretch::isRunning) ? SessionEnd::Running : endOf(stretches.back());
}

} // namespace

void addTo(Played& played, const PlayedStretch& stretch)
{
    played.seconds += stretch.seconds;
    if (!stretch.volume)
        played.noVolumeSeconds += stretch.seconds;
    else if (*stretch.volume == 0)
        played.mutedSeconds += stretch.seconds;
    else
        played.volumeSeconds += stretch.seconds * *stretch.volume;
}

std::string_view name(SessionEnd end)
{
    switch (end) {
    case SessionEnd::Running: return "running";
    case SessionEnd::Stopped: return "stopped";
    case SessionEnd::Vanished: return "vanished";
    case SessionEnd::ServiceEnded: return "service ended";
    case SessionEnd::Unknown: break;
    }
    return "";
}

SessionEnd endOf(const PlayedStretch& stretch)
{
    if (stretch.isRunning)
        return SessionEnd::Running;
    if (stretch.hasVanished)
        return SessionEnd::Vanished;
    return stretch.hasServiceEnded ? SessionEnd::ServiceEnded : SessionEnd::Stopped;
}

std::vector<SessionLine> makeSessionLines(const History& history)
{
    std::vector<SessionLine> lines;
    lines.reserve(history.sessions.size());
    std::unordered_map<std::int64_t, std::size_t> places;
    for (const HistorySession& session : history.sessions) {
        places.emplace(session.id, lines.size());
        lines.push_back({.session = session, .played = {}, .devices = {}, .end = {}});
    }
    for (auto first = history.stretches.begin(); first != history.stretches.end();) {
        const auto last = std::find_if(first, history.stretches.end(),
                                       [&](const PlayedStretch& stretch) { return stretch.session != first->session; });
        const StretchesOfOne stretches(first, last);
        if (const auto place = places.find(first->session); place != places.end()) {
            SessionLine& line = lines[place->second];
            for (const PlayedStretch& stretch : stretches)
                addTo(line.played, stretch);
            line.devices = devicesOf(stretches);
            line.end = endOfAll(stretches);
        }
        first = last;
    }
    for (const Fault& fault : history.faults)
        if (const auto place = places.find(fault.session); place != places.end())
            ++lines[place->second].played.faults;
    return lines;
}

std::vector<SessionLine> chosen(std::vector<SessionLine> lines, const SessionChoice& choice)
{
    std::erase_if(lines, [&choice](const SessionLine& line) {
        return (choice.withFaults && line.played.faults == 0) || (choice.isRunning && line.end != SessionEnd::Running);
    });
    const auto precedes = [&choice](const SessionLine& left, const SessionLine& right) {
        switch (choice.order) {
        case SessionOrder::Began: return left.session.began > right.session.began;
        case SessionOrder::Played: return left.played.seconds > right.played.seconds;
        case SessionOrder::Faults: return left.played.faults > right.played.faults;
        }
        return false;
    };
    std::ranges::stable_sort(lines, precedes);
    if (lines.size() > choice.most)
        lines.erase(lines.begin() + static_cast<std::ptrdiff_t>(choice.most), lines.end());
    return lines;
}
