// SPDX-License-Identifier: Apache-2.0
// Sockets that are bound at the path of an earlier socket, and sockets that are passed.
#include "platform/linux/connection/ListeningSocket.h"

#include "support/TemporaryDirectory.h"

#include <cstdlib>
#include <fcntl.h>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace platform {
namespace {

class ListeningSocketTest : public testing::Test {
protected:
    // Whether a client can connect; otherwise the error number.
    [[nodiscard]] int connectError() const
    {
        const FileDescriptor client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = addressOf(path);
        return ::connect(client.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 ? 0 : errno;
    }

    static sockaddr_un addressOf(const std::filesystem::path& path)
    {
        sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        path.string().copy(address.sun_path, sizeof address.sun_path - 1);
        return address;
    }

    // A socket file as a dead process leaves it behind.
    void leaveBehind(int type = SOCK_STREAM) const
    {
        const FileDescriptor socket = boundSocket(type);
        ASSERT_EQ(connectError(), type == SOCK_STREAM ? ECONNREFUSED : EPROTOTYPE);
    }

    [[nodiscard]] FileDescriptor boundSocket(int type) const
    {
        FileDescriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
        const sockaddr_un address = addressOf(path);
        EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        return socket;
    }

    [[nodiscard]] unsigned permissions() const
    {
        struct stat status = {};
        EXPECT_EQ(::stat(path.c_str(), &status), 0);
        return status.st_mode & 07777;
    }

    support::TemporaryDirectory directory;
    std::filesystem::path path = directory.path() / "socket";
};

TEST_F(ListeningSocketTest, CanBeConnectedToUntilItGoes)
{
    {
        const auto socket = ListeningSocket::bind(path);
        ASSERT_TRUE(socket) << description(socket.error());
        EXPECT_EQ(connectError(), 0);
    }
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(ListeningSocketTest, IsOpenToEveryoneWhateverTheUmask)
{
    const mode_t before = ::umask(0077);
    const auto socket = ListeningSocket::bind(path);
    ::umask(before);
    ASSERT_TRUE(socket);
    EXPECT_EQ(permissions(), 0666U);
}

TEST_F(ListeningSocketTest, IsOpenToWhomItsMakerWants)
{
    const auto socket = ListeningSocket::bind(path, 0600);
    ASSERT_TRUE(socket);
    EXPECT_EQ(permissions(), 0600U);
}

TEST_F(ListeningSocketTest, TakesThePlaceOfOneThatWasLeftBehind)
{
    leaveBehind();
    const auto socket = ListeningSocket::bind(path);
    ASSERT_TRUE(socket) << description(socket.error());
    EXPECT_EQ(connectError(), 0);
}

TEST_F(ListeningSocketTest, LeavesOneAloneBehindWhichSomebodyListens)
{
    const auto first = ListeningSocket::bind(path);
    ASSERT_TRUE(first);
    const auto second = ListeningSocket::bind(path);
    ASSERT_FALSE(second);
    EXPECT_EQ(second.error().error, ListeningSocketError::AlreadyInUse);
    EXPECT_EQ(description(second.error()), "another process listens there");
    EXPECT_EQ(connectError(), 0);
}

TEST_F(ListeningSocketTest, LeavesOneAloneWhoseBacklogIsFull)
{
    const FileDescriptor busy = boundSocket(SOCK_STREAM);
    ASSERT_EQ(::listen(busy.get(), 0), 0);
    const FileDescriptor client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    const sockaddr_un address = addressOf(path);
    ASSERT_EQ(::connect(client.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    const auto socket = ListeningSocket::bind(path);
    ASSERT_FALSE(socket);
    EXPECT_EQ(socket.error().error, ListeningSocketError::AlreadyInUse);
    EXPECT_TRUE(std::filesystem::exists(path));
}

TEST_F(ListeningSocketTest, LeavesAloneWhatIsOfAnotherKind)
{
    const FileDescriptor datagrams = boundSocket(SOCK_DGRAM);
    const auto socket = ListeningSocket::bind(path);
    ASSERT_FALSE(socket);
    EXPECT_EQ(socket.error().error, ListeningSocketError::AlreadyInUse);
}

TEST_F(ListeningSocketTest, LeavesAFileAloneThatIsNoSocket)
{
    support::writeFile(path, "precious");
    const auto socket = ListeningSocket::bind(path);
    ASSERT_FALSE(socket);
    EXPECT_EQ(socket.error().error, ListeningSocketError::NotASocket);
    EXPECT_EQ(description(socket.error()), "something that is not a socket is in the way");
    EXPECT_EQ(support::readFile(path), "precious");
}

TEST_F(ListeningSocketTest, SaysWhatTheSystemSays)
{
    const auto socket = ListeningSocket::bind(directory.path() / "missing" / "socket");
    ASSERT_FALSE(socket);
    EXPECT_EQ(socket.error().error, ListeningSocketError::SystemError);
    EXPECT_EQ(description(socket.error()), "No such file or directory");
}

TEST_F(ListeningSocketTest, RefusesAPathThatIsTooLongAndTakesTheLongest)
{
    constexpr std::size_t longest = sizeof(sockaddr_un::sun_path) - 1;
    const auto ofLength = [&](std::size_t length) {
        return directory.path() / std::string(length - directory.path().native().size() - 1, 'x');
    };
    EXPECT_TRUE(ListeningSocket::bind(ofLength(longest)));
    const auto socket = ListeningSocket::bind(ofLength(longest + 1));
    ASSERT_FALSE(socket);
    EXPECT_EQ(socket.error().error, ListeningSocketError::PathTooLong);
}

// Socket activation passes descriptors from 3 on, so child processes test it. They exit with 0 if all is well.
constexpr int firstPassed = 3;

class PassedSocket : public ListeningSocketTest {
protected:
    // What a child process does with these descriptors.
    template <typename Body> void inChild(const std::vector<int>& passed, Body body)
    {
        EXPECT_EXIT(
            {
                int target = firstPassed;
                for (const int descriptor : passed)
                    ::dup2(descriptor, target++);
                ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
                ::setenv("LISTEN_FDS", std::to_string(passed.size()).c_str(), 1);
                ::_exit(body() ? 0 : 1);
            },
            testing::ExitedWithCode(0), "");
    }

    static bool isRefused()
    {
        const auto socket = ListeningSocket::passed();
        return !socket && socket.error().error == ListeningSocketError::NotOneUnixListener;
    }

    // Listens on a descriptor far from the passed ones.
    [[nodiscard]] FileDescriptor listening() const
    {
        const FileDescriptor socket = boundSocket(SOCK_STREAM);
        EXPECT_EQ(::listen(socket.get(), 8), 0);
        return FileDescriptor(::fcntl(socket.get(), F_DUPFD_CLOEXEC, 100));
    }
};

TEST_F(PassedSocket, NothingPassedIsNoFailure)
{
    ::unsetenv("LISTEN_FDS");
    const auto socket = ListeningSocket::passed();
    ASSERT_TRUE(socket);
    EXPECT_FALSE(*socket);
}

TEST_F(PassedSocket, AListenerThatIsPassedIsTaken)
{
    const FileDescriptor socket = listening();
    inChild({socket.get()}, [this] {
        const auto passed = ListeningSocket::passed();
        if (!passed || !*passed || (*passed)->descriptor() != firstPassed)
            return false;
        const int flags = ::fcntl(firstPassed, F_GETFL);
        return (flags & O_NONBLOCK) != 0 && connectError() == 0 && ::accept(firstPassed, nullptr, nullptr) >= 0;
    });
    EXPECT_TRUE(std::filesystem::exists(path)) << "the file belongs to the process that bound it";
}

TEST_F(PassedSocket, IsTakenOnce)
{
    const FileDescriptor socket = listening();
    inChild({socket.get()}, [] {
        const auto passed = ListeningSocket::passed();
        return ::getenv("LISTEN_FDS") == nullptr && passed.has_value();
    });
}

TEST_F(PassedSocket, SomethingElseIsRefused)
{
    const FileDescriptor file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    inChild({file.get()}, isRefused);

    const FileDescriptor socket = listening();
    inChild({socket.get(), socket.get()}, isRefused); // two

    std::filesystem::remove(path);
    const FileDescriptor silent = boundSocket(SOCK_STREAM); // no process listens on it
    inChild({silent.get()}, isRefused);

    std::filesystem::remove(path);
    const FileDescriptor datagrams = boundSocket(SOCK_DGRAM);
    inChild({datagrams.get()}, isRefused);
}

} // namespace
} // namespace platform
