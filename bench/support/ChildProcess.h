// SPDX-License-Identifier: Apache-2.0
// Further processes of a measurement: a service, a peer. They end with the object, and at the latest with the program.
#pragma once

#include <filesystem>
#include <functional>
#include <initializer_list>
#include <string>
#include <sys/types.h>
#include <utility>
#include <vector>

namespace bench {

class ChildProcess {
public:
    ChildProcess() = default;
    // Runs `body` in a copy of this process, which then ends.
    static ChildProcess run(const std::function<void()>& body);
    // Runs a program with exactly this environment ("NAME=value"); its output goes to the file.
    static ChildProcess execute(const std::vector<std::string>& command, const std::vector<std::string>& environment,
                                const std::filesystem::path& output);

    ChildProcess(ChildProcess&& other) noexcept : identifier_(std::exchange(other.identifier_, 0)) { }
    ChildProcess& operator=(ChildProcess&& other) noexcept
    {
        std::swap(identifier_, other.identifier_);
        return *this;
    }
    ~ChildProcess() { end(); }

    [[nodiscard]] pid_t identifier() const { return identifier_; }
    [[nodiscard]] bool hasEnded() const;
    // Kills the process with SIGKILL. The destructor asks with SIGTERM first.
    void kill();

private:
    explicit ChildProcess(pid_t identifier) : identifier_(identifier) { }
    void end();

    pid_t identifier_ = 0;
};

// Keeps this process and others, with all their threads, on one processor as long as it lives: measurements then show
// work and switching, without the time that a sleeping processor needs to wake up.
class OneProcessor {
public:
    explicit OneProcessor(std::initializer_list<pid_t> others);
    ~OneProcessor();
    OneProcessor(const OneProcessor&) = delete;
    OneProcessor& operator=(const OneProcessor&) = delete;

private:
    std::vector<pid_t> processes_;
};

// The kernel's counts: how often threads of the process stopped running, the processor time of all its threads, and its
// memory.
[[nodiscard]] double contextSwitches(pid_t process);
[[nodiscard]] double processorSeconds(pid_t process);
[[nodiscard]] double residentMegabytes(pid_t process);

} // namespace bench
