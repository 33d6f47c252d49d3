// SPDX-License-Identifier: Apache-2.0
// kestod: puts the service object on the Linux platform and gives the main thread to the listener, until a signal ends
// the process. The launch configuration is in the environment; on its command line it only answers who it is.
#include "ledger/Report.h"
#include "platform/linux/LaunchConfiguration.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/process/DescriptorTable.h"
#include "platform/linux/process/EndSignals.h"
#include "platform/linux/process/ServiceManager.h"
#include "service/KestoReportingServiceDelegate.h"
#include "service/StatusNotifier.h"
#include "session/StorageBudget.h"
#include "tracing/TraceRunner.h"
#include "utility/EndProcess.h"
#include "utility/KestoReportingUtility.h"
#include "utility/LogCategories.h"

#include <csignal>
#include <cstdio>
#include <memory>
#include <string>
#include <string_view>

namespace {

// Prints one line with the reason; returns the status with which a service manager does not start the process again.
int cannotRun(const std::string& reason)
{
    std::fputs(("kestod: " + reason + "\n").c_str(), stderr);
    return platform::LaunchConfiguration::exitStatus;
}

constexpr const char* help = R"(Usage: kestod [--help | --version]

The Kesto reporting service: takes reports about the use of audio on a Unix socket and stores them.
It runs until a signal ends it, takes no other arguments, and is best started by systemd:

  systemctl enable --now kestod.socket            for the system
  systemctl --user enable --now kestod.socket     for one user

Without systemd, its environment names what it needs:

  RUNTIME_DIRECTORY         where its socket is made
  STATE_DIRECTORY           where it stores events
  LOGS_DIRECTORY            where it writes summaries and traces
  CONFIGURATION_DIRECTORY   where its configuration is; may be missing
  KESTO_SERVICE_NAME        the name of the socket: com.quarn.kesto.reporting
  KESTO_LOG                 what it logs: error, default, info or debug

See kestod(8). What it stored shows kesto(1).
)";

int answer(std::string_view argument)
{
    if (argument == "--version")
        return std::puts("kestod " KESTO_VERSION) < 0;
    if (argument == "--help" || argument == "-h")
        return std::fputs(help, stdout) < 0;
    return cannotRun("it takes no argument but --help and --version, not " + std::string(argument)
                     + "; its configuration is in its environment");
}

std::expected<platform::ListeningSocket, std::string> takeSocket(platform::LaunchConfiguration& launch)
{
    if (launch.passedSocket)
        return *std::move(launch.passedSocket);
    auto socket = platform::ListeningSocket::bind(launch.socketPath);
    if (!socket)
        return std::unexpected("cannot listen at " + launch.socketPath.string() + ": " + description(socket.error()));
    return *std::move(socket);
}

// Clients rely on the service by now. An exception does not mean a wrong configuration any more: it ends the process,
// as on every other thread, and the service manager starts the service again.
//
// At the end nothing is destroyed but the listener. Threads of traces run as long as the process and use the platform,
// and an end that is cut short cannot destroy it either: so there is one way out, and nothing that only the other way
// would do. The socket's file goes last: a next service that finds it gives way, instead of finding the store in use.
[[noreturn]] void serve(platform::LinuxPlatform& platform,
                        std::unique_ptr<platform::LinuxConnectionListener> listener) noexcept
{
    listener->resume();
    platform.finish();
    listener.reset();
    utility::endProcess(platform::EndSignals::exitStatus);
}

void logEnd(const std::string& request)
{
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "the service ends: {}", request);
    platform::notifyStopping("ending: " + request);
}

ledger::MemoryState memoryState()
{
    const platform::MemoryLimits limits = platform::current().memory.limits();
    return {.used = session::StorageBudget::service()->taken(),
            .limit = limits.ofTheService,
            .limitOfAUser = limits.ofAUser,
            .limitOfAClient = limits.ofAClient};
}

// As many clients as a device has, with room to spare; 128 KiB of the kernel's memory.
constexpr std::size_t usualDescriptors = 16'384;

int run()
{
    platform::reserveDescriptors(usualDescriptors); // first: it is quick only while there is one thread
    platform::EndSignals endSignals; // before any other thread, because each must block them
    auto launch = platform::LaunchConfiguration::fromEnvironment();
    if (!launch)
        return cannotRun(launch.error());
    auto socket = takeSocket(*launch); // first, so that a second service ends before it opens the store of the first
    if (!socket)
        return cannotRun(socket.error());
    platform::LinuxPlatform platform(*launch);
    auto listener = platform::LinuxConnectionListener::create(*std::move(socket), platform.platform().ledger,
                                                              KestoReportingClientCategory());
    if (!listener)
        return cannotRun("cannot accept connections: " + listener.error().message());
    platform::install(platform.platform());
    platform.removeUnfinished(KestoReportingTracingLogsDirectory());
    (*listener)->setEmitterAccess(platform.emitterAccess());
    (*listener)->setMemory(platform.platform().memory);
    const auto service = KestoReportingServiceDelegate::make();
    (*listener)->setDelegate(*service);
    const ledger::ServiceProcess process{
        .version = KESTO_VERSION,
        .isInternalBuild = KestoReportingUtilityIsInternalBuild(),
        .started = platform.platform().clock.secondsSince1970(),
        .isStoring = [] { return platform::current().analytics.isEnabled(); },
        .isStoringStretches = [&platform] { return platform.analyticsStore().keepsStretches(); },
        .memory = memoryState,
        .backlog = [&platform] { return platform.backlog(); }};
    (*listener)->setStatus([&ledger = platform.platform().ledger, process](bool withCulprits) {
        return ledger::report(ledger, process, withCulprits);
    });
    (*listener)->setListeningHandler([] { platform::notifyReady("accepting connections"); });
    if (platform::hasServiceManager())
        service::StatusNotifier::start(platform.platform().ledger, platform.platform().clock,
                                       platform.platform().workQueues, process, platform::notifyStatus);
    (*listener)->setStoppedHandler([&endSignals, &platform] {
        platform.analyticsStore().beginEnd();
        logEnd(*endSignals.request());
    });
    endSignals.setHandlers({.begin = [&target = **listener] { target.stop(); },
                            .giveUp =
                                [&platform](std::string_view reason) {
                                    platform.giveUp(reason);
                                    utility::reportLosses();
                                }});
    serve(platform, *std::move(listener));
}

} // namespace

int main(int argumentCount, char** arguments)
{
    if (argumentCount > 1)
        return answer(arguments[1]);
    std::signal(SIGPIPE, SIG_IGN); // the log's reader may end; the service goes on
    try {
        return run();
    } catch (const std::exception& exception) { // thrown before clients can connect: out of memory or threads
        return cannotRun(exception.what());
    }
}
