// A connection to one client over a Unix stream socket.
//
// The connection thread reads: whatever has come in, up to a buffer that all connections share, is cut into
// frames, decoded, and delivered at once. Any thread writes: it tries the socket itself, and only what a slow
// peer leaves over waits for the connection thread to be told that there is room again.
//
// Every client is taken for hostile. One that breaks the protocol ends its own connection, with one line in the
// log. One that asks faster than it is answered, or that does not read its answers, is not read from until it
// is less behind; one that then still has far too much unread is cut off. What that cost is said when it ends.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Connection.h"
#include "platform/linux/connection/ConnectionHub.h"
#include "platform/linux/connection/ConnectionInput.h"
#include "platform/linux/connection/ConnectionOutput.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/EmitterAccess.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace platform {

class LinuxConnection final : public Connection, public std::enable_shared_from_this<LinuxConnection> {
public:
    // Beyond either, no more is read from the client, so one read may exceed it. A client may have 10,000 sessions,
    // each with a start that stays unanswered until it is stopped: the number is far above that.
    static constexpr std::uint32_t mostUnansweredCalls = 32 * 1024;
    static constexpr std::uint32_t mostUnansweredBytes = 1024 * 1024;
    // Beyond the first, no more is read from the client; beyond the second, it is cut off.
    static constexpr std::size_t manyUnsentBytes = 8 * 1024 * 1024;
    static constexpr std::size_t mostUnsentBytes = 32 * 1024 * 1024;

    // Who is at the other end.
    struct Peer {
        std::int32_t processIdentifier = 0;
        std::uint32_t userIdentifier = 0;
    };

    // The socket is connected and non-blocking.
    LinuxConnection(std::shared_ptr<ConnectionHub> hub, FileDescriptor socket, Peer peer);

    [[nodiscard]] std::int32_t processIdentifier() const override { return peer_.processIdentifier; }
    [[nodiscard]] std::uint32_t userIdentifier() const { return peer_.userIdentifier; }
    [[nodiscard]] std::string description() const override;
    void setCallHandler(CallHandler handler) override { callHandler_ = std::move(handler); }
    void setInterruptionHandler(EndHandler handler) override { interruptionHandler_ = std::move(handler); }
    void setInvalidationHandler(EndHandler handler) override { invalidationHandler_ = std::move(handler); }
    void resume() override;
    void send(Turn& turn, std::string frame) override;
    void write(std::string frames) override;

    // Does what the events of the socket (of epoll) ask for. False when the connection is over, which it is to be
    // forgotten for. Connection thread.
    [[nodiscard]] bool handle(std::uint32_t events);

    // Ends the connection, with its handlers. Connection thread.
    void invalidate() { end(std::nullopt); }

private:
    class Credit;

    [[nodiscard]] bool isBrokenOff();
    [[nodiscard]] bool settle();
    void read();
    void endOfStream();
    void takeIn(std::string_view bytes);
    [[nodiscard]] std::expected<void, Violation> decodeFrames();
    [[nodiscard]] std::expected<void, Violation> deliverCalls();
    [[nodiscard]] std::expected<void, Violation> askForTraceMarker(const foundation::Value& call);
    void handOver(std::uint64_t call, const EmitterDescriptors& descriptors);
    void breakOff(std::string reason);
    void end(std::optional<std::string> interruptedBecause);

    void returnCredit(std::size_t bytes);
    [[nodiscard]] bool isBehind() const noexcept;
    void drop(std::size_t bytes);
    void writeOutput() KESTO_REQUIRES(lock_);
    void watch() KESTO_REQUIRES(lock_);

    const std::shared_ptr<ConnectionHub> hub_;
    const Peer peer_;

    // The connection thread's.
    CallHandler callHandler_;
    EndHandler interruptionHandler_;
    EndHandler invalidationHandler_;
    ConnectionInput input_;
    bool peerIsDone_ = false; // it closed its side, between two frames
    bool hasAskedForTraceMarker_ = false;

    // How far behind the client is.
    std::atomic<std::uint64_t> unanswered_; // calls in the upper half, their bytes in the lower half
    std::atomic<std::size_t> unsentBytes_; // from `send` until the socket took them
    std::atomic<std::uint64_t> droppedBytes_; // of answers that it will not get

    foundation::Mutex lock_;
    FileDescriptor socket_; // read from without the lock, for only the connection thread closes it, under the lock
    ConnectionOutput output_ KESTO_GUARDED_BY(lock_); // what the socket did not take yet
    std::uint32_t watchedEvents_ KESTO_GUARDED_BY(lock_) = 0;
    std::uint64_t readingPauses_ KESTO_GUARDED_BY(lock_) = 0;
    std::optional<std::string> breakReason_ KESTO_GUARDED_BY(lock_);
    bool isResumed_ KESTO_GUARDED_BY(lock_) = false;
    bool isOver_ KESTO_GUARDED_BY(lock_) = false;
    bool cannotSend_ KESTO_GUARDED_BY(lock_) = false; // the peer takes nothing any more
};

} // namespace platform
