// The room of files: what all other rooms need to touch a file safely. It knows no place and no content.
//
// Files and folders by their names in a folder that is open: one step at a time, and never through a link. Wherever a
// link was put, what is read, written or removed is what the folder itself holds.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>
#include <system_error>
#include <vector>

namespace platform {

// All on any thread. A name is one step, without "/".

[[nodiscard]] std::expected<FileDescriptor, std::error_code> openDirectoryAt(int directory, const std::string& name);

// What the folder holds, hidden names too, in the order of the names; of a folder with more only so many.
[[nodiscard]] std::expected<std::vector<std::string>, std::error_code> namesIn(int directory, std::size_t most);

// The first bytes of a regular file, so many at most; `errc::invalid_argument` when it is something else. Does not
// wait.
[[nodiscard]] std::expected<std::string, std::error_code> readFileAt(int directory, const std::string& name,
                                                                     std::size_t most);

// For a file in the making: hidden, and not to be foreseen by who would like to be there first.
[[nodiscard]] std::string temporaryName();
// Whether it is the name of one, which is there for good if its maker was killed.
[[nodiscard]] bool isTemporaryName(std::string_view name);

// Writes a file that is not there yet, down to the disk.
[[nodiscard]] std::error_code writeFileAt(int directory, const std::string& name, std::string_view bytes);

// How many bytes the files of a folder have, without those of folders in it.
[[nodiscard]] std::uint64_t bytesOfFilesIn(int directory);

// Removes a file, a link, or a folder with everything in it; false when there is none, or something of it stays.
bool removeTreeAt(int directory, const std::string& name);

} // namespace platform
