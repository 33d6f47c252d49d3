// SPDX-License-Identifier: Apache-2.0
// Names of columns within a query: u is the hash of the unit, s of its session, k the key; n and r are the numbers of
// session and row in the device's store. us is how long in microseconds, v the volume in millionths or -1, and f is 1
// of a fault. Sums are of whole numbers.
//
// Tables may be distributed over servers. There, a subquery in a condition is GLOBAL: the first server asks it once for
// all. A list of constants must not be, and constants of one part of a UNION are columns of it by materialize().
#include "kesto/report/fleet/FleetQueries.h"

#include "foundation/values/Microseconds.h"
#include "kesto/report/Report.h"
#include "kesto/report/fleet/SqlText.h"

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <set>
#include <utility>

namespace {

constexpr std::string_view unitHash = "cityHash64(device)";
constexpr std::string_view storeHash = "cityHash64(device, epoch)";
constexpr std::string_view sessionHash = "cityHash64(epoch, session)";
// As of a piece of a stretch of the device's own report, in the same whole numbers.
constexpr std::string_view volumeSum = "sum(intDiv(us, 1000000) * greatest(v, 0)"
                                       " + intDiv(us % 1000000 * greatest(v, 0) + 500000, 1000000))";
// Of rows, with names for the query around it.
const std::string figures =
    fmt::format("sum(us) AS played, sumIf(us, v = 0) AS muted, sumIf(us, v < 0) AS untold, {} AS volume", volumeSum);
constexpr std::string_view sumsOfUnit =
    "sum(played) AS played, sum(muted) AS muted, sum(untold) AS untold, sum(volume) AS volume, sum(faults) AS faults,"
    " sum(sessions) AS sessions, sum(vanished) AS vanished, sum(counted) AS counted, sum(different) AS different,"
    " sum(unwrapped) AS unwrapped";
constexpr std::string_view sumsOfFigures = "sum(played), sum(muted), sum(untold), sum(volume), sum(faults)";
// As Played::faultsAnHour works it out.
constexpr std::string_view faultsAnHour = "faults * 3600 / (played / 1000000)";
constexpr double microsecondsAnHour = 3'600'000'000;
constexpr std::int64_t microsecondsADay = 86'400'000'000;
constexpr std::uint64_t partsOfHashes = 1'000'003;
constexpr std::string_view faultPrefix = "com.quarn.kesto.Error.";
// Of rows that the database has several times, it keeps the last. What else differs makes the choice the same for all
// queries if they came in one second.
constexpr std::string_view lastOfEvent = "ORDER BY received DESC, cityHash64(application, audio_device, model, version,"
                                         " late_cycles) LIMIT 1 BY device, epoch, id";
constexpr std::string_view lastOfStretch =
    "ORDER BY received DESC, cityHash64(application, audio_device, format, ifNull(toInt64(volume_millionths), -1),"
    " model, version, ending) LIMIT 1 BY device, epoch, id";

} // namespace

FleetQueries::FleetQueries(FleetQuestion question, const std::vector<std::int64_t>& days)
    : question_(std::move(question)),
      days_(days),
      from_(foundation::wholeMicroseconds(question_.history.span.from)),
      until_(foundation::wholeMicroseconds(question_.history.span.until))
{
}

// Rows of this second count.
std::string FleetQueries::present()
{
    return "SELECT toUInt32(now()) + 1";
}

// By a part of their hashes: the queries stay short, and to choose one row of each does no harm to other units.
void FleetQueries::setDoubled(const std::vector<std::string>& units)
{
    areManyDoubled_ = units.size() > mostUnits;
    std::set<std::uint64_t> parts;
    for (const std::string& unit : units)
        parts.insert(std::stoull("0" + unit) % partsOfHashes);
    doubled_ = areManyDoubled_ ? "" : fmt::format("{}", fmt::join(parts, ","));
}

// --- Conditions

std::string FleetQueries::unitCondition() const
{
    return question_.unit.empty() ? std::string() : fmt::format(" AND device = {}", sqlText(question_.unit));
}

// Of stretches, whatever they did. Few are longer than a day; these have partitions of their own. With stretches that
// only touch the span it is wide, as a history is.
std::string FleetQueries::touching(bool isWide) const
{
    constexpr std::int64_t rounding = 10;
    const std::int64_t from = from_ - (isWide ? rounding : 0);
    const std::int64_t until = until_ + (isWide ? rounding : 0);
    return fmt::format("began_us < {} AND began_us + microseconds > {} AND (began_us > {} OR microseconds > {})"
                       " AND received < toDateTime({}){}{}",
                       until, from, from - microsecondsADay - 1, microsecondsADay, present_,
                       isWide ? "" : " AND microseconds > 0", unitCondition());
}

namespace {

std::string matching(std::string_view column, const std::string& glob)
{
    return glob == "*" ? "" : fmt::format(" AND match({}, {})", column, sqlText(regularExpression(glob)));
}

} // namespace

// --- Faults

// A condition of events, in the span.
std::string FleetQueries::isFault() const
{
    return fmt::format("name LIKE '{}%' AND happened_us >= {} AND happened_us < {}{}", faultPrefix, from_, until_,
                       unitCondition());
}

std::string FleetQueries::anyFault() const
{
    return fmt::format("SELECT id FROM events WHERE {} LIMIT 1", isFault());
}

// Those of the applications that are asked for, and of sessions that did what is asked for. To know the device takes
// longer; without it, faults of all devices come.
std::string FleetQueries::faults(bool withDevices) const
{
    const HistoryQuestion& asked = question_.history;
    std::string each =
        fmt::format("SELECT {} AS u, {} AS st, {} AS s, id, device AS unit, epoch, session, happened_us AS happened,"
                    " substring(name, {}) AS kind, application, audio_device AS named, model, version,"
                    " toInt64(least(greatest(late_cycles, 0), 1000000000)) AS late FROM (SELECT device, epoch, id,"
                    " session, happened_us, name, application, audio_device, model, version, late_cycles FROM events"
                    " WHERE {} AND received < toDateTime({}) {}) WHERE 1{}{}",
                    unitHash, storeHash, sessionHash, faultPrefix.size() + 1, isFault(), present_, lastOfEvent,
                    matching("application", asked.applications), direction_);
    if (!withDevices)
        return each;
    return fmt::format(
        "SELECT * FROM (SELECT u, s, unit, epoch, session, happened, kind, application, model, version, late,"
        " if(named = '', played_on, named) AS device, played_as AS format FROM ({}) ANY LEFT JOIN ({}) USING (st, id)) "
        "WHERE 1{}",
        each, placesOfFaults(), matching("device", asked.devices));
}

// store, ID of a fault, device and format: a fault is where its session played then; in between, where it had played
// before. Stretches and faults of each session are put in one order, and each fault gets the number of the stretch
// before it. So a session costs as much as it has of both, and not of the one times the other.
std::string FleetQueries::placesOfFaults() const
{
    const std::string both = fmt::format(
        "SELECT {0} AS st, session, began_us AS moment, materialize(toUInt8(0)) AS fault, id,"
        " audio_device AS played_on, format AS played_as FROM stretches WHERE recording = {1} AND {2}"
        " AND (st, session) GLOBAL IN ({3}) UNION ALL"
        " SELECT {0} AS st, session, happened_us AS moment, materialize(toUInt8(1)) AS fault, id,"
        " materialize('') AS played_on, materialize('') AS played_as FROM events WHERE {4} AND session != 0{5}",
        storeHash, question_.history.isRecording ? 1 : 0, touching(true), sessionsWithFault(true), isFault(),
        direction_);
    return fmt::format(
        "SELECT st, id, played_on, played_as FROM (SELECT st, anyIf(row.4, row.2 = 0) AS played_on,"
        " anyIf(row.5, row.2 = 0) AS played_as, groupArrayIf(row.3, row.2 = 1) AS ids FROM (SELECT st, session, row,"
        " greatest(number, 1) AS place FROM (SELECT st, session,"
        " arraySort(groupArray((moment, fault, id, played_on, played_as))) AS rows,"
        " arrayCumSum(arrayMap(x -> 1 - x.2, rows)) AS numbers FROM ({}) GROUP BY st, session)"
        " ARRAY JOIN rows AS row, numbers AS number) GROUP BY st, session, place) ARRAY JOIN ids AS id",
        both);
}

std::string FleetQueries::sessionsWithFault(bool withDirection) const
{
    return fmt::format("SELECT {} AS st, session FROM events WHERE {}{}", storeHash, isFault(),
                       withDirection ? direction_ : "");
}

std::string FleetQueries::recordings() const
{
    return fmt::format("SELECT toString({} AS st), toString(session) FROM stretches WHERE recording = 1 AND {}"
                       " AND (st, session) GLOBAL IN ({}) GROUP BY st, session LIMIT {}",
                       storeHash, touching(true), sessionsWithFault(false), mostSessions + 1);
}

std::string FleetQueries::amongRecordings(const std::vector<FleetSession>& recordings) const
{
    if (recordings.size() > mostSessions)
        return fmt::format("GLOBAL IN (SELECT {} AS st, session FROM stretches WHERE recording = 1 AND {})", storeHash,
                           touching(true));
    std::string list;
    for (const FleetSession& each : recordings)
        list += fmt::format("{}({},{})", list.empty() ? "" : ",", each.store, each.session);
    return fmt::format("IN ({})", list);
}

std::string FleetQueries::onlyRecordings(const std::vector<FleetSession>& recordings) const
{
    return fmt::format("SELECT toString({} AS st), toString(session) FROM stretches WHERE {} AND (st, session) {}"
                       " AND (st, session) GLOBAL IN ({}) GROUP BY st, session HAVING min(recording) = 1 LIMIT {}",
                       storeHash, touching(true), amongRecordings(recordings), sessionsWithFault(false),
                       mostSessions + 1);
}

void FleetQueries::setRecordings(const std::vector<FleetSession>& sessions)
{
    const bool isRecording = question_.history.isRecording;
    direction_ = isRecording ? " AND 0" : "";
    if (sessions.empty())
        return;
    std::string among = amongRecordings(sessions);
    if (sessions.size() > mostSessions && !isRecording)
        among = fmt::format("GLOBAL IN (SELECT {} AS st, session FROM stretches WHERE {} AND (st, session) {}"
                            " GROUP BY st, session HAVING min(recording) = 1)",
                            storeHash, touching(true), among);
    direction_ = fmt::format(" AND {}(({}, session) {})", isRecording ? "" : "NOT ", storeHash, among);
}

// --- Rows

bool FleetQueries::needsDevices(std::string_view by) const
{
    return by == "audio_device" || by == "format" || question_.history.devices != "*";
}

// Of a table or a query as it: with the columns of a row, and `key` as an expression of the columns of the table and of
// `begins` and `ends`.
std::string FleetQueries::stretchRows(std::string_view table, std::string_view key, const std::string& condition) const
{
    const HistoryQuestion& asked = question_.history;
    return fmt::format(
        "SELECT {} AS u, {} AS s, session AS n, id AS r, toInt64(greatest(began_us, {})) AS"
        " begins, least(began_us + microseconds, {}) AS ends, {}, ifNull(toInt64(volume_millionths), -1) AS v,"
        " toUInt8(ending = 'vanished' AND began_us + microseconds <= {}) AS gone, materialize(toUInt64(0)) AS f FROM {}"
        " WHERE recording = {} AND {}{}{}{}",
        unitHash, sessionHash, from_, until_, key, until_, table, asked.isRecording ? 1 : 0, touching(false),
        matching("application", asked.applications), matching("audio_device", asked.devices), condition);
}

// Each row once, also where the database has it several times: of all of them at once as the database merges them, of
// few units by their hashes. Which row of several stays does not depend on what is asked.
std::string FleetQueries::onceEach(std::string_view key, const std::string& condition, std::string_view with) const
{
    constexpr std::string_view columns = "u, s, n, r, us, v, gone, f, k";
    const auto rowsOf = [&](std::string_view table, const std::string& units) {
        return fmt::format("SELECT {} FROM ({}{})", columns, with, stretchRows(table, key, condition + units));
    };
    if (areManyDoubled_)
        return rowsOf("stretches FINAL", "");
    if (doubled_.empty())
        return rowsOf("stretches", "");
    const std::string isDoubled = fmt::format("{} % {} IN ({})", unitHash, partsOfHashes, doubled_);
    const std::string last = fmt::format(
        "(SELECT device, epoch, id, session, recording, began_us, microseconds, application, audio_device, format,"
        " volume_millionths, ending, model, version, received FROM stretches WHERE {} AND {} {})",
        touching(false), isDoubled, lastOfStretch);
    return fmt::format("{} UNION ALL {}", rowsOf("stretches", fmt::format(" AND NOT ({})", isDoubled)),
                       rowsOf(last, ""));
}

namespace {

// A fault as a row.
std::string faultRow(std::string_view key, const std::string& faults)
{
    return fmt::format("SELECT u, s, session AS n, materialize(toUInt64(0)) AS r,"
                       " materialize(toInt64(0)) AS us, materialize(toInt64(-1)) AS v, materialize(toUInt8(0)) AS gone,"
                       " materialize(toUInt64(1)) AS f, {} AS k FROM ({})",
                       key, faults);
}

// What `by` is called of a fault.
std::string_view ofFault(std::string_view by)
{
    return by == "audio_device" ? "device" : by == "device" ? "unit" : by;
}

} // namespace

// Few stretches are in more than one day. `key` is an expression of the columns and of `day`.
std::string FleetQueries::daysOfStretches(const std::string& key, const std::string& condition) const
{
    const std::string both = fmt::format("{}, {}", days_.of("begins", "first"), days_.of("(ends - 1)", "last"));
    const std::string whole = fmt::format("{}, first AS day, ends - begins AS us, {} AS k", both, key);
    const std::string parts = fmt::format("{}, first + arrayJoin(range(toUInt64(last - first + 1))) AS day,"
                                          " least(ends, {}) - greatest(begins, {}) AS us, {} AS k",
                                          both, days_.beginning("(day + 1)"), days_.beginning("day"), key);
    const std::string with = days_.with();
    return fmt::format("{} UNION ALL {}", onceEach(whole, condition + " AND first = last", with),
                       onceEach(parts, condition + " AND first != last", with));
}

// With the faults, if the span has any.
std::string FleetQueries::withFaults(std::string rows, const std::string& with, std::string_view key,
                                     std::string_view by, const std::string& condition) const
{
    if (!hasFaults_)
        return rows;
    return fmt::format("{} UNION ALL {}{}{}", std::move(rows), with, faultRow(key, faults(needsDevices(by))),
                       condition);
}

std::string FleetQueries::rows(std::string_view by) const
{
    if (by == "day")
        return withFaults(daysOfStretches("day", ""), days_.with(), fmt::format("({})", days_.of("happened", "day")),
                          by, "");
    return withFaults(onceEach(fmt::format("ends - begins AS us, {} AS k", by), ""), "", ofFault(by), by, "");
}

std::string FleetQueries::daysOf(std::string_view by, const std::vector<std::string>& hashes) const
{
    const auto dayAndHash = [](const std::string& day, std::string_view key) {
        return fmt::format("concat(toString({}), ' ', toString(cityHash64({})))", day, key);
    };
    const auto isAmong = [&hashes](std::string_view key) {
        return fmt::format("cityHash64({}) IN ({})", key, fmt::join(hashes, ","));
    };
    const std::string ofStretches = daysOfStretches(dayAndHash("day", by), " AND " + isAmong(by));
    return fmt::format("SELECT k, {}, sum(f) FROM ({}) GROUP BY k", figures,
                       withFaults(ofStretches, days_.with(), dayAndHash(days_.of("happened", "day"), ofFault(by)), by,
                                  " WHERE " + isAmong(ofFault(by))));
}

// --- Queries

namespace {

std::string distribution(std::string_view figure, std::string_view condition)
{
    return fmt::format("quantileExactIf(0.5)({0}, {1}), quantileExactIf(0.9)({0}, {1}), maxIf({0}, {1})", figure,
                       condition);
}

// The first lines by two figures, then by name; 0: all in any order.
std::string largest(std::string_view figure, std::string_view second, std::size_t most)
{
    return most == 0 ? std::string() : fmt::format(" ORDER BY {} DESC, {} DESC, name LIMIT {}", figure, second, most);
}

std::string isAboveFloor()
{
    return fmt::format("played >= {:.0f}", FleetPart::leastHours * microsecondsAnHour);
}

} // namespace

// By store first: its numbers say what is the same, without their epoch. Their lower half is enough to find what is
// there twice: what only seems so is chosen once, too.
std::string FleetQueries::all() const
{
    std::string parts =
        fmt::format("SELECT any(u) AS unit, {}, materialize(toUInt64(0)) AS faults, uniqExact(n) AS sessions,"
                    " uniqExactIf(n, gone) AS vanished, count() AS counted, uniqExact(toUInt32(r)) AS different,"
                    " sum(toFloat64(us)) AS unwrapped FROM ({})"
                    " GROUP BY k",
                    figures, onceEach(fmt::format("ends - begins AS us, {} AS k", storeHash), ""));
    if (hasFaults_)
        parts += fmt::format(" UNION ALL SELECT u AS unit, {0} AS played, {0} AS muted, {0} AS untold, {0} AS volume,"
                             " count() AS faults, {1} AS sessions, {1} AS vanished, {1} AS counted, {1} AS different,"
                             " materialize(toFloat64(0)) AS unwrapped"
                             " FROM ({2}) GROUP BY unit",
                             "materialize(toInt64(0))", "materialize(toUInt64(0))", faults(needsDevices("")));
    const std::string floor = isAboveFloor();
    return fmt::format(
        "SELECT {0}, sum(sessions), sum(vanished), countIf(played > 0), {1}, countIf({2}), {3}, sum(unwrapped),"
        " groupArrayIf({4})(toString(unit), counted != different), arrayMap(x -> toString(x.2),"
        " arraySlice(arrayReverseSort(groupArrayIf(({5}, unit), faults > 0 AND {2})), 1, 10))"
        " FROM (SELECT unit, {6} FROM ({7}) GROUP BY unit)",
        sumsOfFigures, distribution("played", "played > 0"), floor, distribution(faultsAnHour, floor), mostUnits + 1,
        faultsAnHour, sumsOfUnit, parts);
}

std::string FleetQueries::doubled() const
{
    return fmt::format("SELECT toString(u1) FROM (SELECT any({}) AS u1, {} AS k, count() AS counted,"
                       " uniqExact(toUInt32(id)) AS different FROM stretches WHERE recording = {} AND {} GROUP BY k)"
                       " WHERE counted != different GROUP BY u1 LIMIT {}",
                       unitHash, storeHash, question_.history.isRecording ? 1 : 0, touching(false), mostUnits + 1);
}

// By unit and key first, if figures over units are asked for, else by the key: by one number, the quickest to group by.
std::string FleetQueries::linesByUnit(std::string_view by, const LineFigures& asked) const
{
    return fmt::format("SELECT any(k) AS name, {}, sum(f) AS faults{} FROM ({}) GROUP BY cityHash64({}k)", figures,
                       asked.withSessions ? ", uniqExactIf(s, f = 0) AS sessions" : "", rows(by),
                       asked.withOverUnits || asked.withSessions ? "u, " : "");
}

std::string FleetQueries::lines(std::string_view by, const LineFigures& asked, std::size_t most) const
{
    const std::string floor = isAboveFloor();
    const std::string overUnits = asked.withOverUnits
        ? fmt::format(", countIf(played > 0), countIf({}), {}", floor, distribution(faultsAnHour, floor))
        : std::string();
    return fmt::format("SELECT name, toString(cityHash64(name)), {}{}{} FROM ({}) GROUP BY name{}", sumsOfFigures,
                       asked.withSessions ? ", sum(sessions)" : "", overUnits, linesByUnit(by, asked),
                       largest("sum(played)", "sum(faults)", most));
}

std::string FleetQueries::sumOfLines(std::string_view by) const
{
    return fmt::format("SELECT uniqExact(name), {} FROM ({})", sumsOfFigures, linesByUnit(by, {}));
}

std::string FleetQueries::volumes() const
{
    return fmt::format("SELECT intDiv(v * 16 - 1, 1000000) AS step, sum(us) FROM ({}) WHERE v > 0 GROUP BY step",
                       onceEach("ends - begins AS us, toUInt64(0) AS k", ""));
}

std::string FleetQueries::faultKinds(std::size_t most) const
{
    return fmt::format("SELECT kind AS name, count(), uniqExact(u, s) FROM ({}) GROUP BY name{}",
                       faults(needsDevices("")), largest("count()", "0", most));
}

std::string FleetQueries::sumOfFaultKinds() const
{
    return fmt::format("SELECT uniqExact(kind), count() FROM ({})", faults(needsDevices("")));
}

std::string FleetQueries::sessionsWithFaults() const
{
    return fmt::format("SELECT uniqExact(u, s) FROM ({}) WHERE session != 0", faults(needsDevices("")));
}

std::string FleetQueries::sessionsThatPlayedWithFaults() const
{
    return fmt::format("SELECT uniqExact(u, s) FROM ({}) WHERE (u, s) GLOBAL IN (SELECT u, s FROM ({}) WHERE session"
                       " != 0)",
                       onceEach("ends - begins AS us, toUInt64(0) AS k", ""), faults(needsDevices("")));
}

std::string FleetQueries::units(const std::vector<std::string>& hashes) const
{
    const std::string list = fmt::format("{}", fmt::join(hashes, ","));
    const std::string ofFaults =
        fmt::format("SELECT unit AS name, s, materialize(toInt64(0)) AS us, materialize(toInt64(-1)) AS v,"
                    " materialize(toUInt64(1)) AS f, model AS m, version AS r, happened AS moment FROM ({})"
                    " WHERE u IN ({})",
                    faults(needsDevices("")), list);
    const std::string ofStretches = onceEach("ends - begins AS us, (device, model, version, begins) AS k",
                                             fmt::format(" AND {} IN ({})", unitHash, list));
    return fmt::format("SELECT name, argMax(m, moment), argMax(r, moment), {}, sum(f), uniqExactIf(s, f = 0)"
                       " FROM (SELECT k.1 AS name, s, us, v, f, k.2 AS m, k.3 AS r, k.4 AS moment FROM ({})"
                       " UNION ALL {}) GROUP BY name",
                       figures, ofStretches, ofFaults);
}

std::string FleetQueries::worstSessions() const
{
    return fmt::format("SELECT unit, epoch, toString(session), sum(late) AS cycles, count() AS faults FROM ({})"
                       " WHERE session != 0 GROUP BY unit, epoch, session"
                       " ORDER BY cycles DESC, faults DESC, unit, epoch, session LIMIT 10",
                       faults(needsDevices("")));
}

std::string FleetQueries::sessionList(const std::vector<std::vector<std::string>>& sessions)
{
    std::string list;
    for (const auto& each : sessions)
        list +=
            fmt::format("{}({},{},{})", list.empty() ? "" : ",", sqlText(each.at(0)), sqlText(each.at(1)), each.at(2));
    return list;
}

std::string FleetQueries::stretchesOf(const std::string& sessions) const
{
    return fmt::format("SELECT device, epoch, toString(session), began_us, microseconds, audio_device, format,"
                       " volume_millionths, ending FROM (SELECT * FROM stretches WHERE recording = {} AND {}"
                       " AND (device, epoch, session) IN ({}) {}) WHERE 1{} ORDER BY began_us",
                       question_.history.isRecording ? 1 : 0, touching(false), sessions, lastOfStretch,
                       matching("audio_device", question_.history.devices));
}

std::string FleetQueries::sessions(const std::string& sessions)
{
    return fmt::format("SELECT device, epoch, toString(id), application, service, process, began, ended FROM sessions"
                       " WHERE (device, epoch, id) IN ({}) ORDER BY has_ended DESC LIMIT 1 BY device, epoch, id",
                       sessions);
}

std::string FleetQueries::faultsOf(const std::string& sessions) const
{
    return fmt::format("SELECT unit, epoch, toString(session), happened, kind, device, late FROM ({})"
                       " WHERE (unit, epoch, session) IN ({}) ORDER BY happened",
                       faults(true), sessions);
}
