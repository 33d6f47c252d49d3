// kestod: puts the service object on the Linux platform and gives the main thread to the listener, for the life of the
// process. It has no command line; the launch configuration is in the environment.
#include "platform/linux/LaunchConfiguration.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/process/ServiceManager.h"
#include "service/KestoReportingServiceDelegate.h"
#include "tracing/TraceRunner.h"
#include "utility/LogCategories.h"

#include <csignal>
#include <cstdio>
#include <string>

namespace {

// Prints one line with the reason; returns the status with which a service manager does not start the process again.
int cannotRun(const std::string& reason)
{
    std::fputs(("kestod: " + reason + "\n").c_str(), stderr);
    return platform::LaunchConfiguration::exitStatus;
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
int serve(platform::ConnectionListener& listener) noexcept
{
    listener.resume();
    return 0;
}

int run()
{
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
    const auto service = KestoReportingServiceDelegate::make();
    (*listener)->setDelegate(*service);
    (*listener)->setListeningHandler([] { platform::notifyReady("accepting connections"); });
    return serve(**listener);
}

} // namespace

int main()
{
    std::signal(SIGPIPE, SIG_IGN); // the log's reader may end; the service goes on
    try {
        return run();
    } catch (const std::exception& exception) { // thrown before clients can connect: out of memory or threads
        return cannotRun(exception.what());
    }
}
