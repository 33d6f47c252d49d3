// SPDX-License-Identifier: Apache-2.0
// The tool as it is shipped, in an environment of its own that names the directories of one service.
#pragma once

#include "sdk/Process.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto/TerminalProcess.h"

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace kesto_tool {

using sdk_test::Finished;
using sdk_test::Process;

// One thread.
class Tool {
public:
    using Arguments = std::vector<std::string>;

    // Uses the directories run, state and configuration below that root; times are in UTC.
    explicit Tool(const std::filesystem::path& root);

    // "NAME=value", or "NAME" to remove the variable.
    void setVariable(const std::string& variable) { environment_.push_back(variable); }
    // From now on the tool runs without special rights, as far as possible; it may use the root's directories.
    void giveUpRights() { hasRights_ = false; }

    // Runs the tool to its end with that input.
    [[nodiscard]] Finished run(const Arguments& arguments, const std::string& input = {}) const;
    // The output of a run that must succeed without error messages.
    [[nodiscard]] std::string print(const Arguments& arguments, const std::string& input = {}) const;
    [[nodiscard]] std::unique_ptr<Process> start(const Arguments& arguments) const;
    // On a terminal of its own.
    [[nodiscard]] std::unique_ptr<TerminalProcess> startOnTerminal(const Arguments& arguments) const;
    // A script of bash on a terminal of its own, with the program's path as $kesto.
    [[nodiscard]] std::unique_ptr<TerminalProcess> startShellOnTerminal(const std::string& script) const;
    // Runs a shell command, with the program's path as $kesto.
    [[nodiscard]] Finished runShell(const std::string& script) const;

private:
    [[nodiscard]] Process::Environment environmentOfShell() const;
    [[nodiscard]] Process::Arguments command(const Arguments& arguments) const;

    Process::Environment environment_;
    bool hasRights_ = true;
};

} // namespace kesto_tool
