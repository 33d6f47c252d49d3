// dbus-daemon as a peer for the cost of an idle service and for the time to start.
#pragma once

#include "peers/BusPeer.h"
#include "support/ChildProcess.h"
#include "support/TemporaryDirectory.h"

#include <filesystem>

namespace bench {

class DaemonPeer {
public:
    [[nodiscard]] static bool isInstalled();
    DaemonPeer();
    [[nodiscard]] pid_t identifier() const { return process_.identifier(); }
    // Waits until it answers a client.
    [[nodiscard]] Bus connect() const;

private:
    support::TemporaryDirectory directory_;
    ChildProcess process_;
};

} // namespace bench
