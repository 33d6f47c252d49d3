// SPDX-License-Identifier: Apache-2.0
// Blocking, and with only the encoding of single values from the service, like a foreign client. A missing answer is an
// exception, so that a test never hangs.
#include "end_to_end/WireClient.h"

#include "end_to_end/Kestod.h"

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <system_error>

namespace end_to_end {
namespace {

platform::FileDescriptor connectTo(const std::filesystem::path& socketPath)
{
    platform::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        return {};
    const timeval timeout{.tv_sec = patience.count(), .tv_usec = 0};
    ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
    return socket;
}

std::string framed(std::string_view item)
{
    std::string frame;
    for (unsigned shift = 0; shift < 32; shift += 8)
        frame.push_back(static_cast<char>(item.size() >> shift));
    return frame.append(item);
}

} // namespace

WireClient::WireClient(const std::filesystem::path& socketPath)
{
    const bool isConnected = waitUntil([&] {
        socket_ = connectTo(socketPath);
        return static_cast<bool>(socket_);
    });
    if (!isConnected)
        throw std::system_error(errno, std::generic_category(), "connecting");
}

void WireClient::sendBytes(std::string_view bytes)
{
    while (!bytes.empty()) {
        const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (count < 0)
            return; // the service closed it; the missing reply will show this
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
}

void WireClient::sendFrameBytes(std::string_view item)
{
    sendBytes(framed(item));
}

void WireClient::sendFrame(const foundation::Value& item, int times)
{
    std::string encoded;
    foundation::appendCbor(item, encoded);
    std::string frames;
    while (times-- > 0)
        frames += framed(encoded);
    sendBytes(frames);
}

void WireClient::closeSendingSide()
{
    ::shutdown(socket_.get(), SHUT_WR);
}

void WireClient::reset()
{
    call(GetAllReporters); // an unread answer turns the close into a reset
    char byte = 0;
    ::recv(socket_.get(), &byte, 1, MSG_PEEK);
    close();
}

bool WireClient::receive(char* bytes, std::size_t count)
{
    const ssize_t received = ::recv(socket_.get(), bytes, count, MSG_WAITALL);
    if (received < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
        throw std::runtime_error("the service does not answer");
    return received == static_cast<ssize_t>(count);
}

std::optional<foundation::Array> WireClient::nextReply()
{
    unsigned char head[4];
    if (!receive(reinterpret_cast<char*>(head), sizeof head))
        return std::nullopt;
    std::string item(head[0] | head[1] << 8 | head[2] << 16 | static_cast<unsigned>(head[3]) << 24, '\0');
    if (!receive(item.data(), item.size()))
        return std::nullopt;
    return decoder_.decode(item).value().array().value();
}

foundation::Array WireClient::replyTo(std::uint64_t call)
{
    const auto reply = nextReply();
    if (!reply)
        throw std::runtime_error("the connection is closed");
    if ((*reply)[0] != foundation::Value(call))
        throw std::runtime_error("not the reply to that call: " + foundation::Value(*reply).text());
    return *reply;
}

} // namespace end_to_end
