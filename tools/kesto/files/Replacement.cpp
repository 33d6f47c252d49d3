// The new file lies on the disk as a whole before it takes the name, so that losing power leaves one or the other.
#include "kesto/files/Replacement.h"

#include "kesto/files/OutputFile.h"
#include "platform/linux/files/FileDescriptor.h"

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

std::runtime_error systemError(std::string_view what, const fs::path& path, int error)
{
    return std::runtime_error(
        fmt::format("cannot {} {}: {}", what, path.native(), std::generic_category().message(error)));
}

// The owner stays another's where only root may change that.
bool takeOver(int file, const struct stat& before)
{
    return (::fchown(file, before.st_uid, before.st_gid) == 0 || errno == EPERM)
        && ::fchmod(file, before.st_mode & ALLPERMS) == 0;
}

} // namespace

void replaceFile(const fs::path& path, std::string_view text)
{
    constexpr mode_t readableByAll = 0644;
    struct stat before{};
    const bool isThere = ::stat(path.c_str(), &before) == 0;
    std::string temporary = path.parent_path() / ".kesto-XXXXXX";
    platform::FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
    if (!file)
        throw systemError("write", path, errno);
    const bool isWritten = (isThere ? takeOver(file.get(), before) : ::fchmod(file.get(), readableByAll) == 0)
        && writeAll(file.get(), text) && ::fsync(file.get()) == 0;
    int error = isWritten ? 0 : errno;
    file = {}; // who watches the directory is told when a file is closed, too: that shall not be in its place already
    if (error == 0 && ::rename(temporary.c_str(), path.c_str()) == 0)
        return;
    error = error == 0 ? errno : error;
    ::unlink(temporary.c_str());
    throw systemError("write", path, error);
}

void makeDirectory(const fs::path& path)
{
    constexpr mode_t readableByAll = 0755;
    const bool isMade = ::mkdir(path.c_str(), readableByAll) == 0;
    if (isMade ? ::chmod(path.c_str(), readableByAll) != 0 : errno != EEXIST)
        throw systemError("make", path, errno);
}
