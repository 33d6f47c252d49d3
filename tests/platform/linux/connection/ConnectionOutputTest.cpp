// SPDX-License-Identifier: Apache-2.0
// Descriptors that go with a frame: on a socket that is full, and in a system that has none to spare.
#include "platform/linux/connection/ConnectionOutput.h"

#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace platform {
namespace {

class ConnectionOutputTest : public testing::Test {
protected:
    struct Received {
        std::string bytes;
        std::size_t descriptors = 0;
    };

    ConnectionOutputTest()
    {
        std::array<int, 2> ends = {};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()), 0);
        own = FileDescriptor(ends[0]);
        peer = FileDescriptor(ends[1]);
    }

    // What the peer takes with one call.
    Received receive()
    {
        std::string bytes(4096, '\0');
        iovec part = {bytes.data(), bytes.size()};
        alignas(cmsghdr) std::array<char, CMSG_SPACE(2 * sizeof(int))> control = {};
        msghdr message = {};
        message.msg_iov = &part;
        message.msg_iovlen = 1;
        message.msg_control = control.data();
        message.msg_controllen = control.size();
        const ssize_t count = ::recvmsg(peer.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
        if (count < 0)
            return {};
        bytes.resize(static_cast<std::size_t>(count));
        const cmsghdr* const head = CMSG_FIRSTHDR(&message);
        if (head == nullptr)
            return {.bytes = std::move(bytes)};
        std::array<int, 2> passed = {-1, -1};
        std::memcpy(passed.data(), CMSG_DATA(head), head->cmsg_len - CMSG_LEN(0));
        for (const int descriptor : passed)
            ::close(descriptor);
        return {.bytes = std::move(bytes), .descriptors = (head->cmsg_len - CMSG_LEN(0)) / sizeof(int)};
    }

    FileDescriptor own;
    FileDescriptor peer;
    const FileDescriptor file{::open("/dev/null", O_RDWR | O_CLOEXEC)};
    const EmitterDescriptors descriptors{.marker = file.get(), .page = file.get()};
    ConnectionOutput output;
};

TEST_F(ConnectionOutputTest, DescriptorsGoWithTheirFrame)
{
    output.append("before");
    output.append("with", descriptors);
    output.append("after");
    EXPECT_EQ(output.writeTo(own.get()), 6U);
    EXPECT_EQ(receive().bytes, "before");
    EXPECT_EQ(output.writeTo(own.get()), 9U);
    const Received received = receive();
    EXPECT_EQ(received.bytes, "withafter");
    EXPECT_EQ(received.descriptors, 2U);
    EXPECT_TRUE(output.empty());
}

TEST_F(ConnectionOutputTest, DescriptorsWaitWithTheirFrameForASocketThatIsFull)
{
    const std::string filling(4096, 'x');
    while (::send(own.get(), filling.data(), filling.size(), MSG_DONTWAIT) > 0) { }
    output.append("frame", descriptors);
    EXPECT_EQ(output.writeTo(own.get()), 0U);
    while (!receive().bytes.empty()) { }
    EXPECT_EQ(output.writeTo(own.get()), 5U);
    const Received received = receive();
    EXPECT_EQ(received.bytes, "frame");
    EXPECT_EQ(received.descriptors, 2U);
}

TEST_F(ConnectionOutputTest, AFrameGoesWithoutDescriptorsWhenTheSystemHasNoneToSpare)
{
    // A user may have as many descriptors on their way as the process may have files open. Root may have more, so the
    // child becomes another user. It has 20 on their way before its limit is 10.
    const pid_t child = ::fork();
    if (child == 0) {
        if (::getuid() == 0 && ::setuid(65534) != 0)
            ::_exit(2);
        const rlimit few = {.rlim_cur = 10, .rlim_max = 10};
        std::array<int, 2> others = {};
        if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, others.data()) != 0)
            ::_exit(3);
        for (int number = 0; number < 10; ++number) {
            ConnectionOutput other;
            other.append("frame", descriptors);
            if (other.writeTo(others[0]) != 5U)
                ::_exit(4);
        }
        if (::setrlimit(RLIMIT_NOFILE, &few) != 0)
            ::_exit(5);
        output.append("frame", descriptors);
        ::_exit(output.writeTo(own.get()) == 5U ? 0 : 6);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    const Received received = receive();
    EXPECT_EQ(received.bytes, "frame");
    EXPECT_EQ(received.descriptors, 0U);
}

} // namespace
} // namespace platform
