// SPDX-License-Identifier: Apache-2.0
// The room of files: functions with which all other rooms use files safely. It depends on no path and no content.
//
// Files and folders by their names in an open folder: one step at a time, and never through a link. So these functions
// read, write and remove only entries of the folder itself.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <functional>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <system_error>
#include <vector>

namespace platform {

// All on any thread. A name is one step, without "/".

[[nodiscard]] std::expected<FileDescriptor, std::error_code> openDirectoryAt(int directory, const std::string& name);

// The sorted names in the folder, hidden ones too; at most so many.
[[nodiscard]] std::expected<std::vector<std::string>, std::error_code> namesIn(int directory, std::size_t most);

// The first bytes of a regular file, at most so many; `errc::invalid_argument` if it is not a regular file. Does not
// wait.
[[nodiscard]] std::expected<std::string, std::error_code> readFileAt(int directory, const std::string& name,
                                                                     std::size_t most);

// 16 random hexadecimal digits, for names that no other process uses.
[[nodiscard]] std::string randomDigits();
// The digits of a text that consists of `begin`, such digits and `end`; empty for other texts.
[[nodiscard]] std::string_view randomDigitsBetween(std::string_view begin, std::string_view end, std::string_view text);

// A name for an unfinished file: hidden, and random, so that another process cannot take it first.
[[nodiscard]] std::string temporaryName();
// Whether it is such a name. A killed process leaves its unfinished files.
[[nodiscard]] bool isTemporaryName(std::string_view name);

enum class ReadableBy : mode_t { Group = 0640, Owner = 0600 };
// Writes a new file, down to the disk.
[[nodiscard]] std::error_code writeFileAt(int directory, const std::string& name, std::string_view bytes,
                                          ReadableBy readers = ReadableBy::Group);

// Whether it is a regular file of this process's user.
[[nodiscard]] bool isOwnFileAt(int directory, const std::string& name);

// Removes the file of that name if the predicate holds for it; false if it stays. The predicate gets the name of a file
// in this folder. Other processes may put another file in its place at any time: only a file for which the predicate
// held is removed. `aside` is a name that this process alone uses. On file systems that cannot rename without replacing
// (RENAME_NOREPLACE) the file stays.
[[nodiscard]] bool removeFileAtIf(int directory, const std::string& name, const std::string& aside,
                                  const std::function<bool(const std::string&)>& isUnwanted);

// The total size of the files in a folder, without subfolders.
[[nodiscard]] std::uint64_t bytesOfFilesIn(int directory);

// Removes a file, a link, or a folder with everything in it; false if it does not exist or a part of it stays.
bool removeTreeAt(int directory, const std::string& name);

} // namespace platform
