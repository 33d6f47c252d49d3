// SPDX-License-Identifier: Apache-2.0
// Names are those of clients: what would move a terminal's cursor is replaced, what would divide a row is quoted, and
// what a spreadsheet would take for a formula becomes a text.
#include "kesto/report/ReportCsv.h"

#include "kesto/Terminal.h"

#include <fmt/format.h>
#include <iterator>

std::string csvField(std::string_view text)
{
    constexpr std::string_view beginningsOfFormulas = "=+-@";
    std::string shown = printable(text);
    if (beginningsOfFormulas.contains(shown.empty() ? ' ' : shown.front()))
        shown.insert(0, 1, '\'');
    if (shown.find_first_of(",\"") == std::string::npos)
        return shown;
    std::string quoted = "\"";
    for (const char character : shown)
        quoted += character == '"' ? std::string("\"\"") : std::string(1, character);
    return quoted + '"';
}

namespace {

std::string secondsText(double seconds)
{
    constexpr int decimals = 3;
    return decimalText(seconds, decimals);
}

// The columns behind the first.
std::string figures(const Played& played)
{
    constexpr int decimals = 4;
    const auto volume = played.meanVolume();
    return fmt::format("{},{},{},{}", secondsText(played.seconds), played.sessions, played.faults,
                       volume ? decimalText(*volume, decimals) : std::string());
}

constexpr std::string_view unitColumns = ",units,median_faults_an_hour,ninetieth_faults_an_hour,most_faults_an_hour";

// In these columns, with the comma before them.
std::string overUnits(const std::optional<OverUnits>& of)
{
    constexpr int decimals = 4;
    std::string text = fmt::format(",{}", of ? of->units : 0);
    if (!of || !of->faultsAnHour)
        return text + ",,,";
    for (const double rate : {of->faultsAnHour->median, of->faultsAnHour->ninetieth, of->faultsAnHour->most})
        text += ',' + decimalText(rate, decimals);
    return text;
}

class Table {
public:
    explicit Table(std::string head) : text_(std::move(head)) { text_ += '\n'; }
    template <typename Figures> void add(std::string_view key, const Figures& figures)
    {
        fmt::format_to(std::back_inserter(text_), "{},{}\n", csvField(key), figures);
    }
    [[nodiscard]] std::string take() { return std::move(text_); }

private:
    std::string text_;
};

std::string volumes(const Report& report)
{
    constexpr int decimals = 4;
    Table table("volume,seconds");
    table.add("muted", secondsText(report.all.mutedSeconds));
    for (const auto& [upTo, seconds] : volumeSteps(report))
        table.add(decimalText(upTo, decimals), secondsText(seconds));
    table.add("", secondsText(report.all.noVolumeSeconds));
    return table.take();
}

std::string faults(const Report& report)
{
    Table table("fault,faults,sessions");
    for (const ReportLine& line : report.faultKinds)
        table.add(line.key, fmt::format("{},{}", line.played.faults, line.played.sessions));
    return table.take();
}

} // namespace

std::string reportCsv(const Report& report, ReportBy by)
{
    if (by == ReportBy::Volume)
        return volumes(report);
    if (by == ReportBy::Fault)
        return faults(report);
    const bool isOverUnits = report.fleet && by != ReportBy::Day && by != ReportBy::Unit;
    Table table(fmt::format("{},seconds,sessions,faults,mean_volume{}", name(by), isOverUnits ? unitColumns : ""));
    if (by == ReportBy::Day) {
        for (const ReportDay& day : report.days)
            table.add(dateText(day.date), figures(day.played));
        return table.take();
    }
    for (const ReportLine& line : linesOf(report, by))
        table.add(line.key, figures(line.played) + (isOverUnits ? overUnits(line.overUnits) : std::string()));
    return table.take();
}
