// SPDX-License-Identifier: Apache-2.0
// Lets any number of callers wake one thread, without a system call while it is awake.
//
// The thread sets `isAsleep_` before it sleeps, and then checks once more for work. Callers first leave their work and
// then read the flag. Both are sequentially consistent, so either the thread sees the work or the caller sees the flag.
// The first caller that sees the flag clears it and rings.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <atomic>
#include <poll.h>
#include <sys/eventfd.h>
#include <utility>

namespace libkesto {

class Doorbell {
public:
    // The descriptor with which it rings; none, with `errno`, if the system refuses it.
    [[nodiscard]] static platform::FileDescriptor makeDescriptor() noexcept
    {
        return platform::FileDescriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    }
    explicit Doorbell(platform::FileDescriptor descriptor) noexcept : descriptor_(std::move(descriptor)) { }

    // Rings if the thread sleeps and no other caller has rung. Any thread.
    void ringIfAsleep() noexcept
    {
        if (isAsleep_.load() && isAsleep_.exchange(false))
            ring();
    }
    // Any thread.
    void ring() noexcept
    {
        eventfd_write(descriptor_.get(), 1); // fails only after 2^64 rings without a reading
    }

    // The following functions are for the thread that is woken. From now on callers ring.
    void fallAsleep() noexcept { isAsleep_.store(true); }
    void stayAwake() noexcept { isAsleep_.store(false); }
    // Call it after every wait.
    void wakeUp(bool hasRung) noexcept
    {
        stayAwake();
        eventfd_t rings = 0;
        if (hasRung)
            eventfd_read(descriptor_.get(), &rings);
    }
    // Sleeps for this time (-1: for ever), or until it rings.
    void wait(int milliseconds) noexcept
    {
        pollfd watched{descriptor_.get(), POLLIN, 0};
        wakeUp(::poll(&watched, 1, milliseconds) > 0);
    }
    [[nodiscard]] int descriptor() const noexcept { return descriptor_.get(); }

private:
    const platform::FileDescriptor descriptor_;
    std::atomic<bool> isAsleep_ = false;
};

} // namespace libkesto
