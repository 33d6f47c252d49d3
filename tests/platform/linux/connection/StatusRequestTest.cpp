// SPDX-License-Identifier: Apache-2.0
// The request for the status: answered at once, by the connection thread alone, and bounded like other requests.
#include "platform/linux/connection/ConnectionHarness.h"
#include "support/PrintValues.h"

#include <atomic>
#include <gmock/gmock.h>

namespace platform {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using ledger::Counter;
using support::ConnectionRecord;
using support::framed;
using support::SocketClient;
using testing::ElementsAre;
using testing::IsEmpty;

class StatusRequest : public support::ConnectionTest {
protected:
    // Answers with the status, and notes what it was asked.
    void listenWith(const Dictionary& status)
    {
        beforeListening = [this, status] {
            listener->setStatus([this, status](bool withCulprits) {
                ++made;
                isTrusted = withCulprits;
                isOnConnectionThread = std::this_thread::get_id() == thread.get_id();
                return status;
            });
        };
        listen();
    }

    std::atomic<int> made = 0;
    std::atomic<bool> isTrusted = false;
    std::atomic<bool> isOnConnectionThread = false;
};

TEST_F(StatusRequest, IsAnsweredByTheConnectionThreadAndNoCallOfTheService)
{
    listenWith({{"deliveries", 5}});
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.write(framed(Array{std::uint64_t{18446744073709551615U}, "status"}));
    EXPECT_EQ(client.readFrame(),
              (Array{std::uint64_t{18446744073709551615U}, Value(), Value(Dictionary{{"deliveries", 5}})}));
    EXPECT_TRUE(isOnConnectionThread);
    EXPECT_TRUE(isTrusted) << "the test's own user is the listener's";
    EXPECT_EQ(callsOf(record), 0U);
    EXPECT_EQ(counted(Counter::CallsStatus), 1U);
}

TEST_F(StatusRequest, MayBeMadeAsOftenAsTheClientLikes)
{
    constexpr int requests = 3000;
    listenWith({{"filler", std::string(2000, 'x')}});
    SocketClient client(path);
    std::string frames;
    for (int number = 1; number <= requests; ++number)
        frames += framed(Array{number, "status"});
    client.write(frames); // all in one read
    for (int number = 1; number <= requests; ++number)
        ASSERT_EQ(client.readNumber(), number);
    EXPECT_EQ(counted(Counter::CallsStatus), 3000U);
    EXPECT_EQ(counted(Counter::AnswerBytesDropped), 0U);
    EXPECT_THAT(logged(), IsEmpty());
}

TEST_F(StatusRequest, OfAClientThatReadsNothingMakesFewAnswersAndHoldsUpNoOther)
{
    constexpr std::size_t answerSize = 64 * 1024; // a socket takes some of them
    constexpr int requests = 4000;
    listenWith({{"filler", std::string(answerSize, 'x')}});
    SocketClient client(path);
    std::string frames;
    for (int number = 1; number <= requests; ++number)
        frames += framed(Array{number, "status"});
    client.write(frames);
    ASSERT_TRUE(waitForCount(Counter::CallsStatus, requests));
    SocketClient other(path);
    other.write(framed(Array{1, "status"}));
    EXPECT_EQ(other.readNumber(), 1);
    EXPECT_LT(made, 100);
    for (int number = 1; number <= requests; ++number)
        ASSERT_EQ(client.readNumber(), number);
    EXPECT_EQ(made, requests + 1);
}

TEST_F(StatusRequest, CountsAsAnUnansweredCallUntilItIsAnswered)
{
    constexpr std::size_t answerSize = 512 * 1024; // more than a socket takes
    listenWith({{"filler", std::string(answerSize, 'x')}});
    SocketClient client(path);
    std::string frames;
    for (std::uint32_t number = 0; number <= LinuxConnection::mostUnansweredCalls + 2; ++number)
        frames += framed(Array{1, "status"});
    client.write(frames);
    ASSERT_TRUE(waitForCount(Counter::ReadingPauses, 1)) << "as many requests may wait as calls";
    EXPECT_LE(made, 3);
}

TEST_F(StatusRequest, LeavesTheCallsAroundItInTheirOrder)
{
    listenWith({});
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.write(support::callNumber(1) + framed(Array{2, "status"}) + support::callNumber(3));
    EXPECT_EQ(client.readNumber(), 2);
    EXPECT_TRUE(waitForHistory(record, {"call 1", "call 3"}));
}

TEST_F(StatusRequest, WithANumberThatIsNoneBreaksTheProtocol)
{
    listenWith({});
    const std::string reason = endsBecause("a call's number is an unsigned 64-bit integer");
    std::ptrdiff_t ended = 0;
    for (const Value& number : {Value(-1), Value(1.0), Value("1"), Value()}) {
        SCOPED_TRACE(number.text());
        const auto before = counted(Counter::FramesNotACall);
        SocketClient client(path);
        client.write(framed(Array{number, "status"}));
        EXPECT_EQ(client.readFrame(), std::nullopt);
        EXPECT_EQ(counted(Counter::FramesNotACall), before + 1);
        ++ended; // the client may see the end before its line is written
        EXPECT_TRUE(waitUntil([&] { return std::ranges::count(logged(), reason) == ended; }));
        EXPECT_EQ(made, 0);
    }
}

TEST_F(StatusRequest, WithMoreThanItsNameIsACallWhichTheServiceJudges)
{
    listenWith({});
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.write(framed(Array{1, "status", true}));
    EXPECT_TRUE(waitForHistory(record, {"call 1"}));
    EXPECT_EQ(made, 0);
}

TEST_F(StatusRequest, OfAClientThatHasGoneIsForgotten)
{
    constexpr std::size_t answerSize = 512 * 1024;
    listenWith({{"filler", std::string(answerSize, 'x')}});
    SocketClient client(path);
    ConnectionRecord& record = connected();
    client.write(framed(Array{1, "status"}) + framed(Array{2, "status"}) + framed(Array{3, "status"}));
    ASSERT_TRUE(waitForCount(Counter::CallsStatus, 3));
    client.close();
    EXPECT_TRUE(waitForEnd(record));
    EXPECT_LE(made, 2);
}

} // namespace
} // namespace platform
