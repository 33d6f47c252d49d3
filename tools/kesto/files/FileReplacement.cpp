// SPDX-License-Identifier: Apache-2.0
// The new file is completely on the disk before it gets the name, so that a loss of power leaves the old or the new
// file.
#include "kesto/files/FileReplacement.h"

#include "kesto/Terminal.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/WriteAll.h"

#include <cerrno>
#include <cstdlib>
#include <fcntl.h>
#include <fmt/format.h>
#include <stdexcept>
#include <string>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace fs = std::filesystem;

namespace {

std::runtime_error failure(std::string_view what, const fs::path& path, int error)
{
    return std::runtime_error(
        fmt::format("cannot {} {}: {}", what, printable(path.native()), std::generic_category().message(error)));
}

// Another user's file changes its owner, unless root replaces it.
bool takeOver(int file, const struct stat& before)
{
    return (::fchown(file, before.st_uid, before.st_gid) == 0 || errno == EPERM)
        && ::fchmod(file, before.st_mode & ALLPERMS) == 0;
}

} // namespace

void replaceFile(const fs::path& path, std::string_view text, mode_t permissionsOfNew)
{
    struct stat before{};
    const bool isThere = ::stat(path.c_str(), &before) == 0;
    std::string temporary = path.parent_path() / ".kesto-XXXXXX";
    platform::FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
    if (!file)
        throw failure("write", path, errno);
    const bool isReady = isThere ? takeOver(file.get(), before) : ::fchmod(file.get(), permissionsOfNew) == 0;
    int error = isReady ? platform::writeAll(file.get(), text) : errno;
    if (error == 0 && ::fsync(file.get()) != 0)
        error = errno;
    file = {}; // before the rename: a watcher of the directory must not count closing as a second change
    if (error == 0 && ::rename(temporary.c_str(), path.c_str()) == 0)
        return;
    error = error == 0 ? errno : error;
    ::unlink(temporary.c_str());
    throw failure("write", path, error);
}

void makeDirectory(const fs::path& path)
{
    constexpr mode_t readableByAll = 0755;
    const bool isMade = ::mkdir(path.c_str(), readableByAll) == 0;
    if (isMade ? ::chmod(path.c_str(), readableByAll) != 0 : errno != EEXIST)
        throw failure("make", path, errno);
}
