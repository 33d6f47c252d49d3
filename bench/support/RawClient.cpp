// SPDX-License-Identifier: Apache-2.0
// Requests are one string in which only the number changes, and answers are only counted in bytes, so that the client's
// own cost in a measurement is minimal.
#include "support/RawClient.h"

#include "support/SampleMessage.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <system_error>

namespace bench {
namespace {

std::array<char, sizeof(std::uint32_t)> bytesOf(std::uint32_t number, std::endian order)
{
    return std::bit_cast<std::array<char, sizeof number>>(order == std::endian::native ? number
                                                                                       : std::byteswap(number));
}

[[noreturn]] void failWith(int error, std::string_view doing)
{
    throw std::system_error(error, std::generic_category(), std::string(doing));
}

} // namespace

Request Request::marked(std::string bytes, std::endian order)
{
    Request request{std::move(bytes), {}, order};
    const auto mark = bytesOf(numberMark, order);
    const std::string_view pattern(mark.data(), mark.size());
    for (auto place = request.bytes.find(pattern); place != std::string::npos;
         place = request.bytes.find(pattern, place + pattern.size()))
        request.places.push_back(place);
    return request;
}

void Request::setNumber(std::uint32_t number)
{
    const auto encoded = bytesOf(number, order);
    for (const std::size_t place : places)
        std::ranges::copy(encoded, bytes.begin() + static_cast<std::ptrdiff_t>(place));
}

RawClient::RawClient(platform::FileDescriptor socket, Request request, std::size_t answerSize)
    : socket_(std::move(socket)),
      request_(std::move(request)),
      answerSize_(answerSize),
      number_(numberMark),
      answers_(mostUnanswered * answerSize, '\0')
{
}

void RawClient::fail(std::string_view doing)
{
    failWith(errno, doing);
}

void RawClient::appendRequest(std::string& out)
{
    request_.setNumber(number_++);
    out += request_.bytes;
}

void RawClient::roundTrip()
{
    request_.setNumber(number_++);
    writeAll(socket_.get(), request_.bytes);
    while (readAnswers(0) == 0) { }
}

// Returns how many answers became complete.
std::size_t RawClient::readAnswers(int flags)
{
    const ssize_t count = ::recv(socket_.get(), answers_.data(), answers_.size(), flags);
    if (count < 0 && errno == EAGAIN)
        return 0;
    if (count <= 0)
        fail("reading answers");
    const std::size_t bytes = partOfAnswer_ + static_cast<std::size_t>(count);
    partOfAnswer_ = bytes % answerSize_;
    return bytes / answerSize_;
}

void RawClient::pipeline(std::size_t count)
{
    constexpr std::size_t together = 32; // requests that are written together
    std::string unwritten;
    std::size_t begun = 0;
    std::size_t answered = 0;
    while (answered < count) {
        if (unwritten.empty() && begun < count && begun - answered + together <= mostUnanswered)
            for (std::size_t each = 0; each < together && begun < count; ++each, ++begun)
                appendRequest(unwritten);
        pollfd ready{socket_.get(), static_cast<short>(unwritten.empty() ? POLLIN : POLLIN | POLLOUT), 0};
        ::poll(&ready, 1, -1);
        if ((ready.revents & POLLOUT) != 0) {
            const ssize_t written =
                ::send(socket_.get(), unwritten.data(), unwritten.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            if (written < 0 && errno != EAGAIN)
                fail("writing requests");
            unwritten.erase(0, static_cast<std::size_t>(std::max<ssize_t>(written, 0)));
        }
        if ((ready.revents & ~POLLOUT) != 0)
            answered += readAnswers(MSG_DONTWAIT);
    }
}

SocketPair::SocketPair()
{
    std::array<int, 2> ends{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends.data()) != 0)
        failWith(errno, "socketpair");
    client = platform::FileDescriptor(ends[0]);
    server = platform::FileDescriptor(ends[1]);
}

platform::FileDescriptor connectTo(const std::filesystem::path& path)
{
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.native().copy(address.sun_path, sizeof address.sun_path - 1);
    platform::FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
        return {};
    return socket;
}

void writeAll(int socket, std::string_view bytes)
{
    while (!bytes.empty()) {
        const ssize_t count = ::send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (count < 0)
            failWith(errno, "writing");
        bytes.remove_prefix(static_cast<std::size_t>(count));
    }
}

bool readAll(int socket, char* bytes, std::size_t count)
{
    while (count != 0) {
        const ssize_t got = ::recv(socket, bytes, count, 0);
        if (got <= 0)
            return false;
        bytes += got;
        count -= static_cast<std::size_t>(got);
    }
    return true;
}

} // namespace bench
