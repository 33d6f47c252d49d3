// The subcommands of `kesto`, a file each. One that is chosen runs after the command line was read and sets the
// exit status.
#pragma once

#include <CLI/App.hpp>
#include <CLI/Config.hpp>
#include <CLI/Formatter.hpp>

// Exit statuses; a wrong command line is 2, and 3 that something is missing in what is shown.
constexpr int exitOk = 0;
constexpr int exitFailure = 1;
constexpr int exitUsage = 2;
constexpr int exitIncomplete = 3;

// That one of the subcommands must be chosen. A word that names none is then told, and not that there is none.
void requireSubcommand(CLI::App& application);

void addBugsCommand(CLI::App& application, int& exitStatus);
void addChannelsCommand(CLI::App& application, int& exitStatus);
void addClientCommand(CLI::App& application, int& exitStatus);
void addEventsCommand(CLI::App& application, int& exitStatus);
void addNotifyCommand(CLI::App& application, int& exitStatus);
void addPrefsCommand(CLI::App& application, int& exitStatus);
void addSummaryCommand(CLI::App& application, int& exitStatus);
void addTraceCommand(CLI::App& application, int& exitStatus);
