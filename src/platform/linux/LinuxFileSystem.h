// Folders and files of the service's own, on the real file system.
//
// A file is written under a name of its own beside its place and then renamed, so that whoever reads it sees the
// old one or the new one and never half of it. Links are not followed where a file is made.
#pragma once

#include "platform/FileSystem.h"

namespace platform {

// Any thread.
class LinuxFileSystem final : public FileSystem {
public:
    explicit LinuxFileSystem(std::filesystem::path diagnosticLogRoot) : diagnosticLogRoot_(std::move(diagnosticLogRoot))
    {
    }

    [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return diagnosticLogRoot_; }
    [[nodiscard]] std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                         unsigned permissions) override;
    [[nodiscard]] std::expected<std::unique_ptr<AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) override;

private:
    const std::filesystem::path diagnosticLogRoot_;
};

} // namespace platform
