// The size that the kernel reports is only a hint: files of /proc report none, and others may grow meanwhile.
#include "platform/linux/files/SmallFile.h"

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>

namespace platform {

std::expected<std::string, std::error_code> readSmallFile(const std::filesystem::path& path, std::size_t limit)
{
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0)
        return std::unexpected(systemError());
    if (!S_ISREG(status.st_mode))
        return std::unexpected(make_error_code(std::errc::invalid_argument));

    // Files of /proc report no size, and any file may grow while it is read: the length is known only at the end.
    constexpr std::size_t smallestRead = 64;
    std::string bytes;
    for (std::size_t length = 0;;) {
        bytes.resize(
            std::min(limit + 1, length + std::max(smallestRead, static_cast<std::size_t>(status.st_size) + 1)));
        const ssize_t count = ::read(file.get(), bytes.data() + length, bytes.size() - length);
        if (count < 0 && errno != EINTR)
            return std::unexpected(systemError());
        length += static_cast<std::size_t>(std::max<ssize_t>(count, 0));
        if (length > limit)
            return std::unexpected(make_error_code(std::errc::file_too_large));
        if (count == 0) {
            bytes.resize(length);
            return bytes;
        }
    }
}

} // namespace platform
