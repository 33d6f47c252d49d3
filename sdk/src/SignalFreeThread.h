// SPDX-License-Identifier: Apache-2.0
// Threads of the library: they never handle the signals of the program.
#pragma once

#include <cerrno>
#include <csignal>
#include <new>
#include <pthread.h>
#include <system_error>
#include <thread>
#include <utility>

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

// Starts a thread of the library. False, with the reason in errno, if the system refuses it.
template <typename Run> [[nodiscard]] bool startThread(std::thread& thread, Run run) noexcept
try {
    const BlockedSignals blocked;
    thread = std::thread(std::move(run));
    return true;
} catch (const std::system_error& error) {
    errno = error.code().value();
    return false;
} catch (const std::bad_alloc&) {
    errno = ENOMEM;
    return false;
}

} // namespace libkesto
