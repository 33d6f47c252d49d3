// SPDX-License-Identifier: Apache-2.0
// The groups of measurements, each in its own file, in the order of the table.
#pragma once

#include "support/Harness.h"
#include "support/Report.h"

namespace bench {

void measureRoundTrip(const BenchOptions& options, Report& report);
void measurePipeline(const BenchOptions& options, Report& report);
void measureStored(const BenchOptions& options, Report& report);
void measureStoredQueries(const BenchOptions& options, Report& report);
void measureIngest(const BenchOptions& options, Report& report);
void measureReports(const BenchOptions& options, Report& report);
void measureGrowingSession(const BenchOptions& options, Report& report);
void measureSessionEnd(const BenchOptions& options, Report& report);
void measureEndedSessions(const BenchOptions& options, Report& report);
void measureLongStop(const BenchOptions& options, Report& report);
void measureNeighbours(const BenchOptions& options, Report& report);
void measureStatusRequest(const BenchOptions& options, Report& report);
void measureLookup(const BenchOptions& options, Report& report);
void measureNotification(const BenchOptions& options, Report& report);
void measureIdle(const BenchOptions& options, Report& report);
void measureStart(const BenchOptions& options, Report& report);
void measureLogStatement(const BenchOptions& options, Report& report);
void measureClientLibrary(const BenchOptions& options, Report& report);
void measureChannels(const BenchOptions& options, Report& report);
void measureDecoding(const BenchOptions& options, Report& report);
void measureDiagnosticsRecord(const BenchOptions& options, Report& report);
void measureTraceEnd(const BenchOptions& options, Report& report);
void measureTraceEventCost(const BenchOptions& options, Report& report);

} // namespace bench
