// SPDX-License-Identifier: Apache-2.0
// Each setting has a line in a table, and each table of rules is read by the same function. A problem names the line of
// the key that it is about.
#include "kesto-uplink/rules/UplinkConfiguration.h"

#include "platform/linux/files/SmallFile.h"
#include "platform/linux/settings/CheckedSettings.h"
#include "platform/linux/settings/TomlFile.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <optional>
#include <ranges>
#include <span>
#include <utility>

namespace kesto_uplink {

using foundation::Dictionary;
using foundation::Value;
using platform::Setting;

namespace {

// --- Settings

constexpr double longestInterval = 7.0 * 86'400;

// Receivers write a label into each row.
constexpr std::size_t longestLabel = 128;

bool readLabel(const Value& value, std::string& setting)
{
    setting = value.stringView();
    return !setting.empty() && setting.size() <= longestLabel;
}

bool readPath(const Value& value, std::filesystem::path& setting)
{
    setting = value.stringView();
    return setting.is_absolute();
}

bool readPositive(const Value& value, double& setting)
{
    const auto number = platform::positiveNumberOf(value);
    setting = number.value_or(setting);
    return number && std::isfinite(*number);
}

bool isServer(const std::string& server)
{
    return (server.starts_with("tls://") || server.starts_with("nats://")) && !server.ends_with('/');
}

constexpr Setting<UplinkConfiguration> settings[] = {
    {"enabled", "true or false",
     [](const Value& value, UplinkConfiguration& to) { return platform::readBoolean(value, to.enabled); }},
    {"servers", "a list of servers such as [\"tls://reports.example:4222\"]",
     [](const Value& value, UplinkConfiguration& to) {
         return platform::readStrings(value, to.servers) && std::ranges::all_of(to.servers, isServer);
     }},
    {"credentials", "the path of a file, from the root on",
     [](const Value& value, UplinkConfiguration& to) { return readPath(value, to.credentials); }},
    {"ca", "the path of a file, from the root on",
     [](const Value& value, UplinkConfiguration& to) { return readPath(value, to.ca); }},
    {"pseudonym_days", "a number of days above 0",
     [](const Value& value, UplinkConfiguration& to) { return readPositive(value, to.pseudonymDays); }},
    {"hash_key_days", "a number of days above 0",
     [](const Value& value, UplinkConfiguration& to) { return readPositive(value, to.hashKeyDays); }},
    {"forget", "\"stored\" or \"queued\"",
     [](const Value& value, UplinkConfiguration& to) {
         to.forgetWhen = value == Value("queued") ? ForgetWhen::Queued : ForgetWhen::Stored;
         return value == Value("queued") || value == Value("stored");
     }},
    {"interval", "a number of seconds above 0, a week at most",
     [](const Value& value, UplinkConfiguration& to) {
         return readPositive(value, to.intervalSeconds) && to.intervalSeconds <= longestInterval;
     }},
    {"maximum_bytes_a_day", "a whole number of bytes, at least 524288, which is the largest batch",
     [](const Value& value, UplinkConfiguration& to) {
         const auto bytes = value.exactly<std::uint64_t>();
         to.maximumBytesADay = bytes.value_or(to.maximumBytesADay);
         return bytes.value_or(0) >= largestBatch;
     }},
    {"metered", "true or false",
     [](const Value& value, UplinkConfiguration& to) { return platform::readBoolean(value, to.metered); }}};

constexpr std::array<std::string_view, 4> tables = {"device", "events", "stretches", "sessions"};

constexpr Setting<UplinkConfiguration> labels[] = {
    {"model", "a text of 1 to 128 bytes",
     [](const Value& value, UplinkConfiguration& to) { return readLabel(value, to.model); }},
    {"version", "a text of 1 to 128 bytes",
     [](const Value& value, UplinkConfiguration& to) { return readLabel(value, to.version); }}};

auto keysOf(std::span<const Setting<UplinkConfiguration>> of)
{
    return of | std::views::transform(&Setting<UplinkConfiguration>::key);
}

// --- Rules

struct Column {
    struct Range {
        std::int64_t least = 0;
        std::int64_t most = 0;
    };
    std::string_view name;
    bool isNumber = false;
    std::optional<Range> whole = {}; // it is a whole number, and these can be edges
};
constexpr std::int64_t largestWhole = std::int64_t{1} << 53; // up to here, a double has every whole number
constexpr Column stretchColumns[] = {
    {"device"}, {"format"}, {"channels", true, Column::Range{0, 4'294'967'295}}, {"volume", true}, {"application"}};
constexpr Column sessionColumns[] = {
    {"reporter", true, Column::Range{-largestWhole, largestWhole}}, {"service"}, {"application"}, {"process"}};

constexpr std::string_view whatRulesAre = R"("keep", "drop", "hash" or a bucket such as { bucket = [1, 10, 60] })";

std::optional<std::vector<double>> edgesOf(const Value& value)
{
    const auto list = value.array();
    if (!list || list->empty())
        return std::nullopt;
    std::vector<double> edges;
    for (const Value& each : *list) {
        const auto number = each.number();
        if (!number || number->kind() == foundation::Number::Kind::Boolean || !std::isfinite(number->doubleValue())
            || (!edges.empty() && number->doubleValue() <= edges.back()))
            return std::nullopt;
        edges.push_back(number->doubleValue());
    }
    return edges;
}

bool canBeEdges(const std::vector<double>& edges, const Column::Range& range)
{
    return std::ranges::all_of(edges, [&range](double edge) {
        return edge == std::trunc(edge) && edge >= static_cast<double>(range.least)
            && edge <= static_cast<double>(range.most);
    });
}

// --- The file

class Reader {
public:
    Reader(const std::filesystem::path& file, const platform::TomlLines& lines, CheckedUplinkConfiguration& to)
        : file_(file),
          lines_(lines),
          to_(to)
    {
    }

    void read(const Dictionary& values)
    {
        for (const auto& [key, value] : values)
            if (std::ranges::find(tables, key.view()) == tables.end())
                readSetting({std::string(key.view())}, value, settings,
                            ", and the tables [device], [events.\"NAME\"],"
                            " [stretches] and [sessions]");
        forTable(values, "device", [&](const Way& way, const Value& value) { readSetting(way, value, labels); });
        forTable(values, "events", [&](const Way& way, const Value& value) { readEvents(way, value); });
        std::ranges::stable_sort(to_.configuration.allowed.events, {}, &EventRules::line);
        to_.configuration.allowed.stretches = readColumns(values, "stretches", stretchColumns);
        to_.configuration.allowed.sessions = readColumns(values, "sessions", sessionColumns);
        if (to_.configuration.enabled && to_.configuration.servers.empty() && to_.problems.empty())
            problem({"enabled"},
                    "without servers nothing can leave: add servers = [\"tls://HOST:4222\"], or set "
                    "enabled = false");
    }

private:
    using Way = std::vector<std::string>; // from the top to a key

    [[nodiscard]] unsigned lineOf(const Way& way) const
    {
        const auto found = lines_.find(way);
        return found == lines_.end() ? 1 : found->second;
    }

    void problem(const Way& way, std::string_view text)
    {
        to_.problems.push_back(fmt::format("{}:{}: {}", file_.native(), lineOf(way), text));
    }

    void readSetting(const Way& way, const Value& value, std::span<const Setting<UplinkConfiguration>> of,
                     std::string_view others = {})
    {
        const std::string& key = way.back();
        const auto setting = std::ranges::find(of, key, &Setting<UplinkConfiguration>::key);
        if (setting == of.end())
            problem(way,
                    fmt::format("unknown key {}: correct or remove it; the keys here are {}{}", key,
                                fmt::join(keysOf(of), ", "), others));
        else if (!setting->read(value, to_.configuration))
            problem(way, fmt::format("{} = {} should be {}", key, value.text(), setting->expected));
    }

    // Visits the keys of a table, if it is there.
    template <typename Visit> void forTable(const Dictionary& values, const std::string& name, Visit visit)
    {
        const Value* const value = values.find(name);
        if (value == nullptr)
            return;
        const auto table = value->dictionary();
        if (!table)
            return problem(
                {name}, fmt::format("{} = {} should be a table: begin it with a line [{}]", name, value->text(), name));
        for (const auto& [key, inner] : *table)
            visit({name, std::string(key.view())}, inner);
    }

    void readEvents(const Way& way, const Value& value)
    {
        const std::string& names = way.back();
        const auto table = value.dictionary();
        if (!table)
            return problem(way,
                           fmt::format("the rules for events named {0} stand in a table of their own: "
                                       "[events.\"{0}\"]",
                                       names));
        EventRules rules{.names = names, .line = lineOf(way)};
        for (const auto& [key, rule] : *table) {
            Way whole = way;
            whole.emplace_back(key.view());
            if (auto read = readRule(whole, rule))
                rules.rules.push_back(*std::move(read));
        }
        to_.configuration.allowed.events.push_back(std::move(rules));
    }

    std::optional<std::vector<Rule>> readColumns(const Dictionary& values, const std::string& name,
                                                 std::span<const Column> columns)
    {
        if (!values.contains(name))
            return std::nullopt;
        std::vector<Rule> rules;
        forTable(values, name, [&](const Way& way, const Value& value) {
            const auto column = std::ranges::find(columns, way.back(), &Column::name);
            if (column == columns.end())
                return problem(way,
                               fmt::format("unknown column {}: correct or remove it; the columns here are {}",
                                           way.back(),
                                           fmt::join(columns | std::views::transform(&Column::name), ", ")));
            auto rule = readRule(way, value);
            if (rule && column->isNumber && rule->action == Rule::Action::Hash)
                return problem(way,
                               fmt::format("{} is a number, and a hash is not: use \"keep\", \"drop\" or a bucket "
                                           "such as {{ bucket = [1, 10, 60] }}",
                                           way.back()));
            if (rule && column->whole && !canBeEdges(rule->edges, *column->whole))
                return problem(way,
                               fmt::format("the edges of {} should be whole numbers from {} to {}", way.back(),
                                           column->whole->least, column->whole->most));
            if (rule)
                rules.push_back(*std::move(rule));
        });
        return rules;
    }

    std::optional<Rule> readRule(const Way& way, const Value& value)
    {
        Rule rule{.key = way.back(), .line = lineOf(way)};
        if (const auto table = value.dictionary()) {
            const Value* const edges = table->find("bucket");
            if (edges == nullptr || table->size() != 1)
                problem(way,
                        fmt::format("the table {0} is no rule: a rule is {1}. The name of an event stands in "
                                    "quotes: [events.\"com.quarn.kesto.Playback.Stop\"]",
                                    way.back(), whatRulesAre));
            else if (auto read = edgesOf(*edges)) {
                rule.action = Rule::Action::Bucket;
                rule.edges = *std::move(read);
                return rule;
            } else
                problem(way,
                        fmt::format("the edges {} of {} should be numbers, each larger than the one before it, "
                                    "such as [1, 10, 60]",
                                    edges->text(), way.back()));
            return std::nullopt;
        }
        constexpr std::pair<std::string_view, Rule::Action> actions[] = {
            {"keep", Rule::Action::Keep}, {"drop", Rule::Action::Drop}, {"hash", Rule::Action::Hash}};
        const auto* const action =
            std::ranges::find(actions, value.stringView(), &std::pair<std::string_view, Rule::Action>::first);
        if (action != std::end(actions)) {
            rule.action = action->second;
            return rule;
        }
        problem(way, fmt::format("{} = {} is no rule: a rule is {}", way.back(), value.text(), whatRulesAre));
        return std::nullopt;
    }

    const std::filesystem::path& file_;
    const platform::TomlLines& lines_;
    CheckedUplinkConfiguration& to_;
};

} // namespace

CheckedUplinkConfiguration parseUplinkConfiguration(const std::filesystem::path& file, std::string_view text)
{
    CheckedUplinkConfiguration checked;
    const auto document = platform::parseTomlWithLines(text);
    if (!document) {
        const platform::TomlError& error = document.error();
        checked.problems.push_back(fmt::format("{}:{}:{}: {}; correct it, so that the file is TOML again",
                                               file.native(), error.line, error.column, error.reason));
        return checked;
    }
    Reader(file, document->lines, checked).read(document->values);
    return checked;
}

CheckedUplinkConfiguration readUplinkConfiguration(const std::filesystem::path& file)
{
    const auto text = platform::readSmallFile(file, platform::TomlFile::largest);
    if (text)
        return parseUplinkConfiguration(file, *text);
    CheckedUplinkConfiguration checked;
    if (text.error() != std::errc::no_such_file_or_directory)
        checked.problems.push_back(fmt::format("{} cannot be read: {}", file.native(), text.error().message()));
    return checked;
}

} // namespace kesto_uplink
