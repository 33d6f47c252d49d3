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
    const History history = readHistory(options.database, options.question);
    span.until = std::min(span.until, present()); // what runs counts up to now
    return makeReport(history, span, options.question.isRecording, dayStart);
}

constexpr std::array allTables{ReportBy::Day,    ReportBy::Application, ReportBy::Device,
                               ReportBy::Volume, ReportBy::Format,      ReportBy::Fault};

std::string textOf(const Report& report, const ReportOptions& options)
{
    const auto chosen = std::ranges::find_if(allTables, [&options](ReportBy by) { return name(by) == options.by; });
    const bool isChosen = chosen != allTables.end();
    if (options.isJson)
        return reportJson(report);
    if (options.isCsv)
        return reportCsv(report, isChosen ? *chosen : ReportBy::Day);
    const std::vector<ReportBy> tables =
        isChosen ? std::vector{*chosen} : std::vector{ReportBy::Day, ReportBy::Application};
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
    const std::string page =
        reportPage(report,
                   {.host = hostName(),
                    .database = options.database,
                    .made = present(),
                    .timeZone = timeZoneName(options.isUTC)
                        + (options.dayStarts ? ", each from " + *options.dayStarts : std::string()),
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
        command->add_option("--by", options->by, "One table: by day, application, device, volume, format or fault")
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
    command->callback([options, &exitStatus] {
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
