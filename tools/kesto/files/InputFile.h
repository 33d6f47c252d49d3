// SPDX-License-Identifier: Apache-2.0
// The room of files: reading the files that commands show, and writing those that they make. It does not know what the
// files mean.
//
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

// Opens a file for reading from the beginning to the end; for a pipe, waits for its writer. Throws std::runtime_error,
// which names the file, if it cannot be opened or is a directory.
[[nodiscard]] InputFile openInput(const std::filesystem::path& path);

// The content of a regular file, not of a pipe or a device, because their sizes are unknown. Throws std::runtime_error,
// which names the file, if it cannot be read or is larger.
[[nodiscard]] std::string readInput(const std::filesystem::path& path, std::size_t largest);
