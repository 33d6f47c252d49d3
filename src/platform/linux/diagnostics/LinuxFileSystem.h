// SPDX-License-Identifier: Apache-2.0
// The room of diagnostics: the folders below the diagnostic-log root, their files, and how many of these are kept.
//
// Folders and files of the service's own, and files that clients name, on the real file system.
//
// A file is written under a temporary name beside its place and then renamed, so that a reader sees the old or the new
// file and never an unfinished one.
//
// Every user may write to some folders, so the service does not trust their content: with a link in the place of a
// folder another user could make the service write, or set permissions, where that user may not. So every step below
// the diagnostic-log root starts from the open folder before it, and no step follows a link. The root itself may be a
// link: the administrator made it. If the root is removed while the service runs, it is made again with its earlier
// permissions, where the service has the right: otherwise later reports would be lost.
//
// A client may name a device file, and merely opening a device may have an effect. So the service first gets a
// descriptor that does not open the file (O_PATH), checks the kind of the file, and only then opens this same file.
#pragma once

#include "platform/FileSystem.h"
#include "platform/linux/files/FileDescriptor.h"

#include <optional>

namespace platform {

class FolderLimits;

// Any thread. It outlives the background queue's work.
class LinuxFileSystem final : public FileSystem {
public:
    // The limits must outlive it. Null: folders have no limits.
    explicit LinuxFileSystem(std::filesystem::path diagnosticLogRoot, FolderLimits* limits = nullptr);

    [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return diagnosticLogRoot_; }
    [[nodiscard]] std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                         unsigned permissions) override;
    [[nodiscard]] std::expected<std::unique_ptr<AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) override;
    void keepWithin(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes) override;
    [[nodiscard]] std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path,
                                                                       std::size_t limit) override;

    // Opens a folder, which is the root or below it.
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> openDirectory(const std::filesystem::path& path) const
    {
        return openDirectory(path, std::nullopt);
    }

    // Removes the unfinished files of a killed service from the folder. Call it at the start, before anything is
    // written. A missing folder counts as empty.
    void removeUnfinished(const std::filesystem::path& folder);

private:
    // Makes the root again as it was at the start, and missing folders above it.
    [[nodiscard]] std::error_code makeRootAgain() const;
    // Walks down from the root, and makes missing folders on the way if `permissions` are given.
    [[nodiscard]] std::expected<FileDescriptor, std::error_code>
    openDirectory(const std::filesystem::path& path, std::optional<unsigned> permissionsOfMissing) const;

    const std::filesystem::path diagnosticLogRoot_;
    const std::optional<unsigned> rootPermissions_; // at the start; nothing if the root did not exist
    FolderLimits* const limits_;
};

} // namespace platform
