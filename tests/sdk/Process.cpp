// SPDX-License-Identifier: Apache-2.0
// A thread collects the program's output, so that the program never waits for its reader, and a process descriptor
// shows its end.
#include "sdk/Process.h"

#include "sdk/FakeService.h"

#include <algorithm>
#include <array>
#include <csignal>
#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <stdexcept>
#include <string_view>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

extern char** environ;

namespace sdk_test {
namespace {

struct Pipe {
    platform::FileDescriptor reading;
    platform::FileDescriptor writing;
};

Pipe makePipe()
{
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0)
        throw std::runtime_error("no pipe");
    return {platform::FileDescriptor(ends[0]), platform::FileDescriptor(ends[1])};
}

} // namespace

std::vector<char*> pointersTo(std::vector<std::string>& texts)
{
    std::vector<char*> all;
    for (std::string& text : texts)
        all.push_back(text.data());
    all.push_back(nullptr);
    return all;
}

std::vector<std::string> mergedEnvironment(const Process::Environment& environment)
{
    const auto nameOf = [](std::string_view variable) { return variable.substr(0, variable.find('=')); };
    std::vector<std::string> all;
    for (char** variable = environ; *variable != nullptr; ++variable)
        if (std::ranges::none_of(environment, [&](const auto& given) { return nameOf(given) == nameOf(*variable); }))
            all.emplace_back(*variable);
    std::ranges::copy_if(environment, std::back_inserter(all), [](const auto& given) { return given.contains('='); });
    return all;
}

Process::Process(const Arguments& arguments, const Environment& environment)
{
    Pipe input = makePipe();
    Pipe output = makePipe();
    Pipe errors = makePipe();
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, input.reading.get(), STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, output.writing.get(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, errors.writing.get(), STDERR_FILENO);
    std::vector<std::string> argumentTexts = arguments;
    std::vector<std::string> environmentTexts = mergedEnvironment(environment);
    const int failure = ::posix_spawnp(&identifier_, argumentTexts.front().c_str(), &actions, nullptr,
                                       pointersTo(argumentTexts).data(), pointersTo(environmentTexts).data());
    posix_spawn_file_actions_destroy(&actions);
    if (failure != 0)
        throw std::runtime_error("cannot run " + arguments.front());
    process_ = platform::FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, identifier_, 0)));
    input_ = std::move(input.writing);
    outputPipe_ = std::move(output.reading);
    errorPipe_ = std::move(errors.reading);
    collector_ = std::thread([this] { collect(); });
}

Process::~Process()
{
    if (!status_) {
        signal(SIGKILL);
        wait();
    }
    collector_.join();
}

void Process::collect()
{
    std::array<char, 4096> buffer;
    std::array<pollfd, 2> pipes{{{outputPipe_.get(), POLLIN, 0}, {errorPipe_.get(), POLLIN, 0}}};
    while (pipes[0].fd >= 0 || pipes[1].fd >= 0) {
        ::poll(pipes.data(), pipes.size(), -1);
        for (std::size_t index = 0; index < pipes.size(); ++index) {
            if (pipes[index].revents == 0)
                continue;
            const ssize_t count = ::read(pipes[index].fd, buffer.data(), buffer.size());
            if (count <= 0) {
                pipes[index].fd = -1;
                continue;
            }
            const foundation::Lock lock(mutex_);
            (index == 0 ? output_ : errors_).append(buffer.data(), static_cast<std::size_t>(count));
            changed_.notifyAll();
        }
    }
    const foundation::Lock lock(mutex_);
    hasEnded_ = true;
    changed_.notifyAll();
}

void Process::write(const std::string& text)
{
    std::string_view rest = text;
    while (!rest.empty()) {
        const ssize_t count = ::write(input_.get(), rest.data(), rest.size());
        if (count <= 0)
            return;
        rest.remove_prefix(static_cast<std::size_t>(count));
    }
}

void Process::signal(int number)
{
    ::kill(identifier_, number);
}

std::string Process::waitForOutput(const std::string& text)
{
    const auto deadline = std::chrono::steady_clock::now() + patience;
    const foundation::Lock lock(mutex_);
    while (!output_.contains(text) && !hasEnded_ && std::chrono::steady_clock::now() < deadline)
        changed_.waitUntil(mutex_, deadline);
    return output_;
}

std::optional<int> Process::wait()
{
    if (status_)
        return status_;
    pollfd ended{process_.get(), POLLIN, 0};
    const std::chrono::milliseconds timeout = patience;
    if (::poll(&ended, 1, static_cast<int>(timeout.count())) != 1)
        return std::nullopt;
    int status = 0;
    ::waitpid(identifier_, &status, 0);
    status_ = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    const foundation::Lock lock(mutex_);
    while (!hasEnded_)
        changed_.wait(mutex_);
    return status_;
}

std::string Process::output() const
{
    const foundation::Lock lock(mutex_);
    return output_;
}

std::string Process::errors() const
{
    const foundation::Lock lock(mutex_);
    return errors_;
}

Finished run(const Process::Arguments& arguments, const std::string& input, const Process::Environment& environment)
{
    Process process(arguments, environment);
    process.write(input);
    process.closeInput();
    const auto status = process.wait();
    return {status, process.output(), process.errors()};
}

} // namespace sdk_test
