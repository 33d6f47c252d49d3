// SPDX-License-Identifier: Apache-2.0
// kesto-pipewire: reports every stream of a running PipeWire to the reporting service, so that players stay unchanged.
//
// This file connects the parts: the observer of PipeWire; the reporter, which decides what to report; the connection to
// the service; and the channels, which the service reads directly. The program runs until a signal ends it and then
// ends every session. If one of the two servers goes, it waits until the server is back.

#include "kesto-pipewire/DeviceChannels.h"
#include "kesto-pipewire/Diagnostics.h"
#include "kesto-pipewire/LibkestoService.h"
#include "kesto-pipewire/Loop.h"
#include "kesto-pipewire/Observer.h"
#include "kesto-pipewire/Reporter.h"
#include "platform/linux/process/Environment.h"

#include <CLI/CLI.hpp>
#include <pipewire/pipewire.h>

#include <sysexits.h>
#include <unistd.h>

#include <csignal>
#include <string>
#include <system_error>

namespace kesto_pipewire {

namespace {

constexpr int exitUndelivered = 1;

struct CommandLine {
    std::string socket;
    std::string remote;
    std::string channels;
    bool verbose = false;
};

// Sets up PipeWire's library before its users, and tears it down after them.
class Library {
public:
    Library()
    {
        pw_init(nullptr, nullptr);
        // The program has its own messages, so the library's log is off unless the variable switches it on.
        if (platform::environment("PIPEWIRE_DEBUG").empty())
            pw_log_set_level(SPA_LOG_LEVEL_NONE);
    }
    ~Library() { pw_deinit(); }
    Library(const Library&) = delete;
    Library& operator=(const Library&) = delete;
};

// Other programs choose reporter IDs too, perhaps from 1 upwards. The process ID makes this program's IDs different,
// and keeps them below 2^53, beyond which readers of JSON lose digits.
ReporterID firstReporterID()
{
    return (ReporterID{getpid()} << 24) + 1;
}

int run(const CommandLine& options)
{
    const Diagnostics diagnostics(options.verbose);
    const Library library;
    Loop loop;
    const auto end = [&loop] { loop.quit(); };
    const auto terminate = loop.addSignal(SIGTERM, end);
    const auto interrupt = loop.addSignal(SIGINT, end);

    // Before the connection, so that a service that the connection starts finds the channels.
    DeviceChannels channels(options.channels, diagnostics);
    LibkestoService service(loop, options.socket, diagnostics);
    Source alarm;
    const auto setAlarm = [&](std::optional<double> uptime) {
        if (uptime)
            loop.arm(alarm, *uptime - currentMoment().uptime);
        else
            loop.disarm(alarm);
    };
    Reporter reporter(service, firstReporterID(), setAlarm, [&channels] { channels.flush(); });
    alarm = loop.addTimer([&reporter] { reporter.settle(currentMoment()); });
    Observer observer(loop, options.remote, reporter, channels, diagnostics);

    service.open(
        {.appeared = [&reporter] { reporter.serviceAppeared(); }, .lost = [&reporter] { reporter.serviceLost(); }});
    observer.start();
    loop.run();
    observer.stop();
    return service.close() ? EX_OK : exitUndelivered;
}

} // namespace

} // namespace kesto_pipewire

int main(int argumentCount, char** arguments)
{
    kesto_pipewire::CommandLine options;
    CLI::App app("Reports every stream of a running PipeWire to the Kesto reporting service.", "kesto-pipewire");
    app.add_option("--socket", options.socket, "Socket of the reporting service")->type_name("PATH");
    app.add_option("--remote", options.remote, "Name or socket of the PipeWire server")->type_name("NAME");
    app.add_option("--channels", options.channels, "Root of the channel tree, for the statistics of devices")
        ->type_name("PATH");
    app.add_flag("--verbose", options.verbose, "Print every report");
    app.set_version_flag("--version", std::string("kesto-pipewire ") + kesto_version());
    try {
        app.parse(argumentCount, arguments);
        return kesto_pipewire::run(options);
    } catch (const CLI::ParseError& error) {
        return app.exit(error) == 0 ? EX_OK : EX_USAGE;
    } catch (const std::system_error& error) {
        fmt::print(stderr, "kesto-pipewire: {}\n", error.what());
        return error.code() == std::errc::invalid_argument ? EX_CONFIG : EX_OSERR;
    }
}
