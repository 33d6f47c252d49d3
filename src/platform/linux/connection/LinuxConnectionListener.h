// The room of connections: the socket of the service, its clients' connections, and the frames that they exchange. It
// touches sockets and epoll. It hands calls to a queue and the descriptors for trace events to clients that ask; it
// knows neither what a call means nor what becomes of it.
//
// Accepts the connections of the socket under which the service is reached, and is the connection thread of all
// of them: the thread that resumes the listener waits for all sockets at once and wakes for nothing else.
//
// It waits with epoll itself rather than through Asio, whose waiting costs one more system call a read: of an
// exchange that takes 3.5 us over a bare socket and 3.5 us with epoll, Asio makes 4.1 us. It also lets every
// thread change what a socket is watched for, without waking this one.
//
// Having read what has come in, the thread helps with the work that came of it (SerialQueue). While it does it
// reads nothing, and who is not read from waits; they would wait for the same work anyway.
#pragma once

#include "platform/linux/connection/ConnectionHub.h"
#include "platform/linux/connection/LinuxConnection.h"
#include "platform/linux/connection/ListeningSocket.h"

#include <chrono>
#include <expected>
#include <functional>
#include <memory>
#include <optional>
#include <system_error>
#include <unordered_map>

struct epoll_event;

namespace platform {

class LinuxConnectionListener final : public ConnectionListener {
public:
    // Of the descriptors that the process may have open, those that clients cannot take.
    static constexpr std::size_t descriptorsForTheRest = 64;
    // Of the connections that are left, the part (a fourth) that no user alone can take: further connections of one
    // user are closed at once, so that none keeps the others out.
    static constexpr std::size_t partForOthers = 4;
    // How long clients wait when the system has no descriptor for them.
    static constexpr std::chrono::milliseconds acceptingPause{1000};

    // The category gets a line for every connection that breaks. Fails when the system has no descriptors left.
    [[nodiscard]] static std::expected<std::unique_ptr<LinuxConnectionListener>, std::error_code>
    create(ListeningSocket socket, LogCategory& log);

    void setDelegate(ConnectionListenerDelegate& delegate) override { delegate_ = &delegate; }
    // Who hands out the marker of the kernel's trace to clients that ask. Before `resume`.
    void setEmitterAccess(EmitterAccess& access) { hub_->emitterAccess = &access; }
    // Called by `resume` when clients that connect from now on are served. Before `resume`.
    void setListeningHandler(std::move_only_function<void()> handler) { listeningHandler_ = std::move(handler); }
    void resume() override;
    // Makes `resume` end all connections and return. Any thread.
    void stop() override;

    // Any thread.
    [[nodiscard]] const ConnectionCounters& counters() const noexcept { return hub_->counters; }

private:
    using Clock = std::chrono::steady_clock;

    // A user with connections.
    struct User {
        std::size_t connections = 0;
        bool refusalIsLogged = false; // since one of them ended
    };

    LinuxConnectionListener(ListeningSocket socket, FileDescriptor epoll, FileDescriptor wake, LogCategory& log);

    [[nodiscard]] bool watch(int operation, int descriptor, std::uint32_t events, void* tag);
    void serve();
    void wake();
    [[nodiscard]] int waitingTime() const;
    void handle(const epoll_event& event);
    void acceptWaiting();
    void welcome(FileDescriptor socket);
    void forget(const LinuxConnection& connection);
    void handle(LinuxConnection& connection, std::uint32_t events);
    void pauseAccepting(std::optional<Clock::duration> pause, int error);
    void resumeAccepting();

    ListeningSocket socket_;
    FileDescriptor wake_;
    const std::shared_ptr<ConnectionHub> hub_;
    const std::size_t mostConnections_;
    const std::size_t mostConnectionsOfAUser_;
    ConnectionListenerDelegate* delegate_ = nullptr;
    std::move_only_function<void()> listeningHandler_;
    std::atomic<bool> isStopping_ = false;

    // The connection thread's.
    std::unordered_map<const LinuxConnection*, std::shared_ptr<LinuxConnection>> connections_;
    std::unordered_map<std::uint32_t, User> users_; // by number
    bool isAccepting_ = false;
    bool pauseIsLogged_ = false;
    std::optional<Clock::time_point> acceptAgainAt_;
};

} // namespace platform
