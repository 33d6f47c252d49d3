// SPDX-License-Identifier: Apache-2.0
// `kesto uplink`: becomes the program kesto-uplink, which comes in a package of its own. It takes the one beside this
// program, so that two versions do not mix, else that in PATH.
#include "kesto/Commands.h"

#include <cerrno>
#include <fmt/format.h>
#include <stdexcept>
#include <string>
#include <system_error>
#include <unistd.h>
#include <vector>

namespace {

constexpr const char* program = "kesto-uplink";

[[noreturn]] void becomeUplink(std::vector<std::string> words)
{
    std::vector<char*> arguments{const_cast<char*>(program)};
    for (std::string& word : words)
        arguments.push_back(word.data());
    arguments.push_back(nullptr);
    std::error_code error;
    const auto beside = std::filesystem::read_symlink("/proc/self/exe", error).parent_path() / program;
    ::execv(beside.c_str(), arguments.data());
    ::execvp(program, arguments.data());
    throw std::runtime_error(
        errno == ENOENT ? "kesto uplink needs kesto-uplink, which is not installed: install that package"
                        : fmt::format("cannot start kesto-uplink: {}", std::generic_category().message(errno)));
}

} // namespace

void addUplinkCommand(CLI::App& application)
{
    CLI::App* const command = application.add_subcommand(
        "uplink", "Shows what leaves the device for its maker's servers, by the program kesto-uplink");
    command->set_help_flag(); // --help is for that program, like all words behind this one
    command->prefix_command();
    command->callback([command] { becomeUplink(command->remaining()); });
}
