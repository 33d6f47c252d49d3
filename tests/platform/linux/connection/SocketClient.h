// SPDX-License-Identifier: Apache-2.0
// A client of a listener that sends any bytes: it can do everything that a hostile client can.
#pragma once

#include "foundation/cbor/Cbor.h"
#include "platform/Connection.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"
#include "support/Progress.h"

#include <cerrno>
#include <filesystem>
#include <gtest/gtest.h>
#include <optional>
#include <poll.h>
#include <stdexcept>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <system_error>
#include <vector>

namespace support {

// The encoding of a value as one frame, with its head.
inline std::string framed(const foundation::Value& value)
{
    std::string item;
    foundation::appendCbor(value, item);
    std::string bytes;
    platform::appendFrame(item, bytes);
    return bytes;
}

// The call with that number, and text that makes it as large as the test needs.
inline std::string callNumber(int number, std::size_t textLength = 0)
{
    return framed(foundation::Array{number, std::string(textLength, 'x')});
}

inline std::string answerTo(const foundation::Array& call, std::size_t textLength = 0)
{
    std::string frame;
    foundation::appendCbor(foundation::Array{call[0], std::string(textLength, 'y')}, frame);
    return frame;
}

// Sends the frame in its own turn.
inline void sendAtOnce(platform::Connection& connection, std::string frame)
{
    platform::Turn turn;
    connection.send(turn, std::move(frame));
    if (auto send = turn.letters.take())
        send();
}

class SocketClient {
public:
    explicit SocketClient(const std::filesystem::path& path) : socket_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0))
    {
        sockaddr_un address = {};
        address.sun_family = AF_UNIX;
        path.string().copy(address.sun_path, sizeof address.sun_path - 1);
        if (::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
            throw std::system_error(errno, std::generic_category(), "connect");
    }

    // Blocks until the service has accepted the bytes.
    void write(std::string_view bytes)
    {
        while (!bytes.empty()) {
            const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
            if (count < 0)
                throw std::system_error(errno, std::generic_category(), "send");
            bytes.remove_prefix(static_cast<std::size_t>(count));
        }
    }

    // Writes what the socket accepts without waiting, and returns the number of bytes.
    std::size_t writeWhatFits(std::string_view bytes)
    {
        const ssize_t count = ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
        return count < 0 ? 0 : static_cast<std::size_t>(count);
    }

    // The next frame; nothing if the service closed or reset the connection.
    std::optional<foundation::Array> readFrame()
    {
        while (true) {
            const auto frame = reader_.next();
            if (!frame)
                throw std::runtime_error("the service sent a frame that is too long");
            if (*frame)
                return decoder_.decode(**frame)->array();
            if (!readMore())
                return std::nullopt;
        }
    }

    // The first number of the next frame; nothing at the end.
    std::optional<int> readNumber()
    {
        const auto frame = readFrame();
        if (!frame)
            return std::nullopt;
        return static_cast<int>((*frame)[0].number()->int64Value());
    }

    // The numbers of so many frames.
    std::vector<int> readNumbers(std::size_t count)
    {
        std::vector<int> numbers;
        while (numbers.size() < count) {
            const auto number = readNumber();
            if (!number)
                break;
            numbers.push_back(*number);
        }
        return numbers;
    }

    // Whether bytes can be read now.
    bool hasSomethingToRead()
    {
        pollfd events = {socket_.get(), POLLIN, 0};
        return ::poll(&events, 1, 0) == 1;
    }

    void waitForSomethingToRead()
    {
        pollfd events = {socket_.get(), POLLIN, 0};
        ASSERT_EQ(::poll(&events, 1, static_cast<int>(std::chrono::milliseconds(longestWait).count())), 1);
    }

    void close() { socket_ = platform::FileDescriptor(); }
    void stopWriting() { ::shutdown(socket_.get(), SHUT_WR); }
    void stopReading() { ::shutdown(socket_.get(), SHUT_RD); }
    [[nodiscard]] int descriptor() const { return socket_.get(); }

private:
    bool readMore()
    {
        waitForSomethingToRead();
        const ssize_t count = ::recv(socket_.get(), buffer_.data(), buffer_.size(), MSG_DONTWAIT);
        if (count <= 0)
            return false;
        reader_.feed({buffer_.data(), static_cast<std::size_t>(count)});
        return true;
    }

    platform::FileDescriptor socket_;
    platform::FrameReader reader_;
    foundation::CborDecoder decoder_;
    std::vector<char> buffer_ = std::vector<char>(256 * 1024);
};

} // namespace support
