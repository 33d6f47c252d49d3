// SPDX-License-Identifier: Apache-2.0
// What all connections of one listener share. It exists as long as the listener or one of its connections does.
#pragma once

#include "foundation/values/Value.h"
#include "ledger/Ledger.h"
#include "platform/Connection.h"
#include "platform/Log.h"
#include "platform/linux/connection/TransitMemory.h"
#include "platform/linux/connection/UnfinishedEnds.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <sys/eventfd.h>
#include <thread>
#include <vector>

namespace platform {

class EmitterAccess;
class LinuxConnection;

struct ConnectionHub {
    static constexpr std::size_t mostReadAtOnce = 64 * 1024;

    FileDescriptor epoll; // watches the sockets; any thread changes it, the connection thread waits for it
    FileDescriptor wake; // what `wakeUp` writes to
    LogCategory& log;
    ledger::Ledger& ledger;
    EmitterAccess* emitterAccess = nullptr; // null: no client can trace
    // The answer to a client that asks for the status; the connection thread calls it.
    std::function<foundation::Dictionary(bool withCulprits)> status = [](bool) { return foundation::Dictionary(); };

    std::thread::id connectionThread = {}; // from its start on
    [[nodiscard]] bool isConnectionThread() const { return connectionThread == std::this_thread::get_id(); }

    // Makes the connection thread look at everything that it waits for. Any thread.
    void wakeUp() const { ::eventfd_write(wake.get(), 1); }

    TransitMemory transit{[this] { wakeUp(); }};
    UnfinishedEnds unfinishedEnds = {};
    // All that are not over.
    foundation::Mutex connectionsLock = {};
    std::map<const void*, std::weak_ptr<LinuxConnection>> connections KESTO_GUARDED_BY(connectionsLock) = {};

    // Room for one read of one connection, used by the connection thread.
    std::array<char, mostReadAtOnce> readBuffer = {};
    std::vector<Connection::Call> calls = {};
    std::size_t bytesOfCalls = 0; // memory of these
};

} // namespace platform
