// SPDX-License-Identifier: Apache-2.0
// A killed service leaves its socket file behind. Such a file is removed only if no process listens behind it, because
// a running service must not lose its socket.
#include "platform/linux/connection/ListeningSocket.h"

#include "platform/linux/files/SystemError.h"

#include <cerrno>
#include <cstring>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

namespace platform {
namespace {

using Failure = ListeningSocketFailure;

std::unexpected<Failure> fail(ListeningSocketError error)
{
    return std::unexpected(Failure{error});
}

std::unexpected<Failure> failWithSystemError()
{
    return std::unexpected(Failure{ListeningSocketError::SystemError, errno});
}

FileDescriptor makeSocket()
{
    return FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

bool bindTo(const FileDescriptor& socket, const sockaddr_un& address)
{
    return ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

// Whether the file is a socket that no process holds. A full backlog refuses as well, but with EAGAIN.
std::expected<void, Failure> checkIsStale(const sockaddr_un& address)
{
    struct stat status = {};
    if (::lstat(address.sun_path, &status) != 0)
        return failWithSystemError();
    if (!S_ISSOCK(status.st_mode))
        return fail(ListeningSocketError::NotASocket);
    const FileDescriptor probe = makeSocket();
    if (!probe)
        return failWithSystemError();
    const bool refused = ::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0
        && errno == ECONNREFUSED;
    return refused ? std::expected<void, Failure>() : fail(ListeningSocketError::AlreadyInUse);
}

} // namespace

std::string description(const ListeningSocketFailure& failure)
{
    switch (failure.error) {
    case ListeningSocketError::NotOneUnixListener:
        return "socket activation passed something other than one listening Unix stream socket";
    case ListeningSocketError::PathTooLong: return "the path is too long for a socket";
    case ListeningSocketError::NotASocket: return "something that is not a socket is in the way";
    case ListeningSocketError::AlreadyInUse: return "another process listens there";
    case ListeningSocketError::SystemError: return std::string(systemErrorText(failure.systemError));
    }
    return "unknown error";
}

ListeningSocket::Result ListeningSocket::bind(std::filesystem::path path, unsigned permissions)
{
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    if (path.native().size() >= sizeof address.sun_path)
        return fail(ListeningSocketError::PathTooLong);
    std::memcpy(address.sun_path, path.c_str(), path.native().size());

    FileDescriptor descriptor = makeSocket();
    if (!descriptor)
        return failWithSystemError();
    if (!bindTo(descriptor, address)) {
        if (errno != EADDRINUSE)
            return failWithSystemError();
        if (const auto stale = checkIsStale(address); !stale)
            return std::unexpected(stale.error());
        ::unlink(address.sun_path);
        if (!bindTo(descriptor, address))
            return failWithSystemError();
    }
    ListeningSocket socket(std::move(descriptor), std::move(path));
    // In this order: before it listens, no client can use permissions that the umask left too wide.
    if (::chmod(address.sun_path, permissions) != 0 || ::listen(socket.descriptor(), SOMAXCONN) != 0)
        return failWithSystemError();
    return socket;
}

ListeningSocket::~ListeningSocket()
{
    if (descriptor_ && !boundPath_.empty())
        ::unlink(boundPath_.c_str());
}

} // namespace platform
