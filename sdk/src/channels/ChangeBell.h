// How callers tell the publisher's thread that a channel has changed, without a system call while it is awake.
//
// The thread says in `isAsleep_` that it is going to sleep until it is woken, and only then looks whether something has
// changed; callers first mark their channel and then look at the flag. Both are sequentially consistent, so one of
// them sees the other. The first caller that sees the flag takes it back and rings.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <poll.h>
#include <sys/eventfd.h>
#include <unistd.h>
#include <utility>

namespace libkesto {

class ChangeBell {
public:
    // An event descriptor that does not block.
    explicit ChangeBell(platform::FileDescriptor doorbell) noexcept : doorbell_(std::move(doorbell)) { }

    // Something was marked. Any thread.
    void tell() noexcept
    {
        if (isAsleep_.load() && isAsleep_.exchange(false))
            ring();
    }
    // Any thread.
    void ring() noexcept
    {
        const std::uint64_t one = 1;
        while (::write(doorbell_.get(), &one, sizeof one) < 0 && errno == EINTR) { }
    }

    // The publisher's thread: from now on what is marked rings.
    void fallAsleep() noexcept { isAsleep_.store(true); }
    void stayAwake() noexcept { isAsleep_.store(false); }
    // The publisher's thread sleeps so long (-1: for ever), or until it rings.
    void wait(int milliseconds) noexcept
    {
        pollfd watched{doorbell_.get(), POLLIN, 0};
        if (::poll(&watched, 1, milliseconds) > 0) {
            std::uint64_t rings = 0;
            static_cast<void>(::read(doorbell_.get(), &rings, sizeof rings));
        }
        stayAwake();
    }

private:
    const platform::FileDescriptor doorbell_;
    std::atomic<bool> isAsleep_ = false;
};

} // namespace libkesto
