// SPDX-License-Identifier: Apache-2.0
// `kesto report`: what was played or recorded in a span of time, as tables for people, as CSV, as JSON and as a page.
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/Terminal.h"
#include "kesto/files/OutputFile.h"
#include "kesto/report/Calendar.h"
#include "kesto/report/Report.h"
#include "kesto/report/ReportCsv.h"
#include "kesto/report/ReportJson.h"
#include "kesto/report/ReportText.h"
#include "kesto/report/fleet/FleetReport.h"
#include "kesto/report/page/ReportPage.h"
#include "kesto/results/MomentText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <climits>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <string>
#include <unistd.h>
#include <vector>

namespace {

using std::chrono::days;
using std::chrono::sys_days;

struct ReportOptions {
    std::filesystem::path database;
    HistoryQuestion question;
    std::optional<std::string> since;
    std::optional<std::string> until;
    std::optional<std::string> dayStarts;
    std::string by;
    bool isUTC = false;
    bool isCsv = false;
    bool isJson = false;
    std::optional<std::string> page; // the path of the file; "-": standard output
    FleetAddress fleet; // without servers: the report of this device
    std::string unit;
    unsigned timeLimit = 30; // seconds

    [[nodiscard]] bool isOfFleet() const { return !fleet.database.servers.empty(); }
};

// The last day of the report and the six before it are a week.
constexpr days daysBefore{6};

double present()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

CLI::ValidationError wrong(const std::string& option, const std::string& text, const std::string& what)
{
    return CLI::ValidationError(option, "\"" + text + "\" is not a " + what);
}

double momentOf(const std::string& option, const std::string& text)
{
    const auto moment = parseMoment(text);
    if (!moment)
        throw wrong(option, text, "time: write 90s, 10m, 2h, 7d or 2026-01-31T18:00:00");
    return *moment;
}

// "HH:MM"
std::chrono::minutes dayStartOf(const std::string& text)
{
    constexpr unsigned hoursADay = 24;
    constexpr unsigned minutesAnHour = 60;
    unsigned hours = hoursADay;
    unsigned minutes = minutesAnHour;
    const char* const end = text.data() + text.size();
    const auto colon = std::from_chars(text.data(), end, hours);
    const bool hasColon = colon.ec == std::errc() && colon.ptr != end && *colon.ptr == ':';
    const bool isWhole = hasColon && std::from_chars(colon.ptr + 1, end, minutes).ptr == end;
    if (!isWhole || hours >= hoursADay || minutes >= minutesAnHour)
        throw wrong("--day-starts", text, "time of day: write HH:MM, such as 04:00");
    return std::chrono::hours(hours) + std::chrono::minutes(minutes);
}

// Every time that is read or shown is then in UTC.
void useUTC()
{
    ::setenv("TZ", "UTC0", 1);
    ::tzset();
}

constexpr std::array allTables{ReportBy::Day,    ReportBy::Application, ReportBy::Device,
                               ReportBy::Volume, ReportBy::Format,      ReportBy::Fault,
                               ReportBy::Model,  ReportBy::Version,     ReportBy::Unit};

// None if `--by` is not there.
std::optional<ReportBy> chosenTable(const ReportOptions& options)
{
    const auto* const chosen =
        std::ranges::find_if(allTables, [&options](ReportBy by) { return name(by) == options.by; });
    return chosen == allTables.end() ? std::nullopt : std::optional(*chosen);
}

// What the chosen output shows. People do not read longer tables; programs get all lines.
FleetParts partsOf(const ReportOptions& options)
{
    constexpr std::size_t mostForPeople = 1000;
    const auto chosen = chosenTable(options);
    FleetParts parts{.tables = {ReportBy::Day, ReportBy::Application}};
    if (options.isJson || options.page)
        parts.tables = {allTables.begin(), allTables.end() - 1};
    else if (chosen || options.isCsv)
        parts.tables = {chosen.value_or(ReportBy::Day)};
    parts.mostLines = options.isJson || options.isCsv ? 0 : mostForPeople;
    parts.withSessions = options.isJson || options.isCsv || options.page;
    parts.withOverUnits = parts.withSessions || chosen;
    parts.withWorst = options.isJson || options.page;
    parts.withDaysOfLines = options.page.has_value();
    return parts;
}

Report reportOf(ReportOptions& options)
{
    DayStart dayStart{.afterMidnight = {}, .isUTC = options.isUTC};
    if (options.dayStarts)
        dayStart.afterMidnight = dayStartOf(*options.dayStarts);
    TimeSpan& span = options.question.span;
    if (options.until)
        span.until = momentOf("--until", *options.until);
    const double ends = std::min(span.until, present());
    const sys_days last(dayOf(std::nextafter(ends, 0), dayStart)); // an end at midnight is that of the day before
    span.from = options.since ? momentOf("--since", *options.since) : beginningOf(last - daysBefore, dayStart);
    if (std::max(span.from, calendarSpan.from) >= ends)
        throw CLI::ValidationError(options.since ? "--since" : "--until", "the report would end before it begins");
    if (options.isOfFleet()) {
        span = {.from = std::max(span.from, calendarSpan.from), .until = ends};
        options.fleet.database.timeLimit = std::chrono::seconds(options.timeLimit);
        return makeFleetReport(options.fleet, {.history = options.question, .unit = options.unit}, dayStart,
                               partsOf(options));
    }
    HistoryQuestion question = options.question;
    constexpr double rounding = 1e-5; // the report cuts at whole microseconds
    question.span = {.from = span.from - rounding, .until = span.until + rounding};
    const History history = readHistory(options.database, question);
    span.until = std::min(span.until, present()); // what runs counts up to now
    return makeReport(history, span, options.question.isRecording, dayStart);
}

std::string textOf(const Report& report, const ReportOptions& options)
{
    const auto chosen = chosenTable(options);
    if (options.isJson)
        return reportJson(report);
    if (options.isCsv)
        return reportCsv(report, chosen.value_or(ReportBy::Day));
    const std::vector<ReportBy> tables =
        chosen ? std::vector{*chosen} : std::vector{ReportBy::Day, ReportBy::Application};
    return reportText(report, tables, {.width = outputWidth(), .isUTF8 = showsUTF8()});
}

std::string hostName()
{
    std::array<char, HOST_NAME_MAX + 1> name{};
    return ::gethostname(name.data(), name.size() - 1) == 0 ? name.data() : "this device";
}

// As its tables call it: "Europe/Berlin".
std::string timeZoneName(bool isUTC)
{
    if (isUTC)
        return "UTC";
    std::error_code missing;
    const char* const zone = std::getenv("TZ");
    std::string name = zone == nullptr ? std::filesystem::read_symlink("/etc/localtime", missing).string() : zone;
    if (zone != nullptr && name.empty()) // as the C library has it
        return "UTC";
    if (name.starts_with(':'))
        name.erase(0, 1);
    constexpr std::string_view folder = "zoneinfo/";
    if (const auto place = name.rfind(folder); place != std::string::npos)
        name.erase(0, place + folder.size());
    return name.empty() ? "the time zone of this device" : name;
}

void writePage(const Report& report, const ReportOptions& options)
{
    const std::string page = reportPage(
        report,
        {.host = options.isOfFleet() ? "fleet " + options.fleet.database.database : hostName(),
         .database = options.isOfFleet() ? options.fleet.database.servers.front() : options.database.string(),
         .made = present(),
         .timeZone =
             timeZoneName(options.isUTC) + (options.dayStarts ? ", each from " + *options.dayStarts : std::string()),
         .isUTC = options.isUTC});
    if (*options.page == "-")
        fmt::print("{}", page);
    else
        writeWholeOutput(*options.page, page);
}

std::vector<std::string> tableNames()
{
    std::vector<std::string> names;
    names.reserve(allTables.size());
    for (const ReportBy by : allTables)
        names.emplace_back(name(by));
    return names;
}

CLI::Validator isAddress()
{
    return CLI::Validator(
        [](const std::string& text) {
            return text.starts_with("http://") || text.starts_with("https://")
                ? std::string()
                : "\"" + text + "\" is not an address such as http://127.0.0.1:8123";
        },
        "");
}

CLI::Validator isPseudonym()
{
    return CLI::Validator(
        [](const std::string& text) {
            return text.size() == 32 && text.find_first_not_of("0123456789abcdef") == std::string::npos
                ? std::string()
                : "\"" + text + "\" is not 32 hexadecimal digits, as kesto uplink status shows them";
        },
        "");
}

void addFleetOptions(CLI::App& command, ReportOptions& options)
{
    constexpr unsigned longestTime = 600;
    fleet_database::ClickHouseConfiguration& database = options.fleet.database;
    CLI::Option* fleet =
        command
            .add_option("--fleet", database.servers,
                        "All devices of a fleet, from its database: http://HOST:8123, or several with commas between")
            ->delimiter(',')
            ->expected(1)
            ->check(isAddress())
            ->excludes("--database");
    const auto add = [&](const char* option, auto& value, const char* description) {
        return command.add_option(option, value, description)->needs(fleet);
    };
    add("--unit", options.unit, "Only the device of the fleet with this pseudonym")->check(isPseudonym());
    add("--fleet-database", database.database, "The name of the fleet's database, in place of kesto");
    add("--credentials", options.fleet.credentials, "A file with user and password of the fleet's database");
    add("--certificate-authority", database.certificateAuthority,
        "A PEM file for https://, in place of the authorities of the system");
    add("--time-limit", options.timeLimit, "Seconds for each question to the fleet's database, in place of 30")
        ->check(CLI::Range(1U, longestTime));
}

} // namespace

void addReportCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<ReportOptions>();
    CLI::App* command = application.add_subcommand(
        "report", "Shows what was played: by day and by application, of this day and the six before it");
    command->add_option("--database", options->database, "The event store, if it is not at its usual place");
    command->add_option("--since", options->since,
                        "From then on, in place of seven days: 90s, 10m, 2h, 30d ago, or a time such as 2026-01-31");
    command->add_option("--until", options->until, "Until then, in place of now: as for --since");
    CLI::Option* by =
        command
            ->add_option("--by", options->by,
                         "One table: by day, application, device, volume, format or fault; with --fleet also by model, "
                         "version or unit, which is a device of the fleet")
            ->check(CLI::IsMember(tableNames()).description(""));
    command->add_option("--application", options->question.applications,
                        "Only applications with matching names, such as 'org.example.*'");
    command->add_option("--device", options->question.devices, "Only matching devices, such as '*headset*'");
    command->add_option("--day-starts", options->dayStarts, "When a day begins, in place of midnight, such as 04:00");
    command->add_flag("--utc", options->isUTC, "Days and times of UTC, in place of this device's time zone");
    command->add_flag("--recording", options->question.isRecording, "What was recorded, in place of what was played");
    CLI::Option* csv = command->add_flag("--csv", options->isCsv, "One table as CSV, by day if --by says no other");
    CLI::Option* json =
        command->add_flag("--json", options->isJson, "All figures as one JSON object, for programs")->excludes(csv);
    command
        ->add_option("--html", options->page,
                     "A page with pictures for a browser, into that file; -: to standard output")
        ->excludes(by)
        ->excludes(csv)
        ->excludes(json);
    addFleetOptions(*command, *options);
    command->callback([options, &exitStatus] {
        if (const auto chosen = chosenTable(*options); !options->isOfFleet() && chosen && *chosen >= ReportBy::Model)
            throw CLI::ValidationError("--by", options->by + " is known of a fleet only: name its database by --fleet");
        if (options->database.empty())
            options->database = usualDatabase();
        if (options->isUTC)
            useUTC();
        const Report report = reportOf(*options);
        if (options->page)
            writePage(report, *options);
        else
            fmt::print("{}", textOf(report, *options));
        exitStatus = exitOk;
    });
}
