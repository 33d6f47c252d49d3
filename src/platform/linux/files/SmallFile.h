// Reading a whole small file, whatever stands at its path: opening never blocks, only regular files are read,
// and none beyond a limit.
#pragma once

#include <cstddef>
#include <expected>
#include <filesystem>
#include <string>
#include <system_error>

namespace platform {

// The bytes of the file. `errc::no_such_file_or_directory` when there is none, `errc::file_too_large` when it
// is longer than the limit, `errc::invalid_argument` when it is no regular file. Any thread.
[[nodiscard]] std::expected<std::string, std::error_code> readSmallFile(const std::filesystem::path& path,
                                                                        std::size_t limit);

} // namespace platform
