// SPDX-License-Identifier: Apache-2.0
// The tool inherits the test's environment, without variables that would lead it to a service of this machine.
#include "tools/kesto/Tool.h"

#include <gtest/gtest.h>
#include <unistd.h>

namespace kesto_tool {

Tool::Tool(const std::filesystem::path& root)
    : environment_{"HOME=" + (root / "home").native(),
                   "XDG_CONFIG_HOME",
                   "XDG_RUNTIME_DIR",
                   "XDG_STATE_HOME",
                   "KESTO_SOCKET",
                   "COLUMNS",
                   "TZ=UTC",
                   "RUNTIME_DIRECTORY=" + (root / "run").native(),
                   "STATE_DIRECTORY=" + (root / "state").native(),
                   "CONFIGURATION_DIRECTORY=" + (root / "configuration").native()}
{
    for (const char* name : {"run", "state", "configuration"})
        std::filesystem::create_directory(root / name);
    std::filesystem::permissions(root, std::filesystem::perms(0755));
}

Process::Arguments Tool::command(const Arguments& arguments) const
{
    Process::Arguments command;
    if (!hasRights_ && ::geteuid() == 0)
        command = {"setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"};
    command.emplace_back(KESTO_PATH);
    command.insert(command.end(), arguments.begin(), arguments.end());
    return command;
}

// The last setting of a variable counts.
static Process::Environment lastOfEach(const Process::Environment& environment)
{
    const auto nameOf = [](const std::string& variable) { return variable.substr(0, variable.find('=')); };
    Process::Environment last;
    for (const std::string& variable : environment) {
        std::erase_if(last, [&](const std::string& other) { return nameOf(other) == nameOf(variable); });
        last.push_back(variable);
    }
    return last;
}

Finished Tool::run(const Arguments& arguments, const std::string& input) const
{
    return sdk_test::run(command(arguments), input, lastOfEach(environment_));
}

std::string Tool::print(const Arguments& arguments, const std::string& input) const
{
    const Finished finished = run(arguments, input);
    EXPECT_EQ(finished.status, 0) << finished.errors;
    EXPECT_EQ(finished.errors, "");
    return finished.output;
}

std::unique_ptr<Process> Tool::start(const Arguments& arguments) const
{
    return std::make_unique<Process>(command(arguments), lastOfEach(environment_));
}

std::unique_ptr<TerminalProcess> Tool::startOnTerminal(const Arguments& arguments) const
{
    return std::make_unique<TerminalProcess>(command(arguments), lastOfEach(environment_));
}

Process::Environment Tool::environmentOfShell() const
{
    Process::Environment environment = lastOfEach(environment_);
    environment.emplace_back(std::string("kesto=") + KESTO_PATH);
    return environment;
}

std::unique_ptr<TerminalProcess> Tool::startShellOnTerminal(const std::string& script) const
{
    return std::make_unique<TerminalProcess>(Arguments{"bash", "-c", script}, environmentOfShell());
}

Finished Tool::runShell(const std::string& script) const
{
    return sdk_test::run({"sh", "-c", script}, {}, environmentOfShell());
}

} // namespace kesto_tool
