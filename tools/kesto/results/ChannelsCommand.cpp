// SPDX-License-Identifier: Apache-2.0
// `kesto channels`: the drivers' present channels, and on request their changes, as the service sees them.
#include "foundation/text/LocalTime.h"
#include "foundation/values/Json.h"
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "platform/linux/channels/ChannelDifference.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/channels/SoundCards.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdio>
#include <fmt/format.h>
#include <iterator>
#include <memory>
#include <thread>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::ReportingChannel;
using platform::ReportingSample;

struct ChannelsOptions {
    std::filesystem::path root;
    std::filesystem::path sound = "/proc/asound";
    platform::ChannelSelection selection;
    bool isWatching = false;
    double interval = 1;
    std::optional<std::size_t> count;
    bool isJson = false;
};

std::filesystem::path usualRoot()
{
    const std::string given = platform::environment("KESTO_CHANNEL_ROOT");
    return given.empty() ? usualRuntimeDirectory() / "channels" : std::filesystem::path(given);
}

// --- the content of a channel

bool isKind(const ReportingChannel& channel, platform::ChannelFormat format)
{
    return channel.format == static_cast<std::uint8_t>(format);
}

std::string withUnit(const std::string& text, const ReportingChannel& channel)
{
    return channel.unit ? text + ' ' + *channel.unit : text;
}

// "0-10:5 30-40:2 ms, 3 to 37": the buckets that were hit, and the least and greatest value.
std::string histogramText(const ReportingChannel& channel)
{
    std::string text;
    for (const auto& bucket : channel.buckets)
        if (bucket.hits != 0)
            text += fmt::format("{}-{}:{} ", bucket.lower, bucket.upper, bucket.hits);
    if (text.empty())
        return "none";
    text.pop_back();
    return withUnit(text, channel) + fmt::format(", {} to {}", channel.minimum, channel.maximum);
}

// "Running 88.0% 12x, Idle 12.0% 11x": the share of time, and how often it was entered.
std::string statesText(const ReportingChannel& channel)
{
    std::string text;
    for (const auto& state : channel.states)
        text += fmt::format("{}{} {:.1f}% {}x", text.empty() ? "" : ", ", state.name, state.dutyCycle * 100,
                            state.transitions);
    return text;
}

std::string contentText(const ReportingChannel& channel)
{
    if (isKind(channel, platform::ChannelFormat::Simple))
        return withUnit(fmt::to_string(channel.value), channel);
    return isKind(channel, platform::ChannelFormat::Histogram) ? histogramText(channel) : statesText(channel);
}

// Whether this channel of a difference is not empty.
bool hasChanged(const ReportingChannel& difference)
{
    return difference.value != 0
        || std::ranges::any_of(difference.buckets, [](const auto& each) { return each.hits != 0; })
        || std::ranges::any_of(difference.states,
                               [](const auto& each) { return each.transitions != 0 || each.residency != 0; });
}

// --- for people

class ChannelTable {
public:
    explicit ChannelTable(bool hasTime) : hasTime_(hasTime) { }

    void printHead() const { printRow("TIME", {"DRIVER", "GROUP", "SUBGROUP", "CHANNEL"}, "CONTENT"); }

    void print(const ReportingChannel& channel, double time) const
    {
        printRow(foundation::localTimeText(time, "{:%H:%M:%S}"),
                 {channel.driver.value_or("-"), channel.group.value_or("-"), channel.subgroup.value_or("-"),
                  channel.name.value_or("-")},
                 contentText(channel));
    }

private:
    static constexpr std::size_t timeColumns = 8;
    static constexpr std::array<std::size_t, 4> columns{16, 12, 10, 24};

    void printRow(const std::string& time, const std::array<std::string, 4>& names, const std::string& content) const
    {
        std::string row = hasTime_ ? padded(time, timeColumns) + ' ' : "";
        std::size_t used = hasTime_ ? timeColumns + 1 : 0;
        for (std::size_t index = 0; index < names.size(); ++index) {
            row += padded(fitted(printable(names[index]), columns[index]), columns[index]) + ' ';
            used += columns[index] + 1;
        }
        fmt::print("{}{}\n", row, fitted(printable(content), columnsBehind(used, width_)));
    }

    const bool hasTime_;
    const std::size_t width_ = outputWidth();
};

// --- for programs

Value textOrNull(const std::optional<std::string>& text)
{
    return text ? Value(*text) : Value();
}

Dictionary describe(const ReportingChannel& channel)
{
    Dictionary description{{"driver", textOrNull(channel.driver)},
                           {"group", textOrNull(channel.group)},
                           {"subgroup", textOrNull(channel.subgroup)},
                           {"channel", textOrNull(channel.name)},
                           {"unit", textOrNull(channel.unit)}};
    if (isKind(channel, platform::ChannelFormat::Simple))
        return description.with("kind", "simple").with("value", channel.value);
    if (isKind(channel, platform::ChannelFormat::Histogram)) {
        std::vector<Value> buckets;
        buckets.reserve(channel.buckets.size());
        for (const auto& bucket : channel.buckets)
            buckets.emplace_back(Dictionary{{"lower", bucket.lower}, {"upper", bucket.upper}, {"hits", bucket.hits}});
        return description.mergedWith({{"kind", "histogram"},
                                       {"minimum", channel.minimum},
                                       {"maximum", channel.maximum},
                                       {"buckets", Array(std::move(buckets))}});
    }
    std::vector<Value> states;
    states.reserve(channel.states.size());
    for (const auto& state : channel.states)
        states.emplace_back(Dictionary{{"name", state.name},
                                       {"transitions", state.transitions},
                                       {"residency", state.residency},
                                       {"dutyCycle", state.dutyCycle}});
    return description.with("kind", "state").with("states", Array(std::move(states)));
}

void printJson(const ReportingChannel& channel, double time)
{
    std::string line;
    foundation::appendJsonText(Dictionary{{"time", time}}.mergedWith(describe(channel)), line);
    fmt::print("{}\n", line);
}

// --- reading

class ChannelsRun {
public:
    explicit ChannelsRun(const ChannelsOptions& options)
        : options_(options),
          tree_(options.root),
          soundCards_(options.sound),
          table_(options.isWatching)
    {
    }

    void list()
    {
        const ReportingSample sample = read();
        if (!sample.channels.empty() || options_.isJson)
            print(sample);
        else if (hasSucceeded())
            fmt::print("No channels are published in {}.\n", options_.root.native());
    }

    // Prints the changes after each interval.
    void watch()
    {
        const std::chrono::duration<double> interval(options_.interval);
        if (!options_.isJson)
            table_.printHead();
        ReportingSample before = read();
        for (std::size_t look = 0; look < options_.count.value_or(SIZE_MAX); ++look) {
            std::fflush(stdout);
            std::this_thread::sleep_for(interval);
            ReportingSample now = read();
            ReportingSample difference = platform::channelDifference(before, now);
            std::erase_if(difference.channels, [](const ReportingChannel& channel) { return !hasChanged(channel); });
            printRows(difference);
            before = std::move(now);
        }
    }

    // Whether the last reading of the tree succeeded.
    [[nodiscard]] bool hasSucceeded() const { return failure_.empty(); }

private:
    using Lines = std::vector<std::string>;

    // Prints each problem when it first occurs.
    ReportingSample read()
    {
        auto reading = tree_.read({options_.selection});
        ReportingSample sample{.channels = {}, .isWhole = reading && reading->isWhole};
        if (reading) {
            sample.cutUsers = std::move(reading->cutUsers);
            reportProblems(std::move(reading->problems));
            reportOnce(reading->leftOut.inWords({}), limits_);
            sample.channels = std::move(reading->channels);
        }
        reportOnce(reading ? Lines() : Lines{options_.root.native() + ": " + reading.error().message()}, failure_);
        std::ranges::move(soundCards_.read({options_.selection}), std::back_inserter(sample.channels));
        return sample;
    }

    void reportProblems(std::vector<platform::ChannelProblem> problems)
    {
        for (const auto& problem : problems)
            if (!std::ranges::binary_search(problems_, problem))
                fmt::print(stderr, "kesto: channel {} is left out: {}\n", printable(problem.path), problem.reason);
        problems_ = std::move(problems);
    }

    static void reportOnce(Lines lines, Lines& reported)
    {
        if (lines != reported)
            for (const std::string& line : lines)
                fmt::print(stderr, "kesto: {}\n", line);
        reported = std::move(lines);
    }

    void print(const ReportingSample& sample) const
    {
        if (!options_.isJson)
            table_.printHead();
        printRows(sample);
    }

    void printRows(const ReportingSample& sample) const
    {
        const double time = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
        for (const ReportingChannel& channel : sample.channels) {
            if (options_.isJson)
                printJson(channel, time);
            else
                table_.print(channel, time);
        }
    }

    const ChannelsOptions& options_;
    const platform::ChannelTree tree_;
    const platform::SoundCards soundCards_;
    const ChannelTable table_;
    std::vector<platform::ChannelProblem> problems_; // of the last reading
    Lines limits_; // that it exceeded
    Lines failure_; // why it failed
};

} // namespace

void addChannelsCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<ChannelsOptions>();
    CLI::App* command =
        application.add_subcommand("channels", "Lists the channels of drivers, or watches their changes");
    command->add_option("--root", options->root, "The channel tree, if it is not at its usual place");
    command->add_option("--sound", options->sound, "The kernel's directory of sound cards, if not /proc/asound");
    command->add_option("--group", options->selection.group, "Only channels of this group");
    command->add_option("--subgroup", options->selection.subgroup, "Only channels of this subgroup");
    CLI::Option* watch = command->add_flag("--watch", options->isWatching, "Go on, and print changes");
    command->add_option("--interval", options->interval, "Seconds between two samples, 0.01 to 86400; 1 by default")
        ->check(secondsToWait())
        ->needs(watch);
    command->add_option("--count", options->count, "End after this many intervals")
        ->check(CLI::NonNegativeNumber)
        ->needs(watch);
    command->add_flag("--json", options->isJson, "One JSON object in each line, for programs");
    command->callback([options, &exitStatus] {
        if (options->root.empty())
            options->root = usualRoot();
        ChannelsRun run(*options);
        if (options->isWatching)
            run.watch();
        else
            run.list();
        exitStatus = run.hasSucceeded() ? exitOk : exitFailure;
    });
}
