// The few things that the service does with files of its own.
#pragma once

#include <expected>
#include <filesystem>
#include <string_view>
#include <system_error>

namespace platform {

// Any thread.
class FileSystem {
public:
    virtual ~FileSystem() = default;
    // The folder below which diagnostic files are kept.
    [[nodiscard]] virtual std::filesystem::path diagnosticLogRoot() const = 0;
    // Makes the folder and those above it that are missing, with exactly these permissions whatever the umask.
    [[nodiscard]] virtual std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                                 unsigned permissions) = 0;
    // Puts the text in place of what stands there, whole or not at all.
    [[nodiscard]] virtual std::expected<void, std::error_code> writeAtomically(const std::filesystem::path& path,
                                                                               std::string_view text) = 0;
};

} // namespace platform
