// SPDX-License-Identifier: Apache-2.0
// kesto-uplink: sends what the maker of a device allowed to the maker's servers. It runs beside the reporting service,
// which knows nothing of it.
#include "kesto-uplink/Commands.h"
#include "kesto/ExitStatus.h"

#include <CLI/Error.hpp>
#include <cstdio>
#include <exception>
#include <stdexcept>

int main(int argumentCount, char** arguments)
{
    CLI::App application("Sends what the maker of a device allowed to the maker's servers.", "kesto-uplink");
    application.set_version_flag("--version", "kesto-uplink " KESTO_VERSION);
    application.require_subcommand(1);
    int exitStatus = exitOk;
    kesto_uplink::addForgetCommand(application, exitStatus);
    kesto_uplink::addPreviewCommand(application, exitStatus);
    kesto_uplink::addRunCommand(application, exitStatus);
    kesto_uplink::addStatusCommand(application, exitStatus);
    try {
        application.parse(argumentCount, arguments);
        if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0)
            throw std::runtime_error("the output could not be written");
        return exitStatus;
    } catch (const CLI::ParseError& error) {
        return application.exit(error) == 0 ? exitOk : exitUsage; // CLI11 reports help and version as errors, too
    } catch (const std::exception& exception) {
        std::fprintf(stderr, "kesto-uplink: %s\n", exception.what());
        return exitFailure;
    }
}
