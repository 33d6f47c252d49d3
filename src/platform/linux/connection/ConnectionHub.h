// What all connections of one listener share, and what outlives the listener for as long as somebody still
// holds one of its connections.
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

// What happened since the listener was made. Any thread.
struct ConnectionCounters {
    std::atomic<std::uint64_t> accepted; // connections
    std::atomic<std::uint64_t> interrupted; // connections that broke, by the peer's fault or ours
    std::atomic<std::uint64_t> droppedBytes; // of frames that were to be sent to connections that were over
    std::atomic<std::uint64_t> readingPauses; // times that reading from a client stopped until it was less behind
    std::atomic<std::uint64_t> refused; // connections of a user who had as many as one may have
    std::atomic<std::uint64_t> acceptingPauses; // times that new clients had to wait for a descriptor
};

struct ConnectionHub {
    static constexpr std::size_t mostReadAtOnce = 64 * 1024;

    FileDescriptor epoll; // watches the sockets; changed by any thread, waited for by the connection thread
    LogCategory& log;
    ConnectionCounters counters = {};
    EmitterAccess* emitterAccess = nullptr; // null: nobody ever traces

    std::thread::id connectionThread = {}; // from its start on
    [[nodiscard]] bool isConnectionThread() const { return connectionThread == std::this_thread::get_id(); }

    // Room for one read of one connection, used by the connection thread.
    std::array<char, mostReadAtOnce> readBuffer = {};
    std::vector<Connection::Call> calls = {};
};

} // namespace platform
