// SPDX-License-Identifier: Apache-2.0
// kesto-uplink: sends what the maker of a device allowed to the maker's servers. It runs beside the reporting service,
// which knows nothing of it.
#include "kesto-uplink/Commands.h"
#include "kesto/RunCommandLine.h"

int main(int argumentCount, char** arguments)
{
    fillStandardDescriptors();
    CLI::App application("Sends what the maker of a device allowed to the maker's servers.", "kesto-uplink");
    application.set_version_flag("--version", "kesto-uplink " KESTO_VERSION);
    application.require_subcommand(1);
    int exitStatus = exitOk;
    kesto_uplink::addForgetCommand(application, exitStatus);
    kesto_uplink::addPreviewCommand(application, exitStatus);
    kesto_uplink::addRunCommand(application, exitStatus);
    kesto_uplink::addStatusCommand(application, exitStatus);
    return runCommandLine(application, argumentCount, arguments, exitStatus);
}
