// SPDX-License-Identifier: Apache-2.0
// The database itself is renamed last: as long as it has its old name, the renaming is not finished.
#include "platform/linux/damage/SetAsideFiles.h"

#include "platform/linux/damage/FilesInPlace.h"
#include "platform/linux/files/FileDescriptor.h"

#include <algorithm>
#include <fcntl.h>
#include <fmt/chrono.h>
#include <string>
#include <system_error>

namespace platform {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view damagedMark = ".corrupt-";
constexpr std::string_view newerMark = ".newer-";
constexpr std::string_view unsavedSuffix = "-unsaved";

bool isThere(const fs::path& path)
{
    std::error_code error;
    return fs::exists(fs::symlink_status(path, error));
}

void removeIfThere(const fs::path& path)
{
    std::error_code error;
    fs::remove(path, error);
}

bool isBesideADatabase(const fs::path& path)
{
    const std::string name = path.filename();
    return name.ends_with(unsavedSuffix)
        || std::ranges::any_of(databaseCompanions, [&](std::string_view suffix) { return name.ends_with(suffix); });
}

} // namespace

std::optional<fs::path> SetAsideFiles::setAsideDamaged()
{
    removeOldestDamaged();
    fs::path target = freeName(damagedMark);
    const fs::path mark = withSuffix(target, unsavedSuffix);
    if (!FileDescriptor(::open(mark.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0644)))
        return std::nullopt;
    if (rename(target))
        return target;
    removeIfThere(mark);
    return std::nullopt;
}

std::optional<fs::path> SetAsideFiles::setAsideNewer()
{
    const fs::path target = freeName(newerMark);
    return rename(target) ? std::optional(target) : std::nullopt;
}

void SetAsideFiles::finish()
{
    for (const fs::path& mark : damagedOnes(unsavedSuffix)) {
        const std::string name = mark;
        const fs::path target = name.substr(0, name.size() - unsavedSuffix.size());
        const auto wasRenamed = [&](std::string_view suffix) { return isThere(withSuffix(target, suffix)); };
        if (isThere(target))
            continue;
        if (!isThere(path_) || std::ranges::none_of(databaseCompanions, wasRenamed) || !rename(target))
            removeIfThere(mark);
    }
}

std::vector<fs::path> SetAsideFiles::unsaved() const
{
    std::vector<fs::path> paths = damagedOnes({});
    std::erase_if(paths, [](const fs::path& path) { return !isThere(withSuffix(path, unsavedSuffix)); });
    return paths;
}

void SetAsideFiles::markSaved(const fs::path& damaged)
{
    removeIfThere(withSuffix(damaged, unsavedSuffix));
}

fs::path SetAsideFiles::freeName(std::string_view mark) const
{
    const auto now = static_cast<std::time_t>(clock_.secondsSince1970());
    const fs::path wanted = withSuffix(path_, fmt::format("{}{:%Y%m%dT%H%M%SZ}", mark, fmt::gmtime(now)));
    fs::path target = wanted;
    for (int number = 2; isThere(target); ++number)
        target = withSuffix(wanted, fmt::format(".{}", number));
    return target;
}

bool SetAsideFiles::rename(const fs::path& target) const
{
    const auto renameCompanions = [](const fs::path& from, const fs::path& to) {
        for (const std::string_view suffix : databaseCompanions) {
            std::error_code isNotThere;
            fs::rename(withSuffix(from, suffix), withSuffix(to, suffix), isNotThere);
        }
    };
    renameCompanions(path_, target);
    std::error_code error;
    fs::rename(path_, target, error);
    if (error)
        renameCompanions(target, path_);
    return !error;
}

// The files whose names have the mark of damage and that end, the oldest first, because the time is in the name. The
// databases themselves with an empty end.
std::vector<fs::path> SetAsideFiles::damagedOnes(std::string_view suffix) const
{
    const std::string beginning = path_.filename().string().append(damagedMark);
    std::vector<fs::path> paths;
    std::error_code error;
    for (fs::directory_iterator file(path_.parent_path(), error); file != end(file); file.increment(error)) {
        const std::string name = file->path().filename();
        if (name.starts_with(beginning) && name.ends_with(suffix)
            && (!suffix.empty() || !isBesideADatabase(file->path())))
            paths.push_back(file->path());
    }
    std::ranges::sort(paths);
    return paths;
}

void SetAsideFiles::removeOldestDamaged() const
{
    std::vector<fs::path> damaged = damagedOnes({});
    const std::size_t surplus = damaged.size() + 1 > mostDamagedKept ? damaged.size() + 1 - mostDamagedKept : 0;
    for (const fs::path& oldest :
         std::vector(damaged.begin(), damaged.begin() + static_cast<std::ptrdiff_t>(surplus))) {
        removeIfThere(oldest);
        markSaved(oldest);
        for (const std::string_view suffix : databaseCompanions)
            removeIfThere(withSuffix(oldest, suffix));
    }
}

} // namespace platform
