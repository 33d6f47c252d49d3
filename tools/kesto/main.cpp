// kesto: how a person talks to the service and reads what it found out.
#include "Commands.h"

#include <CLI/Error.hpp>
#include <cstdio>
#include <exception>

int main(int argumentCount, char** arguments)
{
    CLI::App application("Talks to the audio reporting service and shows what it stored.", "kesto");
    application.set_version_flag("--version", "kesto " KESTO_VERSION);
    application.require_subcommand(1);
    int exitStatus = exitOk;
    addClientCommand(application, exitStatus);
    addEventsCommand(application, exitStatus);
    try {
        application.parse(argumentCount, arguments);
        return exitStatus;
    } catch (const CLI::ParseError& error) {
        return application.exit(error) == 0 ? exitOk : exitUsage; // help and version come this way, too
    } catch (const std::exception& exception) {
        std::fprintf(stderr, "kesto: %s\n", exception.what());
        return exitFailure;
    }
}
