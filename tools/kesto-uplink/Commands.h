// SPDX-License-Identifier: Apache-2.0
// The subcommands of `kesto-uplink`, one in each file, and what they have in common. The chosen one runs after the
// command line was parsed and sets the exit status.
#pragma once

#include "kesto-uplink/Places.h"

#include <CLI/App.hpp>
#include <CLI/Config.hpp>
#include <CLI/Formatter.hpp>
#include <CLI/Validators.hpp>

namespace kesto_uplink {

// --configuration, --database and --state.
void addPlaceOptions(CLI::App& command, Places& places);

void addForgetCommand(CLI::App& application, int& exitStatus);
void addPreviewCommand(CLI::App& application, int& exitStatus);
void addRunCommand(CLI::App& application, int& exitStatus);
void addStatusCommand(CLI::App& application, int& exitStatus);

} // namespace kesto_uplink
