// SPDX-License-Identifier: Apache-2.0
// The subcommands of `kesto`, one in each file. The chosen one runs after the command line was parsed and sets the exit
// status.
#pragma once

#include "kesto/ExitStatus.h"

#include <CLI/App.hpp>
#include <CLI/Config.hpp>
#include <CLI/Formatter.hpp>
#include <CLI/Validators.hpp>

// Requires a subcommand. For an unknown word the error names the word, instead of a missing subcommand.
void requireSubcommand(CLI::App& application);
// For a number of things to show, of which none would make no sense.
[[nodiscard]] CLI::Validator atLeastOne();
// For the seconds between two looks: from `shortestWait` to `longestWait`.
constexpr double shortestWait = 0.01;
constexpr double longestWait = 86'400;
[[nodiscard]] CLI::Validator secondsToWait();

void addBugsCommand(CLI::App& application, int& exitStatus);
void addChannelsCommand(CLI::App& application, int& exitStatus);
void addClientCommand(CLI::App& application, int& exitStatus);
void addEventsCommand(CLI::App& application, int& exitStatus);
void addNotifyCommand(CLI::App& application, int& exitStatus);
void addPrefsCommand(CLI::App& application, int& exitStatus);
void addReportCommand(CLI::App& application, int& exitStatus);
void addSessionsCommand(CLI::App& application, int& exitStatus);
void addStatusCommand(CLI::App& application, int& exitStatus);
void addSummaryCommand(CLI::App& application, int& exitStatus);
void addTopCommand(CLI::App& application, int& exitStatus);
void addTraceCommand(CLI::App& application, int& exitStatus);
void addUplinkCommand(CLI::App& application);
