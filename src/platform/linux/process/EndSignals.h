// SPDX-License-Identifier: Apache-2.0
// The signals that ask the process to end: SIGTERM of a service manager, SIGINT of a terminal.
//
// All threads block them, and one thread waits for them. That thread does nothing else, so the process notices a signal
// even if every other thread works or waits for a disk. It passes the request on, and from then on watches the time:
// after `patience`, or at a second signal, it ends the process, whatever the other threads do. Should even the last log
// line block, the kernel's alarm ends the process.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/files/FileDescriptor.h"

#include <chrono>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <thread>

namespace platform {

class EndSignals {
public:
    // How long the end in order may take. The rest of `limit` is for the last log line.
    static constexpr std::chrono::milliseconds patience{4500};
    static constexpr std::chrono::seconds limit{5};
    // The same for the last line after a second signal.
    static constexpr std::chrono::seconds limitOfSecondSignal{1};
    // The status of a process that a signal ended, in order or not.
    static constexpr int exitStatus = 0;

    struct Handlers {
        // Begins the end in order, and does not wait for it. Called at the first signal; if it came already, then by
        // `setHandlers`.
        std::function<void()> begin;
        // Logs what is given up, for that reason. The process then ends.
        std::function<void(std::string_view reason)> giveUp;
    };

    // Blocks the signals in the calling thread and in all threads that it starts from now on: call it before the first.
    // Throws std::system_error if the system refuses a descriptor or a thread.
    EndSignals();
    // Afterwards the signals stay blocked.
    ~EndSignals();
    EndSignals(const EndSignals&) = delete;
    EndSignals& operator=(const EndSignals&) = delete;

    // The process ends without the handlers if they are not set in time. They are called on the thread of this object,
    // unless said otherwise above, and must live as long as it does. Once.
    void setHandlers(Handlers handlers);

    // Who sent the first signal, for people; nothing before it. Any thread.
    [[nodiscard]] std::optional<std::string> request() const;

private:
    using Clock = std::chrono::steady_clock;

    void run();
    [[nodiscard]] std::optional<std::string> nextSignal(std::optional<Clock::time_point> deadline) const;
    void begin(std::string request);
    [[noreturn]] void giveUp(const std::string& reason);

    FileDescriptor signals_;
    FileDescriptor isOver_; // readable when this object is destroyed

    mutable foundation::Mutex lock_;
    std::optional<std::string> request_ KESTO_GUARDED_BY(lock_);
    Handlers handlers_ KESTO_GUARDED_BY(lock_);
    std::thread thread_;
};

} // namespace platform
