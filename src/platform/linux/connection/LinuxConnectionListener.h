// SPDX-License-Identifier: Apache-2.0
// The room of connections: the socket of the service, its clients' connections, and the frames that they exchange. It
// uses sockets and epoll. It hands calls to a queue, and the trace's marker and switch page, or the status, to clients
// that ask. It does not know what a call or a status means or what the service does with it.
//
// The listener accepts the connections of the service's socket. The thread that resumes it is the connection thread of
// all of them: it waits for all sockets together, and wakes for nothing else.
//
// It uses epoll itself rather than Asio, which makes one more system call for each read: an exchange takes 3.5 us over
// a bare socket, 3.5 us with epoll, and 4.1 us with Asio. Epoll also lets any thread change what a socket is watched
// for, without waking this thread.
//
// When the thread has read what came in, it helps with the resulting work (see SerialQueue). It reads nothing
// meanwhile, so clients wait; they would wait for the same work anyway.
//
// While several clients have something to read, they share the thread's time (see FairShares): it reads a little from
// one, helps with that, and looks who else has come.
#pragma once

#include "platform/linux/connection/ConnectionHub.h"
#include "platform/linux/connection/LinuxConnection.h"
#include "platform/linux/connection/ListeningSocket.h"
#include "platform/linux/queues/FairShares.h"

#include <chrono>
#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <system_error>
#include <unordered_map>
#include <unordered_set>

struct epoll_event;

namespace platform {

class LinuxConnectionListener final : public ConnectionListener {
public:
    // How many of the process's descriptors clients cannot take; but never more than half of them.
    static constexpr std::size_t descriptorsForTheRest = 64;
    // With fewer descriptors the half that clients cannot take may be too small for the service itself: it has some 16
    // files open when it is idle, and some more while it samples channels, captures a bug or writes a file.
    static constexpr std::size_t leastDescriptors = 64;
    // How many this process may have.
    [[nodiscard]] static std::size_t mostDescriptors();
    // The part (a fourth) of all other descriptors that one user alone cannot take. Further connections of a user are
    // closed immediately, so that no user keeps the others out.
    static constexpr std::size_t partForOthers = 4;
    // How long clients wait if the system has no descriptor for them.
    static constexpr std::chrono::milliseconds acceptingPause{1000};
    // How long connections that wait for memory wait at most before they look for it themselves.
    static constexpr std::chrono::milliseconds lookingPause{1000};

    // The ledger counts the connections, and the category gets a line for each that breaks. Fails if the system has no
    // descriptors left. With so many descriptors in all.
    [[nodiscard]] static std::expected<std::unique_ptr<LinuxConnectionListener>, std::error_code>
    create(ListeningSocket socket, ledger::Ledger& ledger, LogCategory& log,
           std::size_t descriptors = mostDescriptors());

    void setDelegate(ConnectionListenerDelegate& delegate) override { delegate_ = &delegate; }
    // Gives the trace's marker and switch page to clients that ask. Call this before `resume`.
    void setEmitterAccess(EmitterAccess& access) { hub_->emitterAccess = &access; }
    // Makes the answers to clients that ask for the status: with culprits for those that may know what others did. The
    // connection thread calls it, so it must not wait. Call this before `resume`.
    void setStatus(std::function<foundation::Dictionary(bool withCulprits)> status)
    {
        hub_->status = std::move(status);
    }
    // Bounds what all connections together hold (see TransitMemory). Without this there are no such bounds. Call this
    // before `resume`.
    void setMemory(const Memory& memory)
    {
        hub_->transit.setLimits([&memory] { return memory.limits(); });
    }
    // `resume` calls the handler once, as soon as new clients are served. Call this before `resume`.
    void setListeningHandler(std::move_only_function<void()> handler) { listeningHandler_ = std::move(handler); }
    // `resume` calls the handler once, when it has been stopped, before it ends the connections. The same.
    void setStoppedHandler(std::move_only_function<void()> handler) { stoppedHandler_ = std::move(handler); }
    void resume() override;
    // From now on new clients wait in the socket, until this object is destroyed.
    void stop() override;

private:
    using Clock = std::chrono::steady_clock;

    // A user with connections.
    struct User {
        std::size_t connections = 0;
        bool refusalIsLogged = false; // since half of the connections ended
    };

    // A connection whose socket has something for it.
    struct Reader : FairShares::Share {
        std::shared_ptr<LinuxConnection> connection;
        std::uint32_t events = 0; // that it has not handled yet
        std::size_t mostBytes = 4096; // that are read at once while others wait

        void adapt(Clock::duration time);
    };

    LinuxConnectionListener(ListeningSocket socket, FileDescriptor epoll, FileDescriptor wake, ledger::Ledger& ledger,
                            LogCategory& log, std::size_t descriptors);

    [[nodiscard]] bool watch(int operation, int descriptor, std::uint32_t events, void* tag);
    void serve();
    [[nodiscard]] int waitingTime() const;
    void handle(const epoll_event& event);
    void lookForRoom();
    void serveReaders();
    [[nodiscard]] bool serve(Reader& reader, std::size_t mostBytes);
    void acceptWaiting();
    void welcome(FileDescriptor socket);
    [[nodiscard]] bool admit(const Submitter& process);
    void forget(const LinuxConnection& connection);
    void pauseAccepting(std::optional<Clock::duration> pause, int error);
    void resumeAccepting();

    ListeningSocket socket_;
    const std::shared_ptr<ConnectionHub> hub_;
    const std::size_t mostConnections_;
    const std::size_t mostConnectionsOfAUser_;
    ConnectionListenerDelegate* delegate_ = nullptr;
    std::move_only_function<void()> listeningHandler_;
    std::move_only_function<void()> stoppedHandler_;
    std::atomic<bool> isStopping_ = false;

    // Only for the connection thread.
    std::unordered_map<const void*, std::shared_ptr<Reader>> connections_; // by connection
    FairShares ready_; // readers
    std::unordered_set<std::shared_ptr<Reader>> waitingForRoom_; // in the memory of all connections
    Clock::time_point lookForRoomAt_; // if some wait
    std::unordered_map<std::uint32_t, User> users_; // by number
    bool isAccepting_ = false;
    bool pauseIsLogged_ = false;
    std::optional<Clock::time_point> acceptAgainAt_;
};

} // namespace platform
