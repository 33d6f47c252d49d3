// SPDX-License-Identifier: Apache-2.0
// The report as one page that any browser shows: it runs no script, loads nothing, and asks nobody.
//
// What clients told is shown as text and as nothing else, whatever it contains. The page stays below 100,000 bytes: of
// many applications and devices it names those with the most time, and many days become weeks. Before the page grows
// beyond that, marks lose the notes that a pointer shows, and pictures are coarser.
#pragma once

#include "kesto/report/Report.h"

#include <cstddef>
#include <string>

struct PageHead {
    std::string host;
    std::string database; // its path
    double made = 0; // seconds since 1970 UTC
    std::string timeZone; // the name of the zone in which days begin
    bool isUTC = false; // else moments are in the time zone of the process
};

constexpr std::size_t mostBytesOfPage = 100'000;

[[nodiscard]] std::string reportPage(const Report& report, const PageHead& head);
