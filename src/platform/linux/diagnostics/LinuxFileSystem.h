// The room of diagnostics: the folders below the diagnostic-log root, their files, and how many of these are kept.
//
// Folders and files of the service's own, and files that clients name, on the real file system.
//
// A file is written under a name of its own beside its place and then renamed, so that whoever reads it sees the
// old one or the new one and never half of it.
//
// Some folders may be written to by everybody, and what stands there is not to be trusted: a link put in the place of a
// folder would have the service write, or open to everybody, where its maker may not. So every step below the
// diagnostic-log root is taken from the folder before it, and none through a link. The root itself may be one: it is
// the administrator's. If it goes while the service runs, it is made again with the permissions that it had, where the
// service may: what is reported from then on would be lost otherwise.
//
// A client may name a device, and of a device even the opening may do something. So what is named is only pointed at,
// looked at, and opened as what was seen.
#pragma once

#include "platform/FileSystem.h"
#include "platform/linux/files/FileDescriptor.h"

#include <optional>

namespace platform {

class FolderKeeper;

// Any thread. It outlives the background queue's work.
class LinuxFileSystem final : public FileSystem {
public:
    // Without a keeper, which outlives it, no folder is kept within limits.
    explicit LinuxFileSystem(std::filesystem::path diagnosticLogRoot, FolderKeeper* keeper = nullptr);

    [[nodiscard]] std::filesystem::path diagnosticLogRoot() const override { return diagnosticLogRoot_; }
    [[nodiscard]] std::expected<void, std::error_code> createDirectories(const std::filesystem::path& path,
                                                                         unsigned permissions) override;
    [[nodiscard]] std::expected<std::unique_ptr<AtomicFile>, std::error_code>
    createAtomically(const std::filesystem::path& path) override;
    void keepWithin(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes) override;
    [[nodiscard]] std::expected<std::string, std::error_code> readFile(const std::filesystem::path& path,
                                                                       std::size_t limit) override;

    // For the start, before anything is written: removes what a service that was killed had begun to write in the
    // folder. A folder that is missing is as good as an empty one.
    void removeUnfinished(const std::filesystem::path& folder);

private:
    // Makes the root again as it was in the beginning, and the folders above it that went with it.
    [[nodiscard]] std::error_code makeRootAgain() const;
    // Steps down from the root, and makes the folders on the way that are missing, if there are permissions for them.
    [[nodiscard]] std::expected<FileDescriptor, std::error_code>
    openDirectory(const std::filesystem::path& path, std::optional<unsigned> permissionsOfMissing) const;

    const std::filesystem::path diagnosticLogRoot_;
    const std::optional<unsigned> rootPermissions_; // in the beginning; nothing when there was none
    FolderKeeper* const keeper_;
};

} // namespace platform
