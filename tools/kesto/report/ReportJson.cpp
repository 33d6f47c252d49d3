// SPDX-License-Identifier: Apache-2.0
// Names stand as the clients sent them: JSON can express each character.
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

Dictionary withFigures(Dictionary::Entries entries, const Played& played)
{
    for (auto& entry : figures(played))
        entries.push_back(std::move(entry));
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

Array lines(const Report& report, ReportBy by)
{
    return listOf(linesOf(report, by), [by](const ReportLine& line) {
        if (by == ReportBy::Fault)
            return Dictionary{{name(by), line.key}, {"faults", line.played.faults}, {"sessions", line.played.sessions}};
        return withFigures({{name(by), line.key}}, line.played);
    });
}

Dictionary worst(const WorstSession& each)
{
    const HistorySession& session = each.session;
    return withFigures({{"session", session.id},
                        {"application", session.application},
                        {"service", session.service},
                        {"process", session.process},
                        {"process_id", valueOf(session.processID)},
                        {"user", valueOf(session.user)},
                        {"devices", each.devices},
                        {"late_cycles", each.lateCycles},
                        {"running", each.isRunning},
                        {"vanished", each.hasVanished}},
                       each.played);
}

} // namespace

std::string reportJson(const Report& report)
{
    const Dictionary all = withFigures(
        {{"from", report.span.from},
         {"until", report.span.until},
         {"recording", report.isRecording},
         {"running", report.running},
         {"vanished", report.vanished},
         {"sessions_with_faults", report.withFaults},
         {"overlapping", report.isOverlapping},
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
         {"worst_sessions", listOf(report.worst, worst)}},
        report.all);
    std::string text;
    foundation::appendJsonText(all, text);
    return text + '\n';
}
