// SPDX-License-Identifier: Apache-2.0
// The report for a person at a terminal: tables with bars, and below them what the numbers leave out.
#pragma once

#include "kesto/report/ReportTable.h"

#include <cstddef>
#include <string>
#include <vector>

struct ReportLayout {
    std::size_t width = 80; // columns of the terminal; npos: lines are not cut
    bool isUTF8 = true;
};

// A report without sound and without faults says so instead, and what to do.
[[nodiscard]] std::string reportText(const Report& report, const std::vector<ReportBy>& tables,
                                     const ReportLayout& layout);
