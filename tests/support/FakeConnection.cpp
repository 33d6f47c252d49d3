// The rules that a real connection keeps are expectations here: no call before reading begins, none after the end.
#include "support/FakeConnection.h"

#include <algorithm>
#include <gtest/gtest.h>
#include <utility>

namespace support {

using foundation::Array;
using foundation::Value;

std::expected<void, platform::Connection::Violation> FakeConnection::call(Array frame)
{
    EXPECT_TRUE(isResumed_ && !isOver_) << "no call reaches a service that does not read";
    std::string bytes;
    foundation::appendCbor(Value(std::move(frame)), bytes);
    const auto unanswered = std::make_shared<std::shared_ptr<Connection>>(shared_from_this());
    unanswered_.push_back(unanswered);
    const CallScope scope(*this);
    auto result = callHandler_({decoded(bytes), {unanswered, this}});
    if (!result)
        breakOff();
    return result;
}

void FakeConnection::resume()
{
    EXPECT_TRUE(callHandler_ && interruptionHandler_ && invalidationHandler_) << "what comes at once must be handled";
    isResumed_ = true;
}

std::size_t FakeConnection::unansweredCalls() const
{
    return static_cast<std::size_t>(
        std::ranges::count_if(unanswered_, [](const auto& call) { return !call.expired(); }));
}

void FakeConnection::close()
{
    if (std::exchange(isOver_, true))
        return;
    invalidationHandler_();
    letGo(); // nothing follows, so nothing is held any more
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
    if (!isOver_ && !std::exchange(isInterrupted_, true))
        interruptionHandler_();
}

std::string FakeConnection::description() const
{
    return "connection of process " + std::to_string(processIdentifier_);
}

void FakeConnection::send(std::string frame)
{
    if (!isOver_)
        received_.push_back(decoded(frame));
}

Array FakeConnection::decoded(const std::string& frame)
{
    const auto value = decoder_.decode(frame);
    EXPECT_TRUE(value && value->array()) << "a frame is an array";
    return value ? value->array().value_or(Array()) : Array();
}

FakeConnectionListener::~FakeConnectionListener()
{
    for (const auto& known : connections_)
        if (const auto connection = known.lock())
            connection->letGo();
}

std::shared_ptr<FakeConnection> FakeConnectionListener::connect(std::int32_t processIdentifier)
{
    auto connection = std::make_shared<FakeConnection>(processIdentifier);
    connections_.push_back(connection);
    EXPECT_TRUE(delegate_->shouldAcceptNewConnection(*this, connection)) << "connections are never refused";
    return connection;
}

} // namespace support
