// SPDX-License-Identifier: Apache-2.0
// Device and inode identify a file under any name.
#include "platform/linux/damage/FilesInPlace.h"

#include <sys/stat.h>
#include <system_error>

namespace platform {

namespace fs = std::filesystem;

FilesInPlace::FilesInPlace(fs::path path, std::chrono::seconds step)
    : path_(std::move(path)),
      directory_(path_.parent_path()),
      companionPaths_{withSuffix(path_, databaseCompanions[0]), withSuffix(path_, databaseCompanions[1])},
      step_(step),
      database_(identityOf(path_)),
      companions_{identityOf(companionPaths_[0]), identityOf(companionPaths_[1])}
{
}

FilesInPlace::Change FilesInPlace::change()
{
    const DirectoryState now = stateOf(directory_);
    if (now.identity.inode != 0 && now == unchanged_)
        return Change::None;
    const Change change = compare();
    if (change == Change::None && isSettled(now))
        unchanged_ = now;
    return change;
}

FilesInPlace::Change FilesInPlace::compare()
{
    if (!isInPlace(database_, path_))
        return Change::Database;
    bool areInPlace = true;
    for (std::size_t each = 0; each < companions_.size(); ++each)
        areInPlace &= isInPlace(companions_[each], companionPaths_[each]);
    return areInPlace ? Change::None : Change::Companions;
}

// A file that was made since and is gone already was removed before it could be noted.
bool FilesInPlace::isInPlace(Identity& noted, const fs::path& path)
{
    const Identity now = identityOf(path);
    if (noted.inode == 0)
        noted = now;
    return now.inode != 0 && now == noted;
}

// Compares the kernel's stamp with the kernel's clock.
bool FilesInPlace::isSettled(const DirectoryState& state) const
{
    timespec now = {};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return state.seconds + step_.count() <= now.tv_sec;
}

void FilesInPlace::removeNotedCompanions() const
{
    for (std::size_t each = 0; each < companions_.size(); ++each)
        if (std::error_code error;
            companions_[each].inode != 0 && identityOf(companionPaths_[each]) == companions_[each])
            fs::remove(companionPaths_[each], error);
}

void FilesInPlace::removeCompanions() const
{
    for (const fs::path& companion : companionPaths_) {
        std::error_code error;
        fs::remove(companion, error);
    }
}

FilesInPlace::Identity FilesInPlace::identityOf(const fs::path& path)
{
    return stateOf(path).identity;
}

FilesInPlace::DirectoryState FilesInPlace::stateOf(const fs::path& path)
{
    struct stat status = {};
    if (::stat(path.c_str(), &status) != 0)
        return {};
    return {.identity = {.device = status.st_dev, .inode = status.st_ino},
            .seconds = status.st_ctim.tv_sec,
            .nanoseconds = status.st_ctim.tv_nsec};
}

} // namespace platform
