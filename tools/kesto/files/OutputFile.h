// SPDX-License-Identifier: Apache-2.0
// Files that commands write to places that the user names.
#pragma once

#include <filesystem>
#include <string_view>

// Writes the text to the path. If something exists there, it writes into it: a device and a pipe stay what they are.
// Throws std::runtime_error, which names the path.
void writeOutput(const std::filesystem::path& path, std::string_view text);

// The same, but whoever opens a file at the path finds the old text or the new one, never a part: the file is replaced
// (FileReplacement.h), and a new one has the permissions that the umask allows. A link goes on to lead to it, also one
// to a file that does not exist yet. For one thread: the umask is that of the process.
void writeWholeOutput(const std::filesystem::path& path, std::string_view text);
