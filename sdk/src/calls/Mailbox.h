// SPDX-License-Identifier: Apache-2.0
// The queue between callers and the client's thread, and how callers wake that thread. It keeps the promise that `send`
// makes no system call while a session is started.
//
// Waking a thread is a system call. So while the thread expects messages, it polls the queue from time to time. Only a
// thread that sleeps until it is woken makes callers ring (see `Doorbell`): they first claim room in the queue and then
// check whether it sleeps.
//
// One case is in between: a start is in the queue, and the thread has not taken it yet and may sleep. Every start
// rings a thread that sleeps, so messages need not ring meanwhile; `startsUnderway_` shows this to their senders.
#pragma once

#include "Doorbell.h"
#include "calls/CallQueue.h"
#include "platform/linux/files/FileDescriptor.h"
#include "wire/CallFrames.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace libkesto {

class Mailbox {
public:
    // `Doorbell::makeDescriptor` makes `doorbell`.
    Mailbox(std::size_t bytes, platform::FileDescriptor doorbell);

    // For messages: no system call unless the thread sleeps. False if the queue has no room. Any thread.
    [[nodiscard]] bool putMessage(const CallHead& head, std::string_view reporters, std::string_view entries,
                                  std::string_view stamps = {}) noexcept;
    // For all other calls; room is kept for them that messages cannot use. Always rings. Any thread.
    [[nodiscard]] bool putCall(const CallHead& head) noexcept;
    // For records of playbacks and recordings; no system call unless the thread sleeps. Those that matter most may use
    // the room that is kept for calls. Any thread.
    [[nodiscard]] bool putStreamRecord(kesto_operation operation, std::string_view record, std::string_view device,
                                       std::string_view encoding, bool usesKeptRoom) noexcept;
    // Any thread.
    void ring() noexcept { bell_.ring(); }
    // The size limit of a message's record: an empty queue always has more room than that.
    [[nodiscard]] std::size_t largestRecord() const noexcept { return bytes_ / 4; }
    // The queue's positions, from which a caller learns when its calls have been taken. Any thread.
    [[nodiscard]] std::uint64_t writePosition() const noexcept { return queue_.writePosition(); }
    [[nodiscard]] std::uint64_t readPosition() const noexcept { return queue_.readPosition(); }

    // For the client's thread: the oldest record.
    [[nodiscard]] std::optional<std::string_view> front() noexcept { return queue_.front(); }
    void popFront() noexcept;

    // The client's thread calls this before it waits for the doorbell: from now on messages ring. False if a call has
    // come, or is just being put in; the thread must then not wait for long.
    [[nodiscard]] bool fallAsleep() noexcept;
    // Call it after every wait.
    void wakeUp(bool hasRung) noexcept { bell_.wakeUp(hasRung); }
    [[nodiscard]] int doorbell() const noexcept { return bell_.descriptor(); }

private:
    [[nodiscard]] std::size_t roomForCalls() const noexcept { return bytes_ / 8; }

    const std::size_t bytes_;
    CallQueue queue_;
    Doorbell bell_;
    std::atomic<std::uint32_t> startsUnderway_ = 0; // in the queue, not taken yet
};

} // namespace libkesto
