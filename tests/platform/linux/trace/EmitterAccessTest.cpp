// SPDX-License-Identifier: Apache-2.0
// The descriptors with which clients emit trace events: when clients get them, which clients do, and their limits.
#include "platform/linux/trace/EmitterAccess.h"
#include "platform/linux/connection/ConnectionHarness.h"
#include "platform/linux/trace/EmittedEvent.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>

namespace platform {
namespace {

using foundation::Array;
using foundation::Value;
using support::callNumber;
using support::ConnectionRecord;
using support::framed;
using support::SocketClient;
using testing::ElementsAre;
using testing::IsEmpty;

// Stands in for the marker: bytes that are written to one end come out at the other.
class MarkerPipe {
public:
    MarkerPipe()
    {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe2(ends.data(), O_NONBLOCK | O_CLOEXEC), 0);
        out = FileDescriptor(ends[0]);
        in = FileDescriptor(ends[1]);
    }
    FileDescriptor out;
    FileDescriptor in;
};

std::uint32_t flagIn(int page)
{
    void* const mapping = ::mmap(nullptr, TraceSwitchPage::size, PROT_READ, MAP_SHARED, page, 0);
    EXPECT_NE(mapping, MAP_FAILED);
    const std::uint32_t flag = static_cast<const TraceSwitchPage*>(mapping)->isTracing;
    ::munmap(mapping, TraceSwitchPage::size);
    return flag;
}

class EmitterAccessTest : public testing::Test {
protected:
    EmitterDescriptors opened()
    {
        EXPECT_FALSE(access.open(marker.in.get()));
        EmitterDescriptors result;
        access.ask(this, [&](const EmitterDescriptors& descriptors) { result = descriptors; });
        return result;
    }

    MarkerPipe marker;
    EmitterAccess access;
};

TEST_F(EmitterAccessTest, AnswersOnceThereIsSomethingToHandOut)
{
    std::vector<int> answers;
    access.ask(&answers, [&](const EmitterDescriptors& descriptors) { answers.push_back(descriptors.marker); });
    access.setTracing(true);
    access.answerWaiting();
    EXPECT_THAT(answers, IsEmpty());
    ASSERT_FALSE(access.open(marker.in.get()));
    access.answerWaiting();
    access.answerWaiting();
    EXPECT_THAT(answers, ElementsAre(marker.in.get()));
    access.ask(&answers, [&](const EmitterDescriptors& descriptors) { answers.push_back(descriptors.marker); });
    EXPECT_EQ(answers.size(), 2U);
}

TEST_F(EmitterAccessTest, ForgetsWhoDoesNotWaitAnyMore)
{
    bool isAnswered = false;
    access.ask(this, [&](const EmitterDescriptors&) { isAnswered = true; });
    access.forget(this);
    ASSERT_FALSE(access.open(marker.in.get()));
    access.answerWaiting();
    EXPECT_FALSE(isAnswered);
}

TEST_F(EmitterAccessTest, ShowsOnThePageWhetherATraceRuns)
{
    const EmitterDescriptors descriptors = opened();
    EXPECT_EQ(flagIn(descriptors.page), 0U);
    access.setTracing(true);
    EXPECT_EQ(flagIn(descriptors.page), 1U);
    access.setTracing(false);
    EXPECT_EQ(flagIn(descriptors.page), 0U);
}

TEST_F(EmitterAccessTest, DoesNotLetOthersChangeThePage)
{
    const int page = opened().page;
    EXPECT_EQ(::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, page, 0), MAP_FAILED);
    void* const readable = ::mmap(nullptr, 4096, PROT_READ, MAP_SHARED, page, 0);
    ASSERT_NE(readable, MAP_FAILED);
    EXPECT_NE(::mprotect(readable, 4096, PROT_READ | PROT_WRITE), 0);
    ::munmap(readable, 4096);
    EXPECT_LT(::pwrite(page, "x", 1, 0), 0);
    EXPECT_NE(::ftruncate(page, 0), 0);
    EXPECT_NE(::ftruncate(page, 8192), 0);
    EXPECT_NE(::fallocate(page, FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, 0, 4096), 0);
    EXPECT_NE(::fcntl(page, F_ADD_SEALS, F_SEAL_WRITE), 0);
    // A second opening gives no more.
    const FileDescriptor again(::open(("/proc/self/fd/" + std::to_string(page)).c_str(), O_RDWR | O_CLOEXEC));
    EXPECT_EQ(::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, again.get(), 0), MAP_FAILED);
    EXPECT_LT(::pwrite(again.get(), "x", 1, 0), 0);
    access.setTracing(true);
    EXPECT_EQ(flagIn(page), 1U) << "the service itself goes on";
}

// ---- Over connections

class EmitterAccessConnections : public support::ConnectionTest {
protected:
    // The numbers of the answers up to that of the request, and the descriptors that came with them.
    struct Received {
        std::vector<int> numbers;
        std::vector<FileDescriptor> descriptors;
    };
    static std::string request(Value number) { return framed(Array{std::move(number), "trace"}); }

    static Received receive(SocketClient& client, std::size_t answers = 1)
    {
        Received received;
        FrameReader reader;
        foundation::CborDecoder decoder;
        while (received.numbers.size() < answers && receiveSome(client, reader, received.descriptors))
            for (auto frame = reader.next(); *frame; frame = reader.next()) {
                const auto answer = decoder.decode(**frame)->array();
                EXPECT_TRUE((*answer)[1].isNull());
                received.numbers.push_back(static_cast<int>((*answer)[0].number()->int64Value()));
            }
        return received;
    }

    static bool receiveSome(SocketClient& client, FrameReader& reader, std::vector<FileDescriptor>& descriptors)
    {
        static std::array<char, 64 * 1024> bytes;
        client.waitForSomethingToRead();
        alignas(cmsghdr) std::array<char, CMSG_SPACE(8 * sizeof(int))> control{};
        iovec part = {bytes.data(), bytes.size()};
        msghdr message{};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        const ssize_t count = ::recvmsg(client.descriptor(), &message, MSG_CMSG_CLOEXEC | MSG_DONTWAIT);
        if (count <= 0)
            return false;
        reader.feed({bytes.data(), static_cast<std::size_t>(count)});
        if (const cmsghdr* head = CMSG_FIRSTHDR(&message); head != nullptr) {
            EXPECT_EQ(head->cmsg_type, SCM_RIGHTS);
            std::array<int, 8> numbers{};
            const std::size_t size = head->cmsg_len - CMSG_LEN(0);
            std::memcpy(numbers.data(), CMSG_DATA(head), size);
            for (std::size_t index = 0; index < size / sizeof(int); ++index)
                descriptors.emplace_back(numbers[index]);
        }
        return true;
    }

    void SetUp() override
    {
        beforeListening = [this] { listener->setEmitterAccess(access); };
    }

    MarkerPipe marker;
    EmitterAccess access;
};

TEST_F(EmitterAccessConnections, HandOverTheMarkerAndThePage)
{
    ASSERT_FALSE(access.open(marker.in.get()));
    access.setTracing(true);
    listen();
    SocketClient client(path);
    client.write(request(7));
    const Received received = receive(client);
    EXPECT_THAT(received.numbers, ElementsAre(7));
    ASSERT_EQ(received.descriptors.size(), 2U);
    EXPECT_EQ(::write(received.descriptors[0].get(), "event", 5), 5);
    std::array<char, 8> text{};
    EXPECT_EQ(::read(marker.out.get(), text.data(), text.size()), 5);
    EXPECT_LT(::read(received.descriptors[0].get(), text.data(), text.size()), 0) << "only the writing end";
    EXPECT_EQ(flagIn(received.descriptors[1].get()), 1U);
}

TEST_F(EmitterAccessConnections, AreAnsweredWhenTheFirstTraceStarts)
{
    listen();
    SocketClient client(path);
    client.write(request(7) + callNumber(8));
    ConnectionRecord& record = connected();
    ASSERT_TRUE(waitForHistory(record, {"call 8"})) << "the service's own calls go on, and see nothing of the request";
    EXPECT_FALSE(client.hasSomethingToRead());
    ASSERT_FALSE(access.open(marker.in.get()));
    access.answerWaiting();
    const Received received = receive(client);
    EXPECT_THAT(received.numbers, ElementsAre(7));
    EXPECT_EQ(received.descriptors.size(), 2U);
}

TEST_F(EmitterAccessConnections, MayAskOnce)
{
    listen();
    SocketClient client(path);
    client.write(request(7) + request(8));
    EXPECT_TRUE(waitForEnd(connected()));
    EXPECT_THAT(logged(), ElementsAre(endsBecause("it asks for the trace marker twice")));
}

TEST_F(EmitterAccessConnections, AskWithANumber)
{
    listen();
    for (const Value& wrong : {Value("text"), Value(-1), Value()}) {
        SocketClient client(path);
        client.write(request(wrong));
        EXPECT_TRUE(waitForEnd(connected()));
    }
    const std::string line = endsBecause("a call's number is an unsigned 64-bit integer");
    EXPECT_THAT(logged(), ElementsAre(line, line, line));
}

TEST_F(EmitterAccessConnections, ThatAreOverAreNotAnswered)
{
    listen();
    {
        SocketClient client(path);
        client.write(request(7) + callNumber(1));
        ASSERT_TRUE(waitForCalls(connected(), 1));
    }
    ASSERT_TRUE(waitForEnd(*records.at(0)));
    stop();
    records.at(0)->calls.clear();
    EXPECT_EQ(records.at(0)->connection.use_count(), 1) << "nothing keeps it for an answer";
    ASSERT_FALSE(access.open(marker.in.get()));
    access.answerWaiting();
}

TEST_F(EmitterAccessConnections, GetTheDescriptorsWithTheirFrameHoweverMuchIsAheadOfIt)
{
    // Large answers, which the client does not read until all of them wait.
    handler = [](ConnectionRecord& record, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        std::string frame;
        foundation::appendCbor(Value(Array{call.frame[0], Value(), std::string(500'000, 'x')}), frame);
        support::sendAtOnce(*record.connection, std::move(frame));
        return {};
    };
    listen();
    SocketClient client(path);
    client.write(callNumber(1) + callNumber(2) + callNumber(3));
    client.waitForSomethingToRead();
    client.write(request(4));
    ASSERT_FALSE(access.open(marker.in.get()));
    access.answerWaiting();
    const Received received = receive(client, 4);
    EXPECT_THAT(received.numbers, ElementsAre(1, 2, 3, 4));
    EXPECT_EQ(received.descriptors.size(), 2U);
    client.write(callNumber(5));
    EXPECT_THAT(receive(client).numbers, ElementsAre(5));
}

TEST_F(EmitterAccessConnections, OfClientsThatReadPlainlyLoseTheDescriptorsAndNothingElse)
{
    ASSERT_FALSE(access.open(marker.in.get()));
    handler = [](ConnectionRecord& record, Connection::Call& call) -> std::expected<void, Connection::Violation> {
        support::sendAtOnce(*record.connection, support::answerTo(call.frame));
        return {};
    };
    listen();
    SocketClient client(path);
    client.write(request(1));
    EXPECT_EQ(client.readNumber(), 1);
    client.write(callNumber(2));
    EXPECT_EQ(client.readNumber(), 2);
}

TEST_F(EmitterAccessConnections, WithoutTracingAreNeverAnswered)
{
    beforeListening = nullptr;
    listen();
    SocketClient client(path);
    client.write(request(7) + callNumber(1));
    EXPECT_TRUE(waitForHistory(connected(), {"call 1"}));
    EXPECT_FALSE(client.hasSomethingToRead());
}

} // namespace
} // namespace platform
