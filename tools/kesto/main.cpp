// SPDX-License-Identifier: Apache-2.0
// kesto: lets a person call the service and read its results.
#include "kesto/Commands.h"
#include "kesto/RunCommandLine.h"

#include <CLI/Error.hpp>
#include <charconv>
#include <cstdint>
#include <string>

void requireSubcommand(CLI::App& application)
{
    application.require_subcommand(0, 1);
    application.callback([&application] {
        if (application.get_subcommands().empty())
            throw CLI::RequiredError::Subcommand(1);
    });
}

CLI::Validator atLeastOne()
{
    return CLI::Validator(
        [](const std::string& text) {
            std::int64_t number = 0;
            const char* const end = text.data() + text.size();
            const bool isNumber = std::from_chars(text.data(), end, number).ptr == end;
            return isNumber && number >= 1 ? std::string() : "\"" + text + "\" is not a number from 1 on";
        },
        "");
}

// "nan" is a number, too, and compares with none.
CLI::Validator secondsToWait()
{
    return CLI::Validator(
        [](const std::string& text) {
            double seconds = 0;
            const char* const end = text.data() + text.size();
            const bool isNumber = std::from_chars(text.data(), end, seconds).ptr == end;
            return isNumber && seconds >= shortestWait && seconds <= longestWait
                ? std::string()
                : "\"" + text + "\" is not a number from 0.01 to 86400";
        },
        "");
}

int main(int argumentCount, char** arguments)
{
    fillStandardDescriptors();
    CLI::App application("Calls the audio reporting service and shows its results.", "kesto");
    application.set_version_flag("--version", "kesto " KESTO_VERSION);
    requireSubcommand(application);
    int exitStatus = exitOk;
    addBugsCommand(application, exitStatus);
    addChannelsCommand(application, exitStatus);
    addClientCommand(application, exitStatus);
    addEventsCommand(application, exitStatus);
    addNotifyCommand(application, exitStatus);
    addPrefsCommand(application, exitStatus);
    addReportCommand(application, exitStatus);
    addSessionsCommand(application, exitStatus);
    addStatusCommand(application, exitStatus);
    addSummaryCommand(application, exitStatus);
    addTopCommand(application, exitStatus);
    addTraceCommand(application, exitStatus);
    addUplinkCommand(application);
    return runCommandLine(application, argumentCount, arguments, exitStatus);
}
