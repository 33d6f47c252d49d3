// SPDX-License-Identifier: Apache-2.0
// Reading, changing and writing happen under a lock on the directory, because the file itself is replaced each time. A
// file that the service could not read is not written.
#include "kesto/settings/PreferencesFile.h"

#include "kesto/files/FileReplacement.h"
#include "kesto/settings/TomlText.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/SmallFile.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/settings/TomlFile.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <sys/file.h>
#include <system_error>
#include <thread>
#include <utility>

namespace fs = std::filesystem;

namespace {

constexpr std::string_view extension = ".toml";
constexpr std::string_view folder = "preferences";

template <typename... Arguments>
std::runtime_error failure(fmt::format_string<const Arguments&...> format, const Arguments&... arguments)
{
    return std::runtime_error(fmt::format(format, arguments...));
}

// Keeps other instances of this program from changing files of the directory.
class DirectoryLock {
public:
    explicit DirectoryLock(const fs::path& directory)
        : directory_(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC))
    {
        if (!directory_)
            throw failure("cannot open {}: {}", directory.native(), std::generic_category().message(errno));
        // Waits only a limited time, because any user who may read the directory could hold the lock.
        for (int turn = 0; ::flock(directory_.get(), LOCK_EX | LOCK_NB) != 0; ++turn) {
            constexpr int mostTurns = 500;
            if (turn == mostTurns)
                throw failure("another program keeps {} locked", directory.native());
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
    }

private:
    const platform::FileDescriptor directory_;
};

} // namespace

PreferencesFile::PreferencesFile(fs::path configurationDirectory, std::string_view domain)
    : configurationDirectory_(std::move(configurationDirectory)),
      directory_(configurationDirectory_ / folder),
      domain_(domain),
      path_(directory_ / std::string(domain).append(extension))
{
}

foundation::Dictionary PreferencesFile::values() const
{
    if (!exists())
        throw failure("the domain {} has no preferences in {}", domain_, directory_.native());
    return *platform::parseToml(read());
}

void PreferencesFile::set(std::string_view key, std::string_view toml) const
{
    makeDirectory(configurationDirectory_);
    makeDirectory(directory_);
    const DirectoryLock lock(directory_);
    const std::string before = exists() ? read() : std::string();
    write(before, withTomlKey(before, key, toml));
}

void PreferencesFile::unset(std::string_view key) const
{
    if (!values().contains(key))
        throw noSuchKey(key);
    const DirectoryLock lock(directory_);
    const std::string before = read();
    write(before, withoutTomlKey(before, key));
}

std::runtime_error PreferencesFile::noSuchKey(std::string_view key) const
{
    return failure("the domain {} has no key \"{}\" in {}", domain_, key, path_.native());
}

bool PreferencesFile::exists() const
{
    std::error_code error;
    const bool isThere = fs::exists(path_, error);
    if (error)
        throw failure("cannot read {}: {}", path_.native(), error.message());
    return isThere;
}

std::string PreferencesFile::read() const
{
    auto text = platform::readSmallFile(path_, platform::TomlFile::largest);
    if (!text)
        throw failure("cannot read {}: {}", path_.native(), text.error().message());
    if (const auto values = platform::parseToml(*text); !values) {
        const platform::TomlError& error = values.error();
        throw failure("{}:{}:{}: {}; correct this first", path_.native(), error.line, error.column, error.reason);
    }
    return *std::move(text);
}

void PreferencesFile::write(const std::string& before, const std::string& after) const
{
    if (after.size() > platform::TomlFile::largest)
        throw failure("{} would be longer than the {} bytes that the service reads", path_.native(),
                      platform::TomlFile::largest);
    if (const auto values = platform::parseToml(after); !values)
        throw failure("this cannot be written to {}: {}", path_.native(), values.error().reason);
    if (after != before)
        replaceFile(path_, after);
}

std::vector<std::string> PreferencesFile::domains(const fs::path& configurationDirectory)
{
    const fs::path directory = configurationDirectory / folder;
    std::vector<std::string> domains;
    std::error_code error;
    for (fs::directory_iterator file(directory, error); !error && file != end(file); file.increment(error)) {
        const std::string domain = file->path().stem();
        if (file->path().extension() == extension && platform::LinuxPreferences::isDomainName(domain))
            domains.push_back(domain);
    }
    if (error && error != std::errc::no_such_file_or_directory)
        throw failure("cannot read {}: {}", directory.native(), error.message());
    std::ranges::sort(domains);
    return domains;
}
