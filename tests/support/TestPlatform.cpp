// SPDX-License-Identifier: Apache-2.0
// A separate file, so that the fakes are compiled once and not for every test that installs them.
#include "support/TestPlatform.h"

namespace support {

TestPlatform::TestPlatform()
{
    platform::install({.log = log,
                       .ledger = ledger,
                       .clock = clock,
                       .workQueues = workQueues,
                       .preferences = preferences,
                       .featureFlags = featureFlags,
                       .deviceProperties = deviceProperties,
                       .processTable = processTable,
                       .notifications = notifications,
                       .analytics = analytics,
                       .traceEmitter = traceEmitter,
                       .reportingChannels = reportingChannels,
                       .bugCapture = bugCapture,
                       .kernelTrace = kernelTrace,
                       .performanceWriter = performanceWriter,
                       .fileSystem = fileSystem,
                       .memory = memory});
}

TestPlatform::~TestPlatform()
{
    // Waiting items may hold sessions, and these use the platform when they are destroyed.
    workQueues.discardAll();
    analytics.clear();
    platform::uninstall();
}

} // namespace support
