// SPDX-License-Identifier: Apache-2.0
// The simplest client: it writes a request that was encoded before, and reads as many bytes as the answer has. It calls
// the service and the peers alike, so that only the servers differ.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <bit>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace bench {

// A request, and the places of its running number of four bytes.
struct Request {
    std::string bytes;
    std::vector<std::size_t> places;
    std::endian order;

    // Finds the places of `numberMark`.
    static Request marked(std::string bytes, std::endian order);
    void setNumber(std::uint32_t number);
};

class RawClient {
public:
    // How many requests may wait for their answer in a pipeline.
    static constexpr std::size_t mostUnanswered = 2048;

    // The socket is connected; all answers have the same size.
    RawClient(platform::FileDescriptor socket, Request request, std::size_t answerSize);

    // Sends a request and waits for its answer.
    void roundTrip();
    // Sends so many, and reads answers while it writes.
    void pipeline(std::size_t count);

private:
    void appendRequest(std::string& out);
    std::size_t readAnswers(int flags);
    [[noreturn]] static void fail(std::string_view doing);

    platform::FileDescriptor socket_;
    Request request_;
    const std::size_t answerSize_;
    std::uint32_t number_;
    std::string answers_; // room for reading
    std::size_t partOfAnswer_ = 0; // bytes of an incomplete answer
};

// A pair of connected Unix stream sockets.
struct SocketPair {
    SocketPair();
    platform::FileDescriptor client;
    platform::FileDescriptor server;
};

// Connects to a Unix stream socket; an empty descriptor if no server listens there.
[[nodiscard]] platform::FileDescriptor connectTo(const std::filesystem::path& path);
void writeAll(int socket, std::string_view bytes);
// Reads exactly so many bytes; false at the end of the stream.
bool readAll(int socket, char* bytes, std::size_t count);

} // namespace bench
