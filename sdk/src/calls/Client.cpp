// SPDX-License-Identifier: Apache-2.0
// The checks before a message is taken, and the order in which a client ends.
#include "calls/Client.h"

#include "SignalFreeThread.h"
#include "client/ServiceOperations.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <string>
#include <system_error>
#include <unistd.h>

namespace {

std::string_view bytesOf(std::span<const kesto_reporter> reporters) noexcept
{
    return {reinterpret_cast<const char*>(reporters.data()), reporters.size_bytes()};
}

} // namespace

std::unique_ptr<kesto_client> kesto_client::create(Settings settings)
{
    platform::FileDescriptor doorbell = libkesto::Doorbell::makeDescriptor();
    if (!doorbell)
        return nullptr;
    return std::unique_ptr<kesto_client>(new kesto_client(std::move(settings), std::move(doorbell)));
}

kesto_client::kesto_client(Settings settings, platform::FileDescriptor doorbell)
    : stampsMessages_(settings.stampsMessages),
      reconnects_(settings.reconnect),
      process_(::getpid()),
      mailbox_(settings.queueBytes, std::move(doorbell)),
      courier_(std::move(settings), mailbox_, streams_, flushes_, counters_)
{
}

bool kesto_client::start() noexcept
{
    const foundation::Lock lock(joining_);
    return libkesto::startThread(thread_, [this] { run(); });
}

void kesto_client::run() noexcept
{
    self_.store(pthread_self());
    pthread_setname_np(pthread_self(), "libkesto");
    courier_.run();
    if (freesItself_)
        drop();
}

// Deletes the client when the last holder has gone.
void kesto_client::drop() noexcept
{
    if (holders_.fetch_sub(1) == 1)
        delete this;
}

void kesto_client::free(kesto_client* client) noexcept
{
    // In a forked child the parent's thread does not exist, and its work may be half done: nothing can be destroyed
    // safely.
    if (client->process_ != ::getpid())
        return;
    client->isClosing_.store(true);
    if (!client->isOwnThread()) {
        static_cast<void>(client->close(std::chrono::milliseconds(0)));
        client->courier_.answerLateCalls();
        return client->drop();
    }
    client->stopStreams();
    client->freesItself_ = true;
    client->courier_.stop();
    const foundation::Lock lock(client->joining_);
    client->thread_.detach();
}

kesto_status kesto_client::refusal() const noexcept
{
    if (isClosing_.load(std::memory_order_relaxed))
        return KESTO_CLOSED;
    switch (courier_.state()) {
    case KESTO_STATE_CONNECTING:
    case KESTO_STATE_CONNECTED: return KESTO_OK;
    case KESTO_STATE_DISCONNECTED: return KESTO_NOT_CONNECTED;
    case KESTO_STATE_CLOSED: break;
    }
    return KESTO_CLOSED;
}

kesto_status kesto_client::call(CallHead head) noexcept
{
    libkesto::Callback callback(head.callback); // released here unless it is handed over
    if (const kesto_status status = refusal(); status != KESTO_OK)
        return status;
    if (courier_.isReportingState() && isOwnThread()) {
        if (const kesto_status status = courier_.putFirst(head); status != KESTO_OK)
            return status;
    } else if (!mailbox_.putCall(head)) {
        return KESTO_QUEUE_FULL;
    }
    callback.handOver();
    return KESTO_OK;
}

kesto_status kesto_client::setConfiguration(const libkesto::MessageEncoder& configuration, CallHead head) noexcept
{
    libkesto::Callback callback(head.callback);
    if (const kesto_status status = configuration.status(); status != KESTO_OK)
        return status;
    std::unique_ptr<std::string> entries;
    try {
        entries = std::make_unique<std::string>(configuration.entries());
    } catch (const std::bad_alloc&) {
        return KESTO_OUT_OF_MEMORY;
    }
    head.entryCount = configuration.entryCount();
    head.entries = entries.get();
    callback.handOver(); // to `call`
    const kesto_status status = call(head);
    if (status == KESTO_OK)
        static_cast<void>(entries.release());
    return status;
}

// Whether the message fits in the queue, and in a frame that the service accepts.
bool kesto_client::fits(std::size_t entryBytes, std::size_t reporterCount) const noexcept
{
    const std::size_t most = std::min(mailbox_.largestRecord(), platform::longestFrame);
    return reporterCount <= client::mostReportersOfAMessage
        && entryBytes + libkesto::frameOverhead(reporterCount) + libkesto::Stamps::longest + sizeof(CallHead) <= most;
}

kesto_status kesto_client::send(const libkesto::MessageEncoder& message, CallHead head,
                                std::span<const kesto_reporter> reporters) noexcept
{
    libkesto::Callback callback(head.callback);
    kesto_status status = message.status();
    if (status == KESTO_OK && !fits(message.entries().size(), reporters.size()))
        status = KESTO_TOO_LARGE;
    if (status != KESTO_OK) {
        ++counters_.droppedUnusable;
        return status;
    }
    if (status = refusal(); status != KESTO_OK) {
        ++counters_.droppedNotConnected;
        return status;
    }
    const libkesto::Stamps stamps =
        stampsMessages_ ? message.missingStamps(libkesto::currentMoment()) : libkesto::Stamps();
    head.entryCount = message.entryCount() + stamps.entryCount();
    head.reporterCount = static_cast<std::uint32_t>(reporters.size());
    if (courier_.isReportingState() && isOwnThread())
        status = courier_.putFirst(head, bytesOf(reporters), message.entries(), stamps.entries());
    else if (!mailbox_.putMessage(head, bytesOf(reporters), message.entries(), stamps.entries()))
        status = KESTO_QUEUE_FULL;
    if (status != KESTO_OK) {
        ++counters_.droppedQueueFull;
        return status;
    }
    ++counters_.queued;
    callback.handOver();
    return KESTO_OK;
}

kesto_status kesto_client::refusalOfStreams() const noexcept
{
    const kesto_status status = refusal();
    return status == KESTO_NOT_CONNECTED && reconnects_ ? KESTO_OK : status; // a later connection gets the state
}

libkesto::Stream& kesto_client::createStream(libkesto::Direction direction, std::string_view application,
                                             kesto_service_type type)
{
    libkesto::Stream& stream = streams_.create(direction, application, type);
    ++holders_;
    return stream;
}

void kesto_client::freeStream(const libkesto::Stream& stream) noexcept
{
    if (process_ != ::getpid())
        return;
    const libkesto::Moment now = libkesto::currentMoment();
    if (refusalOfStreams() == KESTO_OK) // in its place among the calls, so that a flush waits for it
        static_cast<void>(putStamped({.stream = const_cast<libkesto::Stream*>(&stream)}, {}, {}));
    streams_.free(stream, mailbox_.writePosition(), now);
    mailbox_.ring();
    drop();
}

// All of them. Without room for the record they end with the connection.
void kesto_client::stopStreams() noexcept
{
    if (state() != KESTO_STATE_CLOSED)
        static_cast<void>(putStamped({.stream = nullptr}, {}, {}));
}

kesto_status kesto_client::putStreamRecord(libkesto::StreamRecord record, std::string_view device,
                                           std::string_view encoding) noexcept
{
    if (const kesto_status status = refusalOfStreams(); status != KESTO_OK) {
        ++counters_.droppedNotConnected;
        return status;
    }
    if (!putStamped(record, device, encoding)) {
        ++counters_.droppedQueueFull;
        return KESTO_QUEUE_FULL;
    }
    return KESTO_OK;
}

// False if the queue has no room.
bool kesto_client::putStamped(libkesto::StreamRecord record, std::string_view device,
                              std::string_view encoding) noexcept
{
    using enum libkesto::StreamAction;
    record.when = libkesto::currentMoment();
    const bool decidesPlayTime =
        record.action == Start || record.action == Stop || record.action == Pause || record.action == Resume;
    const kesto_operation operation = record.action == Start ? libkesto::streamStart : libkesto::streamOperation;
    return mailbox_.putStreamRecord(operation, bytesOf(record), device, encoding, decidesPlayTime);
}

kesto_status kesto_client::waitForAnswers(std::chrono::milliseconds timeout) noexcept
{
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    try {
        return flushes_.wait(mailbox_.writePosition(), deadline, [this] { mailbox_.ring(); });
    } catch (const std::bad_alloc&) {
        return KESTO_OUT_OF_MEMORY;
    }
}

kesto_status kesto_client::flush(std::chrono::milliseconds timeout) noexcept
{
    return isOwnThread() ? KESTO_WRONG_THREAD : waitForAnswers(timeout);
}

kesto_status kesto_client::close(std::chrono::milliseconds timeout) noexcept
{
    if (isOwnThread())
        return KESTO_WRONG_THREAD;
    isClosing_.store(true);
    kesto_status status = KESTO_OK;
    stopStreams();
    if (timeout.count() > 0 && state() != KESTO_STATE_CLOSED)
        status = waitForAnswers(timeout);
    courier_.stop();
    const foundation::Lock lock(joining_);
    if (thread_.joinable())
        thread_.join();
    return status;
}
