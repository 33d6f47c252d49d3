// SPDX-License-Identifier: Apache-2.0
// A table of keys for each table of the file. Nothing is guessed: a key that is not known, or a value that does not
// fit, is an error, because a program that stores the reports of a fleet must not store them elsewhere.
#include "kesto-ingest/Configuration.h"

#include "fleet-database/Credentials.h"

#include <fmt/format.h>
#include <fmt/ranges.h>

#include <algorithm>
#include <iterator>
#include <optional>
#include <ranges>
#include <string_view>

namespace kesto_ingest {

using fleet_database::readCredentials;
using fleet_database::textIn;
using foundation::Dictionary;
using foundation::Value;

namespace {

// What is read: the configuration, and the files with the credentials.
struct Reading {
    Configuration configuration;
    std::string streamCredentials;
    std::string databaseCredentials;
};

struct Setting {
    std::string_view table;
    std::string_view key;
    std::string_view expected;
    bool (*read)(const Value& value, Reading& reading); // false: it is a wrong one
};

bool readText(const Value& value, std::string& setting)
{
    setting = value.stringView();
    return value.kind() == Value::Kind::String && !setting.empty();
}

bool readServers(const Value& value, std::initializer_list<std::string_view> schemes, std::vector<std::string>& servers)
{
    const auto array = value.array();
    servers.clear();
    for (const Value& each : array.value_or(foundation::Array())) {
        const std::string_view server = each.stringView();
        if (!std::ranges::any_of(schemes, [server](std::string_view scheme) { return server.starts_with(scheme); }))
            return false;
        servers.emplace_back(server.ends_with('/') ? server.substr(0, server.size() - 1) : server);
    }
    return !servers.empty();
}

std::optional<double> numberBetween(const Value& value, double least, double most)
{
    const auto number = value.number();
    if (!number || number->kind() == foundation::Number::Kind::Boolean || !(number->doubleValue() >= least)
        || number->doubleValue() > most)
        return std::nullopt;
    return number->doubleValue();
}

// Sets a duration or a count from a number in these bounds.
template <typename Target> bool readNumber(const Value& value, double least, double most, double unit, Target& target)
{
    const auto number = numberBetween(value, least, most);
    if (number)
        target = Target(static_cast<std::int64_t>(*number * unit));
    return number.has_value();
}

bool readTexts(const Value& value, std::map<std::string, std::string>& texts)
{
    const auto dictionary = value.dictionary();
    for (const auto& [key, each] : dictionary.value_or(Dictionary())) {
        if (each.kind() != Value::Kind::String && each.kind() != Value::Kind::Number)
            return false;
        texts[std::string(key.view())] = each.text();
    }
    return dictionary.has_value();
}

constexpr Setting settings[] = {
    {"stream", "servers", R"(a list such as ["nats://127.0.0.1:4222"])",
     [](const Value& value, Reading& reading) {
         return readServers(value, {"nats://", "tls://"}, reading.configuration.stream.servers);
     }},
    {"stream", "credentials", "the path of a file",
     [](const Value& value, Reading& reading) { return readText(value, reading.streamCredentials); }},
    {"stream", "certificate_authority", "the path of a file",
     [](const Value& value, Reading& reading) {
         return readText(value, reading.configuration.stream.certificateAuthority);
     }},
    {"stream", "time_limit_seconds", "a number from 1 to 60",
     [](const Value& value, Reading& reading) {
         return readNumber(value, 1, 60, 1000, reading.configuration.stream.timeLimit);
     }},
    {"database", "servers", R"(a list such as ["http://127.0.0.1:8123"])",
     [](const Value& value, Reading& reading) {
         return readServers(value, {"http://", "https://"}, reading.configuration.database.servers);
     }},
    {"database", "name", "a text",
     [](const Value& value, Reading& reading) { return readText(value, reading.configuration.database.database); }},
    {"database", "credentials", "the path of a file",
     [](const Value& value, Reading& reading) { return readText(value, reading.databaseCredentials); }},
    {"database", "certificate_authority", "the path of a file",
     [](const Value& value, Reading& reading) {
         return readText(value, reading.configuration.database.certificateAuthority);
     }},
    {"database", "time_limit_seconds", "a number from 1 to 600",
     [](const Value& value, Reading& reading) {
         return readNumber(value, 1, 600, 1, reading.configuration.database.timeLimit);
     }},
    {"database", "settings", "a table such as { insert_quorum = 2 }",
     [](const Value& value, Reading& reading) { return readTexts(value, reading.configuration.database.settings); }},
    {"batches", "rows", "a number from 1 to 100000",
     [](const Value& value, Reading& reading) {
         return readNumber(value, 1, 100'000, 1, reading.configuration.rowsInABlock);
     }},
    {"batches", "seconds", "a number from 0.01 to 30",
     [](const Value& value, Reading& reading) {
         return readNumber(value, 0.01, 30, 1000, reading.configuration.longestJoining);
     }},
    {"metrics", "port", "a number from 0 to 65535",
     [](const Value& value, Reading& reading) {
         return readNumber(value, 0, 65535, 1, reading.configuration.metricsPort);
     }},
};

std::unexpected<std::string> problem(const std::filesystem::path& file, std::string_view what)
{
    return std::unexpected(fmt::format("{}: {}", file.native(), what));
}

std::expected<void, std::string> readTable(const std::filesystem::path& file, std::string_view table,
                                           const Dictionary& values, Reading& reading)
{
    std::vector<Setting> known;
    std::ranges::copy_if(settings, std::back_inserter(known),
                         [table](const Setting& each) { return each.table == table; });
    for (const auto& [key, value] : values) {
        const auto setting = std::ranges::find(known, key.view(), &Setting::key);
        if (setting == known.end())
            return problem(file,
                           fmt::format("unknown key {} in [{}]; the keys are {}", key.view(), table,
                                       fmt::join(known | std::views::transform(&Setting::key), ", ")));
        if (!setting->read(value, reading))
            return problem(file,
                           fmt::format("{}.{} = {} should be {}", table, key.view(), value.text(), setting->expected));
    }
    return {};
}

} // namespace

std::expected<Configuration, std::string> readConfiguration(const std::filesystem::path& file)
{
    const auto values = fleet_database::readToml(file);
    if (!values)
        return std::unexpected(values.error());
    Reading reading;
    for (const auto& [name, value] : *values) {
        const auto table = value.dictionary();
        if (!table || std::ranges::find(settings, name.view(), &Setting::table) == std::end(settings))
            return problem(file,
                           fmt::format("there is no [{}]; the tables are [stream], [database], [batches] and [metrics]",
                                       name.view()));
        if (auto read = readTable(file, name.view(), *table, reading); !read)
            return std::unexpected(read.error());
    }
    const auto stream = readCredentials(reading.streamCredentials, {"user", "password", "nkey", "nkey_seed_file"});
    const auto database = readCredentials(reading.databaseCredentials, {"user", "password"});
    if (!stream || !database)
        return std::unexpected(!stream ? stream.error() : database.error());
    reading.configuration.stream.user = textIn(*stream, "user");
    reading.configuration.stream.password = textIn(*stream, "password");
    reading.configuration.stream.nkey = textIn(*stream, "nkey");
    reading.configuration.stream.nkeySeedFile = textIn(*stream, "nkey_seed_file");
    reading.configuration.database.user = textIn(*database, "user");
    reading.configuration.database.password = textIn(*database, "password");
    return reading.configuration;
}

} // namespace kesto_ingest
