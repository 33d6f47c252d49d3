// SPDX-License-Identifier: Apache-2.0
// The drivers' channels as the sampler reads them now, for tests that take samples.
#pragma once

#include "driver/KestoReportingDriverUtility.h"
#include "support/TestPlatform.h"

namespace support {

// Runs what waits in the platform's queues.
inline session::DriverMoment driverMoment(const KestoReportingDriverUtility& utility, TestPlatform& platform)
{
    session::DriverMoment moment;
    if (utility.needsMoments())
        utility.readMoment([&](session::DriverMoment read) { moment = std::move(read); });
    platform.workQueues.runAll();
    return moment;
}

} // namespace support
