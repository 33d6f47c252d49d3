// SPDX-License-Identifier: Apache-2.0
// The cost of sending for the thread that calls libkesto, which may be a real-time thread: time, and system calls (none
// are allowed). The peer is a program without the library, which writes as many bytes to a socket.
#include "Groups.h"
#include "support/SampleMessage.h"
#include "support/ServiceProcess.h"

#include <array>
#include <csignal>
#include <cstddef>
#include <fmt/format.h>
#include <kesto/kesto.hpp>
#include <kesto/playback.hpp>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <stdexcept>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <thread>
#include <unistd.h>

namespace bench {
namespace {

constexpr std::size_t burst = 256; // messages that fit in the client's queue
constexpr std::size_t bursts = 100;

void check(kesto::Status status)
{
    if (status != kesto::Status::Ok)
        throw std::runtime_error(fmt::format("libkesto: {}", kesto::errorText(status)));
}

// A program that reports, with the sample session started.
class LibraryReporter {
public:
    explicit LibraryReporter(const ServiceProcess& service)
    {
        (void)service.connect(); // once it listens
        kesto::Options options;
        options.socketPath = service.socketPath();
        check(client_.open(options));
        check(client_.createSession(sampleReporterID));
        check(client_.startSession(sampleReporterID));
        playback_ = kesto::Playback(client_, "player", kesto::ServiceType::Test);
        check(playback_.start({"S16LE", 44100, 2}, "speaker"));
        settle();
    }

    // Fills the message again, with the next number.
    void build()
    {
        message_.clear()
            .add("session_output_running", true)
            .add("session_selected_format", "S24LE/48000/2")
            .add("mChannelsPerFrame", 2)
            .add("active_devices", "Built-in Speakers")
            .add("PomoSessionVolume", 0.8125)
            .add("kestoreporting_timestamp", 1'767'225'600.25)
            .add("systemuptime_sec", 86'523)
            .add("spatializationEnabled", false)
            .add("ringerstate", true)
            .add("frames_rendered", number_++);
    }
    void send() { check(client_.send(message_, kesto::Category::Playback, kesto::EventType::Start, sampleReporterID)); }
    // A change each time.
    void setVolume() { check(playback_.volume(number_++ % 2 == 0 ? 0.25 : 0.75)); }
    // Waits until all messages are answered.
    void settle()
    {
        const auto isSettled = [this] {
            const auto counts = client_.statistics();
            return client_.flush(std::chrono::seconds(1)) == kesto::Status::Ok && counts.answered == counts.queued;
        };
        constexpr std::chrono::seconds patience(10);
        for (const auto start = Clock::now(); !isSettled(); std::this_thread::sleep_for(std::chrono::milliseconds(1)))
            if (Clock::now() - start > patience)
                throw std::runtime_error("libkesto's messages are not answered");
    }

private:
    kesto::Client client_;
    kesto::Playback playback_;
    kesto::Message message_;
    std::uint32_t number_ = numberMark;
};

// --- System calls

volatile std::sig_atomic_t systemCalls = 0;

void countSystemCall(int, siginfo_t*, void*)
{
    systemCalls = systemCalls + 1;
}

// From now on each system call of this thread is refused and counted, except the one that ends the thread.
void trapSystemCalls()
{
    struct sigaction action = {};
    action.sa_sigaction = countSystemCall;
    action.sa_flags = SA_SIGINFO;
    ::sigaction(SIGSYS, &action, nullptr);
    std::array<sock_filter, 5> filter{{
        BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_rt_sigreturn, 1, 0),
        BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_exit, 0, 1),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
        BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_TRAP),
    }};
    const sock_fprog program{filter.size(), filter.data()};
    ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0);
    ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program);
}

// The number of system calls that a burst makes on its thread.
template <typename Send> double systemCallsOf(Send send)
{
    systemCalls = 0;
    std::thread([&send] {
        trapSystemCalls();
        ::syscall(SYS_getppid); // to check that counting works
        for (std::size_t each = 0; each < burst; ++each)
            send();
        ::syscall(SYS_exit, 0); // not by returning: that needs other system calls
    }).join();
    if (systemCalls == 0)
        throw std::runtime_error("system calls cannot be counted on this machine");
    return systemCalls - 1;
}

// --- Time

struct SendTimes {
    std::vector<double> medians;
    std::vector<double> slowest; // of a thousand
};

// Nanoseconds of single calls of `send`; `prepare` and `settle` run between them.
template <typename Prepare, typename Send, typename Settle>
void time(SendTimes& times, Prepare prepare, Send send, Settle settle)
{
    constexpr double allButOneOfAThousand = 0.999;
    std::vector<double> each;
    for (std::size_t round = 0; round < bursts; ++round) {
        for (std::size_t message = 0; message < burst; ++message) {
            prepare();
            const auto start = Clock::now();
            send();
            each.push_back(nanosecondsSince(start));
        }
        settle();
    }
    times.medians.push_back(median(each));
    times.slowest.push_back(quantile(std::move(each), allButOneOfAThousand));
}

// Reads the bytes and drops them.
ChildProcess runSink(const SocketPair& sockets)
{
    return ChildProcess::run([&] {
        std::array<char, 65536> bytes{};
        while (::recv(sockets.server.get(), bytes.data(), bytes.size(), 0) > 0) { }
    });
}

} // namespace

void measureClientLibrary(const BenchOptions& options, Report& report)
{
    const ServiceProcess service(options);
    LibraryReporter reporter(service);
    const std::string what = "libkesto's send, caller's side";

    SocketPair sockets;
    const ChildProcess sink = runSink(sockets);
    const std::string bytes = sampleFrame();
    const auto sendToSocket = [&] { writeAll(sockets.client.get(), bytes); };

    SendTimes ours;
    SendTimes built;
    SendTimes volumes;
    SendTimes theirs;
    std::vector<double> calls;
    std::vector<double> theirCalls;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("{}: round {} of {}", what, round + 1, options.rounds));
        time(ours, [&] { reporter.build(); }, [&] { reporter.send(); }, [&] { reporter.settle(); });
        time(
            built, [] {},
            [&] {
                reporter.build();
                reporter.send();
            },
            [&] { reporter.settle(); });
        time(volumes, [] {}, [&] { reporter.setVolume(); }, [&] { reporter.settle(); });
        time(theirs, [] { }, sendToSocket, [] { });
        calls.push_back(systemCallsOf([&] {
            reporter.build();
            reporter.send();
        }));
        reporter.settle();
        theirCalls.push_back(burst);
    }
    clearProgress();
    const std::string socket = "send(2) of as many bytes";
    report.add({what + ", median", "ns", ours.medians, PeerFigure{socket, theirs.medians}, Target::figureAtMost(1000)});
    report.add({what + ", p99.9", "ns", ours.slowest, PeerFigure{socket, theirs.slowest}, Target::figureAtMost(1000)});
    report.add({fmt::format("{}, system calls of {}", what, burst), "", calls, PeerFigure{socket, theirCalls},
                Target::figureAtMost(0)});
    report.add({"building the message and sending it, median", "ns", built.medians});
    report.add({"setting a playback's volume, caller's side, median", "ns", volumes.medians, std::nullopt,
                Target::figureAtMost(1000)});
}

} // namespace bench
