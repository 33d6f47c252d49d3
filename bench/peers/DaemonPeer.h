// SPDX-License-Identifier: Apache-2.0
// dbus-daemon as a peer for the cost of an idle service, for the time to start, and for what a flood costs others.
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
    // The socket of another client, for raw messages; the daemon answers already.
    [[nodiscard]] platform::FileDescriptor connectSocket() const;

private:
    support::TemporaryDirectory directory_;
    ChildProcess process_;
};

} // namespace bench
