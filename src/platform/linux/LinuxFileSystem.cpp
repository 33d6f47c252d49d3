#include "platform/linux/LinuxFileSystem.h"

#include "platform/linux/FileDescriptor.h"

#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace platform {
namespace {

std::error_code lastError()
{
    return {errno, std::generic_category()};
}

class LinuxAtomicFile final : public AtomicFile {
public:
    LinuxAtomicFile(FileDescriptor file, std::filesystem::path temporaryPath, std::filesystem::path path)
        : file_(std::move(file)),
          temporaryPath_(std::move(temporaryPath)),
          path_(std::move(path))
    {
    }
    ~LinuxAtomicFile() override
    {
        if (!isCommitted_)
            ::unlink(temporaryPath_.c_str());
    }
    LinuxAtomicFile(const LinuxAtomicFile&) = delete;
    LinuxAtomicFile& operator=(const LinuxAtomicFile&) = delete;

    void write(std::string_view text) override
    {
        while (!text.empty() && !error_) {
            const ssize_t count = ::write(file_.get(), text.data(), text.size());
            if (count >= 0)
                text.remove_prefix(static_cast<std::size_t>(count));
            else if (errno != EINTR)
                error_ = lastError();
        }
    }

    void clear() override
    {
        if (!error_ && (::ftruncate(file_.get(), 0) != 0 || ::lseek(file_.get(), 0, SEEK_SET) != 0))
            error_ = lastError();
    }

    std::expected<void, std::error_code> commit() override
    {
        if (!error_ && std::rename(temporaryPath_.c_str(), path_.c_str()) != 0)
            error_ = lastError();
        isCommitted_ = !error_;
        if (error_)
            return std::unexpected(error_);
        return {};
    }

private:
    const FileDescriptor file_;
    const std::filesystem::path temporaryPath_;
    const std::filesystem::path path_;
    std::error_code error_;
    bool isCommitted_ = false;
};

} // namespace

std::expected<void, std::error_code> LinuxFileSystem::createDirectories(const std::filesystem::path& path,
                                                                        unsigned permissions)
{
    if (path.has_relative_path() && path != path.parent_path())
        if (struct stat above; ::stat(path.parent_path().c_str(), &above) != 0)
            if (auto made = createDirectories(path.parent_path(), permissions); !made)
                return made;
    if (::mkdir(path.c_str(), permissions) == 0) { // less the umask, which is the process's and not to be touched
        if (::chmod(path.c_str(), permissions) != 0)
            return std::unexpected(lastError());
        return {};
    }
    if (errno != EEXIST)
        return std::unexpected(lastError());
    if (struct stat found; ::stat(path.c_str(), &found) != 0 || !S_ISDIR(found.st_mode))
        return std::unexpected(std::make_error_code(std::errc::not_a_directory));
    return {};
}

std::expected<std::unique_ptr<AtomicFile>, std::error_code>
LinuxFileSystem::createAtomically(const std::filesystem::path& path)
{
    constexpr mode_t readableByAll = 0644;
    const std::filesystem::path temporaryPath = path.parent_path() / fmt::format(".kestod-{}.tmp", ::getpid());
    ::unlink(temporaryPath.c_str()); // of a process of this number that was killed
    FileDescriptor file(
        ::open(temporaryPath.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, readableByAll));
    if (file.get() < 0)
        return std::unexpected(lastError());
    return std::make_unique<LinuxAtomicFile>(std::move(file), temporaryPath, path);
}

} // namespace platform
