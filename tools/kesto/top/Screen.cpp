// SPDX-License-Identifier: Apache-2.0
// The screen is the terminal's alternate one. It gets whole lines, and lines are not wrapped: the caller has cut them.
#include "kesto/top/Screen.h"

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <system_error>
#include <unistd.h>
#include <utility>

namespace {

// The alternate screen, without a cursor and without wrapping; and back.
constexpr std::string_view begin = "\x1B[?1049h\x1B[?25l\x1B[?7l";
constexpr std::string_view end = "\x1B[0m\x1B[?7h\x1B[?25h\x1B[?1049l";

constexpr int longestFarewell = 1000; // milliseconds
constexpr int forEver = -1;

sigset_t setOf(int signal)
{
    sigset_t set;
    ::sigemptyset(&set);
    ::sigaddset(&set, signal);
    return set;
}

// Those that the screen takes. What the caller's shell lets the program ignore stays ignored.
sigset_t takenSignals()
{
    sigset_t set;
    ::sigemptyset(&set);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGUSR1, SIGUSR2, SIGALRM, SIGVTALRM, SIGPROF, SIGXCPU,
                             SIGPWR, SIGIO, SIGTSTP, SIGTTOU, SIGCONT, SIGWINCH}) {
        struct sigaction action{};
        if (::sigaction(signal, nullptr, &action) == 0 && action.sa_handler != SIG_IGN)
            ::sigaddset(&set, signal);
    }
    return set;
}

} // namespace

Screen::Screen()
{
    const sigset_t taken = takenSignals();
    signals_ = platform::FileDescriptor(::signalfd(-1, &taken, SFD_CLOEXEC | SFD_NONBLOCK));
    if (!signals_)
        throw std::system_error(errno, std::generic_category(), "no descriptor for signals");
    output_ = platform::FileDescriptor(::open("/proc/self/fd/1", O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!output_)
        output_ = platform::FileDescriptor(::fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, 0));
    ::pthread_sigmask(SIG_BLOCK, &taken, &maskBefore_);
    show();
}

Screen::~Screen()
{
    hide();
    ::pthread_sigmask(SIG_SETMASK, &maskBefore_, nullptr);
}

// A terminal that is not the program's own has no foreground to be in.
bool Screen::isInForeground() const noexcept
{
    const pid_t group = ::tcgetpgrp(STDOUT_FILENO);
    return group < 0 || group == ::getpgrp();
}

void Screen::show()
{
    if (!isInForeground())
        return stop(SIGTTOU); // as the system does with a program that changes the terminal from there
    termios modes{};
    if (::tcgetattr(STDIN_FILENO, &modes) == 0) {
        if (!isShown_)
            modesBefore_ = modes;
        modes.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
        modes.c_iflag &= ~static_cast<tcflag_t>(IXON);
        modes.c_cc[VMIN] = 1;
        modes.c_cc[VTIME] = 0;
        ::tcsetattr(STDIN_FILENO, TCSANOW, &modes);
    }
    if (!std::exchange(isShown_, true))
        isGone_ = !write(begin, forEver);
}

void Screen::hide() noexcept
{
    if (!isShown_)
        return;
    isShown_ = false;
    write(end, longestFarewell);
    if (modesBefore_)
        ::tcsetattr(STDIN_FILENO, TCSANOW, &*modesBefore_);
}

// Returns when the program goes on. The system does not stop a program whose shell is gone.
void Screen::stop(int signal) const noexcept
{
    ::raise(signal);
    const sigset_t set = setOf(signal);
    ::pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    ::pthread_sigmask(SIG_BLOCK, &set, nullptr);
}

// What the terminal does not take in time is left out; without a limit, what it does not take before a signal comes,
// which may be the end. False if the terminal is gone.
bool Screen::write(std::string_view text, int longestWait) const noexcept
{
    while (!text.empty()) {
        const ssize_t count = ::write(output_.get(), text.data(), text.size());
        if (count > 0) {
            text.remove_prefix(static_cast<std::size_t>(count));
            continue;
        }
        if (count < 0 && errno != EAGAIN && errno != EINTR)
            return false;
        std::array<pollfd, 2> room{
            {{output_.get(), POLLOUT, 0}, {longestWait == forEver ? signals_.get() : -1, POLLIN, 0}}};
        if (::poll(room.data(), room.size(), longestWait) == 0 || room[1].revents != 0)
            break;
    }
    return true;
}

void Screen::draw(const std::vector<std::string>& lines)
{
    if (!isShown_)
        return;
    std::string text = "\x1B[H";
    for (const std::string& line : lines)
        (text += line) += &line == &lines.back() ? "\x1B[K" : "\x1B[K\r\n";
    text += "\x1B[J";
    isGone_ = !write(text, forEver);
}

Screen::Events Screen::wait(int descriptor, std::optional<std::chrono::milliseconds> limit)
{
    std::array<pollfd, 3> watched{
        {{signals_.get(), POLLIN, 0}, {hasKeys_ && isShown_ ? STDIN_FILENO : -1, POLLIN, 0}, {descriptor, POLLIN, 0}}};
    Events events;
    if (isGone_)
        events.end = SIGHUP;
    if (isGone_ || ::poll(watched.data(), watched.size(), limit ? static_cast<int>(limit->count()) : -1) <= 0)
        return events;
    if (watched[0].revents != 0)
        takeSignals(events);
    if (watched[1].revents != 0 && isShown_)
        takeKeys(events);
    events.isReadable = watched[2].revents != 0;
    return events;
}

void Screen::takeSignals(Events& events)
{
    signalfd_siginfo signal{};
    while (::read(signals_.get(), &signal, sizeof signal) == sizeof signal)
        switch (static_cast<int>(signal.ssi_signo)) {
        case SIGTSTP:
            hide();
            stop(SIGTSTP);
            [[fallthrough]];
        case SIGCONT: show(); [[fallthrough]];
        case SIGWINCH: events.isToDraw = true; break;
        case SIGTTOU: break; // of the terminal's modes: they are set only from the foreground
        default: events.end = static_cast<int>(signal.ssi_signo); return;
        }
}

// The end of another file only ends the keys.
void Screen::takeKeys(Events& events)
{
    std::array<char, 64> keys{};
    const ssize_t count = ::read(STDIN_FILENO, keys.data(), keys.size());
    if (count > 0) {
        events.keys.assign(keys.data(), static_cast<std::size_t>(count));
        return;
    }
    if (count < 0 && (errno == EINTR || errno == EAGAIN))
        return;
    if (modesBefore_)
        events.end = SIGHUP; // the terminal is gone
    hasKeys_ = false;
}
