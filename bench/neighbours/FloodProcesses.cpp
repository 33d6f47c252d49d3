// SPDX-License-Identifier: Apache-2.0
// A pair of sockets connects each process: it says that it is prepared, or why not, and waits for a byte.
#include "neighbours/FloodProcesses.h"

#include "support/RawClient.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <exception>
#include <grp.h>
#include <stdexcept>
#include <string>
#include <string_view>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <system_error>
#include <unistd.h>

namespace bench {
namespace {

constexpr std::string_view prepared = "prepared";

// The sockets of the well-behaved client must not stay open here when it closes them.
void closeAllBut(int descriptor)
{
    ::close_range(STDERR_FILENO + 1, static_cast<unsigned>(descriptor) - 1, 0);
    ::close_range(static_cast<unsigned>(descriptor) + 1, ~0U, 0);
}

void raiseDescriptorLimit()
{
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = limit.rlim_max;
    ::setrlimit(RLIMIT_NOFILE, &limit);
}

void becomeOtherUser()
{
    if (::setgroups(0, nullptr) != 0 || ::setgid(otherUser) != 0 || ::setuid(otherUser) != 0)
        throw std::system_error(errno, std::generic_category(), "becoming another user");
    ::prctl(PR_SET_PDEATHSIG, SIGKILL); // the kernel forgets it with the user
}

void waitForStart(int control)
{
    writeAll(control, prepared);
    char byte = 0;
    if (!readAll(control, &byte, 1))
        ::_exit(0); // the parent is gone
}

void runProcess(int control, FloodProcesses::User user, const FloodProcesses::Body& body)
{
    try {
        closeAllBut(control);
        raiseDescriptorLimit();
        if (user == FloodProcesses::User::Other)
            becomeOtherUser();
        body([control] { waitForStart(control); });
    } catch (const std::exception& problem) {
        ::send(control, problem.what(), std::string_view(problem.what()).size(), MSG_NOSIGNAL);
    }
}

std::string received(int control)
{
    std::array<char, 1024> bytes;
    const ssize_t size = ::recv(control, bytes.data(), bytes.size(), 0);
    return {bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0))};
}

} // namespace

FloodProcesses::FloodProcesses(int count, User user, const Body& body)
{
    for (int process = 0; process < count; ++process)
        addProcess(user, body);
    for (const auto& control : controls_)
        if (const std::string answer = received(control.get()); answer != prepared)
            throw std::runtime_error("a flood cannot prepare: " + answer);
}

void FloodProcesses::addProcess(User user, const Body& body)
{
    SocketPair control;
    processes_.push_back(ChildProcess::run([&] { runProcess(control.client.get(), user, body); }));
    controls_.push_back(std::move(control.server));
}

void FloodProcesses::expectRunning() const
{
    for (std::size_t each = 0; each < processes_.size(); ++each)
        if (processes_[each].hasEnded())
            throw std::runtime_error("a flood ended: " + received(controls_[each].get()));
}

void FloodProcesses::start()
{
    for (const auto& control : controls_)
        writeAll(control.get(), "s");
}

} // namespace bench
