// SPDX-License-Identifier: Apache-2.0
// Every table has its key at the left, its figures in columns, and its bar in the room that is left.
#include "kesto/report/ReportText.h"

#include "foundation/text/LocalTime.h"
#include "kesto/Terminal.h"
#include "kesto/report/ReportWords.h"

#include <algorithm>
#include <fmt/format.h>
#include <utility>

namespace {

constexpr std::size_t narrowestKey = 11;
constexpr std::size_t widestKey = 60;
constexpr std::size_t longestBar = 30;
constexpr std::size_t shortestBar = 5; // in less room none is drawn
constexpr std::size_t mostLines = 20; // of a table that was not asked for by its name
constexpr double secondsAMinute = 60;
constexpr double secondsAnHour = 3600;

std::string durationText(double seconds)
{
    if (seconds < secondsAMinute - 0.5)
        return fmt::format("{:.0f} s", seconds);
    if (seconds < secondsAnHour - secondsAMinute / 2)
        return fmt::format("{:.0f} min", seconds / secondsAMinute);
    constexpr double manyHours = 1000;
    const double hours = seconds / secondsAnHour;
    return hours < manyHours ? fmt::format("{:.1f} h", hours) : fmt::format("{:.0f} h", hours);
}

std::string percentText(double share)
{
    constexpr double hundred = 100;
    return fmt::format("{:.0f} %", share * hundred);
}

// Nothing of so short a time that one fault would be hundreds an hour.
std::string rateText(const Played& played)
{
    const auto rate = played.faultsAnHour();
    return rate && played.seconds >= secondsAMinute ? fmt::format("{:.2f}", *rate) : std::string();
}

std::string keyText(std::string_view key)
{
    return key.empty() ? "(unknown)" : printable(key);
}

// A column is as wide as its longest text, and at least as wide as it was made.
class Table {
public:
    struct Column {
        std::string_view head;
        std::size_t width;
    };
    struct Row {
        std::string key;
        std::vector<std::string> figures;
        double length; // of the bar, before it is measured against the longest
    };

    Table(std::string_view head, std::vector<Column> columns) : head_(head), columns_(std::move(columns)) { }
    void add(Row row)
    {
        for (std::size_t index = 0; index < row.figures.size(); ++index)
            columns_[index].width = std::max(columns_[index].width, columnsOf(row.figures[index]));
        rows_.push_back(std::move(row));
    }

    [[nodiscard]] std::string text(const ReportLayout& layout) const
    {
        std::size_t figures = 0;
        for (const Column& column : columns_)
            figures += 2 + column.width;
        const std::size_t key = keyColumns(layout.width, figures);
        const std::size_t behind = columnsFor(layout.width, key + figures + 2);
        double longest = 0;
        for (const Row& row : rows_)
            longest = std::max(longest, row.length);
        std::string text = line(std::string(head_), heads(), key) + '\n';
        for (const Row& row : rows_) {
            text += line(fitted(row.key, key), row.figures, key);
            if (behind >= shortestBar && row.length > 0)
                text.append("  ").append(bar(row.length / longest, behind, layout.isUTF8));
            text += '\n';
        }
        return text;
    }

private:
    [[nodiscard]] std::size_t keyColumns(std::size_t width, std::size_t figures) const
    {
        std::size_t columns = narrowestKey;
        for (const Row& row : rows_)
            columns = std::max(columns, std::min(columnsOf(row.key), widestKey));
        return std::min(columns, std::max(narrowestKey, columnsBehind(figures, width)));
    }
    static std::size_t columnsFor(std::size_t width, std::size_t used)
    {
        if (width == std::string::npos)
            return longestBar;
        return std::min(longestBar, width > used ? width - used : 0);
    }
    [[nodiscard]] std::vector<std::string> heads() const
    {
        std::vector<std::string> heads;
        heads.reserve(columns_.size());
        for (const Column& column : columns_)
            heads.emplace_back(column.head);
        return heads;
    }
    [[nodiscard]] std::string line(std::string key, const std::vector<std::string>& figures, std::size_t columns) const
    {
        std::string text = padded(std::move(key), columns);
        for (std::size_t index = 0; index < figures.size(); ++index)
            text.append("  ").append(alignedRight(figures[index], columns_[index].width));
        return text;
    }

    std::string_view head_;
    std::vector<Column> columns_;
    std::vector<Row> rows_;
};

class ReportPrinter {
public:
    ReportPrinter(const Report& report, const ReportLayout& layout) : report_(report), layout_(layout) { }

    std::string print(const std::vector<ReportBy>& tables)
    {
        if (report_.all.sessions == 0 && report_.all.faults == 0)
            return nothing();
        std::string text = summary() + '\n' + (report_.fleet ? distributions() : "");
        for (const ReportBy by : tables)
            text += table(by, tables.size() == 1);
        return text + notes();
    }

private:
    [[nodiscard]] std::string_view done() const { return report_.isRecording ? "recorded" : "played"; }

    [[nodiscard]] std::string nothing() const
    {
        if (report_.fleet)
            return fmt::format("Nothing that matches was {} between {} and {} on any unit whose reports have come.\n"
                               "Look further back with --since 30d. If that is empty too: see kesto uplink status on a "
                               "device.\n",
                               done(), foundation::localTimeText(report_.span.from, "{:%Y-%m-%d %H:%M}"),
                               foundation::localTimeText(report_.span.until, "{:%Y-%m-%d %H:%M}"));
        return fmt::format(
            "Nothing that matches was {} between {} and {}.\n"
            "Look further back with --since 30d. If that is empty too: nothing may report to kestod (see "
            "kesto status), or\nstretches = false in analytics.toml turns playing times off.\n",
            done(), foundation::localTimeText(report_.span.from, "{:%Y-%m-%d %H:%M}"),
            foundation::localTimeText(report_.span.until, "{:%Y-%m-%d %H:%M}"));
    }

    [[nodiscard]] std::string summary() const
    {
        const std::string_view dot = layout_.isUTF8 ? " · " : "; ";
        std::string text = fmt::format("{} {} in {}{}", durationText(report_.all.seconds), done(),
                                       countText(report_.all.sessions, "session"), dot);
        text += report_.all.faults == 0 ? "no faults" : countText(report_.all.faults, "fault");
        if (const std::string rate = rateText(report_.all); !rate.empty() && report_.all.faults != 0)
            text += fmt::format(", {} an hour", rate);
        std::string ends = report_.vanished == 0 ? std::string() : fmt::format("{} vanished", report_.vanished);
        if (report_.running != 0)
            ends += fmt::format("{}{} still running", ends.empty() ? "" : ", ", report_.running);
        return ends.empty() ? text : fmt::format("{}{}{}", text, dot, ends);
    }

    [[nodiscard]] std::string table(ReportBy by, bool isAlone) const
    {
        switch (by) {
        case ReportBy::Day: return days();
        case ReportBy::Volume: return volumes();
        case ReportBy::Fault: return faults();
        default: return lines(by, isAlone);
        }
    }

    [[nodiscard]] std::string days() const
    {
        // Names of days repeat, and a long time before the first sound says nothing.
        constexpr std::size_t mostNamed = 28;
        const bool areNamed = report_.days.size() <= mostNamed;
        Table table("DAY", {{"PLAYED", 7}});
        bool hasSound = areNamed;
        for (const ReportDay& day : report_.days) {
            hasSound |= day.played.sessions != 0 || day.played.seconds > 0; // a fleet's days may tell no sessions
            if (hasSound)
                table.add({areNamed ? dayName(day.date) : dateText(day.date),
                           {durationText(day.played.seconds)},
                           day.played.seconds});
        }
        return table.text(layout_);
    }

    static std::string dayName(std::chrono::year_month_day date)
    {
        return fmt::format("{} {}", weekdayName(date), unsigned{date.day()});
    }

    [[nodiscard]] std::string shareText(double seconds) const
    {
        return report_.all.seconds > 0 ? percentText(seconds / report_.all.seconds) : "";
    }

    [[nodiscard]] std::string lines(ReportBy by, bool isAlone) const
    {
        std::string head(name(by));
        std::ranges::transform(head, head.begin(), [](char letter) { return static_cast<char>(letter - 'a' + 'A'); });
        std::vector<Table::Column> columns{{"PLAYED", 7}, {"SHARE", 5}, {"VOLUME", 6}, {"FAULTS", 6}, {"/HOUR", 5}};
        const auto& all = linesOf(report_, by);
        const bool isOverUnits = isAlone && report_.fleet && by != ReportBy::Unit;
        if (isOverUnits)
            columns.insert(columns.end(), {{"UNITS", 5}, {"MEDIAN", 6}, {"90 %", 5}, {"WORST", 5}});
        Table table(head, std::move(columns));
        const std::size_t shown = isAlone ? all.size() : std::min(all.size(), mostLines);
        double rest = 0;
        std::size_t left = 0;
        for (std::size_t index = 0; index < all.size(); ++index) {
            const Played& played = all[index].played;
            const auto volume = played.meanVolume();
            if (index >= shown || all[index].others != 0) {
                rest += played.seconds;
                left += std::max<std::size_t>(all[index].others, 1);
                continue;
            }
            std::vector<std::string> figures{durationText(played.seconds), shareText(played.seconds),
                                             volume ? percentText(*volume) : "", fmt::format("{}", played.faults),
                                             rateText(played)};
            if (isOverUnits)
                addOverUnits(all[index].overUnits.value_or(OverUnits()), figures);
            table.add({keyText(all[index].key), std::move(figures), played.seconds});
        }
        std::string text = table.text(layout_);
        if (left != 0)
            text += fmt::format("and {} more with {}: {} shows {}\n", left, durationText(rest),
                                isAlone ? "--csv" : fmt::format("--by {}", name(by)),
                                all.back().others == 0 || isAlone ? "all" : "more");
        return text;
    }

    static void addOverUnits(const OverUnits& of, std::vector<std::string>& figures)
    {
        figures.push_back(fmt::format("{}", of.units));
        const Distribution rates = of.faultsAnHour.value_or(Distribution());
        for (const double rate : {rates.median, rates.ninetieth, rates.most})
            figures.push_back(of.faultsAnHour ? fmt::format("{:.2f}", rate) : "");
    }

    // Of a fleet.
    [[nodiscard]] std::string distributions() const
    {
        const FleetPart& fleet = *report_.fleet;
        if (!fleet.hours)
            return "";
        std::string text = fmt::format("{}; a unit {}: median {:.1f} h, 90 % up to {:.1f} h, most {:.1f} h\n",
                                       countText(fleet.overUnits.units, "unit"), done(), fleet.hours->median,
                                       fleet.hours->ninetieth, fleet.hours->most);
        if (const auto& rates = fleet.overUnits.faultsAnHour)
            text += fmt::format("faults an hour of a unit: median {:.2f}, 90 % up to {:.2f}, worst {:.2f}; of {} that "
                                "{} an hour or more\n",
                                rates->median, rates->ninetieth, rates->most, fleet.overUnits.compared, done());
        return text;
    }

    [[nodiscard]] std::string volumes() const
    {
        Table table("VOLUME", {{"PLAYED", 7}, {"SHARE", 5}});
        const auto add = [&](std::string key, double seconds) {
            table.add({std::move(key), {durationText(seconds), shareText(seconds)}, seconds});
        };
        if (report_.all.mutedSeconds > 0)
            add("muted", report_.all.mutedSeconds);
        for (const auto& [upTo, seconds] : volumeSteps(report_))
            add(fmt::format("to {:.4g} %", upTo * 100), seconds);
        if (report_.all.noVolumeSeconds > 0)
            add("(unknown)", report_.all.noVolumeSeconds);
        return table.text(layout_);
    }

    [[nodiscard]] std::string faults() const
    {
        Table table("FAULT", {{"FAULTS", 7}, {"SESSIONS", 8}});
        std::string more;
        for (const ReportLine& line : report_.faultKinds)
            if (line.others != 0)
                more = fmt::format("and {} more with {}: --csv shows all\n", line.others,
                                   countText(line.played.faults, "fault"));
            else
                table.add({keyText(line.key),
                           {fmt::format("{}", line.played.faults), fmt::format("{}", line.played.sessions)},
                           static_cast<double>(line.played.faults)});
        return table.text(layout_) + more;
    }

    [[nodiscard]] std::string notes() const
    {
        std::string text;
        if (report_.all.mutedSeconds > 0)
            text +=
                fmt::format("{} of it muted, which no mean volume counts\n", durationText(report_.all.mutedSeconds));
        if (report_.all.noVolumeSeconds > 0)
            text += fmt::format("{} of it by streams that told no volume\n", durationText(report_.all.noVolumeSeconds));
        if (report_.isOverlapping)
            text += "streams at the same time each count: a day may have more than 24 h\n";
        return text;
    }

    const Report& report_;
    const ReportLayout& layout_;
};

} // namespace

std::string reportText(const Report& report, const std::vector<ReportBy>& tables, const ReportLayout& layout)
{
    const std::string text = ReportPrinter(report, layout).print(tables);
    return layout.isUTF8 ? text : asciiText(text);
}
