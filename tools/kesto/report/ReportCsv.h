// SPDX-License-Identifier: Apache-2.0
// A table of the report for spreadsheets and scripts, as RFC 4180 has it, but with the line ends of Unix.
#pragma once

#include "kesto/report/ReportTable.h"

#include <string>
#include <string_view>

// docs/report.md describes the columns.
[[nodiscard]] std::string reportCsv(const Report& report, ReportBy by);
// A name of clients as a field: what would move a terminal's cursor is replaced, what would divide a row is quoted, and
// what a spreadsheet would take for a formula begins with an apostrophe.
[[nodiscard]] std::string csvField(std::string_view text);
