// SPDX-License-Identifier: Apache-2.0
// What a service manager does for a service: it binds the socket, and hears how the service is.
#pragma once

#include "end_to_end/Kestod.h"
#include "platform/linux/files/FileDescriptor.h"
#include "support/TemporaryDirectory.h"

#include <cerrno>
#include <stdexcept>
#include <string>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <system_error>

namespace end_to_end {

[[nodiscard]] inline platform::FileDescriptor socketBoundTo(const std::string& path, int type)
{
    platform::FileDescriptor socket(::socket(AF_UNIX, type | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    if (!socket || ::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        throw std::system_error(errno, std::generic_category(), path);
    return socket;
}

// The notifications of a service, at the path that NOTIFY_SOCKET names. One thread.
class Notifications {
public:
    // Waits for the next one.
    [[nodiscard]] std::string next()
    {
        const timeval timeout{.tv_sec = patience.count(), .tv_usec = 0};
        ::setsockopt(socket_.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
        std::string notification(4096, '\0');
        const ssize_t count = ::recv(socket_.get(), notification.data(), notification.size(), 0);
        if (count <= 0)
            throw std::runtime_error("the service does not notify");
        notification.resize(static_cast<std::size_t>(count));
        return notification;
    }

private:
    const support::TemporaryDirectory directory_;

public:
    const std::string path = directory_.path() / "notify";

private:
    const platform::FileDescriptor socket_ = socketBoundTo(path, SOCK_DGRAM);
};

} // namespace end_to_end
