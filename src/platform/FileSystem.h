// SPDX-License-Identifier: Apache-2.0
// The service's work with files: it writes its own files, all below one folder, and reads files that clients name.
#pragma once

#include <cstddef>
#include <cstdint>
#include <expected>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <system_error>

namespace platform {

// An unfinished file. `commit` puts it in place of an older file of its name, completely or not at all; destroyed
// before that, it leaves no file. One thread at a time.
class AtomicFile {
public:
    virtual ~AtomicFile() = default;
    // Appends text. A failure is remembered for `commit`.
    virtual void write(std::string_view text) = 0;
    // Begins again with an empty file.
    virtual void clear() = 0;
    [[nodiscard]] virtual std::expected<void, std::error_code> commit() = 0;
};

// Files of one kind, and how many of them a folder may hold. Beyond that the oldest are removed, but never the newest.
struct KeptFiles {
    std::size_t most;
    std::uint64_t mostBytes; // of all together
    bool (*isOne)(std::string_view name); // for any file name, also of other programs. Any thread
};

// Any thread. The functions that write return `errc::invalid_argument` for paths that are not below the diagnostic-log
// root.
class FileSystem {
public:
    virtual ~FileSystem() = default;
    // The folder below which diagnostic files are kept. It exists when the service starts.
    [[nodiscard]] virtual std::filesystem::path diagnosticLogRoot() const = 0;
    // Makes the folder and the missing folders above it, with exactly these permissions (the umask does not apply).
    // Existing folders stay as they are. If the root was removed, it is made again as it was. `errc::not_a_directory`
    // if a file is in the way.
    [[nodiscard]] virtual std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                                 unsigned permissions) = 0;
    // Begins a file in an existing folder. Several unfinished files may have one name: the last committed one stays.
    [[nodiscard]] virtual std::expected<std::unique_ptr<AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) = 0;
    // Reports that a file of that kind, with so many bytes, was added to the folder: if the folder now holds too many,
    // the oldest are removed in the background. Does not itself read the folder.
    virtual void keepWithin(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes) = 0;
    // The bytes of a file at any path, also one that a client names. Does not wait, and takes no more memory than the
    // limit (bytes): `errc::file_too_large` if the file is longer, `errc::invalid_argument` if it is not a regular
    // file.
    [[nodiscard]] virtual std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path,
                                                                               std::size_t limit) = 0;
};

} // namespace platform
