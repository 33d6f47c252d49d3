// The files that commands show.
#pragma once

#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <string>

struct CloseFile {
    void operator()(std::FILE* file) const { std::fclose(file); }
};
using InputFile = std::unique_ptr<std::FILE, CloseFile>;

// For reading from its beginning to its end: a file, or a pipe, for whose other end it waits. Throws
// std::runtime_error, which names the file, when it cannot be opened or is a directory.
[[nodiscard]] InputFile openInput(const std::filesystem::path& path);

// What a regular file holds: of a pipe or a device it is not known how much that would be. Throws std::runtime_error,
// which names the file, when it cannot be read or is larger.
[[nodiscard]] std::string readInput(const std::filesystem::path& path, std::size_t largest);
