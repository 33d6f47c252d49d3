// Processes that a measurement needs beside its own: a service, a peer. They end with the object, and at the
// latest with the program.
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
    // Runs a program with nothing but this environment ("NAME=value"); its output goes to the file.
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

private:
    explicit ChildProcess(pid_t identifier) : identifier_(identifier) { }
    void end();

    pid_t identifier_ = 0;
};

// A directory that goes, with all that is in it.
class TemporaryDirectory {
public:
    TemporaryDirectory();
    ~TemporaryDirectory();
    TemporaryDirectory(const TemporaryDirectory&) = delete;
    TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;
    [[nodiscard]] const std::filesystem::path& path() const { return path_; }

private:
    std::filesystem::path path_;
};

// Keeps this process and others, with all their threads, on one processor as long as it lives: what is measured then
// is work and switching, without the time that a processor needs to wake from its sleep.
class OneProcessor {
public:
    explicit OneProcessor(std::initializer_list<pid_t> others);
    ~OneProcessor();
    OneProcessor(const OneProcessor&) = delete;
    OneProcessor& operator=(const OneProcessor&) = delete;

private:
    std::vector<pid_t> processes_;
};

// What the kernel counted: times that a thread of the process stopped running, and the memory that it has.
[[nodiscard]] double contextSwitches(pid_t process);
[[nodiscard]] double residentMegabytes(pid_t process);

} // namespace bench
