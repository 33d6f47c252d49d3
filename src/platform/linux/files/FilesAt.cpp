// SPDX-License-Identifier: Apache-2.0
// A thin layer over the kernel's *at calls, which ensures that none of them follows a link.
#include "platform/linux/files/FilesAt.h"

#include "foundation/text/Format.h"
#include "platform/linux/files/RegularFile.h"
#include "platform/linux/files/SystemError.h"
#include "platform/linux/files/WriteAll.h"

#include <algorithm>
#include <cassert>
#include <cerrno>
#include <cstdio>
#include <dirent.h>
#include <fcntl.h>
#include <limits>
#include <memory>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::size_t everything = std::numeric_limits<std::size_t>::max();
constexpr unsigned deepestTree = 8; // that `removeTreeAt` removes; the service's own are not deeper
constexpr std::size_t digits = 16;
constexpr std::string_view temporaryBegin = ".kestod-";
constexpr std::string_view temporaryEnd = ".tmp";

struct CloseDirectory {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

bool removeTree(int directory, const std::string& name, unsigned depth)
{
    if (::unlinkat(directory, name.c_str(), 0) == 0)
        return true;
    if (errno != EISDIR || depth == 0)
        return false;
    const auto opened = openDirectoryAt(directory, name);
    const auto names = opened ? namesIn(opened->get(), everything) : std::unexpected(opened.error());
    return names
        && std::ranges::all_of(*names,
                               [&](const std::string& inside) { return removeTree(opened->get(), inside, depth - 1); })
        && ::unlinkat(directory, name.c_str(), AT_REMOVEDIR) == 0;
}

} // namespace

std::expected<FileDescriptor, std::error_code> openDirectoryAt(int directory, const std::string& name)
{
    FileDescriptor opened(::openat(directory, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!opened)
        return std::unexpected(systemError());
    return opened;
}

std::expected<std::vector<std::string>, std::error_code> namesIn(int directory, std::size_t most)
{
    // Reading changes the descriptor's position, so this uses one of its own.
    const int own = ::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (own < 0)
        return std::unexpected(systemError());
    const std::unique_ptr<DIR, CloseDirectory> stream(::fdopendir(own));
    if (!stream) {
        const auto error = systemError();
        ::close(own);
        return std::unexpected(error);
    }
    std::vector<std::string> names;
    while (const dirent* entry = names.size() < most ? ::readdir(stream.get()) : nullptr)
        if (const std::string_view name = entry->d_name; name != "." && name != "..")
            names.emplace_back(name);
    std::ranges::sort(names);
    return names;
}

std::expected<std::string, std::error_code> readFileAt(int directory, const std::string& name, std::size_t most)
{
    const FileDescriptor file(
        ::openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    return readRegularFile(file, most);
}

std::string randomDigits()
{
    std::uint64_t number = 0;
    [[maybe_unused]] const ssize_t count = ::getrandom(&number, sizeof number, 0); // so few bytes never fail
    assert(count == sizeof number);
    return foundation::format("{:016x}", number);
}

std::string_view randomDigitsBetween(std::string_view begin, std::string_view end, std::string_view text)
{
    if (text.size() != begin.size() + digits + end.size() || !text.starts_with(begin) || !text.ends_with(end))
        return {};
    text = text.substr(begin.size(), digits);
    return text.find_first_not_of("0123456789abcdef") == std::string_view::npos ? text : std::string_view();
}

std::string temporaryName()
{
    return foundation::format("{}{}{}", temporaryBegin, randomDigits(), temporaryEnd);
}

bool isTemporaryName(std::string_view name)
{
    return !randomDigitsBetween(temporaryBegin, temporaryEnd, name).empty();
}

std::error_code writeFileAt(int directory, const std::string& name, std::string_view bytes, ReadableBy readers)
{
    const FileDescriptor file(::openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC,
                                       static_cast<mode_t>(readers)));
    if (!file)
        return systemError();
    if (const int error = writeAll(file.get(), bytes); error != 0)
        return {error, std::generic_category()};
    return ::fsync(file.get()) == 0 ? std::error_code() : systemError();
}

bool isOwnFileAt(int directory, const std::string& name)
{
    struct stat status = {};
    return ::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISREG(status.st_mode)
        && status.st_uid == ::geteuid();
}

// The kernel removes files by name, without a check of their identity. So the file first gets a name that no other
// process uses.
bool removeFileAtIf(int directory, const std::string& name, const std::string& aside,
                    const std::function<bool(const std::string&)>& isUnwanted)
{
    const auto move = [directory](const std::string& from, const std::string& to) {
        return ::renameat2(directory, from.c_str(), directory, to.c_str(), RENAME_NOREPLACE) == 0;
    };
    if (!isUnwanted(name) || !move(name, aside))
        return false;
    const bool isRemoved = isUnwanted(aside);
    if (isRemoved || !move(aside, name)) // it cannot be put back where a newer file has its name
        ::unlinkat(directory, aside.c_str(), 0);
    return isRemoved;
}

std::uint64_t bytesOfFilesIn(int directory)
{
    std::uint64_t bytes = 0;
    for (const std::string& name : namesIn(directory, everything).value_or(std::vector<std::string>()))
        if (struct stat status = {};
            ::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0 && S_ISREG(status.st_mode))
            bytes += static_cast<std::uint64_t>(status.st_size);
    return bytes;
}

bool removeTreeAt(int directory, const std::string& name)
{
    return removeTree(directory, name, deepestTree);
}

} // namespace platform
