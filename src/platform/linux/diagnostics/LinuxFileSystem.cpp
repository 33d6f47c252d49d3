// SPDX-License-Identifier: Apache-2.0
// A path is walked one folder at a time, each by its descriptor, so that the service uses the folder that it checked.
#include "platform/linux/diagnostics/LinuxFileSystem.h"

#include "foundation/text/Format.h"
#include "platform/linux/diagnostics/FolderLimits.h"
#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/SmallFile.h"
#include "platform/linux/files/SystemError.h"
#include "platform/linux/files/WriteAll.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

class LinuxAtomicFile final : public AtomicFile {
public:
    LinuxAtomicFile(FileDescriptor directory, FileDescriptor file, std::string temporaryName, std::string name)
        : directory_(std::move(directory)),
          file_(std::move(file)),
          temporaryName_(std::move(temporaryName)),
          name_(std::move(name))
    {
    }
    ~LinuxAtomicFile() override
    {
        if (!isCommitted_)
            ::unlinkat(directory_.get(), temporaryName_.c_str(), 0);
    }
    LinuxAtomicFile(const LinuxAtomicFile&) = delete;
    LinuxAtomicFile& operator=(const LinuxAtomicFile&) = delete;

    void write(std::string_view text) override
    {
        if (!error_)
            error_.assign(writeAll(file_.get(), text), std::generic_category());
    }

    void clear() override
    {
        if (!error_ && (::ftruncate(file_.get(), 0) != 0 || ::lseek(file_.get(), 0, SEEK_SET) != 0))
            error_ = systemError();
    }

    std::expected<void, std::error_code> commit() override
    {
        if (!error_ && ::renameat(directory_.get(), temporaryName_.c_str(), directory_.get(), name_.c_str()) != 0)
            error_ = systemError();
        isCommitted_ = !error_;
        if (error_)
            return std::unexpected(error_);
        return {};
    }

private:
    const FileDescriptor directory_;
    const FileDescriptor file_;
    const std::string temporaryName_;
    const std::string name_;
    std::error_code error_;
    bool isCommitted_ = false;
};

// Makes the folder with exactly these permissions, unless the name is taken.
std::error_code makeIfMissing(int parent, const char* name, unsigned permissions)
{
    if (::mkdirat(parent, name, permissions) != 0)
        return errno == EEXIST ? std::error_code() : systemError();
    // mkdir applied the umask, which belongs to the whole process and must not change.
    return ::fchmodat(parent, name, permissions, AT_SYMLINK_NOFOLLOW) == 0 ? std::error_code() : systemError();
}

std::optional<unsigned> permissionsOf(const std::filesystem::path& folder)
{
    constexpr unsigned permissions = 07777;
    struct stat status = {};
    if (::stat(folder.c_str(), &status) != 0)
        return std::nullopt;
    return status.st_mode & permissions;
}

} // namespace

LinuxFileSystem::LinuxFileSystem(std::filesystem::path diagnosticLogRoot, FolderLimits* limits)
    : diagnosticLogRoot_(std::move(diagnosticLogRoot)),
      rootPermissions_(permissionsOf(diagnosticLogRoot_)),
      limits_(limits)
{
}

std::error_code LinuxFileSystem::makeRootAgain() const
{
    if (!rootPermissions_)
        return std::make_error_code(std::errc::no_such_file_or_directory);
    std::filesystem::path folder;
    for (const std::filesystem::path& name : diagnosticLogRoot_)
        if (const auto error = makeIfMissing(AT_FDCWD, (folder /= name).c_str(), *rootPermissions_))
            return error;
    return {};
}

std::expected<FileDescriptor, std::error_code>
LinuxFileSystem::openDirectory(const std::filesystem::path& path, std::optional<unsigned> permissionsOfMissing) const
{
    const std::filesystem::path below = path.lexically_relative(diagnosticLogRoot_);
    if (below.empty() || std::ranges::find(below, "..") != below.end())
        return std::unexpected(std::make_error_code(std::errc::invalid_argument));
    const auto openRoot = [this] {
        return FileDescriptor(::open(diagnosticLogRoot_.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    };
    FileDescriptor directory = openRoot();
    if (!directory && errno == ENOENT && permissionsOfMissing) {
        if (const auto error = makeRootAgain())
            return std::unexpected(error);
        directory = openRoot();
    }
    if (!directory)
        return std::unexpected(systemError());
    for (const std::filesystem::path& name : below) {
        if (permissionsOfMissing)
            if (const auto error = makeIfMissing(directory.get(), name.c_str(), *permissionsOfMissing))
                return std::unexpected(error);
        FileDescriptor next(::openat(directory.get(), name.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        if (!next)
            return std::unexpected(systemError());
        directory = std::move(next);
    }
    return directory;
}

std::expected<void, std::error_code> LinuxFileSystem::createDirectories(const std::filesystem::path& path,
                                                                        unsigned permissions)
{
    if (const auto opened = openDirectory(path, permissions); !opened)
        return std::unexpected(opened.error());
    return {};
}

std::expected<std::unique_ptr<AtomicFile>, std::error_code>
LinuxFileSystem::createAtomically(const std::filesystem::path& path)
{
    constexpr mode_t readableByAll = 0644;
    auto directory = openDirectory(path.parent_path());
    if (!directory)
        return std::unexpected(directory.error());
    std::string name = temporaryName();
    FileDescriptor file(
        ::openat(directory->get(), name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, readableByAll));
    if (!file || ::fchmod(file.get(), readableByAll) != 0) // open applied the umask, as mkdir does
        return std::unexpected(systemError());
    return std::make_unique<LinuxAtomicFile>(*std::move(directory), std::move(file), std::move(name),
                                             path.filename().string());
}

void LinuxFileSystem::keepWithin(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes)
{
    if (limits_ != nullptr)
        limits_->added(folder, kept, bytes, [this, folder] { return openDirectory(folder); });
}

void LinuxFileSystem::removeUnfinished(const std::filesystem::path& folder)
{
    const auto opened = openDirectory(folder);
    if (opened && limits_ != nullptr)
        limits_->removeUnfinished(folder, opened->get());
}

std::expected<std::string, std::error_code> LinuxFileSystem::readFile(const std::filesystem::path& path,
                                                                      std::size_t limit)
{
    const std::unexpected notAFile(std::make_error_code(std::errc::invalid_argument));
    if (path.native().contains('\0')) // the system would take the part before it as the path
        return notAFile;
    const FileDescriptor place(::open(path.c_str(), O_PATH | O_CLOEXEC));
    struct stat status = {};
    if (!place || ::fstat(place.get(), &status) != 0)
        return std::unexpected(systemError());
    if (!S_ISREG(status.st_mode))
        return notAFile;
    return readSmallFile(foundation::format("/proc/self/fd/{}", place.get()), limit);
}

} // namespace platform
