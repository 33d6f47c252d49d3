// SPDX-License-Identifier: Apache-2.0
// Other users cannot read a file until it is locked. So none of them can lock it first, and all see that it is not
// finished. The administrator's processes, which can open it, do not treat its maker as dead either.
#include "platform/linux/files/LockedFile.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr mode_t whileItIsMade = S_IWUSR;
constexpr mode_t readableByAll = 0644;

struct flock wholeFile(short type)
{
    struct flock lock = {};
    lock.l_type = type;
    lock.l_whence = SEEK_SET;
    return lock;
}

} // namespace

FileDescriptor makeLockedFileAt(int directory, const std::string& name)
{
    FileDescriptor file(
        ::openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, whileItIsMade));
    struct flock lock = wholeFile(F_WRLCK);
    if (file && (::fcntl(file.get(), F_OFD_SETLK, &lock) != 0 || ::fchmod(file.get(), readableByAll) != 0)) {
        const int error = errno;
        ::unlinkat(directory, name.c_str(), 0);
        file = FileDescriptor();
        errno = error;
    }
    return file;
}

bool isMakerGoneAt(int directory, const std::string& name)
{
    struct stat status = {};
    if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0)
        return errno == ENOENT;
    if (!S_ISREG(status.st_mode))
        return true;
    if ((status.st_mode & S_IROTH) == 0)
        return false;
    const FileDescriptor file(
        ::openat(directory, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct flock lock = wholeFile(F_RDLCK); // only a write lock conflicts with it
    return file && ::fcntl(file.get(), F_OFD_GETLK, &lock) == 0 && lock.l_type == F_UNLCK;
}

} // namespace platform
