// SPDX-License-Identifier: Apache-2.0
// In place of FleetReport.cpp in a build without libcurl.
#include "kesto/report/fleet/FleetReport.h"

#include <stdexcept>

Report makeFleetReport(const FleetAddress&, const FleetQuestion&, DayStart, const FleetParts&)
{
    throw std::runtime_error("this kesto was built without libcurl, so it cannot ask the database of a fleet: build it "
                             "with KESTO_FLEET_REPORT=ON");
}
