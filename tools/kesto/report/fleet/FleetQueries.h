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

// What of each line costs more to find.
struct LineFigures {
    bool withSessions = false;
    bool withOverUnits = false;
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
    // A row if the span has any fault. Without one, the other queries ask for none.
    [[nodiscard]] std::string anyFault() const;
    void setHasFaults(bool hasFaults) { hasFaults_ = hasFaults; }
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
    // microseconds of a unit; units above the floor; median, 90 % and worst of their faults an hour; microseconds as a
    // number that does not wrap; units with doubled rows; those with most faults an hour.
    [[nodiscard]] std::string all() const;
    // key, hash of the key, microseconds, muted, without volume, volume, faults; with sessions these; over units how
    // many, how many above the floor, and median, 90 % and worst of the faults an hour of these. `by` is a column, or
    // "day". The `most` with the most time, or all if that is 0.
    [[nodiscard]] std::string lines(std::string_view by, const LineFigures& asked, std::size_t most) const;
    // lines, and the sums of all of them.
    [[nodiscard]] std::string sumOfLines(std::string_view by) const;
    // day and hash of the key with a blank between, microseconds, muted, without volume, volume, faults: of the keys
    // with those hashes.
    [[nodiscard]] std::string daysOf(std::string_view by, const std::vector<std::string>& hashes) const;
    // step, microseconds
    [[nodiscard]] std::string volumes() const;
    // kind, faults, sessions: the `most` with the most faults, or all if that is 0.
    [[nodiscard]] std::string faultKinds(std::size_t most) const;
    // kinds, and the faults of all of them.
    [[nodiscard]] std::string sumOfFaultKinds() const;
    // sessions
    [[nodiscard]] std::string sessionsWithFaults() const;
    [[nodiscard]] std::string sessionsThatPlayedWithFaults() const;
    // unit, its last model and version in the span, microseconds, muted, without volume, volume, faults, sessions: of
    // those hashes.
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
    [[nodiscard]] std::string isFault() const;
    [[nodiscard]] std::string faults(bool withDevices) const;
    [[nodiscard]] std::string placesOfFaults() const;
    [[nodiscard]] std::string withFaults(std::string rows, const std::string& with, std::string_view key,
                                         std::string_view by, const std::string& condition) const;
    [[nodiscard]] std::string rows(std::string_view by) const;
    [[nodiscard]] std::string linesByUnit(std::string_view by, const LineFigures& asked) const;
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
    bool hasFaults_ = true;
    std::string direction_; // a condition of a fault
    std::string doubled_; // a list of parts of the hashes of units; empty: none
    bool areManyDoubled_ = false;
};
