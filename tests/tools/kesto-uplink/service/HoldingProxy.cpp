// SPDX-License-Identifier: Apache-2.0
// One connection at a time, as the uplink has.
#include "tools/kesto-uplink/service/HoldingProxy.h"

#include "platform/linux/files/FileDescriptor.h"

#include <array>
#include <fmt/format.h>
#include <netinet/in.h>
#include <poll.h>
#include <string_view>
#include <sys/socket.h>
#include <unistd.h>

namespace uplink_test {

namespace {

constexpr int turn = 20; // milliseconds, after which it looks whether it ends

sockaddr_in loopback(int port)
{
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(static_cast<std::uint16_t>(port));
    return address;
}

} // namespace

HoldingProxy::HoldingProxy(int serverPort)
    : serverPort_(serverPort),
      listener_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0))
{
    sockaddr_in address = loopback(0);
    socklen_t size = sizeof address;
    ::bind(listener_, reinterpret_cast<sockaddr*>(&address), size);
    ::listen(listener_, 5);
    ::getsockname(listener_, reinterpret_cast<sockaddr*>(&address), &size);
    port_ = ntohs(address.sin_port);
    thread_ = std::thread([this] { serve(); });
}

HoldingProxy::~HoldingProxy()
{
    ends_ = true;
    thread_.join();
    ::close(listener_);
}

std::string HoldingProxy::url() const
{
    return fmt::format("nats://127.0.0.1:{}", port_);
}

void HoldingProxy::serve()
{
    while (!ends_) {
        pollfd waiting{listener_, POLLIN, 0};
        if (::poll(&waiting, 1, turn) <= 0)
            continue;
        ++connections_;
        pass(::accept4(listener_, nullptr, nullptr, SOCK_CLOEXEC));
    }
}

void HoldingProxy::pass(int client) const
{
    const platform::FileDescriptor device(client);
    const platform::FileDescriptor server(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_in address = loopback(serverPort_);
    if (::connect(server.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        return;
    std::array<char, 65536> bytes{};
    while (!ends_) {
        std::array<pollfd, 2> ends{pollfd{device.get(), POLLIN, 0}, pollfd{server.get(), POLLIN, 0}};
        ::poll(ends.data(), ends.size(), turn);
        for (const auto& [from, to] : {std::pair(0, 1), std::pair(1, 0)}) {
            if (ends[from].revents == 0)
                continue;
            const ssize_t size = ::read(ends[from].fd, bytes.data(), bytes.size());
            if (size <= 0)
                return;
            const std::string_view text(bytes.data(), static_cast<std::size_t>(size));
            if (holds_ && from == 1 && text.contains("\"stream\":\"KESTO\"")) {
                isHolding_ = true;
                continue;
            }
            if (::send(ends[to].fd, text.data(), text.size(), MSG_NOSIGNAL) != size)
                return;
        }
    }
}

} // namespace uplink_test
