// SPDX-License-Identifier: Apache-2.0
// One thread and one poll for all peers; a test accesses them through that thread.
#include "sdk/FakeService.h"

#include <array>
#include <cstring>
#include <poll.h>
#include <stdexcept>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>
#include <utility>

namespace sdk_test {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

void Peer::answer(std::uint64_t call, std::vector<Value> values, Value error)
{
    std::vector<Value> items{Value(call), std::move(error)};
    items.insert(items.end(), values.begin(), values.end());
    std::string frame;
    foundation::appendCbor(Value(Array(std::move(items))), frame);
    sendFrame(frame);
}

void Peer::sendFrame(std::string_view frame)
{
    std::string bytes;
    platform::appendFrame(frame, bytes);
    sendBytes(bytes);
}

void Peer::sendBytes(std::string_view bytes)
{
    while (!bytes.empty()) {
        const ssize_t sent = attached_.empty() ? ::send(socket_.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL)
                                               : sendWithDescriptors(bytes);
        if (sent <= 0)
            return;
        bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
}

ssize_t Peer::sendWithDescriptors(std::string_view bytes)
{
    constexpr std::size_t most = 16;
    const std::vector<int> numbers = std::exchange(attached_, {});
    const std::size_t size = numbers.size() * sizeof(int);
    alignas(cmsghdr) std::array<char, CMSG_SPACE(most * sizeof(int))> control{};
    iovec part = {const_cast<char*>(bytes.data()), bytes.size()};
    msghdr message = {};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    message.msg_control = control.data();
    message.msg_controllen = CMSG_SPACE(size);
    cmsghdr* const head = CMSG_FIRSTHDR(&message);
    head->cmsg_level = SOL_SOCKET;
    head->cmsg_type = SCM_RIGHTS;
    head->cmsg_len = CMSG_LEN(size);
    std::memcpy(CMSG_DATA(head), numbers.data(), size);
    return ::sendmsg(socket_.get(), &message, MSG_NOSIGNAL);
}

void answerObediently(Peer& peer, const Array& call)
{
    constexpr std::int64_t unknownType = 65535;
    const std::uint64_t number = callNumber(call);
    const auto typeOf = [&](std::int64_t reporter) {
        const auto session = peer.sessions.find(reporter);
        return session == peer.sessions.end() ? unknownType : std::int64_t{session->second};
    };
    switch (method(call)) {
    case 1:
        peer.sessions[integerAt(call, 2)] = 0;
        peer.heldStarts.erase(integerAt(call, 2));
        return peer.answer(number, {true});
    case 2:
        if (peer.sessions.contains(integerAt(call, 3)))
            peer.sessions[integerAt(call, 3)] = static_cast<std::uint16_t>(integerAt(call, 2));
        return peer.answer(number, {true});
    case 3:
        if (integerAt(call, 2) == 0)
            peer.answer(number, {unknownType});
        return peer.answer(number, {typeOf(integerAt(call, 2))});
    case 5: {
        const std::int64_t reporter = integerAt(call, 2);
        if (!peer.sessions.contains(reporter) || peer.heldStarts.contains(reporter))
            return peer.answer(number, {true});
        peer.heldStarts[reporter] = number;
        return;
    }
    case 6: return peer.answer(number, {});
    case 7:
        if (const auto start = peer.heldStarts.find(integerAt(call, 2)); start != peer.heldStarts.end()) {
            peer.answer(start->second, {true});
            peer.heldStarts.erase(start);
        }
        return peer.answer(number, {true});
    case 8:
        peer.sessions.erase(integerAt(call, 2));
        peer.heldStarts.erase(integerAt(call, 2));
        return peer.answer(number, {true});
    case 9: {
        const std::int64_t type = typeOf(integerAt(call, 2));
        const std::int64_t reporter = type == unknownType ? 0 : integerAt(call, 2);
        return peer.answer(number, {Value(Dictionary{{"reporterID", reporter}, {"serviceType", type}})});
    }
    case 10: {
        std::vector<Value> reporters;
        for (const auto& [reporter, type] : peer.sessions)
            reporters.emplace_back(reporter);
        return peer.answer(number, {Value(Array(std::move(reporters)))});
    }
    case 11: return peer.close();
    default: return peer.answer(number, {true});
    }
}

FakeService::FakeService(std::string path, Handler handler)
    : path_(std::move(path)),
      handler_(std::move(handler)),
      listener_(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)),
      doorbell_(::eventfd(0, EFD_CLOEXEC))
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path_.size() >= sizeof address.sun_path)
        throw std::runtime_error("the path is too long for a socket");
    std::memcpy(address.sun_path, path_.data(), path_.size());
    if (::bind(listener_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0
        || ::listen(listener_.get(), SOMAXCONN) != 0)
        throw std::runtime_error("cannot listen at " + path_);
    thread_ = std::thread([this] { run(); });
}

FakeService::~FakeService()
{
    {
        const foundation::Lock lock(mutex_);
        isStopping_ = true;
    }
    eventfd_write(doorbell_.get(), 1);
    thread_.join();
    ::unlink(path_.c_str());
}

void FakeService::run()
{
    for (;;) {
        std::vector<pollfd> watched{{doorbell_.get(), POLLIN, 0}, {listener_.get(), POLLIN, 0}};
        for (const auto& peer : peers_)
            watched.push_back({isReading_ ? peer->socket_.get() : -1, POLLIN, 0});
        ::poll(watched.data(), watched.size(), -1);
        {
            const foundation::Lock lock(mutex_);
            if (isStopping_)
                return;
        }
        for (std::size_t index = 0; index < peers_.size(); ++index)
            if (watched[index + 2].revents != 0)
                read(*peers_[index]);
        if (watched[0].revents != 0)
            performActions();
        std::erase_if(peers_, [](const auto& peer) { return peer->isOver_; });
        if (watched[1].revents != 0)
            accept();
    }
}

void FakeService::accept()
{
    platform::FileDescriptor socket(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!socket)
        return;
    peers_.push_back(std::make_unique<Peer>(std::move(socket)));
    const foundation::Lock lock(mutex_);
    ++connections_;
    changed_.notifyAll();
}

void FakeService::read(Peer& peer)
{
    std::array<char, 64 * 1024> buffer;
    const ssize_t count = ::recv(peer.socket_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (count <= 0)
        return peer.close();
    peer.reader_.feed({buffer.data(), static_cast<std::size_t>(count)});
    for (;;) {
        const auto frame = peer.reader_.next();
        if (!frame)
            return peer.close();
        if (!*frame)
            return;
        const auto item = peer.decoder_.decode(**frame);
        const auto call = item ? item->array() : std::nullopt;
        if (!call)
            return peer.close();
        handler_(peer, *call);
        const foundation::Lock lock(mutex_);
        calls_.push_back(*call);
        changed_.notifyAll();
    }
}

std::vector<Array> FakeService::waitForCalls(std::size_t count)
{
    const auto deadline = std::chrono::steady_clock::now() + patience;
    const foundation::Lock lock(mutex_);
    while (calls_.size() < count && std::chrono::steady_clock::now() < deadline)
        changed_.waitUntil(mutex_, deadline);
    return calls_;
}

std::size_t FakeService::connections() const
{
    const foundation::Lock lock(mutex_);
    return connections_;
}

void FakeService::onThread(std::function<void()> action)
{
    const foundation::Lock lock(mutex_);
    action_ = std::move(action);
    eventfd_write(doorbell_.get(), 1);
    while (action_)
        changed_.wait(mutex_);
}

void FakeService::performActions()
{
    eventfd_t rings = 0;
    eventfd_read(doorbell_.get(), &rings);
    std::function<void()> action;
    {
        const foundation::Lock lock(mutex_);
        action = action_;
    }
    if (action)
        action();
    const foundation::Lock lock(mutex_);
    action_ = nullptr;
    changed_.notifyAll();
}

void FakeService::forEachPeer(const std::function<void(Peer& peer)>& action)
{
    onThread([&] {
        for (const auto& peer : peers_)
            action(*peer);
    });
}

void FakeService::setReading(bool isReading)
{
    onThread([&] { isReading_ = isReading; });
}

} // namespace sdk_test
