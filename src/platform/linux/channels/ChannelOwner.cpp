// An owner file is not accessible to other users until it is locked, so that no other process can lock it first.
#include "platform/linux/channels/ChannelOwner.h"

#include "foundation/text/Format.h"
#include "platform/linux/files/FilesAt.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::string_view lineBegin = "owner ";
constexpr std::string_view lineEnd = "\n";
constexpr std::string_view nameBegin = ".kesto-";
constexpr std::string_view ownerFileEnd = ".owner";
constexpr std::string_view temporaryFileEnd = ".tmp";

struct flock wholeFile(short type)
{
    struct flock lock = {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    return lock;
}

} // namespace

std::string channelOwnerLine(std::string_view owner)
{
    return foundation::format("{}{}{}", lineBegin, owner, lineEnd);
}

std::string channelOwnerFileName(std::string_view owner)
{
    return foundation::format("{}{}{}", nameBegin, owner, ownerFileEnd);
}

std::string channelTemporaryFileName(std::string_view owner)
{
    return foundation::format("{}{}{}", nameBegin, owner, temporaryFileEnd);
}

std::string_view takeChannelOwner(std::string_view& text)
{
    const std::string_view line = text.substr(0, text.find('\n') + 1);
    const std::string_view owner = randomDigitsBetween(lineBegin, lineEnd, line);
    if (!owner.empty())
        text.remove_prefix(line.size());
    return owner;
}

std::string_view ownerOfChannelOwnerFile(std::string_view name)
{
    return randomDigitsBetween(nameBegin, ownerFileEnd, name);
}

std::string_view ownerOfChannelTemporaryFile(std::string_view name)
{
    return randomDigitsBetween(nameBegin, temporaryFileEnd, name);
}

FileDescriptor makeChannelOwnerFile(int driverFolder, std::string_view owner)
{
    constexpr mode_t nobodyElse = 0200;
    constexpr mode_t everybody = 0644;
    const std::string name = channelOwnerFileName(owner);
    ::unlinkat(driverFolder, name.c_str(), 0); // another process had made a file of that name
    FileDescriptor file(
        ::openat(driverFolder, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, nobodyElse));
    struct flock lock = wholeFile(F_WRLCK);
    if (file && (::fcntl(file.get(), F_OFD_SETLK, &lock) != 0 || ::fchmod(file.get(), everybody) != 0)) {
        const int error = errno;
        ::unlinkat(driverFolder, name.c_str(), 0);
        file = FileDescriptor();
        errno = error;
    }
    return file;
}

bool isChannelOwnerGone(int driverFolder, std::string_view owner)
{
    const std::string name = channelOwnerFileName(owner);
    struct stat status = {};
    if (::fstatat(driverFolder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
        return errno == ENOENT;
    if (!S_ISREG(status.st_mode))
        return true;
    if ((status.st_mode & S_IROTH) == 0)
        return false; // its publisher is just making it
    const FileDescriptor file(
        ::openat(driverFolder, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct flock lock = wholeFile(F_RDLCK); // only a write lock conflicts with it
    return file && ::fcntl(file.get(), F_OFD_GETLK, &lock) == 0 && lock.l_type == F_UNLCK;
}

} // namespace platform
