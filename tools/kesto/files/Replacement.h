// Files that the service reads, written so that it never sees half of one: beside their place, and then moved there.
#pragma once

#include <filesystem>
#include <string_view>

// A file that was there passes on its permissions and, where this user may do that, its owner. A new one is for all
// to read, whatever the umask: the service is another user. Throws std::runtime_error with a line for a person.
void replaceFile(const std::filesystem::path& path, std::string_view text);

// Makes the directory if it is missing, for its owner to write and for all to read, whatever the umask. What is above
// it must be there. Throws std::runtime_error.
void makeDirectory(const std::filesystem::path& path);
