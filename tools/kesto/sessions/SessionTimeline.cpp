// SPDX-License-Identifier: Apache-2.0
// The time from the first to the last moment is divided into as many parts as there are columns. A column shows what
// happened in its part.
#include "kesto/sessions/SessionTimeline.h"

#include "kesto/Terminal.h"
#include "kesto/sessions/SessionText.h"
#include "ledger/Report.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <fmt/format.h>
#include <string_view>
#include <vector>

namespace {

constexpr std::size_t usualWidth = 80;
constexpr std::size_t labelColumns = 9;
constexpr std::array<std::string_view, 8> blocks{"▁", "▂", "▃", "▄", "▅", "▆", "▇", "█"};
constexpr std::array<std::string_view, 8> digits{"1", "2", "3", "4", "5", "6", "7", "8"};

class Timeline {
public:
    Timeline(const SessionLine& line, const History& history, const TimelineStyle& style)
        : line_(line),
          history_(history),
          isUTF8_(style.isUTF8),
          width_(style.width == std::string::npos ? usualWidth : style.width),
          columns_(columnsBehind(labelColumns, width_)),
          from_(line.session.began),
          until_(line.session.began)
    {
        if (!history.stretches.empty())
            from_ = until_ = history.stretches.front().began;
        for (const PlayedStretch& stretch : history.stretches)
            include(stretch.began, stretch.began + stretch.seconds);
        for (const Fault& fault : history.faults)
            include(fault.happened, fault.happened);
    }

    std::string text()
    {
        addNumbers();
        add("");
        addTimes();
        addPlaying();
        addFaults();
        return std::move(text_);
    }

private:
    void include(double from, double until)
    {
        from_ = std::min(from_, from);
        until_ = std::max(until_, until);
    }

    void add(std::string_view line)
    {
        const std::string shown = fitted(line, width_);
        (text_ += isUTF8_ ? shown : asciiText(shown)) += '\n';
    }

    void addNumbers()
    {
        const auto& [session, played, devices, end] = line_;
        add(fmt::format("session {}, {}{}", session.id,
                        session.application.empty() ? "of an unknown application" : printable(session.application),
                        session.service.empty() ? "" : ", " + printable(session.service)));
        add(fmt::format("by       {}{}{}", session.process.empty() ? "an unknown process" : printable(session.process),
                        session.processID ? fmt::format(", process {}", *session.processID) : "",
                        session.user ? fmt::format(" of user {}", *session.user) : ""));
        add(fmt::format("played   {}{}{}", clockText(played.seconds), end == SessionEnd::Unknown ? "" : "; ",
                        name(end)));
        if (!devices.empty())
            add("on       " + printable(devices));
        add(fmt::format("at       {}{}{}", volumeText(played), played.meanVolume() ? " on average" : "",
                        played.mutedSeconds > 0 && played.meanVolume()
                            ? fmt::format("; muted for {}", clockText(played.mutedSeconds))
                            : ""));
        std::int64_t late = 0;
        for (const Fault& fault : history_.faults)
            late += fault.lateCycles;
        add(fmt::format("faults   {}{}", played.faults,
                        late == 0 ? ""
                                  : ", with " + ledger::countedText(static_cast<std::uint64_t>(late), "late cycle")));
    }

    // Both ends, over the ends of the rows.
    void addTimes()
    {
        const std::string from = momentText(from_);
        const std::string until = momentText(until_);
        const std::size_t blanks = columns_ > from.size() + until.size() ? columns_ - from.size() - until.size() : 1;
        add(std::string(labelColumns, ' ') + from + std::string(blanks, ' ') + until);
    }

    // A time in columns from the left.
    [[nodiscard]] double placeOf(double time) const
    {
        return until_ > from_ ? (time - from_) / (until_ - from_) * static_cast<double>(columns_) : 0;
    }
    [[nodiscard]] std::size_t columnOf(double place) const
    {
        return std::min(columns_ - 1, static_cast<std::size_t>(std::max(0.0, place)));
    }

    // In columns, in the place of seconds.
    [[nodiscard]] std::vector<Played> cells() const
    {
        std::vector<Played> cells(columns_);
        for (const PlayedStretch& stretch : history_.stretches) {
            const double from = placeOf(stretch.began);
            const double until = placeOf(stretch.began + stretch.seconds);
            for (std::size_t column = columnOf(from); column < columns_ && static_cast<double>(column) < until;
                 ++column) {
                const auto left = static_cast<double>(column);
                PlayedStretch part = stretch;
                part.seconds = std::min(until, left + 1) - std::max(from, left);
                addTo(cells[column], part);
            }
        }
        return cells;
    }

    void addPlaying()
    {
        std::string playing = "playing  ";
        std::string volume = "volume   ";
        for (const Played& cell : cells()) {
            playing += playingSign(cell.seconds);
            volume += volumeSign(cell);
        }
        add(playing);
        add(volume);
    }

    [[nodiscard]] std::string_view playingSign(double share) const
    {
        constexpr double half = 0.5;
        constexpr double least = 1e-6; // what is left of nothing by rounding
        if (share < least)
            return " ";
        if (share < half)
            return isUTF8_ ? "▒" : "+";
        return isUTF8_ ? "█" : "#";
    }

    [[nodiscard]] std::string_view volumeSign(const Played& cell) const
    {
        if (const auto volume = cell.meanVolume()) {
            const auto step = static_cast<std::size_t>(std::ceil(*volume * static_cast<double>(blocks.size())));
            return (isUTF8_ ? blocks : digits)[std::clamp<std::size_t>(step, 1, blocks.size()) - 1];
        }
        if (cell.mutedSeconds > 0)
            return "x";
        return playingSign(cell.seconds) == " " ? " " : "-";
    }

    void addFaults()
    {
        constexpr std::size_t most = 9;
        std::vector<std::size_t> counts(columns_);
        for (const Fault& fault : history_.faults)
            ++counts[columnOf(placeOf(fault.happened))];
        std::string faults = "faults   ";
        for (const std::size_t count : counts)
            faults += count == 0 ? ' ' : count <= most ? static_cast<char>('0' + count) : '*';
        add(faults);
    }

    const SessionLine& line_;
    const History& history_;
    const bool isUTF8_;
    const std::size_t width_;
    const std::size_t columns_;
    double from_;
    double until_;
    std::string text_;
};

} // namespace

std::string sessionTimeline(const SessionLine& line, const History& history, const TimelineStyle& style)
{
    return Timeline(line, history, style).text();
}
