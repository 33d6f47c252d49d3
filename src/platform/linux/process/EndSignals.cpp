// SPDX-License-Identifier: Apache-2.0
// The handlers are called under the lock: they neither wait nor use this object, and `begin` is then called once.
#include "platform/linux/process/EndSignals.h"

#include "platform/linux/process/Thread.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fmt/chrono.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <system_error>
#include <utility>

namespace platform {
namespace {

sigset_t endSignals()
{
    sigset_t set;
    sigemptyset(&set);
    sigaddset(&set, SIGTERM);
    sigaddset(&set, SIGINT);
    return set;
}

FileDescriptor checked(int descriptor)
{
    if (descriptor < 0)
        throw std::system_error(errno, std::generic_category(), "cannot wait for signals");
    return FileDescriptor(descriptor);
}

// Any thread may run it, also one that blocks in a system call.
void endOnAlarm(int)
{
    std::_Exit(EndSignals::exitStatus);
}

std::string descriptionOf(const signalfd_siginfo& signal)
{
    const std::string_view name = signal.ssi_signo == SIGTERM ? "SIGTERM" : "SIGINT";
    if (signal.ssi_code == SI_KERNEL)
        return fmt::format("the terminal sent {}", name);
    return fmt::format("process {} (user {}) sent {}", signal.ssi_pid, signal.ssi_uid, name);
}

// As poll counts: rounded up, and -1 without an end.
int millisecondsUntil(std::optional<std::chrono::steady_clock::time_point> deadline)
{
    if (!deadline)
        return -1;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*deadline - std::chrono::steady_clock::now());
    return static_cast<int>(std::max<std::chrono::milliseconds::rep>(left.count(), 0));
}

void setAlarm(std::chrono::seconds time)
{
    ::alarm(static_cast<unsigned>(time.count()));
}

} // namespace

EndSignals::EndSignals()
{
    const sigset_t set = endSignals();
    ::pthread_sigmask(SIG_BLOCK, &set, nullptr);
    signals_ = checked(::signalfd(-1, &set, SFD_CLOEXEC | SFD_NONBLOCK));
    isOver_ = checked(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    struct sigaction onAlarm = {};
    onAlarm.sa_handler = endOnAlarm;
    ::sigaction(SIGALRM, &onAlarm, nullptr);
    thread_ = startThread("end signals", QualityOfService::UserInteractive, [this] { run(); });
}

EndSignals::~EndSignals()
{
    ::eventfd_write(isOver_.get(), 1);
    thread_.join();
}

void EndSignals::setHandlers(Handlers handlers)
{
    const foundation::Lock lock(lock_);
    handlers_ = std::move(handlers);
    if (request_)
        handlers_.begin();
}

std::optional<std::string> EndSignals::request() const
{
    const foundation::Lock lock(lock_);
    return request_;
}

void EndSignals::run()
{
    auto first = nextSignal(std::nullopt);
    if (!first)
        return;
    const auto begun = Clock::now();
    const auto deadline = begun + patience;
    setAlarm(limit);
    begin(std::move(*first));
    const auto second = nextSignal(deadline);
    if (!second && Clock::now() < deadline)
        return; // this object is destroyed
    if (Clock::now() + limitOfSecondSignal < begun + limit)
        setAlarm(limitOfSecondSignal);
    giveUp(second ? fmt::format("a second signal came: {}", *second)
                  : fmt::format("it takes longer than {}", patience));
}

// Who sent the next signal; nothing at the deadline and at the end of this object.
std::optional<std::string> EndSignals::nextSignal(std::optional<Clock::time_point> deadline) const
{
    std::array<pollfd, 2> watched = {};
    watched[0] = {.fd = signals_.get(), .events = POLLIN, .revents = 0};
    watched[1] = {.fd = isOver_.get(), .events = POLLIN, .revents = 0};
    while (::poll(watched.data(), watched.size(), millisecondsUntil(deadline)) < 0 && errno == EINTR) { }
    signalfd_siginfo signal = {};
    if (watched[1].revents != 0 || ::read(signals_.get(), &signal, sizeof signal) != sizeof signal)
        return std::nullopt;
    return descriptionOf(signal);
}

void EndSignals::begin(std::string request)
{
    const foundation::Lock lock(lock_);
    request_ = std::move(request);
    if (handlers_.begin)
        handlers_.begin();
}

void EndSignals::giveUp(const std::string& reason)
{
    {
        const foundation::Lock lock(lock_);
        if (handlers_.giveUp)
            handlers_.giveUp(reason);
    }
    std::_Exit(exitStatus);
}

} // namespace platform
