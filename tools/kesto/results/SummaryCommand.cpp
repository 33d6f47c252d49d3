// SPDX-License-Identifier: Apache-2.0
// `kesto summary`: the file that a session leaves on internal builds, as a timeline that a person can read.
#include "kesto/Commands.h"
#include "kesto/Terminal.h"
#include "kesto/files/InputFile.h"
#include "kesto/files/JsonReader.h"
#include "kesto/results/Timeline.h"

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fmt/format.h>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using foundation::Dictionary;
using foundation::Value;

constexpr std::size_t timeColumns = 12;
constexpr std::size_t markColumns = 2;
constexpr std::size_t kindColumns = 26;

// "0:02.105", or "1:00:02.105" from an hour on.
std::string clockText(double seconds)
{
    constexpr double farthest = 1e9; // larger values are not a session's time
    if (!(std::abs(seconds) < farthest))
        return fmt::format("{:.3g} s", seconds);
    const long long milliseconds = std::llround(std::abs(seconds) * 1000);
    const long long minutes = milliseconds / 60'000;
    const std::string rest = fmt::format("{:02}.{:03}", milliseconds / 1000 % 60, milliseconds % 1000);
    const char* sign = seconds < 0 && milliseconds > 0 ? "-" : "";
    if (minutes < 60)
        return fmt::format("{}{}:{}", sign, minutes, rest);
    return fmt::format("{}{}:{:02}:{}", sign, minutes / 60, minutes % 60, rest);
}

std::string_view markOf(Timeline::Run run)
{
    switch (run) {
    case Timeline::Run::Silent: return "";
    case Timeline::Run::Begins: return "▶";
    case Timeline::Run::GoesOn: return "│";
    case Timeline::Run::Ends: return "■";
    }
    return "";
}

class SummaryView {
public:
    // Reads and shows the file.
    void show(const std::filesystem::path& path)
    {
        const InputFile file = openInput(path);
        std::string problem;
        const auto read = forEachJsonElement(file.get(), [&](const Value& element) {
            const bool isMessage = showMessage(path, element);
            if (!isMessage)
                problem = fmt::format("its element {} is not a message under its identifier", timeline_.messages() + 1);
            return isMessage;
        });
        if (std::ferror(file.get()) != 0)
            throw std::runtime_error(fmt::format("cannot read {} to its end", path.native()));
        if (std::ftell(file.get()) == 0)
            problem = "it is empty, as when a value could not be written as JSON";
        else if (!read)
            problem = read.error();
        if (!problem.empty())
            throw std::runtime_error(fmt::format("{} is not a summary of a session: {}", path.native(), problem));
        showHead(path);
        showEnd();
    }

private:
    bool showMessage(const std::filesystem::path& path, const Value& element)
    {
        const auto entry = element.dictionary();
        if (!entry || entry->size() != 1)
            return false;
        const auto& [identifier, value] = *entry->begin();
        const auto payload = value.dictionary();
        std::optional<Timeline::Row> row;
        if (!payload || !timeline_.add(identifier, *payload, row))
            return false;
        showHead(path);
        if (row)
            show(*row);
        return true;
    }

    // Shows the head once, before the first row.
    void showHead(const std::filesystem::path& path)
    {
        if (isHeadShown_)
            return;
        isHeadShown_ = true;
        fmt::print("{}\n{:>{}}  {} {} {}\n", printable(path.native()), "TIME", timeColumns, padded("", markColumns),
                   padded("MESSAGE", kindColumns), "WHAT CHANGED");
    }

    void show(const Timeline::Row& row) const
    {
        const std::size_t used = timeColumns + markColumns + kindColumns + 4;
        fmt::print("{:>{}}  {} {} {}\n", row.time ? clockText(*row.time) : "", timeColumns,
                   padded(std::string(markOf(row.run)), markColumns),
                   padded(fitted(printable(row.kind), kindColumns), kindColumns),
                   fitted(printable(row.changes), columnsBehind(used, width_)));
    }

    void showEnd() const
    {
        fmt::print("\n{} message{}", timeline_.messages(), timeline_.messages() == 1 ? "" : "s");
        if (timeline_.start())
            fmt::print(" in {} from {}", clockText(timeline_.end()), momentText(*timeline_.start()));
        fmt::print("\n");
        showStretches("played", timeline_.played());
        showStretches("recorded", timeline_.recorded());
        for (const Dictionary& event : timeline_.volumeEvents())
            show(event);
    }

    static void showStretches(std::string_view what, const std::vector<Stretch>& stretches)
    {
        double whole = 0;
        for (const auto& [begin, end] : stretches) {
            whole += end - begin;
            fmt::print("{:<8} {:>{}} to {:<{}} {:.3f} s\n", what, clockText(begin), timeColumns, clockText(end),
                       timeColumns, end - begin);
        }
        if (stretches.size() > 1)
            fmt::print("{:<8} {:>{}}    {:<{}} {:.3f} s\n", what, "", timeColumns, "in all", timeColumns, whole);
    }

    void show(const Dictionary& volumeEvent) const
    {
        const auto text = [&](std::string_view key) {
            const Value* value = volumeEvent.find(key);
            return value == nullptr ? std::string("?") : shownText(*value);
        };
        const std::string line = fmt::format(
            "volume event {} of {}: {} s at volume {}, format {}, device {}", text("msgidx"), text("msgcnt"),
            text("play_seconds"), text("PomoSessionVolume"), text("session_selected_format"), text("active_devices"));
        fmt::print("{}\n", fitted(printable(line), width_));
    }

    const std::size_t width_ = outputWidth();
    Timeline timeline_;
    bool isHeadShown_ = false;
};

} // namespace

void addSummaryCommand(CLI::App& application, int& exitStatus)
{
    const auto files = std::make_shared<std::vector<std::filesystem::path>>();
    CLI::App* command = application.add_subcommand("summary", "Shows the summary files of sessions as timelines");
    command->add_option("FILE", *files, "Such as those in Audio/Reporting/ of the service's log directory")->required();
    command->callback([files, &exitStatus] {
        for (const std::filesystem::path& path : *files) {
            if (&path != &files->front())
                fmt::print("\n");
            try {
                SummaryView().show(path);
            } catch (const std::runtime_error& error) {
                std::fflush(stdout);
                fmt::print(stderr, "kesto: {}\n", error.what());
                exitStatus = exitFailure;
            }
        }
    });
}
