// SPDX-License-Identifier: Apache-2.0
// The room of the report: what was played in a span of time, as tables for a terminal, for programs, and as a page.
//
// This file has the figures; each way to show them draws these and counts nothing itself.
#pragma once

#include "kesto/history/History.h"

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

// A sum over stretches and the faults in them. Streams that play at the same time each count.
struct Played {
    double seconds = 0; // with all of the next three
    double mutedSeconds = 0; // at volume 0
    double noVolumeSeconds = 0; // by streams that told no volume
    double volumeSeconds = 0; // the integral of the volume over the time that was neither
    std::size_t sessions = 0;
    std::size_t faults = 0;

    // By time; of what was neither muted nor without a volume. None if there was no such time.
    [[nodiscard]] std::optional<double> meanVolume() const;
    // None if nothing was played.
    [[nodiscard]] std::optional<double> faultsAnHour() const;
};

// The same in whole numbers, whose sums are the same in any order: the database of a fleet adds in another one. Shares
// of the volume are rounded for each part of a stretch that counts on its own.
struct PlayedSum {
    std::int64_t microseconds = 0;
    std::int64_t muted = 0;
    std::int64_t noVolume = 0;
    std::int64_t volume = 0;
    std::size_t sessions = 0;
    std::size_t faults = 0;

    [[nodiscard]] Played played() const;
};

// Of a figure of each unit, which is a device of a fleet. A device is what sound comes out of.
struct Distribution {
    double median = 0;
    double ninetieth = 0; // so much or less at 90 % of the units
    double most = 0;
};

struct OverUnits {
    std::size_t units = 0; // that played
    std::size_t compared = 0; // those of them that played long enough for the next
    std::optional<Distribution> faultsAnHour = {};
};

// A line of a table: its key is an application, a device, a format or a kind of fault; of a fleet also a model, a
// release or a unit. Empty: not told.
struct ReportLine {
    std::string key;
    Played played;
    std::optional<OverUnits> overUnits = {}; // of a fleet, if it was asked for
    std::size_t others = 0; // of a fleet, in the last line: all that follow, so many, without their sessions
};

// A day of the reader: from one moment of the clock on the wall to the same of the next day, 23 or 25 hours where
// clocks change.
struct ReportDay {
    std::chrono::year_month_day date;
    TimeSpan span; // cut at the ends of the report
    Played played;
    std::vector<double> byApplication; // seconds, of the first `Report::mostInDays` of `Report::applications`
    std::vector<Played> byDevice; // of the first so many of `Report::devices`
};

// A session with faults.
struct WorstSession {
    HistorySession session;
    Played played;
    std::string unit = {}; // of a fleet: its pseudonym
    std::int64_t lateCycles = 0;
    std::string devices; // all it played on, "speaker; headset", the longest first
    std::vector<PlayedStretch> stretches; // by time
    std::vector<Fault> faults; // by time
    bool isRunning = false;
    bool hasVanished = false;
};

struct WorstUnit {
    std::string unit; // its pseudonym
    std::string model;
    std::string version;
    Played played;
};

// What only the report of a fleet has.
struct FleetPart {
    static constexpr double leastHours = 1; // units that played less are not compared by their faults an hour

    OverUnits overUnits = {};
    std::optional<Distribution> hours = {};
    std::vector<ReportLine> models = {}; // those with the most time first, as in the next two
    std::vector<ReportLine> versions = {};
    std::vector<ReportLine> units = {};
    std::vector<WorstUnit> worst = {}; // by faults an hour
};

struct Report {
    static constexpr std::size_t volumeSteps = 16; // of the slider
    static constexpr std::size_t mostWorst = 10;
    static constexpr std::size_t mostInDays = 8; // as many as a picture tells apart

    TimeSpan span;
    bool isRecording = false;
    Played all;
    std::size_t running = 0; // sessions
    std::size_t vanished = 0; // sessions
    std::size_t withFaults = 0; // sessions, also those that played nothing in the span
    std::size_t faultless = 0; // sessions that played, without a fault
    bool isOverlapping = false; // two streams at once played somewhere in it
    std::vector<ReportDay> days; // every day of the span, also those without sound
    std::vector<ReportLine> applications; // those with the most time first, as in the next two
    std::vector<ReportLine> devices; // a combination is one
    std::vector<ReportLine> formats;
    std::vector<ReportLine> faultKinds; // `played.faults` and `played.sessions` only; the most frequent first
    std::array<double, volumeSteps> secondsAtVolume{}; // not muted: [0] is up to 1/16
    std::vector<WorstSession> worst; // by missed cycles, then by faults
    std::optional<FleetPart> fleet = {}; // then `running` and `isOverlapping` are not known
};

// Where days begin.
struct DayStart {
    std::chrono::minutes afterMidnight{0};
    bool isUTC = false; // else in the time zone of the process
};

[[nodiscard]] Report makeReport(const History& history, const TimeSpan& span, bool isRecording, DayStart dayStart);
