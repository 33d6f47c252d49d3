// SPDX-License-Identifier: Apache-2.0
// The waits that floods are compared with: those of a client of a service without a flood, alone and beside processes
// that only burn processor time, and those of a client of dbus-daemon beside clients that flood it.
#pragma once

#include "support/Harness.h"
#include "support/Waits.h"

#include <map>
#include <utility>

namespace bench {

class PeerWaits {
public:
    static constexpr std::chrono::milliseconds duration{1500}; // of each measurement

    explicit PeerWaits(const BenchOptions& options) : options_(options) { }

    [[nodiscard]] Waits alone() const;
    // These are measured when a flood needs them for the first time.
    const Waits& burners(int processes);
    const Waits& daemon(int processes, int connectionsEach);

private:
    const BenchOptions& options_;
    std::map<int, Waits> burners_;
    std::map<std::pair<int, int>, Waits> daemons_; // by processes and connections of each
};

} // namespace bench
