// SPDX-License-Identifier: Apache-2.0
// Socket activation: the service manager passes the socket as a descriptor with an agreed number.
#include "platform/linux/connection/ListeningSocket.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/socket.h>
#include <systemd/sd-daemon.h>

namespace platform {

std::expected<std::optional<ListeningSocket>, ListeningSocketFailure> ListeningSocket::passed()
{
    const int count = ::sd_listen_fds(1);
    if (count == 0)
        return std::nullopt;
    if (count != 1 || ::sd_is_socket_unix(SD_LISTEN_FDS_START, SOCK_STREAM, 1, nullptr, 0) <= 0)
        return std::unexpected(ListeningSocketFailure{ListeningSocketError::NotOneUnixListener});
    FileDescriptor descriptor(SD_LISTEN_FDS_START);
    if (::fcntl(descriptor.get(), F_SETFL, O_NONBLOCK) != 0)
        return std::unexpected(ListeningSocketFailure{ListeningSocketError::SystemError, errno});
    return ListeningSocket(std::move(descriptor), {});
}

} // namespace platform
