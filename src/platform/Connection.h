// SPDX-License-Identifier: Apache-2.0
// Inter-process connections, as the service sees them: a listener with a delegate, and connections that
// deliver calls and carry replies back.
//
// A connection does not know the operations: a call is an array of values, which the call handler checks. All handlers
// of one connection run on one connection thread, in order: calls, then at most one interruption, then one
// invalidation, which is the last. Calls that the peer sent before it went are delivered before these; calls behind one
// that breaks the protocol are not delivered.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Turn.h"
#include "platform/WorkQueue.h"

#include <cstdint>
#include <expected>
#include <functional>
#include <memory>
#include <string>
#include <utility>

namespace platform {

class Connection {
public:
    // A call handler returns it for a call that breaks the protocol; its text goes to the log. The connection then
    // ends.
    struct Violation {
        std::string reason;
    };
    // One call, and the connection that it came from, which is never null. Code that works on a call keeps `caller`
    // until the call is answered: while a client's unanswered calls are too many or too large, the connection stops
    // reading from it.
    struct Call {
        foundation::Array frame;
        std::shared_ptr<Connection> caller;
    };
    using CallHandler = std::move_only_function<std::expected<void, Violation>(Call call)>;
    using EndHandler = std::move_only_function<void()>;

    virtual ~Connection() = default;

    // The connection from which the calling thread is handling a call, or null; null also in the handlers of its end.
    //
    // It belongs to the thread because the functions that handle calls have fixed parameters, and the caller is not
    // among them. Ask before the call's work is submitted to a queue: the queue's items may run on other threads.
    [[nodiscard]] static const Connection* current() noexcept { return current_; }

    // Makes a connection the current one of this thread while its calls are being handled.
    class CallScope {
    public:
        explicit CallScope(const Connection& connection) noexcept : outer_(std::exchange(current_, &connection)) { }
        ~CallScope() { current_ = outer_; }
        CallScope(const CallScope&) = delete;
        CallScope& operator=(const CallScope&) = delete;

    private:
        const Connection* const outer_;
    };

    // The peer's process, as the kernel reported it at acceptance. Any thread.
    [[nodiscard]] virtual std::int32_t processIdentifier() const = 0;
    // The peer's user, likewise. Any thread.
    [[nodiscard]] virtual std::uint32_t userIdentifier() const = 0;
    // A text that names the peer, for the log. Any thread.
    [[nodiscard]] virtual std::string description() const = 0;

    // Call these before `resume`. The connection calls the first handler for each frame, the second when it breaks, and
    // the third when it ends (after it broke, too, and when the peer closed it cleanly). It keeps all handlers until
    // the last has returned, and then releases them.
    virtual void setCallHandler(CallHandler handler) = 0;
    virtual void setInterruptionHandler(EndHandler handler) = 0;
    virtual void setInvalidationHandler(EndHandler handler) = 0;

    // The lane on which the calls are carried out: while it is full, the connection stops reading. What the client
    // makes the service do counts in the workload. Before `resume`.
    virtual void setLane(std::shared_ptr<Lane> lane, std::shared_ptr<ledger::Workload> workload) = 0;

    // What is written to the log about the connection's end counts in that share. Before `resume`.
    virtual void setLogShare(std::shared_ptr<LogShare> share) = 0;

    // Starts reading. Connection thread, in `shouldAcceptNewConnection`.
    virtual void resume() = 0;

    // Sends one frame, an encoded CBOR item, to the peer: it leaves after the turn, once everything that the turn
    // stored is kept. Never blocks; what is sent to a connection that broke or is over, or is so before the frame could
    // leave, is dropped. The thread that runs the turn.
    virtual void send(Turn& turn, std::string frame) = 0;
    // Writes a letter that `send` has filled. Never blocks. Any thread.
    virtual void write(std::string letter) = 0;

private:
    static inline thread_local const Connection* current_ = nullptr;
};

class ConnectionListener;

// Decides on new connections. Called on a connection thread.
class ConnectionListenerDelegate {
public:
    virtual ~ConnectionListenerDelegate() = default;
    // True accepts; the delegate has then installed the handlers and resumed the connection. False closes it.
    virtual bool shouldAcceptNewConnection(ConnectionListener& listener,
                                           const std::shared_ptr<Connection>& connection) = 0;
};

// The listener of the name under which the process was launched. One a process.
class ConnectionListener {
public:
    virtual ~ConnectionListener() = default;
    // The delegate must outlive the listener's run. Call this before `resume`.
    virtual void setDelegate(ConnectionListenerDelegate& delegate) = 0;
    // Accepts connections, on the calling thread; returns after `stop`. Before it returns, it ends the connections as
    // if their peers had closed them: it delivers the calls that these have sent, and invalidates the connections.
    virtual void resume() = 0;
    // Makes `resume` return, also if it is called later. Any thread.
    virtual void stop() = 0;
};

} // namespace platform
