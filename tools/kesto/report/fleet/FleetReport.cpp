// SPDX-License-Identifier: Apache-2.0
// Answers come as lists of lists in JSON. An answer that is not as its query asked for it is no answer of a database
// with these tables.
#include "kesto/report/fleet/FleetReport.h"

#include "fleet-database/Credentials.h"
#include "foundation/values/Microseconds.h"
#include "kesto/files/JsonReader.h"
#include "kesto/report/Calendar.h"
#include "kesto/report/fleet/FleetQueries.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <fmt/format.h>
#include <limits>
#include <map>
#include <stdexcept>
#include <tuple>
#include <unordered_map>
#include <utility>

namespace {

using fleet_database::Answer;
using fleet_database::ClickHouseConfiguration;
using fleet_database::ClickHouseServers;
using foundation::secondsOf;
using foundation::Value;

constexpr std::size_t longestAnswer = std::size_t{256} * 1024 * 1024;
constexpr std::string_view notReadable = "what the database answers is not what was asked for: is there a proxy in "
                                         "between, or another program at this port?";

// A row of an answer, read from the left to the right.
class Cells {
public:
    explicit Cells(const Value& row) : cells_(row.array().value_or(foundation::Array())) { }

    std::int64_t integer()
    {
        const Value& cell = next();
        if (const auto number = cell.exactly<std::int64_t>())
            return *number;
        std::int64_t number = 0; // those of 64 bits are in quotes
        const std::string_view text = cell.stringView();
        const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
        if (text.empty() || error != std::errc() || end != text.data() + text.size())
            throw std::runtime_error(std::string(notReadable));
        return number;
    }
    std::size_t count() { return static_cast<std::size_t>(integer()); }
    // None of null.
    std::optional<double> real()
    {
        const Value& cell = next();
        return cell.isNull() ? std::nullopt : std::optional(cell.asDouble());
    }
    std::string text() { return std::string(next().stringView()); }
    std::vector<std::string> texts()
    {
        const auto list = next().array().value_or(foundation::Array());
        std::vector<std::string> texts;
        for (const Value& each : list)
            texts.emplace_back(each.stringView());
        return texts;
    }
    std::optional<Distribution> distribution(bool isThere)
    {
        const double median = real().value_or(0);
        const double ninetieth = real().value_or(0);
        const double most = real().value_or(0);
        return isThere ? std::optional(Distribution{median, ninetieth, most}) : std::nullopt;
    }
    // Of a sum: microseconds, muted, without volume, volume, faults.
    PlayedSum sum()
    {
        PlayedSum sum;
        for (std::int64_t* const each : {&sum.microseconds, &sum.muted, &sum.noVolume, &sum.volume})
            *each = integer();
        sum.faults = count();
        return sum;
    }

private:
    const Value& next()
    {
        if (place_ == cells_.size())
            throw std::runtime_error(std::string(notReadable));
        return cells_[place_++];
    }

    foundation::Array cells_;
    std::size_t place_ = 0;
};

class FleetDatabase {
public:
    explicit FleetDatabase(const ClickHouseConfiguration& configuration)
        : configuration_(configuration),
          servers_(configuration, longestAnswer)
    {
        const auto edition = servers_.edition();
        if (!edition)
            throw failure(edition.error());
        if (*edition == 0)
            throw std::runtime_error(fmt::format("the database {} has no tables: make them by `kesto-ingest tables | "
                                                 "clickhouse-client --multiquery`, or name another one with "
                                                 "--fleet-database",
                                                 configuration_.database));
        if (*edition != fleet_database::tablesEdition)
            throw std::runtime_error(fmt::format("the tables in the database {} are of edition {}, and this program "
                                                 "reads edition {}: update the older of the two",
                                                 configuration_.database, *edition, fleet_database::tablesEdition));
        limitTime();
    }

    template <typename Read> void ask(const std::string& query, Read read)
    {
        const Answer answer =
            servers_.ask("", query + " FORMAT JSONCompact", [](const Answer& each) { return each.status != 0; });
        if (!answer.isGood())
            throw failure(answer.text);
        if (answer.isCut)
            throw std::runtime_error(fmt::format("the database answers with more than {} bytes: ask for a shorter "
                                                 "span, or for less by --application, --device or --unit",
                                                 longestAnswer));
        const auto parsed = parseJson(answer.text);
        const auto whole = parsed ? parsed->dictionary() : std::nullopt;
        const Value* const data = whole ? whole->find("data") : nullptr;
        const auto rows = data == nullptr ? std::nullopt : data->array();
        if (!rows)
            throw fleet_database::exceptionCode(answer.text) != 0 ? failure(answer.text)
                                                                  : std::runtime_error(std::string(notReadable));
        for (const Value& row : *rows) {
            Cells cells(row);
            read(cells);
        }
    }

private:
    // Of the server, too, which else goes on when nobody waits any more. Who may only read may not say so.
    void limitTime()
    {
        static constexpr std::string_view mayOnlyRead = "1";
        ask("SELECT value FROM system.settings WHERE name = 'readonly'", [this](Cells& row) {
            if (row.text() != mayOnlyRead)
                servers_.set("max_execution_time", std::to_string(configuration_.timeLimit.count()));
        });
    }

    [[nodiscard]] std::runtime_error failure(const std::string& text) const
    {
        constexpr int tookTooLong = 159;
        constexpr int wrongPassword = 193;
        constexpr int requiredPassword = 194;
        constexpr int unknownUser = 192;
        switch (fleet_database::exceptionCode(text)) {
        case unknownUser:
        case wrongPassword:
        case requiredPassword:
            return std::runtime_error(
                fmt::format("the database refuses the user {}: name a file with another user and password by "
                            "--credentials ({})",
                            configuration_.user.empty() ? "default" : configuration_.user, text));
        case tookTooLong:
        case 0:
            return std::runtime_error(
                fmt::format("the database of the fleet cannot be asked: {}{}", text,
                            text.contains("timed out") || fleet_database::exceptionCode(text) == tookTooLong
                                ? ". --time-limit gives it more time"
                                : ""));
        default: return std::runtime_error("the database of the fleet refuses a question: " + text);
        }
    }

    const ClickHouseConfiguration& configuration_;
    ClickHouseServers servers_;
};

// When each day begins, and when the last ends.
std::vector<std::int64_t> boundaries(const std::vector<ReportDay>& days, const TimeSpan& span)
{
    std::vector<std::int64_t> moments;
    moments.reserve(days.size() + 1);
    for (const ReportDay& day : days)
        moments.push_back(foundation::wholeMicroseconds(day.span.from));
    moments.push_back(foundation::wholeMicroseconds(span.until));
    return moments;
}

// A line whose sum is still whole numbers.
struct SummedLine {
    std::string key;
    PlayedSum sum;
    std::optional<OverUnits> overUnits = {};
    std::size_t others = 0;
};

std::vector<ReportLine> sorted(std::vector<SummedLine> lines)
{
    std::ranges::sort(lines, [](const SummedLine& one, const SummedLine& other) {
        return std::tie(one.others, other.sum.microseconds, other.sum.faults, one.key)
            < std::tie(other.others, one.sum.microseconds, one.sum.faults, other.key);
    });
    std::vector<ReportLine> finished;
    finished.reserve(lines.size());
    for (SummedLine& line : lines)
        finished.push_back({.key = std::move(line.key),
                            .played = line.sum.played(),
                            .overUnits = line.overUnits,
                            .others = line.others});
    return finished;
}

std::string_view columnOf(ReportBy by)
{
    switch (by) {
    case ReportBy::Device: return "audio_device";
    case ReportBy::Unit: return "device";
    default: return name(by);
    }
}

class FleetReportMaker {
public:
    FleetReportMaker(const ClickHouseConfiguration& configuration, const FleetQuestion& question, DayStart dayStart,
                     const FleetParts& parts)
        : question_(question),
          dayStart_(dayStart),
          parts_(parts),
          report_(makeReport({}, question.history.span, question.history.isRecording, dayStart)),
          database_(configuration),
          queries_(question, boundaries(report_.days, report_.span))
    {
        report_.fleet.emplace();
    }

    Report make()
    {
        database_.ask(FleetQueries::present(),
                      [this](Cells& row) { queries_.setPresent(std::to_string(row.integer())); });
        database_.ask(queries_.anyFault(), [this](Cells&) { hasFaults_ = true; });
        queries_.setHasFaults(hasFaults_);
        if (hasFaults_)
            readRecordings();
        const HistoryQuestion& asked = question_.history;
        const bool isOfAllRows = asked.applications == "*" && asked.devices == "*";
        const std::vector<std::string> doubled = isOfAllRows ? readAll() : readDoubled();
        queries_.setDoubled(doubled);
        if (!isOfAllRows || !doubled.empty())
            readAll();
        for (const ReportBy by : parts_.tables)
            readTable(by);
        if (parts_.withDaysOfLines)
            readDaysOfLines();
        if (parts_.withWorst)
            readWorst();
        return std::move(report_);
    }

private:
    FleetPart& fleet() { return *report_.fleet; }

    std::vector<FleetSession> readSessions(const std::string& query)
    {
        std::vector<FleetSession> sessions;
        database_.ask(query, [&](Cells& row) {
            std::string store = row.text();
            sessions.push_back({std::move(store), row.text()});
        });
        return sessions;
    }

    void readRecordings()
    {
        std::vector<FleetSession> recordings = readSessions(queries_.recordings());
        if (!recordings.empty() && !report_.isRecording)
            recordings = readSessions(queries_.onlyRecordings(recordings));
        queries_.setRecordings(recordings);
    }

    std::vector<std::string> readDoubled()
    {
        std::vector<std::string> doubled;
        database_.ask(queries_.doubled(), [&](Cells& row) { doubled.push_back(row.text()); });
        return doubled;
    }

    // The units of which the database has rows twice: the figures are then wrong.
    std::vector<std::string> readAll()
    {
        std::vector<std::string> doubled;
        database_.ask(queries_.all(), [&](Cells& row) {
            PlayedSum all = row.sum();
            all.sessions = row.count();
            report_.all = all.played();
            report_.vanished = row.count();
            OverUnits& units = fleet().overUnits;
            units.units = row.count();
            fleet().hours = row.distribution(units.units != 0);
            if (fleet().hours)
                for (double* const each : {&fleet().hours->median, &fleet().hours->ninetieth, &fleet().hours->most})
                    *each = *each / foundation::millionthsOfOne / secondsAnHour;
            units.compared = row.count();
            units.faultsAnHour = row.distribution(units.compared != 0);
            if (row.real().value_or(0) >= static_cast<double>(std::numeric_limits<std::int64_t>::max()))
                throw std::runtime_error("the stretches of the span have more than 292,000 years together, which no "
                                         "device plays: ask for a shorter span, or for one unit by --unit");
            doubled = row.texts();
            worstUnits_ = row.texts();
        });
        return doubled;
    }

    void readTable(ReportBy by)
    {
        switch (by) {
        case ReportBy::Day: readDays(); break;
        case ReportBy::Volume: readVolumes(); break;
        case ReportBy::Fault:
            if (hasFaults_)
                readFaultKinds();
            break;
        case ReportBy::Unit: fleet().units = sorted(readLines(by)); break;
        case ReportBy::Application: report_.applications = sorted(readLines(by)); break;
        case ReportBy::Device: report_.devices = sorted(readLines(by)); break;
        case ReportBy::Format: report_.formats = sorted(readLines(by)); break;
        case ReportBy::Model: fleet().models = sorted(readLines(by)); break;
        case ReportBy::Version: fleet().versions = sorted(readLines(by)); break;
        }
    }

    std::vector<SummedLine> readLines(ReportBy by)
    {
        const std::size_t most = by == ReportBy::Day ? 0 : parts_.mostLines;
        const LineFigures asked{
            .withSessions = parts_.withSessions,
            .withOverUnits = parts_.withOverUnits && by != ReportBy::Day && by != ReportBy::Unit,
        };
        std::vector<SummedLine> lines;
        database_.ask(queries_.lines(columnOf(by), asked, most), [&](Cells& row) {
            SummedLine& line = lines.emplace_back(row.text());
            std::string hash = row.text();
            if (parts_.withDaysOfLines)
                hashes_[line.key] = std::move(hash);
            line.sum = row.sum();
            if (asked.withSessions)
                line.sum.sessions = row.count();
            if (!asked.withOverUnits)
                return;
            OverUnits& units = line.overUnits.emplace();
            units.units = row.count();
            units.compared = row.count();
            units.faultsAnHour = row.distribution(units.compared != 0);
        });
        if (most != 0 && lines.size() == most)
            addOthers(by, lines);
        return lines;
    }

    // One line for all that were not asked for.
    void addOthers(ReportBy by, std::vector<SummedLine>& lines)
    {
        SummedLine others;
        database_.ask(queries_.sumOfLines(columnOf(by)), [&](Cells& row) {
            others.others = row.count() - lines.size();
            others.sum = row.sum();
        });
        for (const SummedLine& line : lines) {
            others.sum.microseconds -= line.sum.microseconds;
            others.sum.muted -= line.sum.muted;
            others.sum.noVolume -= line.sum.noVolume;
            others.sum.volume -= line.sum.volume;
            others.sum.faults -= line.sum.faults;
        }
        if (others.others != 0)
            lines.push_back(std::move(others));
    }

    // Their keys are numbers of days.
    void readDays()
    {
        for (const SummedLine& line : readLines(ReportBy::Day)) {
            const auto day = static_cast<std::size_t>(std::stoull("0" + line.key));
            if (day < report_.days.size())
                report_.days[day].played = line.sum.played();
        }
    }

    // Of the first lines of a table.
    template <typename Keep> void readDaysOf(ReportBy by, const std::vector<ReportLine>& lines, Keep keep)
    {
        std::map<std::string, std::size_t> ranks; // by hash
        std::vector<std::string> hashes;
        for (const ReportLine& line : lines) {
            if (hashes.size() == Report::mostInDays)
                break;
            hashes.push_back(hashes_[line.key]);
            ranks[hashes.back()] = hashes.size() - 1;
        }
        if (hashes.empty())
            return;
        database_.ask(queries_.daysOf(columnOf(by), hashes), [&](Cells& row) {
            const std::string key = row.text(); // the number of the day, a blank, and the hash of the line's key
            const std::size_t blank = key.find(' ');
            const auto day = static_cast<std::size_t>(std::stoull("0" + key.substr(0, blank)));
            const auto rank = blank == std::string::npos ? ranks.end() : ranks.find(key.substr(blank + 1));
            if (day < report_.days.size() && rank != ranks.end())
                keep(report_.days[day], rank->second, row.sum().played());
        });
    }

    void readDaysOfLines()
    {
        for (ReportDay& day : report_.days) {
            day.byApplication.resize(std::min(report_.applications.size(), Report::mostInDays));
            day.byDevice.resize(std::min(report_.devices.size(), Report::mostInDays));
        }
        readDaysOf(
            ReportBy::Application, report_.applications,
            [](ReportDay& day, std::size_t rank, const Played& played) { day.byApplication[rank] = played.seconds; });
        readDaysOf(ReportBy::Device, report_.devices,
                   [](ReportDay& day, std::size_t rank, const Played& played) { day.byDevice[rank] = played; });
    }

    void readVolumes()
    {
        database_.ask(queries_.volumes(), [this](Cells& row) {
            const std::size_t step = row.count();
            report_.secondsAtVolume.at(std::min(step, Report::volumeSteps - 1)) = secondsOf(row.integer());
        });
    }

    void readFaultKinds()
    {
        database_.ask(queries_.faultKinds(parts_.mostLines), [this](Cells& row) {
            ReportLine line{.key = row.text(), .played = {}};
            line.played.faults = row.count();
            line.played.sessions = row.count();
            report_.faultKinds.push_back(std::move(line));
        });
        std::ranges::sort(report_.faultKinds, [](const ReportLine& one, const ReportLine& other) {
            return std::tie(other.played.faults, one.key) < std::tie(one.played.faults, other.key);
        });
        if (parts_.mostLines == 0 || report_.faultKinds.size() != parts_.mostLines)
            return;
        ReportLine others;
        database_.ask(queries_.sumOfFaultKinds(), [&](Cells& row) {
            others.others = row.count() - report_.faultKinds.size();
            others.played.faults = row.count();
        });
        for (const ReportLine& line : report_.faultKinds)
            others.played.faults -= line.played.faults;
        if (others.others != 0)
            report_.faultKinds.push_back(std::move(others));
    }

    std::vector<SummedLine> readUnits(const std::vector<std::string>& hashes)
    {
        std::vector<SummedLine> lines;
        database_.ask(queries_.units(hashes), [&](Cells& row) {
            SummedLine line{.key = row.text(), .sum = {}, .overUnits = {}};
            std::string model = row.text();
            labels_[line.key] = {std::move(model), row.text()};
            line.sum = row.sum();
            line.sum.sessions = row.count();
            lines.push_back(std::move(line));
        });
        return lines;
    }

    void readWorst()
    {
        report_.faultless = report_.all.sessions;
        if (!hasFaults_)
            return;
        readWorstUnits();
        readWorstSessions();
    }

    void readWorstUnits()
    {
        if (worstUnits_.empty())
            return;
        for (ReportLine& line : sorted(readUnits(worstUnits_))) {
            const auto& [model, version] = labels_[line.key];
            fleet().worst.push_back({.unit = line.key, .model = model, .version = version, .played = line.played});
        }
        std::ranges::stable_sort(fleet().worst, std::greater(),
                                 [](const WorstUnit& each) { return each.played.faultsAnHour().value_or(0); });
    }

    // --- Sessions

    using SessionName = std::vector<std::string>; // unit, epoch, ID

    static SessionName sessionIn(Cells& row)
    {
        SessionName name;
        for (int cell = 0; cell < 3; ++cell)
            name.push_back(row.text());
        return name;
    }

    // Each is a history of its own, of which the device's own report makes the figures.
    void readWorstSessions()
    {
        database_.ask(queries_.sessionsWithFaults(), [this](Cells& row) { report_.withFaults = row.count(); });
        database_.ask(queries_.sessionsThatPlayedWithFaults(),
                      [this](Cells& row) { report_.faultless -= row.count(); });
        std::vector<SessionName> names; // the worst first
        database_.ask(queries_.worstSessions(), [&](Cells& row) { names.push_back(sessionIn(row)); });
        if (names.empty())
            return;
        std::map<SessionName, History> histories;
        readHistories(FleetQueries::sessionList(names), histories);
        for (const SessionName& name : names) {
            Report own = makeReport(histories[name], report_.span, report_.isRecording, dayStart_);
            if (own.worst.empty())
                continue;
            own.worst.front().unit = name.front();
            report_.worst.push_back(std::move(own.worst.front()));
        }
    }

    void readHistories(const std::string& list, std::map<SessionName, History>& histories)
    {
        database_.ask(queries_.stretchesOf(list), [&](Cells& row) {
            const SessionName name = sessionIn(row);
            PlayedStretch stretch{.session = idOf(name), .began = secondsOf(row.integer())};
            stretch.seconds = secondsOf(row.integer());
            stretch.device = row.text();
            stretch.format = row.text();
            if (const auto volume = row.real())
                stretch.volume = *volume / foundation::millionthsOfOne;
            stretch.hasVanished = row.text() == "vanished";
            histories[name].stretches.push_back(std::move(stretch));
        });
        database_.ask(FleetQueries::sessions(list), [&](Cells& row) {
            const SessionName name = sessionIn(row);
            HistorySession session{.id = idOf(name), .application = row.text()};
            session.service = row.text();
            session.process = row.text();
            session.began = row.real().value_or(0);
            session.ended = row.real();
            histories[name].sessions.push_back(std::move(session));
        });
        database_.ask(queries_.faultsOf(list), [&](Cells& row) {
            const SessionName name = sessionIn(row);
            Fault fault{.session = idOf(name), .happened = secondsOf(row.integer()), .kind = row.text()};
            fault.device = row.text();
            fault.lateCycles = row.integer();
            histories[name].faults.push_back(std::move(fault));
        });
    }

    static std::int64_t idOf(const SessionName& name) { return std::stoll("0" + name.back()); }

    static constexpr double secondsAnHour = 3600;

    const FleetQuestion& question_;
    const DayStart dayStart_;
    const FleetParts& parts_;
    Report report_;
    FleetDatabase database_;
    FleetQueries queries_;
    bool hasFaults_ = false;
    std::map<std::string, std::string> hashes_; // by the key of a line
    std::vector<std::string> worstUnits_; // hashes
    std::map<std::string, std::pair<std::string, std::string>> labels_; // model and version by unit
};

} // namespace

Report makeFleetReport(const FleetAddress& address, const FleetQuestion& question, DayStart dayStart,
                       const FleetParts& parts)
{
    const auto credentials = fleet_database::readCredentials(address.credentials, {"user", "password"});
    if (!credentials)
        throw std::runtime_error(credentials.error());
    ClickHouseConfiguration database = address.database;
    database.user = fleet_database::textIn(*credentials, "user");
    database.password = fleet_database::textIn(*credentials, "password");
    return FleetReportMaker(database, question, dayStart, parts).make();
}
