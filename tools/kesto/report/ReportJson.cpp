// SPDX-License-Identifier: Apache-2.0
// Names stand as the clients sent them: JSON can express each character. The report of a fleet has no key for what a
// fleet does not know.
#include "kesto/report/ReportJson.h"

#include "foundation/values/Json.h"
#include "foundation/values/Value.h"
#include "kesto/JsonValues.h"
#include "kesto/report/ReportTable.h"

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

Dictionary::Entries figures(const Played& played)
{
    return {{"seconds", played.seconds},
            {"muted_seconds", played.mutedSeconds},
            {"no_volume_seconds", played.noVolumeSeconds},
            {"mean_volume", valueOf(played.meanVolume())},
            {"sessions", played.sessions},
            {"faults", played.faults},
            {"faults_an_hour", valueOf(played.faultsAnHour())}};
}

void append(Dictionary::Entries& entries, Dictionary::Entries more)
{
    for (auto& entry : more)
        entries.push_back(std::move(entry));
}

Dictionary withFigures(Dictionary::Entries entries, const Played& played)
{
    append(entries, figures(played));
    return Dictionary(std::move(entries));
}

template <typename Rows, typename Make> Array listOf(const Rows& rows, Make make)
{
    std::vector<Value> list;
    list.reserve(rows.size());
    for (const auto& row : rows)
        list.emplace_back(make(row));
    return Array(std::move(list));
}

Value distribution(const std::optional<Distribution>& of)
{
    return of ? Value(Dictionary{{"median", of->median}, {"ninetieth", of->ninetieth}, {"most", of->most}}) : Value();
}

Dictionary::Entries overUnits(const OverUnits& of)
{
    return {{"units", of.units},
            {"units_compared", of.compared},
            {"faults_an_hour_of_units", distribution(of.faultsAnHour)}};
}

Array lines(const Report& report, ReportBy by)
{
    return listOf(linesOf(report, by), [by](const ReportLine& line) {
        if (by == ReportBy::Fault)
            return Dictionary{{name(by), line.key}, {"faults", line.played.faults}, {"sessions", line.played.sessions}};
        Dictionary::Entries entries{{name(by), line.key}};
        if (line.overUnits)
            append(entries, overUnits(*line.overUnits));
        return withFigures(std::move(entries), line.played);
    });
}

Dictionary worst(const WorstSession& each)
{
    const HistorySession& session = each.session;
    Dictionary::Entries entries{{"session", session.id},
                                {"application", session.application},
                                {"service", session.service},
                                {"process", session.process}};
    const bool isOfFleet = !each.unit.empty();
    if (isOfFleet)
        append(entries, {{"unit", each.unit}});
    else
        append(entries, {{"process_id", valueOf(session.processID)}, {"user", valueOf(session.user)}});
    append(entries, {{"devices", each.devices}, {"late_cycles", each.lateCycles}});
    if (!isOfFleet)
        append(entries, {{"running", each.isRunning}});
    append(entries, {{"vanished", each.hasVanished}});
    return withFigures(std::move(entries), each.played);
}

// What a fleet adds, or a device knows alone.
Dictionary::Entries ownPart(const Report& report)
{
    if (!report.fleet)
        return {{"running", report.running}, {"overlapping", report.isOverlapping}};
    const FleetPart& fleet = *report.fleet;
    Dictionary::Entries entries = overUnits(fleet.overUnits);
    append(entries,
           {{"hours_of_units", distribution(fleet.hours)},
            {"models", lines(report, ReportBy::Model)},
            {"versions", lines(report, ReportBy::Version)},
            {"worst_units", listOf(fleet.worst, [](const WorstUnit& each) {
                 return withFigures({{"unit", each.unit}, {"model", each.model}, {"version", each.version}},
                                    each.played);
             })}});
    return entries;
}

} // namespace

std::string reportJson(const Report& report)
{
    Dictionary::Entries entries{
        {"from", report.span.from},
        {"until", report.span.until},
        {"recording", report.isRecording},
        {"vanished", report.vanished},
        {"sessions_with_faults", report.withFaults},
        {"days",
         listOf(report.days,
                [](const ReportDay& day) {
                    return withFigures(
                        {{"day", dateText(day.date)}, {"from", day.span.from}, {"until", day.span.until}}, day.played);
                })},
        {"applications", lines(report, ReportBy::Application)},
        {"devices", lines(report, ReportBy::Device)},
        {"formats", lines(report, ReportBy::Format)},
        {"fault_kinds", lines(report, ReportBy::Fault)},
        {"volumes",
         listOf(volumeSteps(report),
                [](const VolumeStep& step) { return Dictionary{{"volume", step.upTo}, {"seconds", step.seconds}}; })},
        {"worst_sessions", listOf(report.worst, worst)}};
    append(entries, ownPart(report));
    std::string text;
    foundation::appendJsonText(withFigures(std::move(entries), report.all), text);
    return text + '\n';
}
