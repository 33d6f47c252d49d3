// SPDX-License-Identifier: Apache-2.0
// How long was played a day: stacked bars, the application with the most time at the bottom.
#include "kesto/report/ReportTable.h"
#include "kesto/report/page/PageColumns.h"
#include "kesto/report/page/PageSections.h"
#include "kesto/report/page/PageText.h"
#include "kesto/report/page/Svg.h"
#include "kesto/report/page/TimeAxis.h"

#include <algorithm>
#include <cmath>
#include <fmt/format.h>

namespace chrono = std::chrono;

namespace {

constexpr std::size_t mostColumns = 100;
constexpr double width = 1040;
constexpr double height = 282;
constexpr double left = 44;
constexpr double top = 26;
constexpr double bottom = 238;
constexpr double widest = 64; // a bar
constexpr double roomForName = 48;

// Colours and names, in the order of the report; behind the named ones stand all others together.
class Applications {
public:
    explicit Applications(const Report& report)
        : report_(report),
          named_(namedOf(report.applications.size(), mostNamedApplications))
    {
    }

    [[nodiscard]] std::size_t count() const { return named_ + (report_.applications.size() > named_ ? 1 : 0); }
    [[nodiscard]] std::string className(std::size_t index) const
    {
        return index < named_ ? fmt::format("c{}", index + 1) : "c0";
    }
    [[nodiscard]] std::string name(std::size_t index, std::size_t mostCharacters) const
    {
        return index < named_ ? htmlName(report_.applications[index].key, mostCharacters)
                              : othersText(numberOf(report_.applications), named_);
    }
    [[nodiscard]] double seconds(std::size_t index) const
    {
        if (index < named_)
            return report_.applications[index].played.seconds;
        double sum = 0;
        for (std::size_t other = named_; other < report_.applications.size(); ++other)
            sum += report_.applications[other].played.seconds;
        return sum;
    }

private:
    const Report& report_;
    std::size_t named_;
};

std::string legend(const Applications& applications)
{
    std::string html = "<ul class=legend>";
    for (std::size_t index = 0; index < applications.count(); ++index)
        html +=
            fmt::format("<li><svg class=key viewBox=\"0 0 10 10\" aria-hidden=true><rect class={} width=10 height=10 "
                        "rx=2 /></svg><bdi>{}</bdi> <b>{}</b>",
                        applications.className(index), applications.name(index, longestLabel),
                        durationText(applications.seconds(index)));
    return html + "</ul>";
}

double longestOf(const PageColumns& columns)
{
    double longest = 0;
    for (const PageColumn& column : columns.columns)
        longest = std::max(longest, column.seconds);
    return longest;
}

// Draws the columns side by side.
class Bars {
public:
    Bars(const PageColumns& columns, const Applications& applications, const PageWords& words)
        : columns_(columns),
          applications_(applications),
          pitch_((width - left) / static_cast<double>(std::max<std::size_t>(1, columns.columns.size()))),
          hasNotes_(words.hasNotes),
          svg_(width, height,
               fmt::format("Bars of the time that was {}, by application; the table below has the figures",
                           words.played())),
          axis_(longestOf(columns), {.left = left, .right = width, .top = top, .bottom = bottom})
    {
    }

    std::string draw()
    {
        axis_.draw(svg_);
        for (std::size_t index = 0; index < columns_.columns.size(); ++index) {
            drawColumn(columns_.columns[index], leftOf(index));
            drawLabel(index);
        }
        return svg_.end();
    }

private:
    [[nodiscard]] double leftOf(std::size_t index) const { return left + pitch_ * static_cast<double>(index); }
    void drawColumn(const PageColumn& column, double x)
    {
        constexpr double gap = 1;
        const double barWidth = std::min(pitch_ * 0.7, widest);
        const double barLeft = x + (pitch_ - barWidth) / 2;
        svg_.beginGroup(hasNotes_ ? noteOf(column) : std::string());
        if (hasNotes_) // a pointer anywhere above the day shows the note
            svg_.bar("hit", x, top, pitch_, bottom - top);
        double y = bottom;
        for (std::size_t index = 0; index < column.byApplication.size(); ++index) {
            if (column.byApplication[index] <= 0)
                continue;
            const double full = axis_.heightOf(column.byApplication[index]);
            svg_.bar(applications_.className(index), barLeft, y - full, barWidth, full > 3 * gap ? full - gap : full);
            y -= full;
        }
        constexpr double roomForValue = 44;
        if (pitch_ >= roomForValue && column.seconds > 0)
            svg_.text("val", x + pitch_ / 2, y - 5, Svg::Anchor::Middle, valueText(column.seconds));
        svg_.endGroup();
    }

    [[nodiscard]] std::string valueText(double seconds) const
    {
        const double value = axis_.valueOf(seconds);
        return value < 0.05 ? "&lt;0.1" : fmt::format("{:.1f}", value);
    }

    [[nodiscard]] std::string noteOf(const PageColumn& column) const
    {
        constexpr std::size_t mostWithNames = 40;
        std::string note = fmt::format("{}: {}", columns_.name(column), durationText(column.seconds));
        if (columns_.columns.size() <= mostWithNames)
            for (std::size_t index = column.byApplication.size(); index-- > 0;)
                if (column.byApplication[index] > 0)
                    note += fmt::format("\n{} {}", applications_.name(index, longestShortName),
                                        durationText(column.byApplication[index]));
        return note;
    }

    void drawLabel(std::size_t index)
    {
        const PageColumn& column = columns_.columns[index];
        const bool isBold = columns_.unit == ColumnUnit::Day && isWeekend(column.first);
        const std::string label =
            columns_.unit == ColumnUnit::Day ? labelOfDay(column, index) : labelOfMany(column, index);
        if (!label.empty())
            svg_.text(isBold ? "ax we" : "ax", leftOf(index) + pitch_ / 2, bottom + 18, Svg::Anchor::Middle, label);
        if (beginsMonth(index) && hasRoomForMonth(index))
            svg_.text("ax", leftOf(index) + std::max(0.0, (pitch_ - widest) / 2), bottom + 38, Svg::Anchor::Start,
                      fmt::format("{} {}", monthName(column.first), static_cast<int>(column.first.year())));
    }

    // "Sun 8" if there is room, else the number, else only Mondays: "9 Nov".
    [[nodiscard]] std::string labelOfDay(const PageColumn& column, std::size_t index) const
    {
        constexpr double roomForNumber = 24;
        constexpr double halfOfLabel = 16;
        const std::string name = columns_.name(column); // "Sun 8 Nov"
        if (pitch_ >= roomForName)
            return name.substr(0, name.rfind(' '));
        if (pitch_ >= roomForNumber)
            return fmt::format("{}", static_cast<unsigned>(column.first.day()));
        const bool isMonday = chrono::weekday(chrono::sys_days(column.first)) == chrono::Monday;
        return isMonday && leftOf(index) < width - halfOfLabel ? name.substr(name.find(' ') + 1) : std::string();
    }

    // Of weeks, months, years and decades, as many as there is room for.
    [[nodiscard]] std::string labelOfMany(const PageColumn& column, std::size_t index) const
    {
        const auto every = static_cast<std::size_t>(std::ceil(1.3 * roomForName / pitch_));
        if (index % every != 0)
            return {};
        const auto month = monthName(column.first).substr(0, 3);
        if (columns_.unit == ColumnUnit::Week)
            return fmt::format("{} {}", static_cast<unsigned>(column.first.day()), month);
        return columns_.unit == ColumnUnit::Month ? fmt::format("{} {}", month, static_cast<int>(column.first.year()))
                                                  : columns_.name(column);
    }

    [[nodiscard]] bool isInMonthOf(std::size_t one, std::size_t other) const
    {
        const auto monthOf = [this](std::size_t index) {
            const auto& first = columns_.columns[index].first;
            return first.year() / first.month();
        };
        return monthOf(one) == monthOf(other);
    }

    [[nodiscard]] bool beginsMonth(std::size_t index) const
    {
        const bool hasDays = columns_.unit == ColumnUnit::Day || columns_.unit == ColumnUnit::Week;
        return hasDays && (index == 0 || !isInMonthOf(index - 1, index));
    }

    // Up to where the next month begins, and up to the end of the picture.
    [[nodiscard]] bool hasRoomForMonth(std::size_t index) const
    {
        constexpr double roomForMonth = 100;
        for (std::size_t next = index + 1; next < columns_.columns.size(); ++next)
            if (!isInMonthOf(index, next))
                return leftOf(next) - leftOf(index) >= roomForMonth;
        return index == 0 || leftOf(index) <= width - roomForMonth;
    }

    const PageColumns& columns_;
    const Applications& applications_;
    const double pitch_;
    const bool hasNotes_;
    Svg svg_;
    const TimeAxis axis_;
};

PageTable tableOf(const PageColumns& columns, const Applications& applications)
{
    PageTable table{.summary = "Hours as a table", .head = {columns.heading()}, .rows = {}};
    for (std::size_t index = 0; index < applications.count(); ++index)
        table.head.push_back("<bdi>" + applications.name(index, longestShortName) + "</bdi>");
    table.head.emplace_back("All");
    for (const PageColumn& column : columns.columns) {
        table.rows.push_back({columns.name(column)});
        for (const double seconds : column.byApplication)
            table.rows.back().push_back(hoursText(seconds));
        table.rows.back().push_back(hoursText(column.seconds));
    }
    return table;
}

// What is unusual about the length of days: where clocks change, and where the report begins or ends within a day. Of
// days that are put together nothing: there can be hundreds.
std::string lengthsOf(const Report& report, ColumnUnit unit)
{
    if (unit != ColumnUnit::Day)
        return {};
    constexpr double day = 86400;
    constexpr double tolerance = 60;
    std::string text;
    for (std::size_t index = 0; index < report.days.size(); ++index) {
        const TimeSpan& span = report.days[index].span;
        const double seconds = span.until - span.from;
        const bool isAtEnd = index == 0 || index + 1 == report.days.size();
        if (std::abs(seconds - day) <= tolerance)
            continue;
        const std::string date = dayText(report.days[index].date);
        text += (text.empty() ? "" : " ")
            + (isAtEnd ? fmt::format("Of {}, {} are in this report.", date, durationText(seconds))
                       : fmt::format("{} had {}.", date, durationText(seconds)));
    }
    return text;
}

} // namespace

std::string timeSection(const Report& report, const PageWords& words)
{
    const PageColumns columns = columnsOf(report, words.hasNotes ? mostColumns : mostColumns / 2);
    const Applications applications(report);
    std::string period = columns.heading();
    period.front() = static_cast<char>(period.front() + ('a' - 'A'));
    std::string html =
        fmt::format("<section><h2>Time of {} a {}</h2><p class=sub>By application{}</p>", words.playing(), period,
                    report.isOverlapping ? "; streams at the same time each count" : "");
    html += legend(applications);
    html += "<div class=scroll tabindex=0>" + Bars(columns, applications, words).draw() + "</div>";
    if (const std::string lengths = lengthsOf(report, columns.unit); !lengths.empty())
        html += "<p class=note>" + lengths;
    return html + tableHTML(tableOf(columns, applications)) + "</section>";
}
