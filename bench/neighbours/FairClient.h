// SPDX-License-Identifier: Apache-2.0
// The well-behaved client: it makes its calls 200 times a second, whether or not earlier ones are answered, and notes
// how long each answer took. Because it does not wait with its next call, a stall shows in every call that falls into
// it, and not only in one.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "support/Harness.h"
#include "support/RawClient.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace bench {

class FairClient {
public:
    // What the server sent: its size, and the call that it answers.
    struct Message {
        enum class Answers : std::uint8_t { Nothing, Oldest, Numbered };
        std::size_t size;
        Answers answers;
        std::uint32_t number = 0; // of the call, if it is numbered
    };
    // Reads the first whole message; nothing if none is whole.
    using ReadMessage = std::optional<Message> (*)(std::string_view bytes);

    // All calls are made at the same time, each with a number of its own.
    FairClient(platform::FileDescriptor socket, std::vector<Request> calls, ReadMessage readMessage);

    // The latencies in microseconds, after so much time. A call that is not answered some time later counts with the
    // time that it has waited until then. Throws if the server ends the connection.
    [[nodiscard]] std::vector<double> latencies(Clock::duration duration);

private:
    void makeCalls();
    void exchangeUntil(Clock::time_point end, bool untilAnswered);
    void write();
    void read();
    void takeAnswers();
    void take(const Message& message);

    platform::FileDescriptor socket_;
    std::vector<Request> calls_;
    const ReadMessage readMessage_;
    std::uint32_t number_;
    std::map<std::uint32_t, Clock::time_point> unanswered_; // by the call's number
    std::vector<double> latencies_;
    std::string unwritten_;
    std::string unread_; // received, but not a whole message
};

} // namespace bench
