// SPDX-License-Identifier: Apache-2.0
// One byte beyond the limit is asked for: a file that has it is too large.
#include "platform/linux/files/SmallFile.h"

#include "platform/linux/files/RegularFile.h"

#include <fcntl.h>

namespace platform {

std::expected<std::string, std::error_code> readSmallFile(const std::filesystem::path& path, std::size_t limit)
{
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
    auto bytes = readRegularFile(file, limit + 1);
    if (bytes && bytes->size() > limit)
        return std::unexpected(make_error_code(std::errc::file_too_large));
    return bytes;
}

} // namespace platform
