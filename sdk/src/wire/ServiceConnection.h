// The socket to the service: connecting, and frames in both directions, without ever waiting for the peer.
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

// Why there is no connection any more, with `errno` where the system said so.
struct ConnectionFailure {
    kesto_status reason;
    int systemError = 0;
};

// The client's thread.
class ServiceConnection {
public:
    using Result = std::expected<void, ConnectionFailure>;
    // Called for each frame that came; false when it breaks the protocol.
    using FrameHandler = std::function<bool(std::string_view frame)>;

    explicit ServiceConnection(Counters& counters) noexcept : counters_(counters) { }

    // Connects to the first of the paths at which somebody listens.
    [[nodiscard]] Result open(const std::vector<std::string>& paths);
    // What was not sent is dropped. The path stays.
    void close() noexcept;

    [[nodiscard]] int descriptor() const noexcept { return socket_.get(); }
    // Of the connection, or the last one that was tried.
    [[nodiscard]] const std::string& path() const noexcept { return path_; }

    // Puts a call behind those to be sent.
    void append(std::uint64_t number, const Call& call);
    // The same with a request for what it takes to emit trace events; the answer's descriptors are then to be taken.
    void appendTraceRequest(std::uint64_t number);
    // Those that came last; none of them may be open.
    [[nodiscard]] ReceivedDescriptors takeDescriptors() noexcept { return std::exchange(descriptors_, {}); }
    [[nodiscard]] std::size_t unsentBytes() const noexcept { return outbox_.size() - sentBytes_; }

    // Sends as much as the socket takes.
    [[nodiscard]] Result send();
    // Reads what has come, once: how many bytes. Fails when the service has gone and nothing is left.
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
    std::deque<std::uint64_t> messageEnds_; // of those in the outbox, as positions in the stream
    std::uint64_t streamPosition_ = 0; // of the outbox's beginning
    platform::FrameReader reader_;
    std::array<char, 16 * 1024> received_;
    ReceivedDescriptors descriptors_;
    bool expectsDescriptors_ = false;
    Counters& counters_;
};

} // namespace libkesto
