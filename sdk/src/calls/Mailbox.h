// The queue between callers and the client's thread, and how the thread is woken: the part that keeps the promise
// that `send` makes no system call while a session is started.
//
// Waking a thread is a system call. So a thread that expects messages looks into the queue by itself from time to
// time, and only one that is going to sleep until it is woken has callers ring (`Doorbell`): they first claim room in
// the queue and then look whether it sleeps.
//
// The one moment in between: a start was given, the thread has not taken it yet, and may be asleep or about to be. The
// start rings in any case, so nobody who sends meanwhile needs to: `startsUnderway_` tells them.
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
    // `doorbell` is made by `Doorbell`.
    Mailbox(std::size_t bytes, platform::FileDescriptor doorbell);

    // For messages: no system call unless the thread sleeps. False when there is no room. Any thread.
    [[nodiscard]] bool putMessage(const CallHead& head, std::string_view reporters, std::string_view entries) noexcept;
    // For all other calls, which find room when messages find none any more. Rings in any case. Any thread.
    [[nodiscard]] bool putCall(const CallHead& head) noexcept;
    // Any thread.
    void ring() noexcept { bell_.ring(); }
    // Largest record that a message may be: smaller than what is ever free when the queue is empty.
    [[nodiscard]] std::size_t largestRecord() const noexcept { return bytes_ / 4; }
    // Where the queue stands, to tell when everything that was put before has been taken. Any thread.
    [[nodiscard]] std::uint64_t writePosition() const noexcept { return queue_.writePosition(); }
    [[nodiscard]] std::uint64_t readPosition() const noexcept { return queue_.readPosition(); }

    // The client's thread takes what was put, oldest first.
    [[nodiscard]] std::optional<std::string_view> front() noexcept { return queue_.front(); }
    void popFront() noexcept;

    // The client's thread says that it is going to wait for the doorbell and that messages are to ring it. False when
    // something was put meanwhile, or is being put: it must not wait for long then.
    [[nodiscard]] bool fallAsleep() noexcept;
    // After waiting, in any case.
    void wakeUp(bool hasRung) noexcept { bell_.wakeUp(hasRung); }
    [[nodiscard]] int doorbell() const noexcept { return bell_.descriptor(); }

private:
    const std::size_t bytes_;
    CallQueue queue_;
    Doorbell bell_;
    std::atomic<std::uint32_t> startsUnderway_ = 0; // given and not taken from the queue yet
};

} // namespace libkesto
