// Files that commands write to places that the user names.
#pragma once

#include <filesystem>
#include <string_view>

// Writes the text to the path. If something exists there, it writes into it: a device and a pipe stay what they are.
// Throws std::runtime_error, which names the path.
void writeOutput(const std::filesystem::path& path, std::string_view text);
