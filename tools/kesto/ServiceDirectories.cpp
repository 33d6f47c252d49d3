// SPDX-License-Identifier: Apache-2.0
// One rule for all directories: only their names differ.
#include "kesto/ServiceDirectories.h"

#include "platform/linux/process/Environment.h"

#include <initializer_list>
#include <string>
#include <system_error>

namespace fs = std::filesystem;
using platform::environment;

namespace {

// The variable's directory; without it the first of the user's directories that holds the file (with an empty name,
// that exists); else the system's.
fs::path usualDirectory(const char* variable, std::initializer_list<fs::path> ofUser, const fs::path& ofSystem,
                        const fs::path& file = {})
{
    if (const std::string value = environment(variable); !value.empty())
        return fs::absolute(value.substr(0, value.find(':'))); // systemd passes several when a unit has several
    for (const fs::path& directory : ofUser)
        if (std::error_code error; directory.is_absolute() && fs::exists(directory / file, error))
            return directory;
    return ofSystem;
}

// The file in the state directory.
fs::path usualStateFile(const fs::path& name)
{
    const fs::path home = environment("HOME");
    // The last is the place of a user's service manager before version 254.
    return usualDirectory("STATE_DIRECTORY",
                          {fs::path(environment("XDG_STATE_HOME")) / "kesto", home / ".local/state/kesto",
                           fs::path(environment("XDG_CONFIG_HOME")) / "kesto", home / ".config/kesto"},
                          "/var/lib/kesto", name)
        / name;
}

} // namespace

fs::path usualDatabase()
{
    return usualStateFile("analytics.sqlite3");
}

fs::path usualLedger()
{
    return usualStateFile("analytics.ledger");
}

fs::path usualSocket()
{
    const fs::path name = "com.quarn.kesto.reporting";
    if (const std::string given = environment("KESTO_SOCKET"); !given.empty())
        return given;
    return usualDirectory("RUNTIME_DIRECTORY", {fs::path(environment("XDG_RUNTIME_DIR")) / "kesto"}, "/run/kesto", name)
        / name;
}

fs::path usualConfigurationDirectory()
{
    return usualDirectory(
        "CONFIGURATION_DIRECTORY",
        {fs::path(environment("XDG_CONFIG_HOME")) / "kesto", fs::path(environment("HOME")) / ".config/kesto"},
        "/etc/kesto");
}

fs::path usualLogsDirectory()
{
    const fs::path home = environment("HOME");
    return usualDirectory("LOGS_DIRECTORY", // the last two are those of service managers before version 254
                          {fs::path(environment("XDG_STATE_HOME")) / "log/kesto", home / ".local/state/log/kesto",
                           fs::path(environment("XDG_CONFIG_HOME")) / "log/kesto", home / ".config/log/kesto"},
                          "/var/log/kesto");
}

fs::path usualRuntimeDirectory()
{
    return usualDirectory("RUNTIME_DIRECTORY", {fs::path(environment("XDG_RUNTIME_DIR")) / "kesto"}, "/run/kesto");
}
