// SPDX-License-Identifier: Apache-2.0
// A connection without a socket, seen from the client's side: the test makes calls, reads the answers, and ends the
// connection in any of several ways.
//
// Every frame is encoded and decoded in both directions, so that a client can send exactly what is possible on a wire
// (and cannot, for example, pass an object of the service's own).
#pragma once

#include "foundation/cbor/Cbor.h"
#include "platform/Connection.h"
#include "support/PrintValues.h"

#include <deque>
#include <memory>
#include <string>
#include <vector>

namespace support {

// One thread.
class FakeConnection final : public platform::Connection, public std::enable_shared_from_this<FakeConnection> {
public:
    // Beyond either limit, reading from the peer pauses.
    static constexpr std::size_t mostUnansweredCalls = 32 * 1024;
    static constexpr std::size_t mostUnansweredBytes = 1024 * 1024;

    explicit FakeConnection(std::int32_t processIdentifier, std::uint32_t userIdentifier = 0)
        : processIdentifier_(processIdentifier),
          userIdentifier_(userIdentifier)
    {
    }

    // The peer makes one call. It is delivered immediately unless too many calls are unanswered; then later, with the
    // next call or with `readOn`. After a violation the connection breaks.
    std::expected<void, Violation> call(foundation::Array frame);
    std::expected<void, Violation> readOn();
    // The frames that came back.
    [[nodiscard]] const std::vector<foundation::Array>& received() const { return received_; }
    // How many frames were sent, including those of the running turn.
    [[nodiscard]] std::size_t sent() const { return sent_; }
    // The number of calls that the service has not finished.
    [[nodiscard]] std::size_t unansweredCalls() const { return unansweredCalls_; }

    // The peer closes the connection: it is invalidated.
    void close();
    // The connection breaks: it is interrupted, then invalidated. Or interrupted only, for now.
    void breakOff();
    void interrupt();
    // Releases its handlers, which hold pending answers, which hold the connection.
    void letGo();

    [[nodiscard]] bool isResumed() const { return isResumed_; }
    [[nodiscard]] bool isOver() const { return isOver_; }

    [[nodiscard]] std::int32_t processIdentifier() const override { return processIdentifier_; }
    [[nodiscard]] std::uint32_t userIdentifier() const override { return userIdentifier_; }
    [[nodiscard]] std::string description() const override;
    void setCallHandler(CallHandler handler) override { callHandler_ = std::move(handler); }
    void setInterruptionHandler(EndHandler handler) override { interruptionHandler_ = std::move(handler); }
    void setInvalidationHandler(EndHandler handler) override { invalidationHandler_ = std::move(handler); }
    // A lane of the fake queues is never full.
    void setLane(std::shared_ptr<platform::Lane>, std::shared_ptr<ledger::Workload>) override { }
    void setLogShare(std::shared_ptr<platform::LogShare>) override { }
    // All handlers must be installed before.
    void resume() override;
    void send(platform::Turn& turn, std::string frame) override;
    void write(std::string letter) override;

private:
    class Credit;

    [[nodiscard]] foundation::Array decoded(std::string_view frame);
    [[nodiscard]] bool isBehind() const;
    [[nodiscard]] std::expected<void, Violation> deliverNext();
    void deliverWhatIsLeft();

    const std::int32_t processIdentifier_;
    const std::uint32_t userIdentifier_;
    CallHandler callHandler_;
    EndHandler interruptionHandler_;
    EndHandler invalidationHandler_;
    bool isResumed_ = false;
    bool isInterrupted_ = false;
    bool isOver_ = false;
    foundation::CborDecoder decoder_;
    std::deque<std::string> unread_; // calls
    std::vector<foundation::Array> received_;
    std::size_t sent_ = 0;
    std::size_t unansweredCalls_ = 0;
    std::size_t unansweredBytes_ = 0;
};

// Passes connections to its delegate when the test makes them.
class FakeConnectionListener final : public platform::ConnectionListener {
public:
    FakeConnectionListener() = default;
    ~FakeConnectionListener() override;
    FakeConnectionListener(const FakeConnectionListener&) = delete;
    FakeConnectionListener& operator=(const FakeConnectionListener&) = delete;

    // A process connects. The connection is over if the delegate refuses it.
    std::shared_ptr<FakeConnection> connect(std::int32_t processIdentifier, std::uint32_t userIdentifier = 0);

    void setDelegate(platform::ConnectionListenerDelegate& delegate) override { delegate_ = &delegate; }
    // Returns immediately: the test makes connections.
    void resume() override { }
    void stop() override;

private:
    [[nodiscard]] std::vector<std::shared_ptr<FakeConnection>> living() const;

    platform::ConnectionListenerDelegate* delegate_ = nullptr;
    std::vector<std::weak_ptr<FakeConnection>> connections_;
};

} // namespace support
