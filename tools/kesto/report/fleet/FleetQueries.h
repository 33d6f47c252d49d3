// SPDX-License-Identifier: Apache-2.0
// What the report asks the database of a fleet, as SQL of ClickHouse 18.16 and later. All SQL of the report stands in
// this file and in the one beside it.
//
// A device of the fleet is a unit, because a device is what sound comes out of. Each query is made of rows: parts of
// stretches, and faults, all with the same columns and with the key of a table's line. A query adds them up by that
// key, or first by unit and key: rows lie in the order of units, so that is quick. Rows that the database has twice
// are rare, and finding them takes longer than counting. So the first query says which units have some, and the others
// choose one of each only there.
#pragma once

#include "kesto/report/fleet/DayTable.h"
#include "kesto/report/fleet/FleetReport.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// A session among all of a fleet: the hash of its unit and epoch, and its ID. As the database wrote them.
struct FleetSession {
    std::string store;
    std::string session;
};

// What the columns of a query are called in the order in which they come stands at each function.
class FleetQueries {
public:
    // That a query names one by one: some name a list several times, and the database reads 262,144 bytes.
    static constexpr std::size_t mostUnits = 3000;
    static constexpr std::size_t mostSessions = 1000;

    // `days`: when each day of the span begins, and when the last ends.
    FleetQueries(FleetQuestion question, const std::vector<std::int64_t>& days);

    // The present of the database. Later rows do not count, so that all queries of a report see the same.
    [[nodiscard]] static std::string present();
    void setPresent(std::string_view present) { present_ = present; }
    // store, session: of the sessions with faults that recorded. A fault does not say whether something was played or
    // recorded; its session does, by its stretches in the span and a day before it.
    [[nodiscard]] std::string recordings() const;
    // store, session: of these, those that did not play.
    [[nodiscard]] std::string onlyRecordings(const std::vector<FleetSession>& recordings) const;
    // Those that recorded, in a report of recordings; in another, those that did not play. Without any, no fault is one
    // of recording.
    void setRecordings(const std::vector<FleetSession>& sessions);
    // units with doubled rows, also of rows that do not match: what differs may be why one of them does.
    [[nodiscard]] std::string doubled() const;
    void setDoubled(const std::vector<std::string>& units);

    // microseconds, muted, without volume, volume, faults, sessions, vanished, units; median, 90 % and most of the
    // microseconds of a unit; units above the floor; median, 90 % and worst of their faults an hour; units with doubled
    // rows; those with most faults an hour.
    [[nodiscard]] std::string all() const;
    // key, hash of the key, microseconds, muted, without volume, volume, faults. `by` is a column, or "day".
    [[nodiscard]] std::string sums(std::string_view by) const;
    // day and hash of the key with a blank between, nothing, microseconds, muted, without volume, volume, faults: of
    // the keys with those hashes.
    [[nodiscard]] std::string daysOf(std::string_view by, const std::vector<std::string>& hashes) const;
    // hash of the key, sessions, units; median, 90 % and worst of the faults an hour of those above the floor.
    [[nodiscard]] std::string overUnits(std::string_view by) const;
    // step, microseconds
    [[nodiscard]] std::string volumes() const;
    // kind, faults, sessions
    [[nodiscard]] std::string faultKinds() const;
    // sessions
    [[nodiscard]] std::string sessionsWithFaults() const;
    [[nodiscard]] std::string sessionsThatPlayedWithFaults() const;
    // unit, its last model and version in the span, microseconds, muted, without volume, volume, faults, sessions. Of
    // those hashes, or of all if there are none.
    [[nodiscard]] std::string units(const std::vector<std::string>& hashes) const;
    // unit, epoch, session, late cycles, faults
    [[nodiscard]] std::string worstSessions() const;
    // unit, epoch, session, began, seconds, device, format, volume, ending: of sessions as the query before has them
    [[nodiscard]] std::string stretchesOf(const std::string& sessions) const;
    // unit, epoch, session, application, service, process, began, ended
    [[nodiscard]] static std::string sessions(const std::string& sessions);
    // unit, epoch, session, happened, kind, device, late cycles
    [[nodiscard]] std::string faultsOf(const std::string& sessions) const;
    // A list of sessions for the queries above; unit, epoch and session stand in turn.
    [[nodiscard]] static std::string sessionList(const std::vector<std::vector<std::string>>& sessions);

private:
    [[nodiscard]] bool needsDevices(std::string_view by) const;
    [[nodiscard]] std::string stretchRows(std::string_view table, std::string_view key,
                                          const std::string& condition) const;
    [[nodiscard]] std::string onceEach(std::string_view key, const std::string& condition,
                                       std::string_view with = {}) const;
    [[nodiscard]] std::string faults(bool withDevices) const;
    [[nodiscard]] std::string rows(std::string_view by, bool isHashed) const;
    [[nodiscard]] std::string daysOfStretches(const std::string& key, const std::string& condition) const;
    [[nodiscard]] std::string touching(bool isWide) const;
    [[nodiscard]] std::string unitCondition() const;
    [[nodiscard]] std::string sessionsWithFault(bool withDirection) const;
    [[nodiscard]] std::string amongRecordings(const std::vector<FleetSession>& recordings) const;

    FleetQuestion question_;
    DayTable days_;
    std::int64_t from_;
    std::int64_t until_;
    std::string present_ = "now() + 1";
    std::string direction_; // a condition of a fault
    std::string doubled_; // a list of parts of the hashes of units; empty: none
    bool areManyDoubled_ = false;
};

// A text as a literal of SQL.
[[nodiscard]] std::string sqlText(std::string_view text);
// A GLOB of SQLite as a regular expression of the database.
[[nodiscard]] std::string regularExpression(std::string_view glob);
