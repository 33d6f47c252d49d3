// SPDX-License-Identifier: Apache-2.0
// Folders are made and opened one by one, from the root on; a file is written beside its place and then renamed.
#include "channels/ChannelFolder.h"

#include "foundation/values/String.h"
#include "platform/linux/files/WriteAll.h"
#include "platform/linux/process/Environment.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <new>
#include <span>
#include <sys/stat.h>

namespace libkesto {
namespace {

using platform::FileDescriptor;

constexpr mode_t folderPermissions = 0755;
constexpr mode_t filePermissions = 0644;

bool isControl(char character)
{
    const auto byte = static_cast<unsigned char>(character);
    return byte < 0x20 || byte == 0x7F;
}

std::expected<std::string, kesto_status> checked(const char* given, std::size_t longest)
{
    if (given == nullptr || *given == '\0')
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    std::string text = given;
    if (text.size() > longest)
        return std::unexpected(KESTO_TOO_LARGE);
    if (!foundation::isValidUtf8(text))
        return std::unexpected(KESTO_INVALID_UTF8);
    std::ranges::replace_if(text, isControl, '_');
    return text;
}

FileDescriptor openFolder(int parent, const char* name, int linkFlag)
{
    return FileDescriptor(::openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | linkFlag));
}

// Makes the folder readable for other users, despite the umask.
int makeFolder(int parent, const char* name)
{
    if (::mkdirat(parent, name, folderPermissions) == 0)
        return ::fchmodat(parent, name, folderPermissions, 0) == 0 ? 0 : errno;
    return errno == EEXIST ? 0 : errno;
}

// Opens the folder, if it exists and belongs to this user or the administrator.
int enter(FileDescriptor& folder, const char* name)
{
    FileDescriptor next = openFolder(folder.get(), name, O_NOFOLLOW);
    struct stat status = {};
    if (!next || ::fstat(next.get(), &status) != 0)
        return errno;
    if (status.st_uid != ::geteuid() && status.st_uid != 0)
        return EPERM;
    folder = std::move(next);
    return 0;
}

// Removes the last of these folders, then the one before it, as long as they are empty.
void removeIfEmpty(const std::string& root, std::span<const std::string> place)
{
    for (; !place.empty(); place = place.first(place.size() - 1)) {
        FileDescriptor folder = openFolder(AT_FDCWD, root.c_str(), 0);
        for (const std::string& name : place.first(place.size() - 1))
            if (!folder || enter(folder, name.c_str()) != 0)
                return;
        if (!folder || ::unlinkat(folder.get(), place.back().c_str(), AT_REMOVEDIR) != 0)
            return;
    }
}

} // namespace

std::expected<std::string, kesto_status> channelFileName(const char* given)
{
    auto name = checked(given, NAME_MAX);
    if (!name)
        return name;
    std::ranges::replace(*name, '/', '_');
    if (name->front() == '.')
        name->front() = '_';
    return name;
}

std::expected<std::string, kesto_status> channelGroupName(const char* given)
{
    if (given == nullptr)
        return "-";
    auto name = channelFileName(given);
    if (name && *name == "-")
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    return name;
}

std::expected<std::string, kesto_status> channelText(const char* given)
{
    return checked(given, KESTO_LONGEST_STATE_NAME);
}

std::string usualChannelRoot()
{
    if (std::string given = platform::environment("KESTO_CHANNEL_ROOT"); !given.empty())
        return given;
    if (const std::string runtime = platform::environment("XDG_RUNTIME_DIR"); !runtime.empty())
        if (openFolder(AT_FDCWD, (runtime + "/kesto").c_str(), 0))
            return runtime + "/kesto/channels";
    return "/run/kesto/channels";
}

ChannelFolder::ChannelFolder(std::string root, ChannelPlace place, std::string temporaryName,
                             std::shared_ptr<DriverClaim> claim)
    : root_(std::move(root)),
      place_(std::move(place)),
      temporaryName_(std::move(temporaryName)),
      claim_(std::move(claim))
{
}

ChannelFolder::~ChannelFolder()
{
    const int error = errno; // the caller may be about to return it
    claim_.reset();
    removeIfEmpty(root_, place_);
    errno = error;
}

int ChannelFolder::open() noexcept
try {
    if (const int error = makeFolder(AT_FDCWD, root_.c_str()); error != 0)
        return error;
    FileDescriptor folder = openFolder(AT_FDCWD, root_.c_str(), 0);
    if (!folder)
        return errno;
    for (const std::string& name : place_) {
        if (const int error = makeFolder(folder.get(), name.c_str()); error != 0)
            return error;
        if (const int error = enter(folder, name.c_str()); error != 0)
            return error;
        if (&name == &place_.front())
            claim_->renew(folder.get());
    }
    folder_ = std::move(folder);
    return 0;
} catch (const std::bad_alloc&) {
    return ENOMEM;
}

int ChannelFolder::write(const std::string& name, std::string_view text) noexcept
{
    const FileDescriptor file(::openat(folder_.get(), temporaryName_.c_str(),
                                       O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, filePermissions));
    if (!file)
        return errno;
    int error = platform::writeAll(file.get(), claim_->line());
    if (error == 0)
        error = platform::writeAll(file.get(), text);
    if (error == 0 && ::fchmod(file.get(), filePermissions) != 0)
        error = errno;
    if (error == 0 && ::renameat(folder_.get(), temporaryName_.c_str(), folder_.get(), name.c_str()) != 0)
        error = errno;
    if (error != 0)
        ::unlinkat(folder_.get(), temporaryName_.c_str(), 0);
    return error;
}

int ChannelFolder::replace(const std::string& name, std::string_view text) noexcept
{
    // Another program may have removed the tree, and another publisher removes a folder that becomes empty.
    constexpr int mostAttempts = 3;
    int error = ENOENT;
    for (int attempt = 0; error == ENOENT && attempt < mostAttempts; ++attempt) {
        error = folder_ && attempt == 0 && !claim_->isLost() ? 0 : open();
        if (error == 0)
            error = write(name, text);
    }
    return error;
}

void ChannelFolder::remove(const std::string& name) noexcept
{
    if (folder_)
        ::unlinkat(folder_.get(), name.c_str(), 0);
}

} // namespace libkesto
