// The files that `kesto trace` reads.
#pragma once

#include <cstddef>
#include <filesystem>
#include <string>

// What a regular file holds. Throws std::runtime_error, which names the file, when it cannot be read or is larger.
[[nodiscard]] std::string readTraceInput(const std::filesystem::path& path, std::size_t largest);
