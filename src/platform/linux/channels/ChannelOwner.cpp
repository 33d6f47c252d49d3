// An owner file is not accessible to other users until it is locked, so that no other process can lock it first.
#include "platform/linux/channels/ChannelOwner.h"

#include "foundation/text/Format.h"

#include <cerrno>
#include <cstdint>
#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr std::size_t ownerDigits = 16;
constexpr std::string_view lineBegin = "owner ";
constexpr std::string_view lineEnd = "\n";
constexpr std::string_view nameBegin = ".kesto-";
constexpr std::string_view ownerFileEnd = ".owner";
constexpr std::string_view temporaryFileEnd = ".tmp";

bool isOwner(std::string_view text)
{
    return text.size() == ownerDigits && text.find_first_not_of("0123456789abcdef") == std::string_view::npos;
}

// The text between the two if it is an owner; else empty.
std::string_view ownerBetween(std::string_view begin, std::string_view end, std::string_view text)
{
    if (text.size() != begin.size() + ownerDigits + end.size() || !text.starts_with(begin) || !text.ends_with(end))
        return {};
    text = text.substr(begin.size(), ownerDigits);
    return isOwner(text) ? text : std::string_view();
}

struct flock wholeFile(short type)
{
    struct flock lock = {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    return lock;
}

} // namespace

std::string randomChannelOwner()
{
    std::uint64_t number = 0;
    if (::getrandom(&number, sizeof number, 0) != sizeof number)
        number = static_cast<std::uint64_t>(::getpid());
    return foundation::format("{:016x}", number);
}

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
    constexpr std::size_t length = lineBegin.size() + ownerDigits + lineEnd.size();
    const std::string_view owner = ownerBetween(lineBegin, lineEnd, text.substr(0, length));
    if (!owner.empty())
        text.remove_prefix(length);
    return owner;
}

std::string_view ownerOfChannelOwnerFile(std::string_view name)
{
    return ownerBetween(nameBegin, ownerFileEnd, name);
}

std::string_view ownerOfChannelTemporaryFile(std::string_view name)
{
    return ownerBetween(nameBegin, temporaryFileEnd, name);
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
