// SPDX-License-Identifier: Apache-2.0
// Expectations check the rules that a real connection keeps: no call before reading begins, none after the end.
#include "support/fakes/FakeConnection.h"

#include "platform/linux/connection/FrameReader.h"

#include <gtest/gtest.h>
#include <utility>

namespace support {

using foundation::Array;
using foundation::Value;

// A call holds it until the call is answered.
class FakeConnection::Credit {
public:
    Credit(std::shared_ptr<FakeConnection> connection, std::size_t bytes)
        : connection_(std::move(connection)),
          bytes_(bytes)
    {
        ++connection_->unansweredCalls_;
        connection_->unansweredBytes_ += bytes_;
    }
    ~Credit()
    {
        --connection_->unansweredCalls_;
        connection_->unansweredBytes_ -= bytes_;
    }
    Credit(const Credit&) = delete;
    Credit& operator=(const Credit&) = delete;

private:
    const std::shared_ptr<FakeConnection> connection_;
    const std::size_t bytes_;
};

std::expected<void, platform::Connection::Violation> FakeConnection::call(Array frame)
{
    EXPECT_TRUE(isResumed_ && !isInterrupted_ && !isOver_) << "no call reaches a service that does not read";
    foundation::appendCbor(Value(std::move(frame)), unread_.emplace_back());
    return readOn();
}

std::expected<void, platform::Connection::Violation> FakeConnection::readOn()
{
    while (!unread_.empty() && !isBehind())
        if (auto delivered = deliverNext(); !delivered) {
            breakOff();
            return delivered;
        }
    return {};
}

bool FakeConnection::isBehind() const
{
    return unansweredCalls_ > mostUnansweredCalls || unansweredBytes_ > mostUnansweredBytes;
}

// Calls after a violation are ignored.
std::expected<void, platform::Connection::Violation> FakeConnection::deliverNext()
{
    const std::string bytes = std::move(unread_.front());
    unread_.pop_front();
    const CallScope scope(*this);
    auto result = callHandler_({decoded(bytes), {std::make_shared<Credit>(shared_from_this(), bytes.size()), this}});
    if (!result)
        unread_.clear();
    return result;
}

void FakeConnection::resume()
{
    EXPECT_TRUE(callHandler_ && interruptionHandler_ && invalidationHandler_)
        << "calls may come immediately, so all handlers must be set";
    isResumed_ = true;
}

// Delivers all calls that the peer made before it went.
void FakeConnection::deliverWhatIsLeft()
{
    while (!isInterrupted_ && !unread_.empty())
        if (!deliverNext())
            interrupt();
}

void FakeConnection::close()
{
    deliverWhatIsLeft();
    if (std::exchange(isOver_, true))
        return;
    if (invalidationHandler_)
        invalidationHandler_();
    letGo(); // no call follows, so the handlers are released
}

void FakeConnection::letGo()
{
    callHandler_ = nullptr;
    interruptionHandler_ = nullptr;
    invalidationHandler_ = nullptr;
}

void FakeConnection::breakOff()
{
    interrupt();
    close();
}

void FakeConnection::interrupt()
{
    deliverWhatIsLeft();
    if (!isOver_ && !std::exchange(isInterrupted_, true))
        interruptionHandler_();
}

std::string FakeConnection::description() const
{
    return "connection of process " + std::to_string(processIdentifier_);
}

void FakeConnection::send(platform::Turn& turn, std::string frame)
{
    ++sent_;
    platform::appendFrame(frame, turn.letters.to(*this));
}

void FakeConnection::write(std::string letter)
{
    if (isInterrupted_ || isOver_)
        return;
    platform::FrameReader reader;
    reader.feed(letter);
    for (auto frame = reader.next(); frame && *frame; frame = reader.next())
        received_.push_back(decoded(**frame));
}

Array FakeConnection::decoded(std::string_view frame)
{
    const auto value = decoder_.decode(frame);
    EXPECT_TRUE(value && value->array()) << "a frame is an array";
    return value ? value->array().value_or(Array()) : Array();
}

FakeConnectionListener::~FakeConnectionListener()
{
    for (const auto& connection : living())
        connection->letGo();
}

std::shared_ptr<FakeConnection> FakeConnectionListener::connect(std::int32_t processIdentifier,
                                                                std::uint32_t userIdentifier)
{
    auto connection = std::make_shared<FakeConnection>(processIdentifier, userIdentifier);
    connections_.push_back(connection);
    if (!delegate_->shouldAcceptNewConnection(*this, connection))
        connection->close();
    return connection;
}

void FakeConnectionListener::stop()
{
    for (const auto& connection : living())
        connection->close();
}

std::vector<std::shared_ptr<FakeConnection>> FakeConnectionListener::living() const
{
    std::vector<std::shared_ptr<FakeConnection>> living;
    for (const auto& known : connections_)
        if (auto connection = known.lock())
            living.push_back(std::move(connection));
    return living;
}

} // namespace support
