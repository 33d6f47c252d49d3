// SPDX-License-Identifier: Apache-2.0
// Times have a suitable unit and four digits: enough to compare, few enough to read.
#include "kesto/trace/TraceView.h"

#include "foundation/values/Json.h"
#include "kesto/ExitStatus.h"
#include "kesto/Terminal.h"
#include "kesto/trace/TraceStatistics.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <fmt/format.h>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

// A sentence for each kind of missing data.
std::vector<std::string> whatIsMissing(const TraceResultsFile& results)
{
    std::vector<std::string> sentences;
    const auto add = [&](double count, fmt::format_string<double&> sentence) {
        if (count != 0)
            sentences.push_back("INCOMPLETE: " + fmt::format(sentence, count));
    };
    if (!results.problem.empty())
        sentences.push_back("INCOMPLETE: " + printable(results.problem));
    add(results.lostEvents,
        "up to {} events were lost: intervals may be missing, and others span the loss, longer than any that happened");
    add(results.lostIntervals,
        "{} points of the parameters file were not measured: there were too many events or values");
    add(results.lostPoints, "{} traces and points of the parameters file were not read: it has too many");
    add(results.lostValues, "{} values are missing: the file would have been too large");
    return sentences;
}

// --- numbers

struct Scale {
    double size;
    std::string_view unit;
};

// The unit in which the number is neither long nor a fraction.
Scale scaleOf(double number, std::string_view unit)
{
    constexpr std::array<Scale, 3> scales{{{1e9, "s"}, {1e6, "ms"}, {1e3, "µs"}}};
    if (unit == "ns")
        for (const Scale& scale : scales)
            if (std::abs(number) >= scale.size)
                return scale;
    return {.size = 1, .unit = unit};
}

// "187.2 µs"
std::string numberText(double number, std::string_view unit)
{
    const Scale scale = scaleOf(number, unit);
    return fmt::format("{:.4g} {}", number / scale.size, printable(scale.unit));
}

// The boundary of a row of that width: all rows have one unit, and enough digits to differ.
std::string boundaryText(double number, double width, double scale)
{
    constexpr double longest = 1e12;
    number /= scale;
    const double places = std::ceil(-std::log10(width / scale));
    if (std::abs(number) >= longest || !std::isfinite(places))
        return fmt::format("{:.4g}", number);
    return fmt::format("{:.{}f}", number, static_cast<int>(std::clamp(places, 0.0, 9.0)));
}

// --- for people

void printHead(const TraceResultsFile& results)
{
    std::size_t values = 0;
    for (const TraceSeries& series : results.series)
        values += series.values.size();
    fmt::print("{}, version {}: {} value{}\n", printable(results.project), results.version, values,
               values == 1 ? "" : "s");
    if (results.withoutValue != 0)
        fmt::print("{} left out: without a value\n", results.withoutValue);
    for (const std::string& sentence : whatIsMissing(results))
        fmt::print("{}\n", sentence);
}

void printTable(const TraceResultsFile& results, std::size_t width)
{
    constexpr std::size_t countColumns = 8;
    constexpr std::size_t columns = 10;
    constexpr std::size_t used = countColumns + 5 * (columns + 1) + 2;
    fmt::print("\n{:>{}}", "COUNT", countColumns);
    for (const std::string_view title : {"MIN", "MEDIAN", "90%", "99%", "MAX"})
        fmt::print(" {:>{}}", title, columns);
    fmt::print("  NAME\n");
    for (const TraceSeries& series : results.series) {
        const TraceStatistics statistics = traceStatistics(series.values);
        fmt::print("{:>{}}", series.values.size(), countColumns);
        for (const double number : {statistics.minimum, statistics.median, statistics.percentile90,
                                    statistics.percentile99, statistics.maximum})
            fmt::print(" {:>{}}", numberText(number, series.unit), columns);
        fmt::print("  {}\n", fitted(printable(series.name), columnsBehind(used, width)));
    }
}

// A bar. Its share of the columns is the share of `count` in `most`; it is never empty for a count above 0.
std::string barText(std::size_t count, std::size_t most, std::size_t columns)
{
    constexpr std::array<std::string_view, 8> parts{"", "▏", "▎", "▍", "▌", "▋", "▊", "▉"};
    const double share = static_cast<double>(count) / static_cast<double>(most);
    auto eighths = static_cast<std::size_t>(std::lround(share * static_cast<double>(8 * columns)));
    eighths = count != 0 ? std::max<std::size_t>(eighths, 1) : 0;
    std::string bar = eighths != 0 ? " " : "";
    for (std::size_t full = 0; full < eighths / 8; ++full)
        bar += "█";
    return bar.append(parts[eighths % 8]);
}

struct HistogramLine {
    std::string lower;
    std::string upper;
    std::size_t count;
};

void printHistogram(const TraceSeries& series, std::size_t width)
{
    constexpr std::size_t widestBar = 40;
    constexpr std::size_t countColumns = 8;
    const std::vector<HistogramRow> rows = traceHistogram(series.values);
    const double rowWidth = rows.front().upper - rows.front().lower;
    const Scale scale = scaleOf(rows.size() > 1 ? rows[rows.size() - 2].upper : rows.front().upper, series.unit);
    std::vector<HistogramLine> lines;
    std::size_t textColumns = 0;
    std::size_t most = 0;
    for (const HistogramRow& row : rows) {
        lines.push_back(
            {boundaryText(row.lower, rowWidth, scale.size), boundaryText(row.upper, rowWidth, scale.size), row.count});
        textColumns = std::max({textColumns, lines.back().lower.size(), lines.back().upper.size()});
        most = std::max(most, row.count);
    }
    const std::string unit = printable(scale.unit);
    const std::size_t used = 2 * textColumns + unit.size() + countColumns + 9;
    const std::size_t barColumns = std::min(columnsBehind(used, width), widestBar);
    fmt::print("\n{}\n", fitted(printable(series.name), width));
    for (const HistogramLine& line : lines)
        fmt::print("  {:>{}} to {:>{}} {} {:>{}}{}\n", line.lower, textColumns, line.upper, textColumns, unit,
                   line.count, countColumns, barText(line.count, most, barColumns));
}

void printForPeople(const TraceResultsFile& results)
{
    const std::size_t width = outputWidth();
    printHead(results);
    if (results.series.empty())
        return;
    printTable(results, width);
    for (const TraceSeries& series : results.series)
        printHistogram(series, width);
}

// --- for programs

void printJson(const TraceSeries& series)
{
    const TraceStatistics statistics = traceStatistics(series.values);
    std::vector<Value> rows;
    for (const HistogramRow& row : traceHistogram(series.values))
        rows.emplace_back(Dictionary{{"lower", row.lower}, {"upper", row.upper}, {"count", row.count}});
    std::string line;
    foundation::appendJsonText(Dictionary{{"name", series.name},
                                          {"unit", series.unit},
                                          {"count", series.values.size()},
                                          {"minimum", statistics.minimum},
                                          {"median", statistics.median},
                                          {"percentile90", statistics.percentile90},
                                          {"percentile99", statistics.percentile99},
                                          {"maximum", statistics.maximum},
                                          {"histogram", Array(std::move(rows))}},
                               line);
    fmt::print("{}\n", line);
}

} // namespace

TraceResultsFile traceResultsOf(std::string_view text, const std::filesystem::path& path)
{
    auto results = parseTraceResults(text);
    if (!results)
        throw std::runtime_error(
            fmt::format("{} is not a results file of a trace: {}", printable(path.native()), results.error()));
    for (TraceSeries& series : results->series)
        std::ranges::sort(series.values);
    return *std::move(results);
}

int showTraceResults(const TraceResultsFile& results, bool isJson)
{
    const std::vector<std::string> missing = whatIsMissing(results);
    if (isJson) {
        for (const TraceSeries& series : results.series)
            printJson(series);
        for (const std::string& sentence : missing)
            fmt::print(stderr, "kesto: {}\n", sentence);
    } else {
        printForPeople(results);
    }
    return missing.empty() ? exitOk : exitIncomplete;
}
