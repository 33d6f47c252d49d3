// SPDX-License-Identifier: Apache-2.0
// The well-behaved clients of the service and of dbus-daemon.
#pragma once

#include "neighbours/FairClient.h"
#include "peers/DaemonPeer.h"
#include "support/ServiceProcess.h"

namespace bench {

// It validates a reporter ID and sends a message to a session of its own.
[[nodiscard]] FairClient fairClientOf(const ServiceProcess& service);
// It asks twice for the identity of the bus. The daemon answers already.
[[nodiscard]] FairClient fairClientOf(const DaemonPeer& daemon);

} // namespace bench
