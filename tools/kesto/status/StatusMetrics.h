// SPDX-License-Identifier: Apache-2.0
// The status in the text format of Prometheus, as node_exporter's textfile collector reads it.
#pragma once

#include "foundation/values/Value.h"

#include <string>

// All metrics of the report. The counters are those since the ledger began, so they grow over restarts of the service.
[[nodiscard]] std::string metricsText(const foundation::Dictionary& report);
