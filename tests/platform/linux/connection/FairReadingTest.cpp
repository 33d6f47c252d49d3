// A client that sends little is read beside those that send much, and what cuts a read short loses nothing.
#include "platform/linux/connection/ConnectionHarness.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <latch>
#include <string>
#include <sys/socket.h>
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

TEST_F(FairReading, WhoSendsLittleIsReadBeforeTheRestOfWhoSendsMuch)
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

TEST_F(FairReading, ManyWhoSendMuchAreReadALittleAtATime)
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
    const std::string bytes = callNumber(1);
    iovec data{const_cast<char*>(bytes.data()), bytes.size()};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int))> control{};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* const head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(sizeof(int));
    const int descriptor = client.descriptor();
    std::memcpy(CMSG_DATA(head), &descriptor, sizeof descriptor);
    ASSERT_EQ(::sendmsg(client.descriptor(), &message, MSG_NOSIGNAL), static_cast<ssize_t>(bytes.size()));
    client.write(callNumber(2));
    client.stopWriting();
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 2", "invalidated"}));
}

} // namespace
} // namespace platform
