// SPDX-License-Identifier: Apache-2.0
// The age of a file is the time of its last write. Its name holds the wall-clock time, which the device's owner may set
// back.
#include "platform/linux/diagnostics/FolderLimits.h"

#include "platform/linux/files/FilesAt.h"
#include "platform/linux/files/Surplus.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <numeric>
#include <sys/stat.h>
#include <tuple>
#include <unistd.h>
#include <utility>

namespace platform {
namespace {

constexpr std::size_t mostNames = 65536; // the most that one look reads, because other users may fill the folder

// The target size after the oldest files are removed.
template <typename Number> Number threeQuartersOf(Number limit)
{
    return limit - limit / 4;
}

// How many of the oldest files to remove. The newest always stays.
std::size_t howManyGo(std::span<const std::uint64_t> sizes, const KeptFiles& kept)
{
    if (surplus(sizes, kept.most, kept.mostBytes) == 0)
        return 0;
    return std::min(surplus(sizes, threeQuartersOf(kept.most), threeQuartersOf(kept.mostBytes)), sizes.size() - 1);
}

} // namespace

struct FolderLimits::File {
    std::pair<std::int64_t, std::int64_t> age; // seconds and nanoseconds since 1970
    std::string name;
    std::uint64_t bytes;
};

void FolderLimits::added(const std::filesystem::path& folder, const KeptFiles& kept, std::uint64_t bytes, Open open)
{
    {
        const foundation::Lock lock(lock_);
        Account& account = accounts_[folder];
        account.contents.files += 1;
        account.contents.bytes += bytes;
        const bool isWithin = account.contents.files <= kept.most && account.contents.bytes <= kept.mostBytes;
        if (account.isLookedThrough || (account.isKnown && isWithin))
            return;
        account = {.isKnown = true, .isLookedThrough = true};
    }
    workQueues_.backgroundQueue().submit([this, folder, kept, open = std::move(open)] { look(folder, kept, open); });
}

// Files that cannot be removed count as removed, to avoid another attempt with each new file.
void FolderLimits::look(const std::filesystem::path& folder, const KeptFiles& kept, const Open& open)
{
    const auto opened = open();
    const auto files = opened ? filesIn(opened->get(), kept.isOne) : std::unexpected(opened.error());
    Contents staying;
    if (files) {
        std::vector<std::uint64_t> sizes;
        std::ranges::transform(*files, std::back_inserter(sizes), &File::bytes);
        const std::size_t going = howManyGo(sizes, kept);
        removeOldest(std::span(*files).first(going), opened->get(), folder, kept);
        staying = {sizes.size() - going,
                   std::accumulate(sizes.begin() + static_cast<std::ptrdiff_t>(going), sizes.end(), std::uint64_t{0})};
    } else {
        log_.error("{} cannot be searched ({}): its oldest files stay", folder.native(), files.error().message());
    }
    const foundation::Lock lock(lock_);
    Account& account = accounts_[folder];
    account.contents.files += staying.files;
    account.contents.bytes += staying.bytes;
    account.isLookedThrough = false;
}

void FolderLimits::removeUnfinished(const std::filesystem::path& folder, int opened)
{
    const auto files = filesIn(opened, isTemporaryName);
    const Removal removal = files ? remove(*files, opened) : Removal{.reason = files.error()};
    if (removal.removed != 0)
        log_.note("removed {} files from {} that a killed service had not finished", removal.removed, folder.native());
    if (removal.reason)
        log_.error("the unfinished files of a killed service in {} cannot be removed ({})", folder.native(),
                   removal.reason.message());
}

// The files of that kind, the oldest first, with the unfinished files of a killed service.
std::expected<std::vector<FolderLimits::File>, std::error_code>
FolderLimits::filesIn(int folder, bool (*isOne)(std::string_view name))
{
    auto names = namesIn(folder, mostNames);
    if (!names)
        return std::unexpected(names.error());
    std::vector<File> files;
    for (std::string& name : *names) {
        struct stat status = {};
        if ((isOne(name) || isTemporaryName(name)) && ::fstatat(folder, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0
            && S_ISREG(status.st_mode) && status.st_uid == ::geteuid())
            files.push_back({{status.st_mtim.tv_sec, status.st_mtim.tv_nsec},
                             std::move(name),
                             static_cast<std::uint64_t>(status.st_size)});
    }
    std::ranges::sort(files, [](const File& left, const File& right) {
        return std::tie(left.age, left.name) < std::tie(right.age, right.name);
    });
    return files;
}

FolderLimits::Removal FolderLimits::remove(std::span<const File> files, int folder)
{
    Removal removal;
    for (const File& file : files) {
        if (::unlinkat(folder, file.name.c_str(), 0) == 0) {
            ++removal.removed;
        } else if (errno != ENOENT) {
            ++removal.staying;
            removal.reason = {errno, std::generic_category()};
        }
    }
    return removal;
}

void FolderLimits::removeOldest(std::span<const File> files, int folder, const std::filesystem::path& path,
                                const KeptFiles& kept)
{
    const Removal removal = remove(files, folder);
    removedFiles_ += removal.removed;
    if (removal.removed != 0)
        log_.note("removed the oldest {} files from {}, {} since the start: there may be {} of {} MiB together",
                  removal.removed, path.native(), removedFiles(), kept.most, kept.mostBytes >> 20);
    if (removal.staying != 0)
        log_.error("{} of the oldest files cannot be removed from {} ({})", removal.staying, path.native(),
                   removal.reason.message());
}

} // namespace platform
