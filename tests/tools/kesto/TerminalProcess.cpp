// SPDX-License-Identifier: Apache-2.0
// The program is the leader of a session with this terminal, as a shell's is.
#include "tools/kesto/TerminalProcess.h"

#include "end_to_end/Kestod.h"

#include <array>
#include <csignal>
#include <fcntl.h>
#include <poll.h>
#include <pty.h>
#include <stdexcept>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>
#include <utmp.h>
#include <vector>

namespace kesto_tool {

TerminalProcess::TerminalProcess(const sdk_test::Process::Arguments& arguments,
                                 const sdk_test::Process::Environment& environment)
{
    int master = -1;
    int slave = -1;
    const winsize size{.ws_row = 24, .ws_col = 80, .ws_xpixel = 0, .ws_ypixel = 0};
    if (::openpty(&master, &slave, nullptr, nullptr, &size) != 0)
        throw std::runtime_error("no terminal");
    master_ = platform::FileDescriptor(master);
    slave_ = platform::FileDescriptor(slave);
    ::fcntl(master, F_SETFD, FD_CLOEXEC);
    std::vector<std::string> argumentTexts = arguments;
    std::vector<std::string> environmentTexts = sdk_test::mergedEnvironment(environment);
    std::vector<char*> argumentPointers = sdk_test::pointersTo(argumentTexts);
    std::vector<char*> environmentPointers = sdk_test::pointersTo(environmentTexts);
    identifier_ = ::fork();
    if (identifier_ < 0)
        throw std::runtime_error("no process");
    if (identifier_ == 0) {
        for (int number = 1; number < NSIG; ++number)
            ::signal(number, SIG_DFL); // the test may have been told to ignore some
        ::login_tty(slave);
        ::execvpe(argumentPointers[0], argumentPointers.data(), environmentPointers.data());
        ::_exit(127);
    }
    ::fcntl(slave, F_SETFD, FD_CLOEXEC);
}

TerminalProcess::~TerminalProcess()
{
    if (identifier_ == 0)
        return;
    signal(SIGKILL);
    ::waitpid(identifier_, nullptr, 0);
}

void TerminalProcess::type(std::string_view text) const
{
    if (::write(master_.get(), text.data(), text.size()) != std::ssize(text))
        throw std::runtime_error("the terminal takes no input");
}

void TerminalProcess::resize(unsigned short columns, unsigned short lines) const
{
    const winsize size{.ws_row = lines, .ws_col = columns, .ws_xpixel = 0, .ws_ypixel = 0};
    ::ioctl(master_.get(), TIOCSWINSZ, &size);
}

void TerminalProcess::signal(int number) const
{
    if (identifier_ > 0) // else a whole group of processes would get it
        ::kill(identifier_, number);
}

bool TerminalProcess::read()
{
    constexpr int shortWait = 2; // milliseconds
    pollfd readable{master_.get(), POLLIN, 0};
    std::array<char, 65536> buffer{};
    if (master_ && ::poll(&readable, 1, shortWait) == 1 && (readable.revents & POLLIN) != 0)
        if (const ssize_t count = ::read(master_.get(), buffer.data(), buffer.size()); count > 0) {
            output_.append(buffer.data(), static_cast<std::size_t>(count));
            return true;
        }
    return false;
}

bool TerminalProcess::waitFor(std::string_view text)
{
    return end_to_end::waitUntil([&] {
        read();
        const std::size_t place = output_.find(text, waitedFor_);
        if (place == std::string::npos)
            return false;
        waitedFor_ = place + text.size();
        return true;
    });
}

bool TerminalProcess::hasUsualModes() const
{
    termios modes{};
    constexpr tcflag_t usual = ICANON | ECHO | ISIG;
    return ::tcgetattr(slave_.get(), &modes) == 0 && (modes.c_lflag & usual) == usual && (modes.c_iflag & IXON) != 0;
}

std::optional<int> TerminalProcess::wait()
{
    int status = 0;
    if (!end_to_end::waitUntil([&] {
            read();
            return ::waitpid(identifier_, &status, WNOHANG) == identifier_;
        }))
        return std::nullopt;
    identifier_ = 0;
    while (read()) { }
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

} // namespace kesto_tool
