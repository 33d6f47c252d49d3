// SPDX-License-Identifier: Apache-2.0
// A process that performs an action, and lives until a test kills it.
#pragma once

#include <array>
#include <csignal>
#include <functional>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

// Make it before the test starts threads, because the process is a fork of the test's.
class Victim {
public:
    struct Unawaited { };

    // `act` returns whether it succeeded, which is expected.
    explicit Victim(const std::function<bool()>& act) : Victim(Unawaited(), act) { expectSuccess(); }
    // Does not wait until the action is done.
    Victim(Unawaited, const std::function<bool()>& act)
    {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe(ends.data()), 0);
        process_ = ::fork();
        if (process_ == 0) {
            const char outcome = act() ? 'y' : 'n';
            if (::write(ends[1], &outcome, 1) == 1)
                ::pause();
            ::_exit(1);
        }
        ::close(ends[1]);
        outcome_ = ends[0];
    }
    ~Victim()
    {
        kill();
        ::close(outcome_);
    }
    Victim(const Victim&) = delete;
    Victim& operator=(const Victim&) = delete;

    // Waits until the action is done.
    void expectSuccess() const
    {
        char outcome = 0;
        EXPECT_EQ(::read(outcome_, &outcome, 1), 1);
        EXPECT_EQ(outcome, 'y');
    }
    // Kills it with SIGKILL and waits for its end.
    void kill()
    {
        if (process_ <= 0)
            return;
        ::kill(process_, SIGKILL);
        EXPECT_EQ(::waitpid(process_, nullptr, 0), process_);
        process_ = 0;
    }

private:
    pid_t process_ = 0;
    int outcome_ = -1;
};

} // namespace support
