// Files that the service reads. Each is written beside its place and then moved, so that the service never sees an
// unfinished file.
#pragma once

#include <filesystem>
#include <string_view>

// The new file takes over the old file's permissions and, if this user has the right, its owner. Without an old file it
// is readable for all users, despite the umask, because the service is another user. Throws std::runtime_error with a
// line for a person.
void replaceFile(const std::filesystem::path& path, std::string_view text);

// Makes the directory if it is missing, writable for its owner and readable for all, despite the umask. The directory
// above it must exist. Throws std::runtime_error.
void makeDirectory(const std::filesystem::path& path);
