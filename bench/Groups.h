// The groups of measurements, a file each, in the order of the table.
#pragma once

#include "support/Harness.h"
#include "support/Report.h"

namespace bench {

void measureRoundTrip(const Options& options, Report& report);
void measurePipeline(const Options& options, Report& report);
void measureStored(const Options& options, Report& report);
void measureSession(const Options& options, Report& report);
void measureSessionEnd(const Options& options, Report& report);
void measureEndedSessions(const Options& options, Report& report);
void measureLongStop(const Options& options, Report& report);
void measureLookup(const Options& options, Report& report);
void measureNotification(const Options& options, Report& report);
void measureIdle(const Options& options, Report& report);
void measureStart(const Options& options, Report& report);
void measureLogStatement(const Options& options, Report& report);
void measureClientLibrary(const Options& options, Report& report);
void measureChannels(const Options& options, Report& report);
void measureDecoding(const Options& options, Report& report);
void measureRecord(const Options& options, Report& report);
void measureTrace(const Options& options, Report& report);
void measureTracing(const Options& options, Report& report);

} // namespace bench
