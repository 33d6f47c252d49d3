// SPDX-License-Identifier: Apache-2.0
// The kernel kills a child with its parent; /proc holds its costs.
#include "support/ChildProcess.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <fmt/format.h>
#include <fstream>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <system_error>
#include <thread>
#include <unistd.h>

namespace bench {
namespace {

namespace fs = std::filesystem;

std::vector<char*> pointersTo(const std::vector<std::string>& texts)
{
    std::vector<char*> pointers;
    std::ranges::transform(texts, std::back_inserter(pointers),
                           [](const auto& text) { return const_cast<char*>(text.c_str()); });
    pointers.push_back(nullptr);
    return pointers;
}

std::vector<pid_t> threadsOf(pid_t process)
{
    std::vector<pid_t> threads;
    for (const auto& entry : fs::directory_iterator(fmt::format("/proc/{}/task", process)))
        threads.push_back(std::stoi(entry.path().filename()));
    return threads;
}

void allowProcessors(pid_t process, const cpu_set_t& processors)
{
    for (const pid_t thread : threadsOf(process))
        ::sched_setaffinity(thread, sizeof processors, &processors);
}

// The sum of the numbers behind these names in a file of lines "name: number".
double sumIn(const fs::path& path, std::initializer_list<std::string_view> names)
{
    double sum = 0;
    std::ifstream file(path);
    for (std::string line; std::getline(file, line);)
        if (const auto colon = line.find(':'); colon != std::string::npos)
            if (std::ranges::find(names, std::string_view(line).substr(0, colon)) != names.end())
                sum += std::stod(line.substr(colon + 1));
    return sum;
}

} // namespace

ChildProcess ChildProcess::run(const std::function<void()>& body)
{
    const pid_t parent = ::getpid();
    const pid_t child = ::fork();
    if (child < 0)
        throw std::system_error(errno, std::generic_category(), "fork");
    if (child != 0)
        return ChildProcess(child);
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (::getppid() == parent)
        body();
    ::_exit(0);
}

ChildProcess ChildProcess::execute(const std::vector<std::string>& command, const std::vector<std::string>& environment,
                                   const fs::path& output)
{
    const auto arguments = pointersTo(command);
    const auto variables = pointersTo(environment);
    return run([&] {
        const int file = ::open(output.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
        ::dup2(file, STDOUT_FILENO);
        ::dup2(file, STDERR_FILENO);
        ::close_range(STDERR_FILENO + 1, ~0U, 0);
        ::execve(arguments.front(), arguments.data(), variables.data());
        ::_exit(127);
    });
}

bool ChildProcess::hasEnded() const
{
    siginfo_t state = {};
    return ::waitid(P_PID, static_cast<id_t>(identifier_), &state, WEXITED | WNOHANG | WNOWAIT) != 0
        || state.si_pid != 0;
}

void ChildProcess::end()
{
    if (identifier_ == 0)
        return;
    constexpr int mostWaits = 2000; // of a millisecond
    ::kill(identifier_, SIGTERM);
    for (int wait = 0; wait < mostWaits && !hasEnded(); ++wait)
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    kill();
}

void ChildProcess::kill()
{
    if (identifier_ == 0)
        return;
    ::kill(identifier_, SIGKILL);
    ::waitpid(identifier_, nullptr, 0);
    identifier_ = 0;
}

OneProcessor::OneProcessor(std::initializer_list<pid_t> others) : processes_(others)
{
    processes_.push_back(::getpid());
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(static_cast<unsigned>(::sched_getcpu()), &one);
    for (const pid_t process : processes_)
        allowProcessors(process, one);
}

OneProcessor::~OneProcessor()
{
    cpu_set_t all;
    CPU_ZERO(&all);
    for (unsigned processor = 0; processor < CPU_SETSIZE; ++processor)
        CPU_SET(processor, &all);
    for (const pid_t process : processes_)
        allowProcessors(process, all);
}

double contextSwitches(pid_t process)
{
    double count = 0;
    for (const pid_t thread : threadsOf(process))
        count += sumIn(fmt::format("/proc/{}/task/{}/status", process, thread),
                       {"voluntary_ctxt_switches", "nonvoluntary_ctxt_switches"});
    return count;
}

double processorSeconds(pid_t process)
{
    clockid_t clock{};
    timespec time{};
    if (::clock_getcpuclockid(process, &clock) != 0 || ::clock_gettime(clock, &time) != 0)
        return 0;
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

double residentMegabytes(pid_t process)
{
    return sumIn(fmt::format("/proc/{}/smaps_rollup", process), {"Rss"}) / 1024;
}

} // namespace bench
