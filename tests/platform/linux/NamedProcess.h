// SPDX-License-Identifier: Apache-2.0
// A real process for tests that look up processes.
#pragma once

#include <csignal>
#include <gtest/gtest.h>
#include <stdexcept>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

// A process that only has names.
class NamedProcess {
public:
    explicit NamedProcess(const std::string& name)
    {
        EXPECT_EQ(::pipe(toChild_), 0);
        EXPECT_EQ(::pipe(fromChild_), 0);
        identifier_ = ::fork();
        if (identifier_ < 0)
            throw std::runtime_error("no process");
        if (identifier_ == 0) {
            char next[17] = {};
            while (::read(toChild_[0], next, 16) == 16) {
                ::prctl(PR_SET_NAME, next);
                if (::write(fromChild_[1], "x", 1) != 1)
                    break;
            }
            ::_exit(0);
        }
        rename(name);
    }
    ~NamedProcess()
    {
        end();
        for (const int end : {toChild_[0], toChild_[1], fromChild_[0], fromChild_[1]})
            ::close(end);
    }
    NamedProcess(const NamedProcess&) = delete;
    NamedProcess& operator=(const NamedProcess&) = delete;

    void rename(std::string name)
    {
        name.resize(16);
        char done = 0;
        EXPECT_EQ(::write(toChild_[1], name.data(), 16), 16);
        EXPECT_EQ(::read(fromChild_[0], &done, 1), 1);
    }
    void end()
    {
        if (identifier_ <= 0)
            return;
        ::kill(identifier_, SIGKILL);
        ::waitpid(identifier_, nullptr, 0);
        identifier_ = 0;
    }
    [[nodiscard]] int identifier() const noexcept { return identifier_; }

private:
    int toChild_[2] = {};
    int fromChild_[2] = {};
    pid_t identifier_ = 0;
};

} // namespace support
