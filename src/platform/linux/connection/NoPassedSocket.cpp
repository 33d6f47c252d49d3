// SPDX-License-Identifier: Apache-2.0
// A build without systemd: nothing passes sockets, so the service always makes its own.
#include "platform/linux/connection/ListeningSocket.h"

namespace platform {

std::expected<std::optional<ListeningSocket>, ListeningSocketFailure> ListeningSocket::passed()
{
    return std::nullopt;
}

} // namespace platform
