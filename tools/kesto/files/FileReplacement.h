// SPDX-License-Identifier: Apache-2.0
// Files that are replaced as a whole. Each is written beside its place and then moved, so that the service, or whoever
// else reads it, never sees an unfinished file.
#pragma once

#include <filesystem>
#include <string_view>
#include <sys/types.h>

// The service is another user, and must be able to read what a user writes for it.
constexpr mode_t readableForTheService = 0644;

// The new file takes over the old file's permissions and, if this user has the right, its owner. Without an old file it
// gets the given permissions, despite the umask. Throws std::runtime_error with a line for a person.
void replaceFile(const std::filesystem::path& path, std::string_view text,
                 mode_t permissionsOfNew = readableForTheService);

// Makes the directory if it is missing, writable for its owner and readable for all, despite the umask. The directory
// above it must exist. Throws std::runtime_error.
void makeDirectory(const std::filesystem::path& path);
