// SPDX-License-Identifier: Apache-2.0
// A link is slow by passing a few bytes in each turn of a fiftieth of a second.
#include "support/Relay.h"

#include "support/KeptPort.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <poll.h>
#include <stdexcept>
#include <string_view>
#include <vector>

namespace support {

namespace {

constexpr std::chrono::milliseconds turn{20};
constexpr std::size_t turnsInASecond = std::chrono::milliseconds(1000) / turn;

platform::FileDescriptor makeSocket()
{
    return platform::FileDescriptor(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
}

} // namespace

Relay::Relay(std::uint16_t serverPort, std::size_t bytesPerSecond)
    : serverPort_(serverPort),
      mostInATurn_(bytesPerSecond / turnsInASecond),
      listener_(makeSocket())
{
    constexpr int waitingConnections = 64;
    sockaddr_in address = loopback(0);
    socklen_t size = sizeof address;
    if (::bind(listener_.get(), reinterpret_cast<sockaddr*>(&address), size) != 0
        || ::listen(listener_.get(), waitingConnections) != 0
        || ::getsockname(listener_.get(), reinterpret_cast<sockaddr*>(&address), &size) != 0)
        throw std::runtime_error("the relay has no port");
    port_ = ntohs(address.sin_port);
    thread_ = std::thread([this] { serve(); });
}

Relay::~Relay()
{
    ends_ = true;
    thread_.join();
}

void Relay::loseAnswersWith(const std::string& word)
{
    word_ = word;
    hasLost_ = false;
    loses_ = true;
}

void Relay::serve()
{
    while (!ends_) {
        std::vector<pollfd> awaited{{listener_.get(), POLLIN, 0}};
        for (const Pair& pair : pairs_) {
            awaited.push_back({pair.client.get(), POLLIN, 0});
            awaited.push_back({pair.server.get(), POLLIN, 0});
        }
        ::poll(awaited.data(), awaited.size(), static_cast<int>(turn.count()));
        auto end = awaited.begin() + 1;
        for (auto pair = pairs_.begin(); pair != pairs_.end(); end += 2) {
            const int client = pair->client.get();
            const int server = pair->server.get();
            const bool isOpen = (end[0].revents == 0 || pass(client, server, false))
                && (end[1].revents == 0 || pass(server, client, true));
            pair = isOpen ? std::next(pair) : pairs_.erase(pair);
        }
        if (awaited.front().revents != 0)
            accept();
        if (mostInATurn_ != 0)
            std::this_thread::sleep_for(turn);
    }
}

// A client whose server is away is turned away.
void Relay::accept()
{
    ++connections_;
    Pair pair{platform::FileDescriptor(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC)), makeSocket()};
    const sockaddr_in address = loopback(serverPort_);
    if (::connect(pair.server.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0)
        pairs_.push_back(std::move(pair));
}

bool Relay::pass(int from, int to, bool isAnswer)
{
    std::array<char, 65536> bytes;
    const std::size_t most = mostInATurn_ == 0 ? bytes.size() : std::min(bytes.size(), mostInATurn_);
    const ssize_t size = ::recv(from, bytes.data(), most, 0);
    if (size <= 0)
        return false;
    const std::string_view text(bytes.data(), static_cast<std::size_t>(size));
    if (isAnswer && loses_ && text.contains(word_)) {
        hasLost_ = true;
        return true;
    }
    return ::send(to, text.data(), text.size(), MSG_NOSIGNAL) == size;
}

} // namespace support
