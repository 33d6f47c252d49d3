// SPDX-License-Identifier: Apache-2.0
// One thread serves all connections in turns, and writes whenever a socket takes something.
#include "neighbours/FloodPipeline.h"

#include "support/SampleMessage.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <poll.h>
#include <sys/socket.h>

namespace bench {
namespace {

class FloodingConnection {
public:
    explicit FloodingConnection(platform::FileDescriptor socket) : socket_(std::move(socket)) { }

    [[nodiscard]] int socket() const { return socket_.get(); }

    // False if the server ended the connection; so does `discardAnswers`.
    [[nodiscard]] bool write(std::vector<Request>& calls)
    {
        while (unwritten_.size() < leastUnwritten)
            append(calls);
        const ssize_t count = ::send(socket_.get(), unwritten_.data(), unwritten_.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0)
            return errno == EAGAIN;
        unwritten_.erase(0, static_cast<std::size_t>(count));
        return true;
    }

    [[nodiscard]] bool discardAnswers() const
    {
        static std::array<char, std::size_t{64} << 10> bytes;
        const ssize_t count = ::recv(socket_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        return count > 0 || (count < 0 && errno == EAGAIN);
    }

private:
    static constexpr std::size_t leastUnwritten = std::size_t{16} << 10;

    void append(std::vector<Request>& calls)
    {
        for (Request& call : calls) {
            call.setNumber(number_++);
            unwritten_ += call.bytes;
        }
    }

    platform::FileDescriptor socket_;
    std::uint32_t number_ = numberMark;
    std::string unwritten_;
};

} // namespace

void FloodPipeline::run(const std::function<void()>& waitForStart) const
{
    std::vector<FloodingConnection> all;
    for (int connection = 0; connection < connections; ++connection)
        all.emplace_back(connect());
    waitForStart();

    std::vector<Request> numbered = calls;
    const bool isReading = answers == Answers::Discarded;
    std::vector<pollfd> ready(all.size());
    while (true) {
        std::ranges::transform(all, ready.begin(), [&](const FloodingConnection& connection) {
            return pollfd{connection.socket(), static_cast<short>(isReading ? POLLIN | POLLOUT : POLLOUT), 0};
        });
        ::poll(ready.data(), ready.size(), -1);
        for (std::size_t each = 0; each < all.size(); ++each) {
            const short events = ready[each].revents;
            bool isOpen = (events & (POLLERR | POLLNVAL)) == 0;
            if (isOpen && (events & POLLOUT) != 0)
                isOpen = all[each].write(numbered);
            if (isOpen && isReading && (events & (POLLIN | POLLHUP)) != 0)
                isOpen = all[each].discardAnswers();
            if (!isOpen || (!isReading && (events & POLLHUP) != 0))
                all[each] = FloodingConnection(connect());
        }
    }
}

} // namespace bench
