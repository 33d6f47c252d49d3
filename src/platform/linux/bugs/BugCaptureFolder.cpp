// SPDX-License-Identifier: Apache-2.0
// All steps use names in the open folder, and captures are made and removed under hidden names: even if the service is
// killed, a capture is complete or does not exist.
#include "platform/linux/bugs/BugCaptureFolder.h"

#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/Surplus.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <ctime>
#include <fcntl.h>
#include <fmt/format.h>
#include <limits>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>
#include <utility>

namespace platform {
namespace {

constexpr const char* folderName = "bug-captures";
constexpr const char* lastNumberName = "bug-captures.last"; // beside the folder, which people may remove
constexpr const char* stateName = "state";
constexpr mode_t permissions = 0750; // of folders: only the service's user and group may read captures

constexpr std::size_t everything = std::numeric_limits<std::size_t>::max();

// Folders have hidden names while they are made or removed.
constexpr std::string_view coming = ".new";
constexpr std::string_view going = ".old";

// The number at the start of the text if that character follows it and a next number exists; else 0.
std::uint64_t numberBefore(char end, std::string_view text)
{
    std::uint64_t number = 0;
    const auto [read, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool isNumber = error == std::errc() && read != text.data() + text.size() && *read == end;
    return isNumber && number < std::numeric_limits<std::uint64_t>::max() ? number : 0;
}

// The number of a capture; 0 for other names.
std::uint64_t numberOf(std::string_view name)
{
    return numberBefore('-', name);
}

std::string utcText(double time)
{
    constexpr std::size_t longest = 64;
    std::array<char, longest> text{};
    const auto seconds = static_cast<std::time_t>(std::floor(time));
    std::tm parts{};
    if (::gmtime_r(&seconds, &parts) == nullptr)
        return "unknown";
    return {text.data(), std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &parts)};
}

// Hides the folder in one step, and then removes it.
void remove(int directory, const std::string& name, int folder)
{
    const std::string hidden(going);
    removeTreeAt(folder, hidden); // of an attempt that failed
    if (::renameat(directory, name.c_str(), folder, hidden.c_str()) == 0)
        removeTreeAt(folder, hidden); // the next start removes the rest
}

std::error_code syncDirectory(int directory)
{
    return ::fsync(directory) == 0 ? std::error_code() : systemError();
}

std::error_code writeFiles(int directory, const std::vector<BugCaptureFolder::File>& files)
{
    for (const auto& [name, text] : files)
        if (const auto error = writeFileAt(directory, name, text))
            return error;
    return syncDirectory(directory);
}

std::expected<FileDescriptor, std::error_code> makeDirectoryAt(int directory, const std::string& name)
{
    if (::mkdirat(directory, name.c_str(), permissions) != 0)
        return std::unexpected(systemError());
    return openDirectoryAt(directory, name);
}

} // namespace

// A capture on the disk.
struct BugCaptureFolder::Capture {
    std::uint64_t number;
    std::string name;
    std::optional<std::uint64_t> bulk; // in bytes; nothing for a tombstone
};

BugCaptureFolder::BugCaptureFolder(std::filesystem::path stateDirectory, Limits limits)
    : stateDirectory_(std::move(stateDirectory)),
      path_(stateDirectory_ / folderName),
      limits_(limits)
{
    if (const auto folder = open())
        removeLeftovers(folder->get());
}

// The state directory may be a link, because the administrator made it. Its content is the service's own.
std::expected<FileDescriptor, std::error_code> BugCaptureFolder::openStateDirectory() const
{
    FileDescriptor opened(::open(stateDirectory_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!opened)
        return std::unexpected(systemError());
    return opened;
}

std::expected<FileDescriptor, std::error_code> BugCaptureFolder::open() const
{
    const auto parent = openStateDirectory();
    return parent ? openDirectoryAt(parent->get(), folderName) : std::unexpected(parent.error());
}

std::expected<FileDescriptor, std::error_code> BugCaptureFolder::openOrMake() const
{
    auto folder = open();
    if (folder || folder.error() != std::errc::no_such_file_or_directory)
        return folder;
    if (::mkdir(path_.c_str(), permissions) != 0)
        return std::unexpected(systemError());
    return open();
}

void BugCaptureFolder::removeLeftovers(int folder)
{
    for (const std::string& name : namesIn(folder, everything).value_or(std::vector<std::string>()))
        if (name == coming || name == going)
            removeTreeAt(folder, name);
}

std::error_code BugCaptureFolder::checkFreeSpace() const
{
    struct statvfs status = {};
    if (::statvfs(stateDirectory_.c_str(), &status) != 0)
        return systemError();
    const auto free = std::uint64_t{status.f_bavail} * status.f_frsize;
    return free < limits_.bytesLeftFree ? make_error_code(std::errc::no_space_on_device) : std::error_code();
}

std::vector<BugCaptureFolder::Capture> BugCaptureFolder::capturesIn(int folder)
{
    std::vector<Capture> captures;
    for (std::string& name : namesIn(folder, everything).value_or(std::vector<std::string>())) {
        const std::uint64_t number = numberOf(name);
        if (number == 0)
            continue;
        const auto opened = openDirectoryAt(folder, name);
        if (!opened)
            continue;
        const auto state = openDirectoryAt(opened->get(), stateName);
        captures.push_back(
            {number, std::move(name), state ? std::optional(bytesOfFilesIn(state->get())) : std::nullopt});
    }
    std::ranges::sort(captures, {}, &Capture::number);
    return captures;
}

// 0 if no number was kept.
std::uint64_t BugCaptureFolder::lastNumber() const
{
    constexpr std::size_t longest = 32;
    const auto parent = openStateDirectory();
    const auto text = parent ? readFileAt(parent->get(), lastNumberName, longest) : std::unexpected(parent.error());
    return text ? numberBefore('\n', *text) : 0;
}

std::error_code BugCaptureFolder::keepLastNumber(std::uint64_t number) const
{
    const auto parent = openStateDirectory();
    if (!parent)
        return parent.error();
    const std::string unfinished = std::string(lastNumberName) + ".new";
    removeTreeAt(parent->get(), unfinished); // left by a killed service
    if (const auto error = writeFileAt(parent->get(), unfinished, fmt::format("{}\n", number)))
        return error;
    if (::renameat(parent->get(), unfinished.c_str(), parent->get(), lastNumberName) == 0)
        return syncDirectory(parent->get());
    const auto error = systemError();
    removeTreeAt(parent->get(), unfinished);
    return error;
}

std::expected<std::string, std::error_code> BugCaptureFolder::nextName(double time) const
{
    const auto folder = openOrMake();
    if (!folder)
        return std::unexpected(folder.error());
    const auto names = namesIn(folder->get(), everything);
    if (!names)
        return std::unexpected(names.error());
    std::uint64_t highest = lastNumber();
    for (const std::string& name : *names)
        highest = std::max(highest, numberOf(name));
    return fmt::format("{:08}-{}", highest + 1, utcText(time));
}

// Makes room for one more capture, with so many bytes of state.
void BugCaptureFolder::makeRoom(int folder, std::uint64_t bytes)
{
    const std::vector<Capture> captures = capturesIn(folder);
    std::vector<std::uint64_t> bulks;
    for (const Capture& capture : captures)
        if (capture.bulk)
            bulks.push_back(*capture.bulk);
    bulks.push_back(bytes);
    std::size_t tooMany = surplus(bulks, limits_.mostWithBulk, limits_.mostBytes);
    for (const Capture& capture : captures) {
        if (!capture.bulk || tooMany == 0)
            continue;
        --tooMany;
        ++removed_;
        if (const auto opened = openDirectoryAt(folder, capture.name))
            remove(opened->get(), stateName, folder);
    }
    const std::size_t most = std::max<std::size_t>(limits_.mostCaptures, 1) - 1;
    for (std::size_t oldest = 0; captures.size() - oldest > most; ++oldest, ++removed_)
        remove(folder, captures[oldest].name, folder);
}

std::error_code BugCaptureFolder::write(int folder, const std::string& hidden, const std::vector<File>& files,
                                        const std::vector<File>& state) const
{
    const auto made = makeDirectoryAt(folder, hidden);
    if (!made)
        return made.error();
    if (!state.empty()) {
        const auto bulk = makeDirectoryAt(made->get(), stateName);
        if (!bulk)
            return bulk.error();
        if (const auto error = writeFiles(bulk->get(), state))
            return error;
    }
    return writeFiles(made->get(), files);
}

std::error_code BugCaptureFolder::add(const std::string& name, const std::vector<File>& files,
                                      const std::vector<File>& state)
{
    const auto folder = openOrMake();
    if (!folder)
        return folder.error();
    std::uint64_t bytes = 0;
    for (const File& file : state)
        bytes += file.text.size();
    const bool isTooMuch = bytes > limits_.mostBytes || limits_.mostWithBulk == 0;
    makeRoom(folder->get(), isTooMuch ? 0 : bytes);

    const std::string hidden(coming);
    removeTreeAt(folder->get(), hidden); // of an attempt that failed
    auto error = write(folder->get(), hidden, files, isTooMuch ? std::vector<File>() : state);
    if (!error)
        error = keepLastNumber(std::max(numberOf(name), lastNumber()));
    if (!error && ::renameat(folder->get(), hidden.c_str(), folder->get(), name.c_str()) != 0)
        error = systemError();
    if (error)
        removeTreeAt(folder->get(), hidden);
    else
        error = syncDirectory(folder->get());
    return error;
}

} // namespace platform
