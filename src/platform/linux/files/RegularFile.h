// SPDX-License-Identifier: Apache-2.0
// Reading from an open file that must be a regular one, so that reading never waits.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstddef>
#include <expected>
#include <string>
#include <system_error>

namespace platform {

// The first bytes of the file, at most so many. `errc::invalid_argument` if it is not a regular file. Takes what `open`
// returned, and says why it failed. Any thread.
[[nodiscard]] std::expected<std::string, std::error_code> readRegularFile(const FileDescriptor& file, std::size_t most);

} // namespace platform
