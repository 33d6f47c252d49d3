// SPDX-License-Identifier: Apache-2.0
// The memory that floods leave in the service. It takes time to return, so the services stay until all floods are over,
// and wait for it at the same time.
#pragma once

#include "support/Report.h"
#include "support/ServiceProcess.h"

#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace bench {

class FloodedServices {
public:
    // Waits until the service has done what the flood left behind. One that still works after ten seconds would disturb
    // the next measurement: it ends, and counts with the memory that it has at that moment.
    void add(std::string_view flood, std::unique_ptr<ServiceProcess> service, double megabytesBefore);
    // Waits, and adds a row for the flood that left most.
    void reportTo(Report& report);

private:
    struct Resting {
        std::string flood;
        std::unique_ptr<ServiceProcess> service;
        double megabytesBefore;
    };
    struct Growth {
        std::string flood;
        double megabytes = 0;
    };

    void note(std::string_view flood, double megabytes);

    std::vector<Resting> resting_;
    Growth largest_;
};

} // namespace bench
