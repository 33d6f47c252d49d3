// SPDX-License-Identifier: Apache-2.0
// A port of 127.0.0.1 for a server that a test starts, ends and starts again: no other program gets the port meanwhile.
//
// A socket that never listens keeps the port. The server shares it, since both reuse addresses.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <netinet/in.h>
#include <stdexcept>
#include <sys/socket.h>

namespace support {

inline sockaddr_in loopback(std::uint16_t port)
{
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(port);
    return address;
}

class KeptPort {
public:
    KeptPort() : keeper_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0))
    {
        const int yes = 1;
        sockaddr_in address = loopback(0);
        socklen_t size = sizeof address;
        const bool isKept = ::setsockopt(keeper_.get(), SOL_SOCKET, SO_REUSEADDR, &yes, sizeof yes) == 0
            && ::bind(keeper_.get(), reinterpret_cast<sockaddr*>(&address), size) == 0
            && ::getsockname(keeper_.get(), reinterpret_cast<sockaddr*>(&address), &size) == 0;
        if (!isKept)
            throw std::runtime_error("no port on loopback is free");
        number_ = ntohs(address.sin_port);
    }

    [[nodiscard]] std::uint16_t number() const { return number_; }

private:
    platform::FileDescriptor keeper_;
    std::uint16_t number_ = 0;
};

} // namespace support
