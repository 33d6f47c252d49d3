// SPDX-License-Identifier: Apache-2.0
// Written bytes stay at the front of the buffer until moving the rest costs less than sending them did.
#include "platform/linux/connection/ConnectionOutput.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <string_view>
#include <sys/socket.h>
#include <utility>

namespace platform {
namespace {

// Sends what the socket accepts, and the descriptors with the first byte.
ssize_t sendWithDescriptors(int socket, std::string_view bytes, const EmitterDescriptors& descriptors)
{
    const std::array numbers{descriptors.marker, descriptors.page};
    alignas(cmsghdr) std::array<char, CMSG_SPACE(sizeof numbers)> control{};
    iovec part = {const_cast<char*>(bytes.data()), bytes.size()};
    msghdr message = {};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = control.size();
    cmsghdr* const head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(sizeof numbers);
    std::memcpy(CMSG_DATA(head), numbers.data(), sizeof numbers);
    return ::sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
}

} // namespace

void ConnectionOutput::append(std::string frames)
{
    if (bytes_.empty())
        bytes_ = std::move(frames);
    else
        bytes_ += frames;
}

void ConnectionOutput::append(std::string frame, const EmitterDescriptors& descriptors)
{
    handOver_ = {bytes_.size(), descriptors};
    append(std::move(frame));
}

std::optional<std::size_t> ConnectionOutput::writeTo(int socket)
{
    const ssize_t count = sendTo(socket);
    if (count < 0 && errno != EAGAIN && errno != EINTR)
        return std::nullopt;
    const std::size_t taken = count < 0 ? 0 : static_cast<std::size_t>(count);
    forget(taken);
    return taken;
}

// Descriptors go with the first byte of their frame. If the system has none to spare, because clients do not take
// theirs, the frame goes without them.
ssize_t ConnectionOutput::sendTo(int socket)
{
    std::string_view rest = std::string_view(bytes_).substr(start_);
    if (handOver_ && handOver_->place == start_) {
        const ssize_t count = sendWithDescriptors(socket, rest, handOver_->descriptors);
        if (count > 0 || errno == ETOOMANYREFS)
            handOver_.reset();
        if (count > 0 || handOver_)
            return count;
    } else if (handOver_) {
        rest = rest.substr(0, handOver_->place - start_);
    }
    return ::send(socket, rest.data(), rest.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
}

void ConnectionOutput::forget(std::size_t count)
{
    start_ += count;
    if (start_ == bytes_.size()) {
        std::string().swap(bytes_); // rather than clear: an idle connection keeps no buffer
        start_ = 0;
    } else if (start_ > bytes_.size() / 2) { // so that moving costs less than sending did
        bytes_.erase(0, start_);
        if (handOver_)
            handOver_->place -= start_;
        start_ = 0;
    }
}

std::size_t ConnectionOutput::drop() noexcept
{
    const std::size_t dropped = bytes_.size() - start_;
    std::string().swap(bytes_);
    start_ = 0;
    handOver_.reset();
    return dropped;
}

} // namespace platform
