// How any number of callers wake one thread, without a system call while it is awake.
//
// The thread says in `isAsleep_` that it is going to sleep until it is woken, and only then looks whether there is
// something to do; callers first leave what they have for it and then look at the flag. Both are sequentially
// consistent, so one of them sees the other. The first caller that sees the flag takes it back and rings.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <atomic>
#include <poll.h>
#include <sys/eventfd.h>
#include <utility>

namespace libkesto {

class Doorbell {
public:
    // What it rings with; none, with `errno`, when the system has no descriptor.
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
        eventfd_write(descriptor_.get(), 1); // fails only when it has been rung 2^64 times and not been heard
    }

    // The thread that is woken, as what follows: from now on callers ring.
    void fallAsleep() noexcept { isAsleep_.store(true); }
    void stayAwake() noexcept { isAsleep_.store(false); }
    // After waiting, in any case.
    void wakeUp(bool hasRung) noexcept
    {
        stayAwake();
        eventfd_t rings = 0;
        if (hasRung)
            eventfd_read(descriptor_.get(), &rings);
    }
    // Sleeps so long (-1: for ever), or until it rings.
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
