// A connection without a socket, seen from the client's side: the test makes calls, reads the answers, and ends the
// connection in one way or the other.
//
// Every frame goes through its encoding in both directions, so that what a client can say, and what it cannot (hand
// in an object of the service's own, for one), is what it is on a wire.
#pragma once

#include "foundation/Cbor.h"
#include "platform/Connection.h"

#include <memory>
#include <string>
#include <vector>

namespace support {

// One thread.
class FakeConnection final : public platform::Connection, public std::enable_shared_from_this<FakeConnection> {
public:
    explicit FakeConnection(std::int32_t processIdentifier) : processIdentifier_(processIdentifier) { }

    // Delivers one call. After a violation the connection breaks.
    std::expected<void, Violation> call(foundation::Array frame);
    // The frames that came back.
    [[nodiscard]] const std::vector<foundation::Array>& received() const { return received_; }
    // Calls that nobody has finished working on.
    [[nodiscard]] std::size_t unansweredCalls() const;

    // The peer closes the connection: it is invalidated.
    void close();
    // The connection breaks: it is interrupted, then invalidated. Or interrupted only, for now.
    void breakOff();
    void interrupt();
    // Lets its handlers go, which hold what will answer, which holds the connection.
    void letGo();

    [[nodiscard]] bool isResumed() const { return isResumed_; }

    [[nodiscard]] std::int32_t processIdentifier() const override { return processIdentifier_; }
    [[nodiscard]] std::string description() const override;
    void setCallHandler(CallHandler handler) override { callHandler_ = std::move(handler); }
    void setInterruptionHandler(EndHandler handler) override { interruptionHandler_ = std::move(handler); }
    void setInvalidationHandler(EndHandler handler) override { invalidationHandler_ = std::move(handler); }
    // All handlers are installed before.
    void resume() override;
    void send(std::string frame) override;

private:
    [[nodiscard]] foundation::Array decoded(const std::string& frame);

    const std::int32_t processIdentifier_;
    CallHandler callHandler_;
    EndHandler interruptionHandler_;
    EndHandler invalidationHandler_;
    bool isResumed_ = false;
    bool isInterrupted_ = false;
    bool isOver_ = false;
    foundation::CborDecoder decoder_;
    std::vector<foundation::Array> received_;
    std::vector<std::weak_ptr<void>> unanswered_;
};

// Hands connections to its delegate when the test has them come.
class FakeConnectionListener final : public platform::ConnectionListener {
public:
    FakeConnectionListener() = default;
    ~FakeConnectionListener() override;
    FakeConnectionListener(const FakeConnectionListener&) = delete;
    FakeConnectionListener& operator=(const FakeConnectionListener&) = delete;

    // A process connects.
    std::shared_ptr<FakeConnection> connect(std::int32_t processIdentifier);

    void setDelegate(platform::ConnectionListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override { }
    void stop() override { }

private:
    platform::ConnectionListenerDelegate* delegate_ = nullptr;
    std::vector<std::weak_ptr<FakeConnection>> connections_;
};

} // namespace support
