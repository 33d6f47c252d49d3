// SPDX-License-Identifier: Apache-2.0
// All figures of the report as one JSON object, for programs.
#pragma once

#include "kesto/report/Report.h"

#include <string>

// docs/report.md describes the keys. With a line end.
[[nodiscard]] std::string reportJson(const Report& report);
