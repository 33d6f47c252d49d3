// A table of the report for spreadsheets and scripts, as RFC 4180 has it, but with the line ends of Unix.
#pragma once

#include "kesto/report/ReportTable.h"

#include <string>

// docs/report.md describes the columns.
[[nodiscard]] std::string reportCsv(const Report& report, ReportBy by);
