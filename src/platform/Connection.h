// Inter-process connections, as the service sees them: a listener with a delegate, and connections that
// deliver calls and carry replies back.
//
// A connection knows nothing of the operations: a call is an array of values, checked by whoever is
// given it. All handlers of one connection run on one connection thread, in order: calls, then at most
// one interruption, then one invalidation, after which nothing follows. What the peer sent before it went is
// delivered before that; what it sent behind a call that breaks the protocol is not.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Turn.h"

#include <cstdint>
#include <expected>
#include <functional>
#include <memory>
#include <string>
#include <utility>

namespace platform {

class Connection {
public:
    // What a call handler answers to a call that breaks the protocol: the words that the log shows.
    // The connection then ends.
    struct Violation {
        std::string reason;
    };
    // One call, and the connection that it came from, which is never null. Whoever works on it keeps `caller` until it
    // is answered: while a client's unanswered calls are too many or too large, the connection reads no more from it.
    struct Call {
        foundation::Array frame;
        std::shared_ptr<Connection> caller;
    };
    using CallHandler = std::move_only_function<std::expected<void, Violation>(Call call)>;
    using EndHandler = std::move_only_function<void()>;

    virtual ~Connection() = default;

    // The connection whose call the calling thread is handling, or null; null also in the handlers of its end.
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

    // Who is at the other end, as the kernel told at acceptance. Any thread.
    [[nodiscard]] virtual std::int32_t processIdentifier() const = 0;
    // The peer in words, for the log. Any thread.
    [[nodiscard]] virtual std::string description() const = 0;

    // Before `resume`: what is called for each frame, when the connection broke, and when it is over (also
    // after it broke, and when the peer closed it cleanly). All of them are held until the last has returned, and none
    // after that.
    virtual void setCallHandler(CallHandler handler) = 0;
    virtual void setInterruptionHandler(EndHandler handler) = 0;
    virtual void setInvalidationHandler(EndHandler handler) = 0;

    // Begins to read.
    virtual void resume() = 0;

    // Sends one frame, an encoded CBOR item, to the peer: it leaves after the turn, once everything that the turn
    // stored is kept. Never blocks; what is sent to a connection that broke or is over, or is so before the frame could
    // leave, is dropped.
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
    virtual void setDelegate(ConnectionListenerDelegate& delegate) = 0; // must outlive the listener's run
    // Accepts connections; keeps the calling thread until `stop` (which only tests call). The connections are
    // invalidated before it returns.
    virtual void resume() = 0;
    virtual void stop() = 0;
};

} // namespace platform
