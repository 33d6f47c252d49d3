// SPDX-License-Identifier: Apache-2.0
// The room of calls: from a caller's function to a sent frame, and from an answer to the caller's callback. It has one
// thread for each client.
//
// The object behind a caller's client: it refuses what cannot be sent, puts the rest into the mailbox, and owns the
// thread that empties the mailbox.
#pragma once

#include "ClientSettings.h"
#include "Counters.h"
#include "calls/Courier.h"
#include "calls/Flushes.h"
#include "calls/Mailbox.h"
#include "calls/Streams.h"
#include "wire/MessageEncoder.h"

#include <atomic>
#include <chrono>
#include <memory>
#include <pthread.h>
#include <span>
#include <sys/types.h>
#include <thread>

// The opaque type of the interface. Any thread.
struct kesto_client final {
public:
    using Settings = libkesto::ClientSettings;
    using CallHead = libkesto::CallHead;

    // Null, with `errno`, if the system refuses a descriptor. May throw std::bad_alloc.
    [[nodiscard]] static std::unique_ptr<kesto_client> create(Settings settings);
    // Begins to connect. False, with `errno`, if the system refuses a thread; the client can then only be freed.
    [[nodiscard]] bool start() noexcept;
    // Ends the client, on any thread and in any process. Its memory stays as long as it has streams.
    static void free(kesto_client* client) noexcept;
    ~kesto_client() = default;

    // Any operation except sending a message and setting a configuration. Takes over the callback.
    [[nodiscard]] kesto_status call(CallHead head) noexcept;
    [[nodiscard]] kesto_status setConfiguration(const libkesto::MessageEncoder& configuration, CallHead head) noexcept;
    // For real-time threads.
    [[nodiscard]] kesto_status send(const libkesto::MessageEncoder& message, CallHead head,
                                    std::span<const kesto_reporter> reporters) noexcept;

    // For playbacks and recordings. A stream stays until it is freed. May throw std::bad_alloc.
    [[nodiscard]] libkesto::Stream& createStream(libkesto::Direction direction, std::string_view application,
                                                 kesto_service_type type);
    // Stops the stream, too. The caller must not use the client any more, except by other streams.
    void freeStream(const libkesto::Stream& stream) noexcept;
    // Adds the time. For real-time threads.
    [[nodiscard]] kesto_status putStreamRecord(libkesto::StreamRecord record, std::string_view device,
                                               std::string_view encoding) noexcept;

    [[nodiscard]] kesto_status flush(std::chrono::milliseconds timeout) noexcept;
    [[nodiscard]] kesto_status close(std::chrono::milliseconds timeout) noexcept;

    [[nodiscard]] kesto_state state() const noexcept { return courier_.state(); }
    // Null if the client has none.
    [[nodiscard]] const kesto_tracer* tracer() const noexcept { return courier_.emitter(); }
    [[nodiscard]] kesto_statistics statistics() const noexcept { return counters_.statistics(); }
    void countUnusable() noexcept { ++counters_.droppedUnusable; }

private:
    kesto_client(Settings settings, platform::FileDescriptor doorbell);
    [[nodiscard]] kesto_status refusal() const noexcept;
    [[nodiscard]] kesto_status refusalOfStreams() const noexcept;
    [[nodiscard]] bool putStamped(libkesto::StreamRecord record, std::string_view device,
                                  std::string_view encoding) noexcept;
    void stopStreams() noexcept;
    void drop() noexcept;
    [[nodiscard]] bool fits(std::size_t entryBytes, std::size_t reporterCount) const noexcept;
    [[nodiscard]] kesto_status waitForAnswers(std::chrono::milliseconds timeout) noexcept;
    // Compares thread IDs: the first access to a thread-local variable may allocate.
    [[nodiscard]] bool isOwnThread() const noexcept { return pthread_equal(pthread_self(), self_.load()) != 0; }
    void run() noexcept;

    const bool stampsMessages_;
    const bool reconnects_;
    const pid_t process_; // of the process that made it: a forked child does not have the thread
    libkesto::Counters counters_;
    libkesto::Mailbox mailbox_;
    libkesto::Streams streams_;
    libkesto::Flushes flushes_;
    libkesto::Courier courier_;
    std::atomic<bool> isClosing_ = false;
    std::atomic<std::size_t> holders_ = 1; // the program and each stream; the last to go deletes the client
    bool freesItself_ = false; // when its thread ends; only its thread uses this
    foundation::Mutex joining_;
    std::thread thread_ KESTO_GUARDED_BY(joining_);
    std::atomic<pthread_t> self_{}; // of the client's thread, which sets it
};
