// SPDX-License-Identifier: Apache-2.0
// Each connection has one lock, for its output and for its end. What only the connection thread uses needs no lock.
#include "platform/linux/connection/LinuxConnection.h"

#include "foundation/cbor/Cbor.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/connection/TrustedPeer.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <fmt/format.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <unistd.h>
#include <utility>

namespace platform {

using ledger::Counter;

namespace {

// Both counts in one number, so that exactly one thread sees them fall below the limits.
constexpr std::uint64_t unansweredCall(std::size_t bytes) noexcept
{
    return std::uint64_t{1} << 32 | bytes;
}

// The requests beside the calls of the service's operations have names; of other frames the name is empty.
std::string_view requestName(const foundation::Array& frame)
{
    return frame.size() == 2 ? frame[1].stringView() : std::string_view();
}

constexpr std::string_view emitterAccessRequest = "trace";
constexpr std::string_view statusRequest = "status";

const Connection::Violation wrongNumber{"a call's number is an unsigned 64-bit integer"};

constexpr bool areTooManyUnanswered(std::uint64_t unanswered) noexcept
{
    return unanswered >> 32 > LinuxConnection::mostUnansweredCalls
        || (unanswered & 0xFFFFFFFF) > LinuxConnection::mostUnansweredBytes;
}

} // namespace

// The room that a call takes of the limits until it is answered.
class LinuxConnection::Credit {
public:
    Credit(std::shared_ptr<LinuxConnection> connection, std::size_t bytes) noexcept
        : connection_(std::move(connection)),
          bytes_(bytes)
    {
    }
    ~Credit() { connection_->returnCredit(bytes_); }
    Credit(const Credit&) = delete;
    Credit& operator=(const Credit&) = delete;

private:
    const std::shared_ptr<LinuxConnection> connection_;
    const std::size_t bytes_;
};

LinuxConnection::LinuxConnection(std::shared_ptr<ConnectionHub> hub, FileDescriptor socket, Peer peer)
    : hub_(std::move(hub)),
      peer_(peer),
      share_(hub_->transit.makeShare(peer.userIdentifier)),
      socket_(std::move(socket))
{
}

std::string LinuxConnection::description() const
{
    return fmt::format("connection of process {} (user {})", peer_.processIdentifier, peer_.userIdentifier);
}

void LinuxConnection::setLane(std::shared_ptr<Lane> lane, std::shared_ptr<ledger::Workload> workload)
{
    lane_ = std::move(lane);
    workload_ = std::move(workload);
    lane_->setWorkload(workload_);
    lane_->setRoomHandler([weak = weak_from_this()] {
        if (const auto self = weak.lock()) {
            self->isLaneFull_ = false;
            const foundation::Lock lock(self->lock_);
            self->watch();
        }
    });
    lane_->setReleaseHandler([hub = hub_, share = share_](std::size_t bytes) { hub->transit.remove(*share, bytes); });
}

void LinuxConnection::resume()
{
    assert(hub_->isConnectionThread());
    const foundation::Lock lock(lock_);
    epoll_event event = {};
    event.events = watchedEvents_ = EPOLLIN | EPOLLRDHUP | EPOLLET;
    event.data.ptr = this;
    isResumed_ = ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_ADD, socket_.get(), &event) == 0;
    if (!isResumed_)
        breakReason_.emplace(systemErrorText(errno));
}

LinuxConnection::Next LinuxConnection::handle(std::uint32_t events, std::size_t mostBytes)
{
    assert(hub_->isConnectionThread());
    constexpr std::uint32_t endings = EPOLLHUP | EPOLLRDHUP | EPOLLERR;
    if ((events & ~EPOLLOUT) != 0)
        mayHaveUnread_ = true;
    if ((events & endings) != 0)
        peerIsGone_ = true;
    bool reads = false;
    {
        const foundation::Lock lock(lock_);
        if ((events & EPOLLOUT) != 0)
            writeOutput();
        reads = wantsToRead();
    }
    if (reads)
        readIfThereIsRoom(mostBytes);
    answerStatusRequest();
    return settle();
}

// What is not read stays in the socket.
void LinuxConnection::readIfThereIsRoom(std::size_t mostBytes)
{
    const std::size_t room = hub_->transit.roomFor(*share_, partBytes_);
    const bool lackedRoom = std::exchange(lacksRoom_, room == 0);
    if (!lacksRoom_)
        read(std::min(mostBytes, room));
    else if (!lackedRoom)
        hub_->ledger.count(Counter::MemoryPauses);
}

// It also reads from a client that is behind but gone: the bytes left in the socket are limited, and only behind them
// does the connection find its end.
bool LinuxConnection::wantsToRead() const
{
    return mayHaveUnread_ && !breakReason_ && (peerIsGone_ || (watchedEvents_ & EPOLLIN) != 0);
}

// Ends the connection if it broke or the peer closed it; otherwise watches for what comes next. Call it after
// everything that can break the connection.
LinuxConnection::Next LinuxConnection::settle()
{
    std::optional<std::string> reason;
    {
        const foundation::Lock lock(lock_);
        if (isOver_)
            return Next::End;
        if (!breakReason_ && !peerIsDone_) {
            watch();
            const bool answers = !statusRequests_.empty() && output_.empty();
            if (answers || (wantsToRead() && !lacksRoom_))
                return Next::Turn;
            return wantsToRead() ? Next::Room : Next::Event;
        }
        reason = breakReason_; // it counts even if the peer closed at the same moment
    }
    end(std::move(reason));
    return Next::End;
}

// A read that fills less than the buffer has emptied the socket. A client that sends more than bytes can cut a read
// short; the rest is then read with what it sends next, or at its end.
void LinuxConnection::read(std::size_t mostBytes)
{
    auto& buffer = hub_->readBuffer;
    const std::size_t room = std::min(mostBytes, buffer.size());
    const ssize_t count = ::recv(socket_.get(), buffer.data(), room, MSG_DONTWAIT);
    mayHaveUnread_ = count > 0 && (peerIsGone_ || static_cast<std::size_t>(count) == room);
    if (count > 0)
        takeIn({buffer.data(), static_cast<std::size_t>(count)});
    else if (count == 0)
        endOfStream();
    else if (errno != EAGAIN && errno != EINTR)
        breakOff(std::string(systemErrorText(errno)));
}

// Behind the bytes that are left in the socket, the connection now finds its end.
void LinuxConnection::finish()
{
    assert(hub_->isConnectionThread());
    isFinishing_ = true;
    lacksRoom_ = false;
    ::shutdown(socket_.get(), SHUT_RD);
    while (settle() != Next::End)
        read(ConnectionHub::mostReadAtOnce);
}

void LinuxConnection::endOfStream()
{
    if (!input_.isInsideFrame() || isFinishing_) {
        peerIsDone_ = true;
        return;
    }
    hub_->ledger.count(Counter::FramesCutOff);
    breakOff("the stream ends inside a frame");
}

// Decodes all frames before it delivers the first call: deliveries in quick succession wake the queue only once, which
// then finds all calls.
void LinuxConnection::takeIn(std::string_view bytes)
{
    input_.feed(bytes);
    const auto decoded = decodeFrames();
    countPart();
    if (workload_ != nullptr)
        workload_->received(hub_->calls.size(), bytes.size());
    const auto delivered = deliverCalls();
    if (!delivered)
        breakOff(delivered.error().reason);
    else if (!decoded)
        breakOff(decoded.error().reason);
}

std::expected<void, Connection::Violation> LinuxConnection::decodeFrames()
{
    while (true) {
        auto frame = input_.next();
        if (!frame) {
            hub_->ledger.count(frame.error().counter);
            return std::unexpected(Violation{std::move(frame).error().reason});
        }
        if (!*frame)
            return {};
        auto& [array, size, memory] = **frame;
        if (const std::string_view request = requestName(array);
            request == emitterAccessRequest || request == statusRequest) {
            auto asked = request == statusRequest ? askForStatus(array[0], size) : askForEmitterAccess(array[0]);
            if (!asked) {
                hub_->ledger.count(Counter::FramesNotACall);
                return asked;
            }
            continue;
        }
        unanswered_.fetch_add(unansweredCall(size));
        std::shared_ptr<Connection> caller(std::make_shared<Credit>(shared_from_this(), size), this);
        hub_->bytesOfCalls += memory;
        hub_->calls.push_back({std::move(array), std::move(caller)});
    }
}

void LinuxConnection::countPart()
{
    const std::size_t before = std::exchange(partBytes_, input_.isInsideFrame() ? input_.heldBytes() : 0);
    if (partBytes_ > before)
        hub_->transit.add(*share_, partBytes_ - before);
    else if (partBytes_ < before)
        hub_->transit.remove(*share_, before - partBytes_);
    if (partBytes_ == 0)
        hub_->transit.completed(*share_);
}

std::expected<void, Connection::Violation> LinuxConnection::deliverCalls()
{
    const std::size_t held = std::exchange(hub_->bytesOfCalls, 0);
    hub_->transit.add(*share_, held);
    const CallScope scope(*this);
    std::expected<void, Violation> result;
    for (Call& call : hub_->calls) {
        result = callHandler_(std::move(call));
        if (!result)
            break;
    }
    hub_->calls.clear();
    if (lane_ != nullptr) {
        isLaneFull_ = true; // before the question, because the lane may have room again at once
        if (!lane_->isFull(held))
            isLaneFull_ = false;
    } else {
        hub_->transit.remove(*share_, held);
    }
    if (!result)
        hub_->ledger.count(Counter::FramesNotACall);
    return result;
}

// This request is not a call of the service: it concerns only the connection, and no other part of the service sees it.
// Each connection may ask once, so that no client can make the service keep many requests or descriptors.
std::expected<void, Connection::Violation> LinuxConnection::askForEmitterAccess(const foundation::Value& call)
{
    const auto number = call.exactly<std::uint64_t>();
    if (!number)
        return std::unexpected(wrongNumber);
    if (std::exchange(hasAskedForEmitterAccess_, true))
        return std::unexpected(Violation{"it asks for the trace marker twice"});
    hub_->ledger.count(Counter::CallsTrace);
    if (hub_->emitterAccess != nullptr)
        hub_->emitterAccess->ask(this,
                                 [weak = weak_from_this(), number = *number](const EmitterDescriptors& descriptors) {
                                     if (const auto self = weak.lock())
                                         self->handOver(number, descriptors);
                                 });
    return {};
}

// This answer does not wait for a turn of the server queue, because no event has to be kept for it.
void LinuxConnection::handOver(std::uint64_t call, const EmitterDescriptors& descriptors)
{
    std::string frame;
    foundation::appendCborArrayHead(2, frame);
    foundation::appendCborInteger(call, frame);
    foundation::appendCborNull(frame);
    const foundation::Lock lock(lock_);
    startOutput(frame, &descriptors);
}

// This request concerns what the service counted, so no turn of the server queue is needed for it either.
std::expected<void, Connection::Violation> LinuxConnection::askForStatus(const foundation::Value& call,
                                                                         std::size_t size)
{
    const auto number = call.exactly<std::uint64_t>();
    if (!number)
        return std::unexpected(wrongNumber);
    hub_->ledger.count(Counter::CallsStatus);
    unanswered_.fetch_add(unansweredCall(size));
    hub_->transit.add(*share_, sizeof(StatusRequest));
    awaitsStatus_ = true;
    const foundation::Lock lock(lock_);
    statusRequests_.push_back({*number, size});
    return {};
}

// Answers the oldest request, unless the socket has not taken the answers before it. The connection thread makes the
// answer without the lock.
void LinuxConnection::answerStatusRequest()
{
    if (!awaitsStatus_)
        return;
    StatusRequest request = {};
    {
        const foundation::Lock lock(lock_);
        if (statusRequests_.empty() || !output_.empty())
            return;
        request = statusRequests_.front();
        statusRequests_.pop_front();
        awaitsStatus_ = !statusRequests_.empty();
    }
    std::string frame;
    foundation::appendCborArrayHead(3, frame);
    foundation::appendCborInteger(request.call, frame);
    foundation::appendCborNull(frame);
    foundation::appendCbor(hub_->status(mayKnowWhatOthersDid()), frame);
    {
        const foundation::Lock lock(lock_);
        startOutput(frame, nullptr);
    }
    hub_->transit.remove(*share_, sizeof(StatusRequest));
    returnCredit(request.size);
}

bool LinuxConnection::mayKnowWhatOthersDid() const
{
    return isTrusted(peer_.userIdentifier, groupsOfPeer(socket_.get(), peer_.groupIdentifier), ::geteuid(),
                     ::getegid());
}

// Sends a frame outside any turn.
void LinuxConnection::startOutput(std::string_view frame, const EmitterDescriptors* descriptors)
{
    if (isOver_ || breakReason_ || cannotSend_)
        return;
    std::string whole;
    appendFrame(frame, whole);
    unsentBytes_ += whole.size();
    hub_->transit.add(*share_, whole.size());
    if (descriptors != nullptr)
        output_.append(std::move(whole), *descriptors);
    else
        output_.append(std::move(whole));
    writeOutput();
}

void LinuxConnection::returnCredit(std::size_t bytes)
{
    const std::uint64_t before = unanswered_.fetch_sub(unansweredCall(bytes));
    if (!areTooManyUnanswered(before) || areTooManyUnanswered(before - unansweredCall(bytes)))
        return;
    const foundation::Lock lock(lock_);
    watch();
}

void LinuxConnection::send(Turn& turn, std::string frame)
{
    const std::size_t size = frameHeadSize + frame.size();
    const std::size_t unsent = unsentBytes_.fetch_add(size) + size;
    if (!hasGivenUp_ && hub_->transit.add(*share_, size))
        makeRoom();
    if (hasGivenUp_)
        return drop(size);
    if (frame.size() > longestFrame)
        breakOff("an answer is longer than a frame may be");
    else if (unsent > mostUnsentBytes)
        breakOff("it does not read its answers");
    else
        return appendFrame(frame, turn.letters.to(*this));
    drop(size);
}

void LinuxConnection::write(std::string frames)
{
    const foundation::Lock lock(lock_);
    if (isOver_ || breakReason_ || cannotSend_) {
        drop(frames.size());
        watch(); // it is less behind now, so reading may go on
    } else if (!output_.empty()) { // the socket is full: the connection thread goes on when there is room
        output_.append(std::move(frames));
        watch();
    } else {
        output_.append(std::move(frames));
        writeOutput();
    }
}

void LinuxConnection::writeOutput()
{
    if (isOver_ || output_.empty())
        return;
    if (const auto taken = output_.writeTo(socket_.get())) {
        noLongerUnsent(*taken);
    } else { // reading goes on, because earlier bytes of the peer are still there
        cannotSend_ = true;
        drop(output_.drop());
    }
    watch();
}

void LinuxConnection::drop(std::size_t bytes)
{
    if (bytes == 0)
        return;
    noLongerUnsent(bytes);
    droppedBytes_ += bytes;
    hub_->ledger.count(Counter::AnswerBytesDropped, bytes);
}

void LinuxConnection::noLongerUnsent(std::size_t bytes)
{
    unsentBytes_ -= bytes;
    if (!hasGivenUp_)
        hub_->transit.remove(*share_, bytes);
}

// The connection that leaves the most answers unread, of one user or of all, or null. Those that have given up free
// their memory soon.
std::shared_ptr<LinuxConnection> LinuxConnection::largestDebtor(ConnectionHub& hub, const TransitMemory::User* of)
{
    std::shared_ptr<LinuxConnection> largest;
    const foundation::Lock lock(hub.connectionsLock);
    for (const auto& [identity, weak] : hub.connections) {
        const auto each = weak.lock();
        const bool isCandidate = each && !each->hasGivenUp_ && (of == nullptr || each->share_->user.get() == of);
        if (isCandidate && each->unsentBytes_ > (largest ? largest->unsentBytes_.load() : 0))
            largest = each;
    }
    return largest;
}

// Ends connections until the limits hold. Only the thread that runs the turn adds answers and makes room.
void LinuxConnection::makeRoom()
{
    using enum TransitMemory::Excess;
    for (auto excess = hub_->transit.excess(*share_); excess != None; excess = hub_->transit.excess(*share_)) {
        const auto debtor = excess == OfTheClient
            ? shared_from_this()
            : largestDebtor(*hub_, excess == OfTheUser ? share_->user.get() : hub_->transit.largestUser().get());
        if (!debtor || debtor->hasGivenUp_)
            return;
        debtor->giveUp();
    }
}

// Its answers will be dropped, and count no longer.
void LinuxConnection::giveUp()
{
    const foundation::Lock lock(lock_);
    hub_->transit.remove(*share_, unsentBytes_);
    hasGivenUp_ = true;
    breakOffLocked("it does not read its answers, and memory is short");
    drop(output_.drop());
}

bool LinuxConnection::isBehind() const noexcept
{
    return areTooManyUnanswered(unanswered_) || unsentBytes_ > manyUnsentBytes;
}

// Makes epoll watch the socket for what the connection can do now. Every function calls it after a change of what it
// reads; so the last call sees all changes.
void LinuxConnection::watch()
{
    if (!isResumed_ || isOver_)
        return;
    const bool behind = isBehind();
    epoll_event event = {};
    event.events = EPOLLRDHUP | EPOLLET;
    if (!behind && !isLaneFull_)
        event.events |= EPOLLIN;
    if (!output_.empty() || !statusRequests_.empty())
        event.events |= EPOLLOUT;
    if (event.events == watchedEvents_)
        return;
    if (behind && (watchedEvents_ & EPOLLIN) != 0) {
        ++readingPauses_;
        hub_->ledger.count(Counter::ReadingPauses);
    }
    watchedEvents_ = event.events;
    event.data.ptr = this;
    ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_MOD, socket_.get(), &event);
}

// Marks the connection as broken, and shuts it down. This wakes the connection thread, which ends it.
void LinuxConnection::breakOff(std::string reason)
{
    const foundation::Lock lock(lock_);
    breakOffLocked(std::move(reason));
}

void LinuxConnection::breakOffLocked(std::string reason)
{
    if (isOver_ || breakReason_)
        return;
    breakReason_ = std::move(reason);
    ::shutdown(socket_.get(), SHUT_RDWR);
}

// The end is carried out when all items of the lane have run.
void LinuxConnection::countUnfinishedEnd()
{
    if (lane_ == nullptr)
        return;
    const Submitter process{.user = peer_.userIdentifier, .process = peer_.processIdentifier};
    hub_->unfinishedEnds.add(process);
    lane_->submit([hub = hub_, process](Turn&) { hub->unfinishedEnds.remove(process); });
}

void LinuxConnection::end(std::optional<std::string> interruptedBecause)
{
    assert(hub_->isConnectionThread());
    const LogShare::Writing aboutConnection(logShare_.get(), LogShare::About::Connections);
    std::uint64_t readingPauses = 0;
    {
        const foundation::Lock lock(lock_);
        if (isOver_)
            return;
        isOver_ = true;
        hub_->transit.remove(*share_, statusRequests_.size() * sizeof(StatusRequest));
        statusRequests_.clear();
        drop(output_.drop());
        readingPauses = readingPauses_;
        if (isResumed_) // closing is not enough while a child process holds a copy
            ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_DEL, socket_.get(), nullptr);
        socket_ = FileDescriptor();
    }
    hub_->transit.remove(*share_, std::exchange(partBytes_, 0));
    hub_->transit.completed(*share_);
    {
        const foundation::Lock lock(hub_->connectionsLock);
        hub_->connections.erase(this);
    }
    if (hasAskedForEmitterAccess_ && hub_->emitterAccess != nullptr)
        hub_->emitterAccess->forget(this);
    if (readingPauses != 0 || droppedBytes_ != 0)
        KESTO_LOG(hub_->log, Default, "{} was behind: reading paused {} times, {} bytes of answers were dropped",
                  description(), readingPauses, droppedBytes_.load());
    hub_->ledger.count(interruptedBecause ? Counter::ConnectionsInterrupted : Counter::ConnectionsEnded);
    if (interruptedBecause) {
        KESTO_LOG(hub_->log, Default, "{} ends: {}", description(), *interruptedBecause);
        if (interruptionHandler_)
            interruptionHandler_();
    }
    if (invalidationHandler_)
        invalidationHandler_();
    countUnfinishedEnd();
    // Only after both calls: the call handler owns what they end, and every handler may own the connection.
    callHandler_ = nullptr;
    interruptionHandler_ = nullptr;
    invalidationHandler_ = nullptr;
}

} // namespace platform
