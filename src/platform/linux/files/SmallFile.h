// SPDX-License-Identifier: Apache-2.0
// Reading a whole small file at any path: opening never blocks, and only regular files within a limit are read.
#pragma once

#include <cstddef>
#include <expected>
#include <filesystem>
#include <string>
#include <system_error>

namespace platform {

// The bytes of the file. `errc::no_such_file_or_directory` if it does not exist, `errc::file_too_large` if it is longer
// than the limit, `errc::invalid_argument` if it is not a regular file. Any thread.
[[nodiscard]] std::expected<std::string, std::error_code> readSmallFile(const std::filesystem::path& path,
                                                                        std::size_t limit);

} // namespace platform
