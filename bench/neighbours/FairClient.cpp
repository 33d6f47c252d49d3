// SPDX-License-Identifier: Apache-2.0
// A call counts from the moment at which the client makes it, even if the socket takes it later.
#include "neighbours/FairClient.h"

#include "support/SampleMessage.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <poll.h>
#include <stdexcept>
#include <sys/socket.h>

namespace bench {
namespace {

constexpr std::chrono::microseconds period(5000);
constexpr std::chrono::milliseconds patience(1000); // after the last call

timespec timeUntil(Clock::time_point end)
{
    constexpr std::int64_t nanosecondsOfSecond = 1'000'000'000;
    const auto left = std::max<std::int64_t>(std::chrono::nanoseconds(end - Clock::now()).count(), 0);
    return {.tv_sec = left / nanosecondsOfSecond, .tv_nsec = left % nanosecondsOfSecond};
}

[[noreturn]] void failAsEnded()
{
    throw std::runtime_error("the server ended the connection of the well-behaved client");
}

} // namespace

FairClient::FairClient(platform::FileDescriptor socket, std::vector<Request> calls, ReadMessage readMessage)
    : socket_(std::move(socket)),
      calls_(std::move(calls)),
      readMessage_(readMessage),
      number_(numberMark)
{
}

std::vector<double> FairClient::latencies(Clock::duration duration)
{
    const auto end = Clock::now() + duration;
    for (auto due = Clock::now(); due < end; due += period) {
        exchangeUntil(due, false);
        makeCalls();
    }
    exchangeUntil(Clock::now() + patience, true);
    for (const auto& [number, start] : unanswered_)
        latencies_.push_back(nanosecondsSince(start) / 1e3);
    unanswered_.clear();
    return std::exchange(latencies_, {});
}

void FairClient::makeCalls()
{
    const auto now = Clock::now();
    for (Request& call : calls_) {
        call.setNumber(++number_);
        unanswered_.emplace(number_, now);
        unwritten_ += call.bytes;
    }
    write();
}

void FairClient::exchangeUntil(Clock::time_point end, bool untilAnswered)
{
    while (!untilAnswered || !unanswered_.empty()) {
        pollfd ready{socket_.get(), static_cast<short>(unwritten_.empty() ? POLLIN : POLLIN | POLLOUT), 0};
        const timespec left = timeUntil(end);
        if (::ppoll(&ready, 1, &left, nullptr) == 0)
            return;
        if ((ready.revents & POLLOUT) != 0)
            write();
        if ((ready.revents & ~POLLOUT) != 0)
            read();
    }
}

void FairClient::write()
{
    const ssize_t count = ::send(socket_.get(), unwritten_.data(), unwritten_.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
    if (count < 0 && errno != EAGAIN)
        failAsEnded();
    unwritten_.erase(0, static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
}

void FairClient::read()
{
    std::array<char, 16'384> bytes;
    const ssize_t count = ::recv(socket_.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
    if (count == 0 || (count < 0 && errno != EAGAIN))
        failAsEnded();
    unread_.append(bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
    takeAnswers();
}

void FairClient::takeAnswers()
{
    std::string_view rest(unread_);
    while (const auto message = readMessage_(rest)) {
        take(*message);
        rest.remove_prefix(message->size);
    }
    unread_.erase(0, unread_.size() - rest.size());
}

void FairClient::take(const Message& message)
{
    if (message.answers == Message::Answers::Nothing)
        return;
    const auto call =
        message.answers == Message::Answers::Oldest ? unanswered_.begin() : unanswered_.find(message.number);
    if (call == unanswered_.end())
        return; // the late answer to a call of an earlier measurement
    latencies_.push_back(nanosecondsSince(call->second) / 1e3);
    unanswered_.erase(call);
}

} // namespace bench
