// SPDX-License-Identifier: Apache-2.0
// The size that the kernel reports is not asked for: files of /proc report none, and others may grow meanwhile.
#include "platform/linux/files/RegularFile.h"

#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {

std::expected<std::string, std::error_code> readRegularFile(const FileDescriptor& file, std::size_t most)
{
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0)
        return std::unexpected(systemError());
    if (!S_ISREG(status.st_mode))
        return std::unexpected(make_error_code(std::errc::invalid_argument));
    std::array<char, 4096> piece;
    std::string bytes;
    for (;;) {
        const ssize_t count = ::read(file.get(), piece.data(), std::min(piece.size(), most - bytes.size()));
        if (count < 0 && errno == EINTR) // file systems in user space may be interrupted
            continue;
        if (count < 0)
            return std::unexpected(systemError());
        if (count == 0) // at the end of the file, or because no more was asked for
            return bytes;
        bytes.append(piece.data(), static_cast<std::size_t>(count));
    }
}

} // namespace platform
