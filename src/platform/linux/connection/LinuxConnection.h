// SPDX-License-Identifier: Apache-2.0
// A connection to one client over a Unix stream socket.
//
// The connection thread reads: it takes what has come in, up to a limit, into a buffer that all connections share, cuts
// it into frames, decodes them, and delivers their calls immediately. Any thread writes: it tries the socket itself.
// Only what a slow peer does not take waits until the connection thread finds room in the socket again.
//
// A client may ask for the status as often as it likes: a connection makes one answer in each pass of the connection
// thread, and only when the socket has taken the one before. The other requests wait; they count as unanswered calls.
//
// A connection reads only while its lane has room, so that calls that cannot be carried out soon stay with their
// client; and only while there is memory for what comes (see TransitMemory).
//
// Every client is treated as hostile. If one breaks the protocol, its own connection ends, with one line in the log. If
// it asks faster than it gets answers, or does not read its answers, the connection stops reading from it until it is
// less behind; if even then far too many answers are unread, the connection ends. At the end the log says what this
// cost.
#pragma once

#include "foundation/Mutex.h"
#include "platform/Connection.h"
#include "platform/linux/connection/ConnectionHub.h"
#include "platform/linux/connection/ConnectionInput.h"
#include "platform/linux/connection/ConnectionOutput.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/EmitterAccess.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

class LinuxConnection final : public Connection, public std::enable_shared_from_this<LinuxConnection> {
public:
    // The connection stops reading beyond either limit; the read that passes it is still taken in. A client may have
    // 10,000 sessions, and the start of each is unanswered until the session stops: the number is far above that.
    static constexpr std::uint32_t mostUnansweredCalls = 32 * 1024;
    static constexpr std::uint32_t mostUnansweredBytes = 1024 * 1024;
    // Beyond the first limit, the connection stops reading from the client; beyond the second, it ends.
    static constexpr std::size_t manyUnsentBytes = 8 * 1024 * 1024;
    static constexpr std::size_t mostUnsentBytes = 32 * 1024 * 1024;

    // The process at the other end.
    struct Peer {
        std::int32_t processIdentifier = 0;
        std::uint32_t userIdentifier = 0;
        std::uint32_t groupIdentifier = 0; // its primary group
    };

    // The socket is connected and non-blocking.
    LinuxConnection(std::shared_ptr<ConnectionHub> hub, FileDescriptor socket, Peer peer);

    [[nodiscard]] std::int32_t processIdentifier() const override { return peer_.processIdentifier; }
    [[nodiscard]] std::uint32_t userIdentifier() const override { return peer_.userIdentifier; }
    [[nodiscard]] std::string description() const override;
    void setCallHandler(CallHandler handler) override { callHandler_ = std::move(handler); }
    void setInterruptionHandler(EndHandler handler) override { interruptionHandler_ = std::move(handler); }
    void setInvalidationHandler(EndHandler handler) override { invalidationHandler_ = std::move(handler); }
    void setLane(std::shared_ptr<Lane> lane, std::shared_ptr<ledger::Workload> workload) override;
    void setLogShare(std::shared_ptr<LogShare> share) override { logShare_ = std::move(share); }
    void resume() override;
    void send(Turn& turn, std::string frame) override;
    void write(std::string frames) override;

    // What a connection waits for.
    enum class Next : std::uint8_t {
        Event, // of its socket
        Room, // in the memory of all connections
        Turn, // of the connection thread: it has more to do already
        End // nothing: it is over, so that the listener forgets it
    };
    // Handles events of the socket (those of epoll, once for each change), and what earlier calls left to do. Reads at
    // most so many bytes. Connection thread.
    [[nodiscard]] Next handle(std::uint32_t events, std::size_t mostBytes);
    // Whether there may be memory for what it did not read. Connection thread.
    [[nodiscard]] bool mayHaveRoom() { return hub_->transit.mayHaveRoom(*share_, partBytes_); }

    // Ends the connection, with its handlers. Connection thread.
    void invalidate() { end(std::nullopt); }

    // The same as if the peer closed it now: first delivers the calls that it has sent. Connection thread.
    void finish();

private:
    class Credit;
    struct StatusRequest {
        std::uint64_t call;
        std::size_t size; // of its frame
    };

    [[nodiscard]] bool wantsToRead() const KESTO_REQUIRES(lock_);
    [[nodiscard]] Next settle();
    void readIfThereIsRoom(std::size_t mostBytes);
    void read(std::size_t mostBytes);
    void endOfStream();
    void takeIn(std::string_view bytes);
    [[nodiscard]] std::expected<void, Violation> decodeFrames();
    [[nodiscard]] std::expected<void, Violation> deliverCalls();
    [[nodiscard]] std::expected<void, Violation> askForEmitterAccess(const foundation::Value& call);
    void handOver(std::uint64_t call, const EmitterDescriptors& descriptors);
    [[nodiscard]] std::expected<void, Violation> askForStatus(const foundation::Value& call, std::size_t size);
    void answerStatusRequest();
    [[nodiscard]] bool mayKnowWhatOthersDid() const;
    void countPart();
    [[nodiscard]] static std::shared_ptr<LinuxConnection> largestDebtor(ConnectionHub& hub,
                                                                        const TransitMemory::User* of);
    void makeRoom();
    void giveUp();
    void breakOff(std::string reason);
    void breakOffLocked(std::string reason) KESTO_REQUIRES(lock_);
    void countUnfinishedEnd();
    void end(std::optional<std::string> interruptedBecause);

    void startOutput(std::string_view frame, const EmitterDescriptors* descriptors) KESTO_REQUIRES(lock_);
    void returnCredit(std::size_t bytes);
    [[nodiscard]] bool isBehind() const noexcept;
    void drop(std::size_t bytes);
    void noLongerUnsent(std::size_t bytes);
    void writeOutput() KESTO_REQUIRES(lock_);
    void watch() KESTO_REQUIRES(lock_);

    const std::shared_ptr<ConnectionHub> hub_;
    const Peer peer_;

    // Only for the connection thread.
    std::shared_ptr<Lane> lane_; // null: it is never full
    std::shared_ptr<ledger::Workload> workload_; // null without a lane
    std::shared_ptr<LogShare> logShare_; // null: it writes for nobody
    CallHandler callHandler_;
    EndHandler interruptionHandler_;
    EndHandler invalidationHandler_;
    ConnectionInput input_;
    std::size_t partBytes_ = 0; // memory of a frame that has come in part
    bool mayHaveUnread_ = false; // bytes in the socket
    bool lacksRoom_ = false; // for what is in the socket
    bool peerIsGone_ = false; // it sends no more, or cannot be reached
    bool peerIsDone_ = false; // all that it sent is read, and ends between two frames
    bool isFinishing_ = false; // by the service: a frame that is cut short is not the peer's fault
    bool hasAskedForEmitterAccess_ = false;
    bool awaitsStatus_ = false; // a request waits, so that other connections need no lock to find none

    const std::shared_ptr<TransitMemory::Share> share_; // of the part, of waiting calls and requests, and of answers
    std::atomic<bool> hasGivenUp_ = false; // its answers, which count no longer

    // How far the client is behind.
    std::atomic<bool> isLaneFull_ = false; // this alone is not the client's fault, so no pause is counted
    std::atomic<std::uint64_t> unanswered_; // calls in the upper half, their bytes in the lower half
    std::atomic<std::size_t> unsentBytes_; // from `send` until the socket accepts them
    std::atomic<std::uint64_t> droppedBytes_; // of answers that the client will not get

    foundation::Mutex lock_;
    FileDescriptor socket_; // read without the lock: only the connection thread closes it, under the lock
    ConnectionOutput output_ KESTO_GUARDED_BY(lock_); // what the socket has not accepted yet
    std::deque<StatusRequest> statusRequests_ KESTO_GUARDED_BY(lock_); // not answered yet
    std::uint32_t watchedEvents_ KESTO_GUARDED_BY(lock_) = 0;
    std::uint64_t readingPauses_ KESTO_GUARDED_BY(lock_) = 0;
    std::optional<std::string> breakReason_ KESTO_GUARDED_BY(lock_);
    bool isResumed_ KESTO_GUARDED_BY(lock_) = false;
    bool isOver_ KESTO_GUARDED_BY(lock_) = false;
    bool cannotSend_ KESTO_GUARDED_BY(lock_) = false; // the peer accepts no more bytes
};

} // namespace platform
