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
    : process_(::getpid()),
      mailbox_(settings.queueBytes, std::move(doorbell)),
      courier_(std::move(settings), mailbox_, flushes_, counters_)
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
        delete this;
}

void kesto_client::free(std::unique_ptr<kesto_client> client) noexcept
{
    if (client->process_ != ::getpid()) {
        // The parent's thread does not exist here, and its work may be half done: nothing can be destroyed safely.
        static_cast<void>(client.release());
        return;
    }
    client->isClosing_.store(true);
    if (!client->isOwnThread()) {
        static_cast<void>(client->close(std::chrono::milliseconds(0)));
        return;
    }
    client->freesItself_ = true;
    client->courier_.stop();
    const foundation::Lock lock(client->joining_);
    client->thread_.detach();
    static_cast<void>(client.release());
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
        if (const kesto_status status = courier_.putFirst(head, {}, {}); status != KESTO_OK)
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
        && entryBytes + libkesto::frameOverhead(reporterCount) + sizeof(CallHead) <= most;
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
    head.entryCount = message.entryCount();
    head.reporterCount = static_cast<std::uint32_t>(reporters.size());
    if (courier_.isReportingState() && isOwnThread())
        status = courier_.putFirst(head, bytesOf(reporters), message.entries());
    else if (!mailbox_.putMessage(head, bytesOf(reporters), message.entries()))
        status = KESTO_QUEUE_FULL;
    if (status != KESTO_OK) {
        ++counters_.droppedQueueFull;
        return status;
    }
    ++counters_.queued;
    callback.handOver();
    return KESTO_OK;
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
    if (timeout.count() > 0 && state() != KESTO_STATE_CLOSED)
        status = waitForAnswers(timeout);
    courier_.stop();
    const foundation::Lock lock(joining_);
    if (thread_.joinable())
        thread_.join();
    return status;
}
