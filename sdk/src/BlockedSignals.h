// The library's threads do not handle the program's signals.
#pragma once

#include <csignal>
#include <pthread.h>

namespace libkesto {

// Blocks all signals while it lives, so that a thread that is started meanwhile never handles one.
class BlockedSignals {
public:
    BlockedSignals() noexcept
    {
        sigset_t all;
        sigfillset(&all);
        pthread_sigmask(SIG_SETMASK, &all, &before_);
    }
    ~BlockedSignals() { pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
    BlockedSignals(const BlockedSignals&) = delete;
    BlockedSignals& operator=(const BlockedSignals&) = delete;

private:
    sigset_t before_;
};

} // namespace libkesto
