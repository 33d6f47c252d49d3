// SPDX-License-Identifier: Apache-2.0
// The room of the wire: the service's path, the socket, and the frames that it carries. It has no threads and does not
// know which calls wait for answers.
//
// The socket to the service: it connects and carries frames in both directions, and never waits for the peer.
#pragma once

#include "AttachableEmitter.h"
#include "Counters.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"
#include "wire/CallFrames.h"

#include <array>
#include <cstdint>
#include <deque>
#include <expected>
#include <functional>
#include <string>
#include <string_view>
#include <sys/socket.h>
#include <utility>
#include <vector>

namespace libkesto {

// Why the connection ended, with `errno` if the system gave the reason.
struct ConnectionFailure {
    kesto_status reason;
    int systemError = 0;
};

// The client's thread.
class ServiceConnection {
public:
    using Result = std::expected<void, ConnectionFailure>;
    // Called for each frame; false if the frame breaks the protocol.
    using FrameHandler = std::function<bool(std::string_view frame)>;

    explicit ServiceConnection(Counters& counters) noexcept : counters_(counters) { }

    // Connects to the first of the paths at which a service listens.
    [[nodiscard]] Result open(const std::vector<std::string>& paths);
    // Drops the unsent bytes, and keeps the path.
    void close() noexcept;

    [[nodiscard]] int descriptor() const noexcept { return socket_.get(); }
    // The path of the connection, or of the last attempt.
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

    // Puts a call behind those that wait to be sent.
    void append(std::uint64_t number, const Call& call);
    // The same with a request for the descriptors for trace events; take them when the answer comes.
    void appendTraceRequest(std::uint64_t number);
    // The last descriptors that came; each may be empty.
    [[nodiscard]] ReceivedDescriptors takeDescriptors() noexcept { return std::exchange(descriptors_, {}); }
    [[nodiscard]] std::size_t unsentBytes() const noexcept { return outbox_.size() - sentBytes_; }

    // Sends what the socket accepts.
    [[nodiscard]] Result send();
    // Reads once, and returns the number of bytes. Fails if the service has gone and nothing is left to read.
    [[nodiscard]] std::expected<std::size_t, ConnectionFailure> receive(const FrameHandler& handle);

private:
    [[nodiscard]] Result connect(const std::string& path);
    [[nodiscard]] ssize_t receiveBytes();
    void keepDescriptors(const msghdr& message) noexcept;
    void countSentMessages();

    platform::FileDescriptor socket_;
    std::string path_;
    std::string outbox_; // its first `sentBytes_` are sent
    std::size_t sentBytes_ = 0;
    std::deque<std::uint64_t> messageEnds_; // of messages in the outbox, as positions in the stream
    std::uint64_t streamPosition_ = 0; // of the beginning of the outbox
    platform::FrameReader reader_;
    std::array<char, 16 * 1024> received_;
    ReceivedDescriptors descriptors_;
    bool expectsDescriptors_ = false;
    Counters& counters_;
};

} // namespace libkesto
