// What all connections of one listener share. It exists as long as the listener or one of its connections does.
#pragma once

#include "platform/Connection.h"
#include "platform/Log.h"
#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <atomic>
#include <cstdint>
#include <thread>
#include <vector>

namespace platform {

class EmitterAccess;

// Counts since the listener was made. Any thread.
struct ConnectionCounters {
    std::atomic<std::uint64_t> accepted; // connections
    std::atomic<std::uint64_t> interrupted; // connections that broke, by the fault of the client or of the service
    std::atomic<std::uint64_t> droppedBytes; // of frames for connections that were over
    std::atomic<std::uint64_t> readingPauses; // times that reading from a client paused until it was less behind
    std::atomic<std::uint64_t> refused; // connections of users who already had as many as one user may have
    std::atomic<std::uint64_t> acceptingPauses; // times that new clients had to wait for a descriptor
};

struct ConnectionHub {
    static constexpr std::size_t mostReadAtOnce = 64 * 1024;

    FileDescriptor epoll; // watches the sockets; any thread changes it, the connection thread waits for it
    LogCategory& log;
    ConnectionCounters counters = {};
    EmitterAccess* emitterAccess = nullptr; // null: no client can trace

    std::thread::id connectionThread = {}; // from its start on
    [[nodiscard]] bool isConnectionThread() const { return connectionThread == std::this_thread::get_id(); }

    // Room for one read of one connection, used by the connection thread.
    std::array<char, mostReadAtOnce> readBuffer = {};
    std::vector<Connection::Call> calls = {};
};

} // namespace platform
