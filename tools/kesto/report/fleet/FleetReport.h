// SPDX-License-Identifier: Apache-2.0
// The report over a fleet: the same figures as those of a device, from the database of `kesto-ingest`, and how they are
// distributed over the units.
//
// The database adds up; here are the days, the order of lines, and the sessions that went worst.
#pragma once

#include "fleet-database/ClickHouseServers.h"
#include "kesto/history/History.h"
#include "kesto/report/ReportTable.h"

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

struct FleetAddress {
    fleet_database::ClickHouseConfiguration database = {};
    std::filesystem::path credentials = {}; // a file with user and password; empty: the database asks for none
};

struct FleetQuestion {
    HistoryQuestion history = {}; // its span has ends
    std::string unit = {}; // only this one; empty: all
};

// What takes time to find, so that only what is shown is asked.
struct FleetParts {
    std::vector<ReportBy> tables = {};
    std::size_t mostLines = 0; // of a table, and one for all others; 0: all
    bool withSessions = false; // of each line
    bool withOverUnits = false; // how faults are distributed, of each line
    bool withWorst = false; // units and sessions
    bool withDaysOfLines = false; // what each day has by application and by device
};

// Throws std::runtime_error, with a line for a person.
[[nodiscard]] Report makeFleetReport(const FleetAddress& address, const FleetQuestion& question, DayStart dayStart,
                                     const FleetParts& parts);
