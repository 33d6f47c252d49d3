// SPDX-License-Identifier: Apache-2.0
// `kesto notify`: posts a system notification by writing its file, notifications/<name> in the runtime directory. The
// text of the file is the state.
#include "kesto/Commands.h"
#include "kesto/ServiceDirectories.h"
#include "kesto/files/FileReplacement.h"
#include "platform/linux/files/FileDescriptor.h"

#include <cerrno>
#include <charconv>
#include <cstdint>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <system_error>

namespace fs = std::filesystem;

namespace {

struct NotifyOptions {
    fs::path directory;
    std::string name;
    std::string state; // empty: unchanged
};

std::string wrongName(const std::string& name)
{
    constexpr std::size_t longest = 255;
    if (!name.empty() && !name.starts_with('.') && name.size() <= longest && !name.contains('/'))
        return {};
    return "\"" + name + R"(" cannot be the name of a notification: no "/", no "." at its beginning, 255 bytes)";
}

std::string wrongState(const std::string& text)
{
    std::uint64_t state = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), state);
    if (error == std::errc() && end == text.data() + text.size())
        return {};
    return "\"" + text + "\" is not a state: give a number from 0 to 18446744073709551615";
}

// Closing a file that was open for writing posts it; changing its times would post it again. A missing file is made,
// without a state.
void touch(const fs::path& path)
{
    if (std::error_code error; !fs::exists(path, error) && !error)
        return replaceFile(path, {});
    const platform::FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    if (!file)
        throw std::runtime_error(
            fmt::format("cannot write {}: {}", path.native(), std::generic_category().message(errno)));
}

void notify(const NotifyOptions& options)
{
    if (std::error_code error; !fs::exists(options.directory, error))
        throw std::runtime_error(
            fmt::format("the runtime directory {} does not exist: is kestod installed? Name another with --directory",
                        options.directory.native()));
    const fs::path directory = options.directory / "notifications";
    makeDirectory(directory);
    if (options.state.empty())
        touch(directory / options.name);
    else
        replaceFile(directory / options.name, options.state + '\n');
}

} // namespace

void addNotifyCommand(CLI::App& application, int& exitStatus)
{
    const auto options = std::make_shared<NotifyOptions>();
    CLI::App* command = application.add_subcommand("notify", "Posts a system notification");
    command->add_option("--directory", options->directory,
                        "The service's runtime directory, if it is not at its usual place");
    command->add_option("NAME", options->name, "Such as com.quarn.halden.ringerstate")->required()->check(wrongName);
    command->add_option("STATE", options->state, "Its new state, a number; by default it keeps its state")
        ->check(wrongState);
    command->footer(R"(Turns the ringer on and reports it to every session:
  kesto notify com.quarn.halden.ringerstate 1)");
    command->callback([options, &exitStatus] {
        if (options->directory.empty())
            options->directory = usualRuntimeDirectory();
        notify(*options);
        exitStatus = exitOk;
    });
}
