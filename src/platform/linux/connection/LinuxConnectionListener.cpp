// SPDX-License-Identifier: Apache-2.0
// One loop around epoll. It accepts a few clients at a time, and pauses when descriptors run out, so that neither many
// new clients nor too many clients harm those that are connected.
#include "platform/linux/connection/LinuxConnectionListener.h"

#include "platform/linux/files/SystemError.h"
#include "platform/linux/queues/SerialQueue.h"
#include "platform/linux/queues/ThreadHeap.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <cerrno>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <utility>

namespace platform {
namespace {

// Newcomers that are accepted at once, and while connected clients wait to be read: then clients that come and go
// without a pause leave no more connections open than are read to their end, and the others get their turn.
constexpr int mostAcceptedAtOnce = 4;
constexpr int mostAcceptedBesideReaders = 1;
constexpr std::size_t mostEventsAtOnce = 64;

// While several clients have something to read, the thread reads for so long before it helps and looks who else has
// come; and so much of one client at once that this takes about that time.
constexpr std::chrono::microseconds longestReading{25};
constexpr std::size_t leastRead = 256;
// One read costs its connection this much at most. A longer read means that the thread waited for a processor. A
// connection that paid for this wait would then wait until every other connection has used as much time.
constexpr std::chrono::microseconds mostCharged{200};

std::size_t mostConnections(std::size_t descriptors)
{
    return descriptors - std::min(LinuxConnectionListener::descriptorsForTheRest, descriptors / 2);
}

} // namespace

std::size_t LinuxConnectionListener::mostDescriptors()
{
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    return limit.rlim_cur;
}

std::expected<std::unique_ptr<LinuxConnectionListener>, std::error_code>
LinuxConnectionListener::create(ListeningSocket socket, ledger::Ledger& ledger, LogCategory& log,
                                std::size_t descriptors)
{
    FileDescriptor epoll(::epoll_create1(EPOLL_CLOEXEC));
    if (!epoll)
        return std::unexpected(systemError());
    FileDescriptor wake(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (!wake)
        return std::unexpected(systemError());
    std::unique_ptr<LinuxConnectionListener> listener(
        new LinuxConnectionListener(std::move(socket), std::move(epoll), std::move(wake), ledger, log, descriptors));
    if (!listener->watch(EPOLL_CTL_ADD, listener->hub_->wake.get(), EPOLLIN | EPOLLET, &listener->hub_->wake)
        || !listener->watch(EPOLL_CTL_ADD, listener->socket_.descriptor(), 0, &listener->socket_))
        return std::unexpected(systemError());
    return listener;
}

LinuxConnectionListener::LinuxConnectionListener(ListeningSocket socket, FileDescriptor epoll, FileDescriptor wake,
                                                 ledger::Ledger& ledger, LogCategory& log, std::size_t descriptors)
    : socket_(std::move(socket)),
      hub_(std::make_shared<ConnectionHub>(std::move(epoll), std::move(wake), log, ledger)),
      mostConnections_(mostConnections(descriptors)),
      mostConnectionsOfAUser_(mostConnections_ - mostConnections_ / partForOthers)
{
}

bool LinuxConnectionListener::watch(int operation, int descriptor, std::uint32_t events, void* tag)
{
    epoll_event event = {};
    event.events = events;
    event.data.ptr = tag;
    return ::epoll_ctl(hub_->epoll.get(), operation, descriptor, &event) == 0;
}

void LinuxConnectionListener::resume()
{
    assert(delegate_ != nullptr);
    hub_->connectionThread = std::this_thread::get_id();
    resumeAccepting();
    if (listeningHandler_)
        listeningHandler_();
    serve();
    if (stoppedHandler_)
        stoppedHandler_();
    for (const auto& [identity, reader] : std::exchange(connections_, {}))
        reader->connection->finish();
}

// After each slice of reading this thread helps with the calls of the clients, if they are few.
void LinuxConnectionListener::serve()
{
    SerialQueue::Helper helper;
    ThreadHeap heap([this] { hub_->wakeUp(); });
    while (!isStopping_) {
        std::array<epoll_event, mostEventsAtOnce> events;
        const int count =
            ::epoll_wait(hub_->epoll.get(), events.data(), events.size(), ready_.isEmpty() ? waitingTime() : 0);
        for (int index = 0; index < count; ++index)
            handle(events[static_cast<std::size_t>(index)]);
        if (acceptAgainAt_ && *acceptAgainAt_ <= Clock::now())
            resumeAccepting();
        lookForRoom();
        serveReaders();
        helper.help();
        heap.tidyIfAsked();
    }
}

void LinuxConnectionListener::stop()
{
    isStopping_ = true;
    hub_->wakeUp();
}

// In milliseconds, as epoll counts; rounded up, so that the loop does not wake too early.
int LinuxConnectionListener::waitingTime() const
{
    const auto end = std::min(acceptAgainAt_.value_or(Clock::time_point::max()),
                              waitingForRoom_.empty() ? Clock::time_point::max() : lookForRoomAt_);
    if (end == Clock::time_point::max())
        return -1;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now());
    return static_cast<int>(std::max<std::chrono::milliseconds::rep>(left.count(), 0));
}

void LinuxConnectionListener::handle(const epoll_event& event)
{
    const void* const tag = event.data.ptr; // a copy, because the kernel packs its structure
    if (tag == &socket_) {
        acceptWaiting();
    } else if (tag == &hub_->wake) {
        lookForRoomAt_ = {};
    } else {
        const auto& reader = connections_.at(tag);
        reader->events |= event.events;
        ready_.enter(reader);
    }
}

// Usually the memory says when it has room; a limit that was raised is found by looking.
void LinuxConnectionListener::lookForRoom()
{
    if (waitingForRoom_.empty())
        return;
    const auto now = Clock::now();
    if (now < lookForRoomAt_)
        return;
    lookForRoomAt_ = now + lookingPause;
    std::erase_if(waitingForRoom_, [this](const auto& reader) {
        const bool mayHaveRoom = reader->connection->mayHaveRoom();
        if (mayHaveRoom)
            ready_.enter(reader);
        return mayHaveRoom;
    });
}

// Those that want little are all served at once.
void LinuxConnectionListener::serveReaders()
{
    for (auto begin = Clock::now(), now = begin; !ready_.isEmpty() && now - begin < longestReading;) {
        auto& reader = static_cast<Reader&>(ready_.serveFirst());
        const bool hasMore = serve(reader, ready_.isContested() ? reader.mostBytes : ConnectionHub::mostReadAtOnce);
        const auto time = Clock::now() - now;
        reader.adapt(time);
        ready_.charge(std::min<Clock::duration>(time, mostCharged), hasMore);
        now += time;
    }
}

void LinuxConnectionListener::Reader::adapt(Clock::duration time)
{
    if (time > longestReading)
        mostBytes = std::max(mostBytes / 2, leastRead);
    else if (time < longestReading / 2)
        mostBytes = std::min(mostBytes * 2, ConnectionHub::mostReadAtOnce);
}

// Whether the connection has more to do already.
bool LinuxConnectionListener::serve(Reader& reader, std::size_t mostBytes)
{
    using enum LinuxConnection::Next;
    const auto next = reader.connection->handle(std::exchange(reader.events, 0), mostBytes);
    if (next == Room) {
        waitingForRoom_.insert(connections_.at(reader.connection.get()));
    } else if (next == End) {
        forget(*reader.connection);
        if (!isAccepting_)
            resumeAccepting();
    }
    return next == Turn;
}

void LinuxConnectionListener::acceptWaiting()
{
    const int most = ready_.isEmpty() ? mostAcceptedAtOnce : mostAcceptedBesideReaders;
    for (int accepted = 0; accepted < most; ++accepted) {
        if (connections_.size() >= mostConnections_)
            return pauseAccepting(std::nullopt, EMFILE);
        FileDescriptor socket(::accept4(socket_.descriptor(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
        if (socket) {
            welcome(std::move(socket));
        } else if (errno == EAGAIN) {
            pauseIsLogged_ = false;
            return;
        } else if (errno != EINTR && errno != ECONNABORTED) {
            return pauseAccepting(acceptingPause, errno);
        }
    }
}

void LinuxConnectionListener::welcome(FileDescriptor socket)
{
    ucred peer = {};
    socklen_t size = sizeof peer;
    if (::getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0)
        return; // it has gone already
    const Submitter process{.user = peer.uid, .process = peer.pid};
    if (!admit(process))
        return;
    const auto connection =
        std::make_shared<LinuxConnection>(hub_, std::move(socket), LinuxConnection::Peer{peer.pid, peer.uid, peer.gid});
    const auto reader = std::make_shared<Reader>();
    reader->connection = connection;
    ready_.admit(*reader, process);
    connections_.emplace(connection.get(), reader);
    {
        const foundation::Lock lock(hub_->connectionsLock);
        hub_->connections.emplace(connection.get(), connection);
    }
    hub_->ledger.count(ledger::Counter::ConnectionsAccepted);
    if (!delegate_->shouldAcceptNewConnection(*this, connection))
        connection->invalidate();
    ready_.enter(reader); // it may be over already
}

// Counts a new connection, unless its user has too many already or its process ends them too fast.
bool LinuxConnectionListener::admit(const Submitter& process)
{
    if (const auto refusal = hub_->unfinishedEnds.refusal(process)) {
        hub_->ledger.count(ledger::Counter::ConnectionsRefusedUnfinished);
        if (refusal->isFirst)
            KESTO_LOG(hub_->log, Error,
                      "process {} gets no more connections for now: {} of its own have ended and are not removed yet, "
                      "and {} of user {} in all",
                      process.process, refusal->endsOfProcess, refusal->endsOfUser, process.user);
        return false;
    }
    User& user = users_[process.user];
    if (user.connections == mostConnectionsOfAUser_) {
        hub_->ledger.count(ledger::Counter::ConnectionsRefused);
        if (!std::exchange(user.refusalIsLogged, true))
            KESTO_LOG(hub_->log, Error, "user {} has {} connections and gets no more until one ends", process.user,
                      user.connections);
        return false;
    }
    ++user.connections;
    return true;
}

void LinuxConnectionListener::forget(const LinuxConnection& connection)
{
    const auto user = users_.find(connection.userIdentifier());
    if (--user->second.connections <= mostConnectionsOfAUser_ / 2)
        user->second.refusalIsLogged = false;
    if (user->second.connections == 0)
        users_.erase(user);
    const auto known = connections_.find(&connection);
    waitingForRoom_.erase(known->second);
    connections_.erase(known);
}

// Without descriptors the waiting clients must wait: trying again without a pause would only keep the thread busy.
void LinuxConnectionListener::pauseAccepting(std::optional<Clock::duration> pause, int error)
{
    isAccepting_ = !watch(EPOLL_CTL_MOD, socket_.descriptor(), 0, &socket_);
    if (pause)
        acceptAgainAt_ = Clock::now() + *pause;
    hub_->ledger.count(ledger::Counter::AcceptingPauses);
    if (!std::exchange(pauseIsLogged_, true))
        KESTO_LOG(hub_->log, Error, "new connections have to wait, with {} open: {}", connections_.size(),
                  systemErrorText(error));
}

void LinuxConnectionListener::resumeAccepting()
{
    acceptAgainAt_.reset();
    isAccepting_ = watch(EPOLL_CTL_MOD, socket_.descriptor(), EPOLLIN, &socket_);
}

} // namespace platform
