// SPDX-License-Identifier: Apache-2.0
// How a program with subcommands begins and ends: its standard descriptors, its command line, its errors and its exit
// status.
#pragma once

#include "kesto/ExitStatus.h"

#include <CLI/App.hpp>
#include <CLI/Error.hpp>
#include <cstdio>
#include <exception>
#include <fcntl.h>
#include <stdexcept>
#include <unistd.h>

// Where the caller has closed one of the three, the next file or socket would get its number, and what is printed would
// go there. Standard output gets a file that cannot be written, so that a lost output is a failure.
inline void fillStandardDescriptors()
{
    for (const int number : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO})
        if (::fcntl(number, F_GETFD) < 0)
            ::open("/dev/null", number == STDERR_FILENO ? O_WRONLY : O_RDONLY); // stays open under that number
}

// Runs the subcommand that the words name. It leaves its exit status in `exitStatus`, which this returns if all went
// well.
inline int runCommandLine(CLI::App& application, int argumentCount, char** arguments, const int& exitStatus)
{
    try {
        application.parse(argumentCount, arguments);
        if (std::fflush(stdout) != 0 || std::ferror(stdout) != 0)
            throw std::runtime_error("the output could not be written");
        return exitStatus;
    } catch (const CLI::ParseError& error) {
        return application.exit(error) == 0 ? exitOk : exitUsage; // CLI11 reports help and version as errors, too
    } catch (const std::exception& exception) {
        std::fprintf(stderr, "%s: %s\n", application.get_name().c_str(), exception.what());
        return exitFailure;
    }
}
