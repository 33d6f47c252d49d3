// What a caller holds: refuses what cannot be sent, puts the rest into the mailbox, and owns the thread that takes it
// out again.
#pragma once

#include "ClientSettings.h"
#include "Counters.h"
#include "calls/Courier.h"
#include "calls/Flushes.h"
#include "calls/Mailbox.h"
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

    // Null, with `errno`, when the system has no descriptor. May throw std::bad_alloc.
    [[nodiscard]] static std::unique_ptr<kesto_client> create(Settings settings);
    // Begins to connect. False, with `errno`, when the system has no thread; the client is then good for nothing.
    [[nodiscard]] bool start() noexcept;
    // Ends the client, whichever thread this is and in whichever process.
    static void free(std::unique_ptr<kesto_client> client) noexcept;
    ~kesto_client() = default;

    // Any operation but sending a message and setting a configuration. Takes over the callback.
    [[nodiscard]] kesto_status call(CallHead head) noexcept;
    [[nodiscard]] kesto_status setConfiguration(const libkesto::MessageEncoder& configuration, CallHead head) noexcept;
    // For real-time threads.
    [[nodiscard]] kesto_status send(const libkesto::MessageEncoder& message, CallHead head,
                                    std::span<const kesto_reporter> reporters) noexcept;

    [[nodiscard]] kesto_status flush(std::chrono::milliseconds timeout) noexcept;
    [[nodiscard]] kesto_status close(std::chrono::milliseconds timeout) noexcept;

    [[nodiscard]] kesto_state state() const noexcept { return courier_.state(); }
    // Null when the client was not to have one.
    [[nodiscard]] const kesto_tracer* tracer() const noexcept { return courier_.emitter(); }
    [[nodiscard]] kesto_statistics statistics() const noexcept { return counters_.statistics(); }
    void countUnusable() noexcept { ++counters_.droppedUnusable; }

private:
    kesto_client(Settings settings, platform::FileDescriptor doorbell);
    [[nodiscard]] kesto_status refusal() const noexcept;
    [[nodiscard]] bool fits(std::size_t entryBytes, std::size_t reporterCount) const noexcept;
    [[nodiscard]] kesto_status waitForAnswers(std::chrono::milliseconds timeout) noexcept;
    // Not by a thread-local variable: the first look at one may allocate.
    [[nodiscard]] bool isOwnThread() const noexcept { return pthread_equal(pthread_self(), self_.load()) != 0; }
    void run() noexcept;

    const pid_t process_; // that made it: a child that was forked off has no such thread
    libkesto::Counters counters_;
    libkesto::Mailbox mailbox_;
    libkesto::Flushes flushes_;
    libkesto::Courier courier_;
    std::atomic<bool> isClosing_ = false;
    bool freesItself_ = false; // at its thread's end; the thread's
    foundation::Mutex joining_;
    std::thread thread_ KESTO_GUARDED_BY(joining_);
    std::atomic<pthread_t> self_{}; // of the client's thread, set by it
};
