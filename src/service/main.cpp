// kestod: puts the service object on the Linux platform and gives the main thread to the listener, for the life of
// the process. There is no command line; the launch configuration is all in the environment.
#include "platform/linux/LaunchConfiguration.h"
#include "platform/linux/LinuxPlatform.h"
#include "platform/linux/connection/LinuxConnectionListener.h"
#include "platform/linux/process/ServiceManager.h"
#include "service/KestoReportingServiceDelegate.h"
#include "tracing/TraceRunner.h"
#include "utility/KestoReportingLogCategories.h"

#include <csignal>
#include <cstdio>
#include <string>

namespace {

// One line that says why, and the status that keeps a service manager from trying again.
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

// Clients rely on the service by now. What is thrown is no matter of the configuration any more: it ends the process as
// it would on every other thread, and the service manager starts it again.
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
    auto socket = takeSocket(*launch); // first: a second service gives way before it opens the store of the first
    if (!socket)
        return cannotRun(socket.error());
    auto listener = platform::LinuxConnectionListener::create(*std::move(socket), KestoReportingClientCategory());
    if (!listener)
        return cannotRun("cannot accept connections: " + listener.error().message());

    platform::LinuxPlatform platform(*launch);
    platform::install(platform.platform());
    platform.removeUnfinished(KestoReportingTracingLogsDirectory());
    (*listener)->setTraceAccess(platform.traceMarkerAccess());
    const auto service = KestoReportingServiceDelegate::make();
    (*listener)->setDelegate(*service);
    (*listener)->setListeningHandler([] { platform::notifyReady("accepting connections"); });
    return serve(**listener);
}

} // namespace

int main()
{
    std::signal(SIGPIPE, SIG_IGN); // nobody reads the log any more: no reason to end
    try {
        return run();
    } catch (const std::exception& exception) { // what is thrown before anybody can connect: no memory, no threads
        return cannotRun(exception.what());
    }
}
