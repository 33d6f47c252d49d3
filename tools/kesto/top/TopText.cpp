// SPDX-License-Identifier: Apache-2.0
// Each line is cut before it gets colours, so that no escape sequence is cut.
#include "kesto/top/TopText.h"

#include "foundation/text/LocalTime.h"
#include "kesto/Terminal.h"
#include "kesto/status/StatusText.h"
#include "ledger/Report.h"

#include <algorithm>
#include <fmt/format.h>
#include <iterator>
#include <string_view>
#include <utility>

using ledger::countedText;
using ledger::groupedText;
using ledger::numberIn;

namespace {

enum class Paint : std::uint8_t { None, Title, Warning };

class Lines {
public:
    explicit Lines(const TopStyle& style) : style_(style) { }

    void add(std::string_view line, Paint paint = Paint::None)
    {
        const std::string shown = fitted(line, style_.width);
        lines_.push_back(painted(style_.isUTF8 ? shown : asciiText(shown), paint));
    }

    // So many lines, of which the last may be a sign.
    std::vector<std::string> take()
    {
        if (lines_.size() > style_.height && style_.height > 0) {
            const std::size_t leftOut = lines_.size() - style_.height + 1;
            lines_.resize(style_.height - 1);
            add(fmt::format("and {} more", countedText(leftOut, "line")));
        }
        return std::move(lines_);
    }

private:
    [[nodiscard]] std::string painted(std::string line, Paint paint) const
    {
        if (!style_.hasColor || paint == Paint::None)
            return line;
        return fmt::format("\x1B[{}m{}\x1B[0m", paint == Paint::Title ? 1 : 31, line);
    }

    const TopStyle& style_;
    std::vector<std::string> lines_;
};

// The time of day, or the day of an earlier one.
std::string sinceText(double since, double now)
{
    constexpr std::string_view day = "{:%Y-%m-%d}";
    const std::string begun = foundation::localTimeText(since, day);
    return begun == foundation::localTimeText(now, day) ? foundation::localTimeText(since, "{:%H:%M:%S}") : begun;
}

void addService(const TopLook& look, Lines& lines)
{
    if (!look.statusProblem.empty())
        return lines.add(printable(look.statusProblem), Paint::Warning);
    const foundation::Dictionary& status = *look.status;
    const auto size = [&status](std::string_view path) { return sizeText(numberIn(status, path)); };
    if (!look.isRunning())
        return lines.add("kestod does not run", Paint::Warning);
    lines.add(fmt::format("kestod {}, running since {}", printable(status.find("version")->text()),
                          momentText(static_cast<double>(numberIn(status, "started")))));
    lines.add(fmt::format("clients   {}, with {}", countedText(numberIn(status, "now.connections"), "connection"),
                          countedText(numberIn(status, "now.sessions"), "session")));
    lines.add(
        fmt::format("traffic   {:.1f} messages and {:.1f} events a second", look.rates->messages, look.rates->events));
    const foundation::Dictionary now = *status.find("now")->dictionary();
    if (now.contains("waitingCalls")) // an earlier version has none
        lines.add(fmt::format("backlog   {} and {}", countedText(numberIn(now, "waitingCalls"), "call"),
                              countedText(numberIn(now, "waitingEvents"), "event")));
    lines.add(fmt::format("memory    {} of at most {}", size("memory.used"), size("memory.limit")));
    const auto oldest = static_cast<double>(numberIn(status, "store.oldest"));
    lines.add(fmt::format("store     {} in {}{}", countedText(numberIn(status, "store.events"), "event"),
                          size("store.bytes"), oldest == 0 ? "" : ", the oldest of " + momentText(oldest)));
    const std::uint64_t losses = ledger::lossesIn(*status.find("sinceStart")->dictionary());
    if (losses == 0)
        lines.add("lost      nothing");
    else
        lines.add(fmt::format("lost      {} since the start; kesto status says why", groupedText(losses)),
                  Paint::Warning);
    if (!look.isStoring())
        lines.add(nothingIsStored, Paint::Warning);
    else if (!look.isStoringStretches())
        lines.add(noStretchesAreStored, Paint::Warning);
}

void addRow(std::string_view application, std::string_view since, std::string_view volume, std::string_view faults,
            std::string_view format, std::string_view device, Paint paint, Lines& lines)
{
    constexpr std::size_t nameColumns = 22;
    constexpr std::size_t formatColumns = 14;
    const auto column = [](std::string_view text, std::size_t columns) {
        return padded(fitted(printable(text), columns), columns);
    };
    lines.add(fmt::format("{} {:<10} {:>6} {:>7}  {} {}", column(application, nameColumns), since, volume, faults,
                          column(format, formatColumns), printable(device)),
              paint);
}

void addStreams(const std::vector<PlayingStream>& all, double now, bool isRecording, Lines& lines)
{
    std::vector<const PlayingStream*> streams;
    for (const PlayingStream& stream : all)
        if (stream.isRecording == isRecording)
            streams.push_back(&stream);
    if (streams.empty())
        return;
    lines.add("");
    addRow(isRecording ? "RECORDS" : "PLAYS", "SINCE", "VOLUME", "FAULTS", "FORMAT", "DEVICE", Paint::Title, lines);
    const auto known = [](const std::string& text) { return text.empty() ? "-" : text; };
    constexpr double percent = 100;
    for (const PlayingStream* stream : streams)
        addRow(known(stream->application), sinceText(stream->since, now),
               stream->volume ? fmt::format("{:.0f} %", *stream->volume * percent) : "-", groupedText(stream->faults),
               known(stream->format), known(stream->device), stream->faults == 0 ? Paint::None : Paint::Warning, lines);
}

} // namespace

std::vector<std::string> topLines(const TopLook& look, std::string_view note, const TopStyle& style)
{
    Lines lines(style);
    lines.add(fmt::format("{}{}{}", momentText(look.time), note.empty() ? "" : ", ", note));
    addService(look, lines);
    if (!look.storeProblem.empty()) {
        lines.add("");
        lines.add(printable(look.storeProblem), Paint::Warning);
    }
    if (look.streams && look.streams->empty()) {
        lines.add("");
        lines.add("nothing plays or records");
    } else if (look.streams) {
        addStreams(*look.streams, look.time, false, lines);
        addStreams(*look.streams, look.time, true, lines);
    }
    return lines.take();
}

std::vector<std::string> topHelpLines(const TopStyle& style)
{
    Lines lines(style);
    for (const std::string_view line :
         {"q      ends", "h      shows this, and hides it", "Space  pauses, and goes on",
          "+ -    a longer and a shorter delay", "", "Sorting", "s      since when: the longest first",
          "a      application", "d      device", "v      volume: the loudest first", "f      faults: the most first"})
        lines.add(line, line == "Sorting" ? Paint::Title : Paint::None);
    return lines.take();
}
