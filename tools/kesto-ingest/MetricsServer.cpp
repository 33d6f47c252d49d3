// SPDX-License-Identifier: Apache-2.0
// A thread that waits for connections, and gives each a second to ask.
#include "kesto-ingest/MetricsServer.h"

#include <fmt/format.h>

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <array>
#include <cerrno>
#include <system_error>

namespace kesto_ingest {

namespace {

using platform::FileDescriptor;

void check(bool succeeded, const std::string& what)
{
    if (!succeeded)
        throw std::system_error(errno, std::generic_category(), what);
}

FileDescriptor listeningSocket(std::uint16_t port)
{
    FileDescriptor made(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    check(static_cast<bool>(made), "socket");
    const int on = 1;
    check(::setsockopt(made.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) == 0, "setsockopt");
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const std::string what = fmt::format("the metrics cannot use port {} of 127.0.0.1", port);
    check(::bind(made.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0, what);
    check(::listen(made.get(), 16) == 0, what);
    return made;
}

} // namespace

MetricsServer::MetricsServer(const Metrics& metrics, std::uint16_t port)
    : metrics_(metrics),
      socket_(listeningSocket(port)),
      end_(::eventfd(0, EFD_CLOEXEC))
{
    check(static_cast<bool>(end_), "eventfd");
    thread_ = std::thread([this] { serve(); });
}

MetricsServer::~MetricsServer()
{
    static_cast<void>(::eventfd_write(end_.get(), 1));
    thread_.join();
}

std::uint16_t MetricsServer::port() const
{
    sockaddr_in address{};
    socklen_t size = sizeof address;
    check(::getsockname(socket_.get(), reinterpret_cast<sockaddr*>(&address), &size) == 0, "getsockname");
    return ntohs(address.sin_port);
}

void MetricsServer::serve()
{
    for (;;) {
        std::array<pollfd, 2> awaited = {pollfd{end_.get(), POLLIN, 0}, pollfd{socket_.get(), POLLIN, 0}};
        if (::poll(awaited.data(), awaited.size(), -1) < 0 && errno != EINTR)
            return;
        if (awaited[0].revents != 0)
            return;
        if (const FileDescriptor connection(::accept4(socket_.get(), nullptr, nullptr, SOCK_CLOEXEC)); connection)
            answer(connection);
    }
}

void MetricsServer::answer(const FileDescriptor& connection) const
{
    const timeval patience{.tv_sec = 1, .tv_usec = 0};
    static_cast<void>(::setsockopt(connection.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience));
    static_cast<void>(::setsockopt(connection.get(), SOL_SOCKET, SO_SNDTIMEO, &patience, sizeof patience));
    std::array<char, 4096> request; // what it asks for does not matter
    if (::recv(connection.get(), request.data(), request.size(), 0) <= 0)
        return;
    const std::string body = metrics_.text();
    const std::string text = fmt::format("HTTP/1.0 200 OK\r\nContent-Type: text/plain; version=0.0.4\r\n"
                                         "Content-Length: {}\r\nConnection: close\r\n\r\n{}",
                                         body.size(), body);
    static_cast<void>(::send(connection.get(), text.data(), text.size(), MSG_NOSIGNAL));
    static_cast<void>(::shutdown(connection.get(), SHUT_WR));
}

} // namespace kesto_ingest
