// SPDX-License-Identifier: Apache-2.0
// Rows become text and JSON only at the end, when the columns' widths are known.
#include "support/Report.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>

namespace bench {
namespace {

using Cells = std::array<std::string, 7>;
constexpr std::array<bool, 7> isAlignedRight{false, true, false, true, true, true, false};

// Three significant digits.
std::string numberText(double number)
{
    const double size = std::abs(number);
    const int decimals = size == 0 || size >= 100 ? 0 : size >= 10 ? 1 : 2;
    return fmt::format("{:.{}f}", number, decimals);
}

std::string figureText(const Series& figure, std::string_view unit)
{
    return fmt::format("{}{}{}", numberText(figure.median()), unit.empty() || unit.starts_with('/') ? "" : " ", unit);
}

std::string targetText(const Row& row)
{
    if (!row.target)
        return "-";
    const std::string_view sign = row.target->bound == Target::Bound::AtMost ? "<=" : ">=";
    if (row.target->of == Target::Of::Ratio)
        return fmt::format("{} {:.2f}x", sign, row.target->limit);
    return fmt::format("{} {:g} {}", sign, row.target->limit, row.unit);
}

Cells cells(const Row& row)
{
    const auto ratio = row.ratio();
    const auto isMet = row.isMet();
    return {row.what,
            figureText(row.figure, row.unit),
            row.peer ? row.peer->name : "-",
            row.peer ? figureText(row.peer->figure, row.unit) : "",
            ratio ? fmt::format("{:.2f}x", *ratio) : "",
            targetText(row),
            !isMet       ? ""
                : *isMet ? "met"
                         : "MISSED"};
}

std::string line(const Cells& cells, const std::array<std::size_t, 7>& widths)
{
    std::string text;
    for (std::size_t column = 0; column < cells.size(); ++column) {
        const auto& cell = cells[column];
        text += isAlignedRight[column] ? fmt::format("{:>{}}  ", cell, widths[column])
                                       : fmt::format("{:<{}}  ", cell, widths[column]);
    }
    text.erase(text.find_last_not_of(' ') + 1);
    return text + '\n';
}

foundation::Value json(const Series& series)
{
    std::vector<foundation::Value> rounds(series.figures().begin(), series.figures().end());
    return foundation::Dictionary{{"median", series.median()}, {"rounds", foundation::Array(std::move(rounds))}};
}

foundation::Value json(const Row& row)
{
    foundation::Dictionary::Entries entries{
        {"what", row.what}, {"unit", std::string(row.unit)}, {"figure", json(row.figure)}};
    if (row.peer)
        entries.push_back(
            {"peer", foundation::Dictionary{{"name", row.peer->name}, {"figure", json(row.peer->figure)}}});
    if (const auto ratio = row.ratio())
        entries.push_back({"ratio", *ratio});
    if (row.target) {
        entries.push_back({"target", targetText(row)});
        entries.push_back({"met", *row.isMet()});
    }
    return foundation::Dictionary(std::move(entries));
}

} // namespace

std::optional<double> Row::ratio() const
{
    if (!peer || peer->figure.median() == 0)
        return std::nullopt;
    return figure.median() / peer->figure.median();
}

std::optional<bool> Row::isMet() const
{
    if (!target)
        return std::nullopt;
    const auto value = target->of == Target::Of::Figure ? figure.median() : ratio();
    return value && (target->bound == Target::Bound::AtMost ? *value <= target->limit : *value >= target->limit);
}

std::string Report::table() const
{
    std::vector<Cells> lines{{"what", "figure", "peer", "figure", "ratio", "target", ""}};
    std::ranges::transform(rows_, std::back_inserter(lines), cells);
    std::array<std::size_t, 7> widths{};
    for (const Cells& line : lines)
        for (std::size_t column = 0; column < line.size(); ++column)
            widths[column] = std::max(widths[column], line[column].size());
    std::string text;
    for (const Cells& each : lines)
        text += line(each, widths);
    for (const Skipped& row : skipped_)
        text += fmt::format("{}: not measured: {}\n", row.what, row.reason);
    return text;
}

foundation::Dictionary Report::json() const
{
    std::vector<foundation::Value> rows;
    std::ranges::transform(rows_, std::back_inserter(rows), [](const Row& row) { return bench::json(row); });
    std::vector<foundation::Value> skipped;
    for (const Skipped& row : skipped_)
        skipped.emplace_back(foundation::Dictionary{{"what", row.what}, {"reason", row.reason}});
    return {{"rows", foundation::Array(std::move(rows))}, {"skipped", foundation::Array(std::move(skipped))}};
}

} // namespace bench
