// SPDX-License-Identifier: Apache-2.0
// One loop: it takes the callers' calls, sends them, sleeps, and hands out the answers.
#include "calls/Courier.h"

#include <algorithm>
#include <array>
#include <limits>
#include <memory>
#include <new>
#include <poll.h>

namespace libkesto {
namespace {

constexpr Courier::Milliseconds forever{-1}; // as in poll
constexpr std::uint64_t traceRequest = 0; // the number of this request; numbers of calls begin with 1

// The record of a stream behind the head that all records have.
std::string_view streamRecordOf(std::string_view record) noexcept
{
    return record.substr(sizeof(CallHead));
}

} // namespace

Courier::Courier(ClientSettings settings, Mailbox& mailbox, Streams& streams, Flushes& flushes, Counters& counters)
    : settings_(std::move(settings)),
      mailbox_(mailbox),
      streams_(streams),
      flushes_(flushes),
      counters_(counters),
      connection_(counters),
      calls_(counters),
      retryPause_(settings_.firstRetry)
{
}

void Courier::stop() noexcept
{
    isStopping_.store(true);
    mailbox_.ring();
}

void Courier::run() noexcept
{
    while (!isStopping_.load()) {
        try {
            step();
        } catch (const std::bad_alloc&) { // the call at fault is still in the mailbox, or in the table
            disconnect({KESTO_OUT_OF_MEMORY});
        }
    }
    sendTheRest();
    close();
    state_.store(KESTO_STATE_CLOSED);
    calls_.endAll(KESTO_CLOSED);
    loseWaitingCalls(KESTO_CLOSED);
    streams_.close();
    changeState(KESTO_STATE_CLOSED);
    flushes_.close();
}

// What was taken before the end goes out as far as the socket takes it without waiting: often it is the stop of what
// the program has just stopped to play.
void Courier::sendTheRest() noexcept
try {
    if (state_.load() != KESTO_STATE_CONNECTED)
        return;
    takeCalls();
    static_cast<void>(connection_.send());
} catch (const std::bad_alloc&) {
    return; // it is lost, as what does not fit into the socket
}

void Courier::step()
{
    switch (state_.load()) {
    case KESTO_STATE_CONNECTING: return connect();
    case KESTO_STATE_CONNECTED: return exchange();
    default: return pauseBeforeRetry();
    }
}

void Courier::connect()
{
    if (const auto opened = connection_.open(settings_.paths); !opened)
        return disconnect(opened.error());
    ++counters_.connections;
    retryPause_ = settings_.firstRetry;
    if (settings_.emitter)
        connection_.appendTraceRequest(traceRequest);
    streams_.renewSessions(*this);
    changeState(KESTO_STATE_CONNECTED);
}

void Courier::close() noexcept
{
    connection_.close();
    if (settings_.emitter)
        settings_.emitter->detach(); // the descriptors came from a service that is gone
}

void Courier::disconnect(ConnectionFailure failure)
{
    close();
    retryAt_.reset();
    if (settings_.reconnect) {
        retryAt_ = Clock::now() + retryPause_;
        retryPause_ = std::min(retryPause_ * 2, settings_.longestRetry);
    }
    state_.store(KESTO_STATE_DISCONNECTED); // from now on calls are refused
    startedReporters_.clear();
    calls_.endAll(KESTO_CONNECTION_LOST);
    loseWaitingCalls(KESTO_CONNECTION_LOST);
    flushes_.endAll(KESTO_CONNECTION_LOST);
    changeState(KESTO_STATE_DISCONNECTED, failure);
}

void Courier::pauseBeforeRetry()
{
    loseWaitingCalls(KESTO_CONNECTION_LOST); // calls that were made during the change
    flushes_.endAll(KESTO_NOT_CONNECTED);
    static_cast<void>(wait());
    if (!retryAt_ || Clock::now() < *retryAt_)
        return;
    loseWaitingCalls(KESTO_CONNECTION_LOST); // so that new sessions begin with what streams have done until now
    changeState(KESTO_STATE_CONNECTING);
}

void Courier::exchange()
{
    takeCalls();
    if (const auto sent = connection_.send(); !sent) {
        while (receive().value_or(0) > 0) { } // answers that the service sent before it went
        return disconnect(sent.error());
    }
    flushes_.serve(mailbox_.readPosition(), lastCall_, calls_);
    if (!wait())
        return;
    if (const auto received = receive(); !received)
        disconnect(received.error());
}

std::expected<std::size_t, ConnectionFailure> Courier::receive()
{
    return connection_.receive([this](std::string_view frame) {
        const auto answer = readAnswer(frame, decoder_);
        return answer && take(*answer);
    });
}

bool Courier::take(const AnswerFrame& answer)
{
    if (answer.call != traceRequest || !settings_.emitter)
        return calls_.answer(answer);
    ReceivedDescriptors descriptors = connection_.takeDescriptors();
    return !descriptors[0] || settings_.emitter->attach(std::move(descriptors)); // without them, it may not trace
}

bool Courier::canTakeCalls() const noexcept
{
    return connection_.unsentBytes() < mostUnsentBytes && calls_.unanswered() < settings_.unansweredLimit;
}

// A call leaves the mailbox only when the table has it. So a failure in between loses no call, and the library answers
// each call exactly once.
void Courier::takeCalls()
{
    while (canTakeCalls()) {
        const auto record = nextRecord();
        if (!record)
            break;
        takeRecord(*record);
        popRecord();
        pause_ = shortestPause;
    }
    streams_.letGo(mailbox_.readPosition(), this);
}

void Courier::takeRecord(std::string_view record)
{
    if (isOfStream(readHead(record).operation))
        return streams_.follow(streamRecordOf(record), this);
    readCall(record, call_);
    putOnTheWay(call_);
    delete call_.head.entries;
}

void Courier::takeCall(const Call& call)
{
    putOnTheWay(call);
    if (call.head.operation == KESTO_OPERATION_SEND)
        ++counters_.queued;
}

void Courier::putOnTheWay(const Call& call)
{
    connection_.append(lastCall_ + 1, call);
    rememberWhetherStarted(call.head);
    calls_.add(lastCall_ + 1, call.head);
    ++lastCall_;
}

std::optional<std::string_view> Courier::nextRecord() noexcept
{
    return firstCalls_.empty() ? mailbox_.front() : firstCalls_.front();
}

void Courier::popRecord() noexcept
{
    if (firstCalls_.empty())
        return mailbox_.popFront();
    firstCallsBytes_ -= firstCalls_.front().size();
    firstCalls_.pop_front();
}

kesto_status Courier::putFirst(const CallHead& head, std::string_view reporters, std::string_view entries,
                               std::string_view stamps) noexcept
{
    const std::size_t size = sizeof head + reporters.size() + entries.size() + stamps.size();
    if (firstCallsBytes_ + size > settings_.queueBytes)
        return KESTO_QUEUE_FULL;
    try {
        std::string record(bytesOf(head));
        record.append(reporters).append(entries).append(stamps);
        firstCalls_.push_back(std::move(record));
    } catch (const std::bad_alloc&) {
        return KESTO_OUT_OF_MEMORY;
    }
    firstCallsBytes_ += size;
    return KESTO_OK;
}

void Courier::rememberWhetherStarted(const CallHead& head)
{
    switch (head.operation) {
    case KESTO_OPERATION_START_SESSION: startedReporters_.insert(head.reporter); break;
    case KESTO_OPERATION_CREATE_SESSION:
    case KESTO_OPERATION_STOP_SESSION:
    case KESTO_OPERATION_DESTROY_SESSION: startedReporters_.erase(head.reporter); break;
    default: break;
    }
}

void Courier::loseWaitingCalls(kesto_status status) noexcept
{
    while (const auto record = nextRecord()) {
        const CallHead head = readHead(*record);
        if (isOfStream(head.operation)) {
            if (state_.load() != KESTO_STATE_CLOSED) // afterwards its stream may have gone
                streams_.follow(streamRecordOf(*record), nullptr);
            popRecord();
            continue;
        }
        const std::unique_ptr<std::string> entries(head.entries);
        popRecord();
        if (head.operation == KESTO_OPERATION_SEND)
            ++counters_.lost;
        answerWithError(++lastCall_, head.operation, head.reporter, Callback(head.callback), status);
    }
    streams_.letGo(mailbox_.readPosition(), nullptr);
}

bool Courier::looksByItself() const noexcept
{
    if (settings_.wakeOnSend)
        return false;
    return !startedReporters_.empty() || calls_.unanswered() > 0 || (settings_.reconnect && streams_.isAnyStarted());
}

// How long to sleep. If messages must ring to wake the thread, it first tells callers so.
Courier::Milliseconds Courier::longestWait() noexcept
{
    if (!canTakeCalls())
        return forever; // the service must act first, and then the socket wakes the thread
    if (nextRecord())
        return Milliseconds(0);
    // If the mailbox does not let it sleep, a call is just being put in, and will be there in a moment.
    Milliseconds wait = looksByItself() ? pause_ : mailbox_.fallAsleep() ? forever : shortestPause;
    if (retryAt_ && state_.load() == KESTO_STATE_DISCONNECTED) {
        const auto untilRetry = std::chrono::ceil<Milliseconds>(*retryAt_ - Clock::now());
        wait = std::max(Milliseconds(0), wait == forever ? untilRetry : std::min(wait, untilRetry));
    }
    return wait;
}

// Waits until there is something to do. True if the socket has something to read.
bool Courier::wait()
{
    const short writing = connection_.unsentBytes() > 0 ? POLLOUT : 0;
    std::array<pollfd, 2> watched{
        {{mailbox_.doorbell(), POLLIN, 0}, {connection_.descriptor(), static_cast<short>(POLLIN | writing), 0}}};
    constexpr std::int64_t most = std::numeric_limits<int>::max();
    const auto timeout = static_cast<int>(std::min<std::int64_t>(longestWait().count(), most));
    const int ready = ::poll(watched.data(), watched.size(), timeout);
    mailbox_.wakeUp((watched[0].revents & POLLIN) != 0);
    if (ready == 0)
        pause_ = std::min(pause_ * 2, longestPause);
    return (watched[1].revents & (POLLIN | POLLHUP | POLLERR)) != 0;
}

void Courier::changeState(kesto_state state, ConnectionFailure failure)
{
    state_.store(state);
    std::uint32_t retryAfter = std::numeric_limits<std::uint32_t>::max();
    if (state == KESTO_STATE_DISCONNECTED && retryAt_) {
        const auto until = std::chrono::ceil<Milliseconds>(*retryAt_ - Clock::now());
        retryAfter = static_cast<std::uint32_t>(std::max<std::int64_t>(0, until.count()));
    }
    isReportingState_.store(true, std::memory_order_relaxed);
    settings_.stateChanged({state, failure.reason, failure.systemError, retryAfter, connection_.path().c_str()});
    isReportingState_.store(false, std::memory_order_relaxed);
}

} // namespace libkesto
