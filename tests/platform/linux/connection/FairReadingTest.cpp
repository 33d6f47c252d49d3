// SPDX-License-Identifier: Apache-2.0
// A client that sends little is read beside those that send much, and what cuts a read short loses nothing.
#include "platform/linux/connection/ConnectionHarness.h"
#include "platform/linux/connection/ConnectionOutput.h"

#include <algorithm>
#include <latch>
#include <string>
#include <vector>

namespace platform {
namespace {

using support::callNumber;
using support::ConnectionRecord;
using support::SocketClient;

class FairReading : public support::ConnectionTest {
protected:
    // Handles the first call for as long as the clients need to send what they want to send.
    void handleTheFirstCallUntil(std::latch& everythingIsSent)
    {
        handler = [this, &everythingIsSent](ConnectionRecord& record, Connection::Call&) {
            const bool isFirst = order.empty();
            progress.change([&] { order.push_back(&record); });
            if (isFirst)
                everythingIsSent.wait();
            return std::expected<void, Connection::Violation>();
        };
    }
    [[nodiscard]] bool waitForOrder(std::size_t calls)
    {
        return progress.waitFor([&] { return order.size() == calls; });
    }

    std::vector<const ConnectionRecord*> order; // of calls: whose they were
};

TEST_F(FairReading, AClientThatSendsLittleIsReadBeforeTheRestOfOneThatSendsMuch)
{
    std::latch everythingIsSent(1);
    handleTheFirstCallUntil(everythingIsSent);
    listen();
    SocketClient greedy(path);
    const ConnectionRecord& greedyRecord = connected();
    SocketClient modest(path);
    const ConnectionRecord& modestRecord = connected();

    greedy.write(callNumber(0));
    ASSERT_TRUE(waitForOrder(1));
    for (int call = 1; call <= 80; ++call)
        greedy.write(callNumber(call, 1000));
    modest.write(callNumber(1));
    everythingIsSent.count_down();

    ASSERT_TRUE(waitForOrder(82));
    EXPECT_EQ(order[0], &greedyRecord);
    EXPECT_EQ(order[1], &modestRecord);
}

TEST_F(FairReading, ClientsThatSendMuchAreReadALittleAtATime)
{
    std::latch everythingIsSent(1);
    handleTheFirstCallUntil(everythingIsSent);
    listen();
    SocketClient first(path);
    static_cast<void>(connected());
    SocketClient greedy(path);
    const ConnectionRecord& greedyRecord = connected();
    SocketClient other(path);
    const ConnectionRecord& otherRecord = connected();

    first.write(callNumber(0));
    ASSERT_TRUE(waitForOrder(1));
    for (int call = 0; call < 60; ++call) {
        greedy.write(callNumber(call, 1000));
        other.write(callNumber(call, 1000));
    }
    everythingIsSent.count_down();

    ASSERT_TRUE(waitForOrder(121));
    const auto calls = [&](const ConnectionRecord& record, std::size_t among) {
        return std::count(order.begin(), order.begin() + static_cast<std::ptrdiff_t>(among), &record);
    };
    EXPECT_GE(calls(greedyRecord, 61), 10);
    EXPECT_GE(calls(otherRecord, 61), 10);
}

// A descriptor ends the read that meets it.
TEST_F(FairReading, CallsBehindADescriptorAreDeliveredAtTheEndOfItsClient)
{
    listen();
    SocketClient client(path);
    ConnectionRecord& record = connected();
    ConnectionOutput output;
    output.append(callNumber(1), {client.descriptor(), client.descriptor()});
    ASSERT_EQ(output.writeTo(client.descriptor()), callNumber(1).size());
    client.write(callNumber(2));
    client.stopWriting();
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 2", "invalidated"}));
}

} // namespace
} // namespace platform
