// SPDX-License-Identifier: Apache-2.0
// The socket never blocks: bytes that it does not accept wait here.
#include "wire/ServiceConnection.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

namespace libkesto {
namespace {

// How long a service that accepts no connection may delay connecting.
constexpr timeval longestConnecting{.tv_sec = 1, .tv_usec = 0};

std::unexpected<ConnectionFailure> failure(kesto_status reason, int systemError = 0)
{
    return std::unexpected(ConnectionFailure{reason, systemError});
}

} // namespace

ServiceConnection::Result ServiceConnection::open(const std::vector<std::string>& paths)
{
    Result result = failure(KESTO_CONNECT_FAILED, ENOENT);
    for (const std::string& path : paths) {
        path_ = path;
        result = connect(path);
        if (result)
            break;
    }
    return result;
}

ServiceConnection::Result ServiceConnection::connect(const std::string& path)
{
    platform::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size()); // it fits: opening a client checks the paths
    if (!socket
        || ::setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &longestConnecting, sizeof longestConnecting) != 0
        || ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        return failure(KESTO_CONNECT_FAILED, errno);
    socket_ = std::move(socket);
    reader_ = {};
    return {};
}

void ServiceConnection::close() noexcept
{
    if (socket_) {
        // If answers are left unread, the service treats the connection as broken.
        ::shutdown(socket_.get(), SHUT_WR);
        while (::recv(socket_.get(), received_.data(), received_.size(), MSG_DONTWAIT) > 0) { }
    }
    socket_ = {};
    outbox_.clear();
    sentBytes_ = 0;
    messageEnds_.clear();
    descriptors_ = {};
    expectsDescriptors_ = false;
}

void ServiceConnection::append(std::uint64_t number, const Call& call)
{
    if (sentBytes_ > outbox_.size() / 2) {
        outbox_.erase(0, sentBytes_);
        streamPosition_ += sentBytes_;
        sentBytes_ = 0;
    }
    appendCall(number, call, outbox_);
    if (call.head.operation == KESTO_OPERATION_SEND)
        messageEnds_.push_back(streamPosition_ + outbox_.size());
}

void ServiceConnection::appendTraceRequest(std::uint64_t number)
{
    libkesto::appendTraceRequest(number, outbox_);
    expectsDescriptors_ = true;
}

ServiceConnection::Result ServiceConnection::send()
{
    while (unsentBytes() > 0) {
        const ssize_t count =
            ::send(socket_.get(), outbox_.data() + sentBytes_, unsentBytes(), MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0 && errno == EAGAIN)
            return {};
        if (count < 0)
            return failure(KESTO_CONNECTION_LOST, errno);
        sentBytes_ += static_cast<std::size_t>(count);
        countSentMessages();
    }
    streamPosition_ += sentBytes_;
    outbox_.clear();
    sentBytes_ = 0;
    return {};
}

void ServiceConnection::countSentMessages()
{
    while (!messageEnds_.empty() && messageEnds_.front() <= streamPosition_ + sentBytes_) {
        messageEnds_.pop_front();
        ++counters_.sent;
    }
}

// Descriptors come before their frame, and are ignored where none are expected.
ssize_t ServiceConnection::receiveBytes()
{
    if (!expectsDescriptors_)
        return ::recv(socket_.get(), received_.data(), received_.size(), MSG_DONTWAIT);
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof(int) * std::tuple_size_v<ReceivedDescriptors>)> control;
    iovec part = {received_.data(), received_.size()};
    msghdr message{};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    const ssize_t count = ::recvmsg(socket_.get(), &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    if (count > 0)
        keepDescriptors(message);
    return count;
}

void ServiceConnection::keepDescriptors(const msghdr& message) noexcept
{
    const cmsghdr* const head = CMSG_FIRSTHDR(&message);
    if (head == nullptr || head->cmsg_level != SOL_SOCKET || head->cmsg_type != SCM_RIGHTS)
        return;
    std::array<int, std::tuple_size_v<ReceivedDescriptors>> numbers{-1, -1};
    std::memcpy(numbers.data(), CMSG_DATA(head), std::min(head->cmsg_len - CMSG_LEN(0), sizeof numbers));
    std::ranges::transform(numbers, descriptors_.begin(), [](int number) { return platform::FileDescriptor(number); });
}

std::expected<std::size_t, ConnectionFailure> ServiceConnection::receive(const FrameHandler& handle)
{
    const ssize_t count = receiveBytes();
    if (count < 0 && errno == EAGAIN)
        return 0;
    if (count <= 0)
        return failure(KESTO_CONNECTION_LOST, count < 0 ? errno : 0);
    reader_.feed({received_.data(), static_cast<std::size_t>(count)});
    for (;;) {
        const auto frame = reader_.next();
        if (!frame)
            return failure(KESTO_PROTOCOL_VIOLATION);
        if (!*frame)
            return static_cast<std::size_t>(count);
        if (!handle(**frame))
            return failure(KESTO_PROTOCOL_VIOLATION);
    }
}

} // namespace libkesto
