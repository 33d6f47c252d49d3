// SPDX-License-Identifier: Apache-2.0
// How the tool ends; 2 is a wrong command line. `kesto status` has some of its own.
#pragma once

constexpr int exitOk = 0;
constexpr int exitFailure = 1;
constexpr int exitUsage = 2;
constexpr int exitIncomplete = 3; // the results are not whole
