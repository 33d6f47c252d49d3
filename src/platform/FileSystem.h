// The few things that the service does with files: it writes those of its own, all of them below one folder, and reads
// those that clients name.
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

// A file in the making. It takes the place of what stands under its name when it is committed, whole or not at
// all; destroyed before that, it leaves nothing behind. One thread at a time.
class AtomicFile {
public:
    virtual ~AtomicFile() = default;
    // Appends text. A failure is remembered for `commit`.
    virtual void write(std::string_view text) = 0;
    // Begins again with an empty file.
    virtual void clear() = 0;
    [[nodiscard]] virtual std::expected<void, std::error_code> commit() = 0;
};

// Files of one kind, and how many of them a folder may hold. Beyond that the oldest go, but never the newest.
struct KeptFiles {
    std::size_t most;
    std::uint64_t mostBytes; // of all together
    bool (*isOne)(std::string_view name); // of a file name, whoever chose it. Any thread
};

// Any thread. What is written lies below the diagnostic-log root; for other paths, `errc::invalid_argument` comes back.
class FileSystem {
public:
    virtual ~FileSystem() = default;
    // The folder below which diagnostic files are kept. It exists when the service starts.
    [[nodiscard]] virtual std::filesystem::path diagnosticLogRoot() const = 0;
    // Makes the folder and those above it that are missing, with exactly these permissions whatever the umask. Those
    // that exist stay as they are. The root is made again, as it was, if it has gone. `errc::not_a_directory` where a
    // file stands.
    [[nodiscard]] virtual std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                                 unsigned permissions) = 0;
    // Begins a file in a folder that exists. Several of one name may be in the making: the last that is committed
    // counts.
    [[nodiscard]] virtual std::expected<std::unique_ptr<AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) = 0;
    // Tells that a file of that kind, of so many bytes, has come into the folder: if there are too many now, the oldest
    // are removed in the background. Does not look into the folder itself.
    virtual void keepWithin(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes) = 0;
    // The bytes of a file anywhere, whoever named it. Does not wait, and takes no more memory than the limit (bytes):
    // `errc::file_too_large` when the file is longer, `errc::invalid_argument` when the path is no regular file's.
    [[nodiscard]] virtual std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path,
                                                                               std::size_t limit) = 0;
};

} // namespace platform
