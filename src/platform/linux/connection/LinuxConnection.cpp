// One lock a connection, for what it has to write and for how it ends; what only the connection thread touches needs
// none.
#include "platform/linux/connection/LinuxConnection.h"

#include "foundation/cbor/Cbor.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/SystemError.h"

#include <cassert>
#include <cerrno>
#include <fmt/format.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <utility>

namespace platform {
namespace {

// Both counts in one number, so that exactly one thread sees them fall below the limits.
constexpr std::uint64_t unansweredCall(std::size_t bytes) noexcept
{
    return std::uint64_t{1} << 32 | bytes;
}

// The one request beside the calls of the service's operations.
bool asksForTraceMarker(const foundation::Array& frame)
{
    if (frame.size() != 2)
        return false;
    const auto method = frame[1].string();
    return method && method->view() == "trace";
}

constexpr bool areTooManyUnanswered(std::uint64_t unanswered) noexcept
{
    return unanswered >> 32 > LinuxConnection::mostUnansweredCalls
        || (unanswered & 0xFFFFFFFF) > LinuxConnection::mostUnansweredBytes;
}

} // namespace

// What a call holds until it is answered.
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
      socket_(std::move(socket))
{
}

std::string LinuxConnection::description() const
{
    return fmt::format("connection of process {} (user {})", peer_.processIdentifier, peer_.userIdentifier);
}

void LinuxConnection::resume()
{
    assert(hub_->isConnectionThread());
    const foundation::Lock lock(lock_);
    epoll_event event = {};
    event.events = watchedEvents_ = EPOLLIN | EPOLLRDHUP;
    event.data.ptr = this;
    isResumed_ = ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_ADD, socket_.get(), &event) == 0;
    if (!isResumed_)
        breakReason_.emplace(systemErrorText(errno));
}

bool LinuxConnection::handle(std::uint32_t events)
{
    assert(hub_->isConnectionThread());
    constexpr std::uint32_t endings = EPOLLHUP | EPOLLRDHUP | EPOLLERR;
    if ((events & EPOLLOUT) != 0) {
        const foundation::Lock lock(lock_);
        writeOutput();
    }
    if ((events & ~EPOLLOUT) != 0 && ((events & endings) == 0 || !isBrokenOff()))
        read();
    return settle();
}

bool LinuxConnection::isBrokenOff()
{
    const foundation::Lock lock(lock_);
    return breakReason_.has_value();
}

// After all that may have happened: ends the connection if it broke, else waits for what comes next. Whether it
// goes on.
bool LinuxConnection::settle()
{
    std::optional<std::string> reason;
    {
        const foundation::Lock lock(lock_);
        if (isOver_)
            return false;
        if (!breakReason_ && !peerIsDone_) {
            watch();
            return true;
        }
        reason = breakReason_; // which counts also when the peer closed at the same moment
    }
    end(std::move(reason));
    return false;
}

// One read, so that every client gets its turn. It happens also when the client is behind but gone: what it
// left in the socket has an end, and the connection would otherwise never get to see it.
void LinuxConnection::read()
{
    auto& buffer = hub_->readBuffer;
    const ssize_t count = ::recv(socket_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (count > 0)
        takeIn({buffer.data(), static_cast<std::size_t>(count)});
    else if (count == 0)
        endOfStream();
    else if (errno != EAGAIN && errno != EINTR)
        breakOff(std::string(systemErrorText(errno)));
}

void LinuxConnection::endOfStream()
{
    if (input_.isInsideFrame())
        breakOff("the stream ends inside a frame");
    else
        peerIsDone_ = true;
}

// Everything is decoded before anything is delivered: delivering alone is so quick that the queue which the
// calls go to wakes up once and finds them all.
void LinuxConnection::takeIn(std::string_view bytes)
{
    input_.feed(bytes);
    const auto decoded = decodeFrames();
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
        if (!frame)
            return std::unexpected(std::move(frame).error());
        if (!*frame)
            return {};
        auto& [array, size] = **frame;
        if (asksForTraceMarker(array)) {
            if (auto asked = askForTraceMarker(array[0]); !asked)
                return asked;
            continue;
        }
        unanswered_.fetch_add(unansweredCall(size));
        std::shared_ptr<Connection> caller(std::make_shared<Credit>(shared_from_this(), size), this);
        hub_->calls.push_back({std::move(array), std::move(caller)});
    }
}

std::expected<void, Connection::Violation> LinuxConnection::deliverCalls()
{
    const CallScope scope(*this);
    std::expected<void, Violation> result;
    for (Call& call : hub_->calls) {
        result = callHandler_(std::move(call));
        if (!result)
            break;
    }
    hub_->calls.clear();
    return result;
}

// Not one of the service's calls: it is about the connection's own means, and no other part of the service learns of
// it. Once a connection, so that nobody can have the service keep requests or descriptors in any number.
std::expected<void, Connection::Violation> LinuxConnection::askForTraceMarker(const foundation::Value& call)
{
    const auto number = call.exactly<std::uint64_t>();
    if (!number)
        return std::unexpected(Violation{"a call's number is an unsigned 64-bit integer"});
    if (std::exchange(hasAskedForTraceMarker_, true))
        return std::unexpected(Violation{"it asks for the trace marker twice"});
    if (hub_->emitterAccess != nullptr)
        hub_->emitterAccess->ask(this,
                                 [weak = weak_from_this(), number = *number](const EmitterDescriptors& descriptors) {
                                     if (const auto self = weak.lock())
                                         self->handOver(number, descriptors);
                                 });
    return {};
}

// Ahead of what a turn of the server queue holds back: nothing is kept for this answer.
void LinuxConnection::handOver(std::uint64_t call, const EmitterDescriptors& descriptors)
{
    std::string frame;
    foundation::appendCborArrayHead(2, frame);
    foundation::appendCborInteger(call, frame);
    foundation::appendCborNull(frame);
    const foundation::Lock lock(lock_);
    if (isOver_ || breakReason_ || cannotSend_)
        return;
    std::string whole;
    appendFrame(frame, whole);
    unsentBytes_ += whole.size();
    output_.append(std::move(whole), descriptors);
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
        watch(); // it is less behind now, and may still be read from
    } else if (!output_.empty()) { // the socket has no room: the connection thread goes on when it has
        output_.append(std::move(frames));
        watch();
    } else {
        output_.append(std::move(frames));
        writeOutput();
    }
}

// Gives the socket what it takes.
void LinuxConnection::writeOutput()
{
    if (isOver_ || output_.empty())
        return;
    if (const auto taken = output_.writeTo(socket_.get())) {
        unsentBytes_ -= *taken;
    } else { // reading goes on: what the peer sent before is still there
        cannotSend_ = true;
        drop(output_.drop());
    }
    watch();
}

void LinuxConnection::drop(std::size_t bytes)
{
    unsentBytes_ -= bytes;
    droppedBytes_ += bytes;
    hub_->counters.droppedBytes += bytes;
}

bool LinuxConnection::isBehind() const noexcept
{
    return areTooManyUnanswered(unanswered_) || unsentBytes_ > manyUnsentBytes;
}

// Has the socket watched for what can be done with it now. Everyone who changes what it depends on calls it
// afterwards; whoever comes last sees all changes.
void LinuxConnection::watch()
{
    if (!isResumed_ || isOver_)
        return;
    epoll_event event = {};
    event.events = EPOLLRDHUP;
    if (!isBehind())
        event.events |= EPOLLIN;
    if (!output_.empty())
        event.events |= EPOLLOUT;
    if (event.events == watchedEvents_)
        return;
    if ((watchedEvents_ & ~event.events & EPOLLIN) != 0) {
        ++readingPauses_;
        ++hub_->counters.readingPauses;
    }
    watchedEvents_ = event.events;
    event.data.ptr = this;
    ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_MOD, socket_.get(), &event);
}

// Marks the connection as broken. The connection thread ends it, woken by the shutdown.
void LinuxConnection::breakOff(std::string reason)
{
    const foundation::Lock lock(lock_);
    if (isOver_ || breakReason_)
        return;
    breakReason_ = std::move(reason);
    ::shutdown(socket_.get(), SHUT_RDWR);
}

void LinuxConnection::end(std::optional<std::string> interruptedBecause)
{
    assert(hub_->isConnectionThread());
    std::uint64_t readingPauses = 0;
    {
        const foundation::Lock lock(lock_);
        if (isOver_)
            return;
        isOver_ = true;
        drop(output_.drop());
        readingPauses = readingPauses_;
        if (isResumed_) // closing does not suffice when a child process happens to hold a copy
            ::epoll_ctl(hub_->epoll.get(), EPOLL_CTL_DEL, socket_.get(), nullptr);
        socket_ = FileDescriptor();
    }
    if (hasAskedForTraceMarker_ && hub_->emitterAccess != nullptr)
        hub_->emitterAccess->forget(this);
    if (readingPauses != 0 || droppedBytes_ != 0)
        KESTO_LOG(hub_->log, Default, "{} was behind: reading paused {} times, {} bytes of answers were dropped",
                  description(), readingPauses, droppedBytes_.load());
    if (interruptedBecause) {
        ++hub_->counters.interrupted;
        KESTO_LOG(hub_->log, Default, "{} ends: {}", description(), *interruptedBecause);
        if (interruptionHandler_)
            interruptionHandler_();
    }
    if (invalidationHandler_)
        invalidationHandler_();
    // Only now: the call handler holds what the other two end, and all of them may hold the connection.
    callHandler_ = nullptr;
    interruptionHandler_ = nullptr;
    invalidationHandler_ = nullptr;
}

} // namespace platform
