// SPDX-License-Identifier: Apache-2.0
// Folders wait on a stack for each user, in the order of their names; the channels are put in order at the end.
#include "platform/linux/channels/ChannelWalk.h"

#include "foundation/values/String.h"
#include "platform/linux/channels/ChannelOwner.h"
#include "platform/linux/channels/ChannelSelections.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <fcntl.h>
#include <functional>
#include <ranges>
#include <sys/stat.h>
#include <tuple>
#include <utility>

namespace platform {
namespace {

constexpr std::string_view missingName = "-";
constexpr std::size_t groupDepth = 1;
constexpr std::size_t subgroupDepth = 2; // the files in such a folder are channels

// A step reads at most so much.
constexpr std::size_t mostFilesOfAStep = 32;
constexpr std::size_t mostBytesOfAStep = std::size_t{64} * 1024;

// Looking for drivers takes at most this part of the time, so that some is left for reading those that were found.
constexpr int partForFindingDrivers = 2;
constexpr std::size_t namesBetweenLooksAtTheTime = 256;

std::optional<std::string> nameOrNothing(const std::string& folder)
{
    return folder == missingName ? std::nullopt : std::optional(folder);
}

bool mayBeFolder(unsigned char type)
{
    return type == DT_DIR || type == DT_LNK || type == DT_UNKNOWN; // a link is a problem, which opening it finds
}

bool isRegular(int file)
{
    struct stat status = {};
    return ::fstat(file, &status) == 0 && S_ISREG(status.st_mode);
}

} // namespace

ChannelWalk::ChannelWalk(DIR* root, const std::vector<ChannelSelection>& selections, const ChannelTreeLimits& limits,
                         const ChannelTree::Now& now)
    : root_(root),
      selections_(selections),
      limits_(limits),
      now_(now),
      start_(now()),
      allowed_(limits),
      left_(limits),
      folders_(root)
{
}

ChannelReading ChannelWalk::run(const std::vector<std::string>& knownDrivers)
{
    findDrivers(knownDrivers);
    letUsersTakeTurns();
    for (const auto& [number, user] : users_)
        if (user.isCut)
            reading_.cutUsers.push_back(number);
    std::ranges::sort(reading_.problems);
    std::ranges::sort(reading_.channels, {}, [](const ReportingChannel& channel) {
        return std::tie(channel.driver, channel.group, channel.subgroup, channel.name);
    });
    return std::move(reading_);
}

void ChannelWalk::findDrivers(const std::vector<std::string>& known)
{
    for (const std::string& driver : known)
        addDriver(driver.c_str());
    for (std::size_t count = 0; const dirent* entry = ::readdir(root_); ++count) {
        const bool isTimeOver =
            count % namesBetweenLooksAtTheTime == 0 && timeTaken() > limits_.time / partForFindingDrivers;
        if (count == limits_.drivers || isTimeOver) {
            ++(isTimeOver ? reading_.leftOut.beyondTime : reading_.leftOut.beyondDrivers);
            reading_.isWhole = false;
            break;
        }
        if (entry->d_name[0] == '.' || std::ranges::binary_search(known, std::string_view(entry->d_name)))
            continue;
        if (mayBeFolder(entry->d_type))
            addDriver(entry->d_name);
        else if (!foundation::isValidUtf8(entry->d_name))
            fail(entry->d_name, "its name is not UTF-8");
    }
    for (auto& [number, user] : users_)
        std::ranges::sort(user.folders, std::greater(), [](const Folder& folder) { return folder.place->name; });
}

void ChannelWalk::addDriver(const char* name)
{
    if (!foundation::isValidUtf8(name))
        return fail(name, "its name is not UTF-8");
    struct stat status = {};
    if (::fstatat(descriptorOf(root_), name, &status, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno != ENOENT)
            fail(name, systemErrorText(errno));
        return;
    }
    User& user = users_[status.st_uid];
    user.number = status.st_uid;
    user.folders.push_back({std::make_shared<FolderPlace>(nullptr, name)});
    if (user.folders.size() > 2 * limits_.folders)
        forgetLastDrivers(user);
}

// More than can be opened need no memory.
void ChannelWalk::forgetLastDrivers(User& user)
{
    const auto end = user.folders.begin() + static_cast<std::ptrdiff_t>(limits_.folders);
    std::ranges::nth_element(user.folders, end, {}, [](const Folder& folder) { return folder.place->name; });
    leaveOut(user, &LeftOutChannels::beyondFolders, user.folders.size() - limits_.folders);
    user.folders.erase(end, user.folders.end());
}

void ChannelWalk::letUsersTakeTurns()
{
    std::multimap<double, User*> turns;
    for (auto& [number, user] : users_)
        turns.emplace(0, &user);
    while (!turns.empty()) {
        auto turn = turns.extract(turns.begin());
        User& user = *turn.mapped();
        if (timeTaken() > limits_.time)
            leaveOutTheRest(user);
        else
            step(user);
        turn.key() = user.taken.greatestPartOf(allowed_);
        if (!user.folders.empty())
            turns.insert(std::move(turn));
    }
}

void ChannelWalk::step(User& user)
{
    if (user.folders.back().files)
        readFiles(user);
    else
        open(user);
}

void ChannelWalk::open(User& user)
{
    Folder opened = std::move(user.folders.back());
    user.folders.pop_back();
    if (left_[ChannelResource::Folders] == 0)
        return leaveOut(user, &LeftOutChannels::beyondFolders, 1);
    take(user, ChannelResource::Folders, 1);
    const auto folder = folders_.open(opened.place);
    if (!folder) {
        if (folder.error() != ENOENT)
            fail(opened.place->path(), systemErrorText(folder.error()));
        return;
    }
    std::vector<Entry> entries = entriesOf(*folder, user);
    if (opened.place->depth < subgroupDepth)
        return addFolders(opened.place, std::move(entries), user);
    opened.files = std::move(entries);
    user.folders.push_back(std::move(opened));
}

// Sorted, so that the result does not depend on the order in which files were made.
std::vector<ChannelWalk::Entry> ChannelWalk::entriesOf(DIR* folder, User& user)
{
    std::vector<Entry> entries;
    std::size_t& left = left_[ChannelResource::Names];
    for (std::size_t count = 0; const dirent* entry = ::readdir(folder); ++count) {
        if (left == 0 || count == limits_.namesOfAFolder) {
            leaveOut(user, &LeftOutChannels::beyondNames, 1);
            break;
        }
        take(user, ChannelResource::Names, 1);
        if (entry->d_name[0] != '.')
            entries.push_back({entry->d_name, entry->d_type});
    }
    std::ranges::sort(entries, {}, &Entry::name);
    return entries;
}

void ChannelWalk::addFolders(const SharedPlace& parent, std::vector<Entry> entries, User& user)
{
    for (Entry& entry : std::views::reverse(entries)) {
        if (!foundation::isValidUtf8(entry.name))
            fail(parent->path() + '/' + entry.name, "its name is not UTF-8");
        else if (mayBeFolder(entry.type) && isSelected(parent, entry.name))
            user.folders.push_back({std::make_shared<FolderPlace>(parent, std::move(entry.name), parent->depth + 1)});
    }
}

bool ChannelWalk::isSelected(const SharedPlace& parent, const std::string& name) const
{
    return parent->depth + 1 == groupDepth ? selectsGroup(selections_, nameOrNothing(name))
                                           : selects(selections_, nameOrNothing(parent->name), nameOrNothing(name));
}

void ChannelWalk::readFiles(User& user)
{
    Folder& files = user.folders.back();
    const auto folder = folders_.open(files.place);
    if (!folder) { // it was removed in between
        user.folders.pop_back();
        return;
    }
    const std::size_t filesEnd = std::min(files.files->size(), files.filesRead + mostFilesOfAStep);
    const std::size_t bytesBefore = user.taken[ChannelResource::Bytes];
    while (files.filesRead < filesEnd && user.taken[ChannelResource::Bytes] - bytesBefore < mostBytesOfAStep)
        readChannel(*folder, files.place, (*files.files)[files.filesRead++], user);
    if (files.filesRead == files.files->size())
        user.folders.pop_back();
}

void ChannelWalk::readChannel(DIR* folder, const SharedPlace& place, const Entry& entry, User& user)
{
    if (left_[ChannelResource::Channels] == 0)
        return leaveOut(user, &LeftOutChannels::beyondChannels, 1);
    if (left_[ChannelResource::Bytes] == 0)
        return leaveOut(user, &LeftOutChannels::beyondBytes, 1);
    take(user, ChannelResource::Channels, 1);
    const auto failed = [&](std::string_view reason) { fail(place->path() + '/' + entry.name, reason); };
    if (!foundation::isValidUtf8(entry.name))
        return failed("its name is not UTF-8");
    if (entry.type != DT_REG && entry.type != DT_UNKNOWN) // merely opening a device may have an effect
        return failed("it is not a regular file");
    const auto text = readFile(folder, place, entry, user);
    if (!text)
        return;
    std::string_view content = *text;
    const SharedPlace& group = place->parent;
    const SharedPlace& driver = group->parent;
    if (const auto owner = takeChannelOwner(content); !owner.empty() && isGone(driver, owner, user))
        return;
    auto channel = parseChannelFile(content);
    if (!channel)
        return failed(description(channel.error()));
    channel->driver = driver->name;
    channel->group = nameOrNothing(group->name);
    channel->subgroup = nameOrNothing(place->name);
    channel->name = entry.name;
    channel->user = user.number;
    reading_.channels.push_back(*std::move(channel));
}

// The content, valid until the next call; nothing if the file cannot be read, which is noted unless the file has gone.
std::optional<std::string_view> ChannelWalk::readFile(DIR* folder, const SharedPlace& place, const Entry& entry,
                                                      User& user)
{
    const auto failed = [&](std::string_view reason) {
        fail(place->path() + '/' + entry.name, reason);
        return std::nullopt;
    };
    const FileDescriptor file(
        ::openat(descriptorOf(folder), entry.name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (file && entry.type == DT_UNKNOWN && !isRegular(file.get()))
        return failed("it is not a regular file");
    // One call reads the whole file, because publishers replace files and never change them.
    const ssize_t count = file ? ::read(file.get(), buffer_.data(), buffer_.size()) : -1;
    if (count < 0)
        return errno == ENOENT ? std::nullopt : failed(systemErrorText(errno));
    const std::string_view text(buffer_.data(), static_cast<std::size_t>(count));
    take(user, ChannelResource::Bytes, text.size());
    return text.size() <= largestChannelFile ? std::optional(text) : failed("it is too large");
}

bool ChannelWalk::isGone(const SharedPlace& driver, std::string_view owner, User& user)
{
    if (user.owner.driver != driver || user.owner.owner != owner) {
        const auto folder = folders_.open(driver);
        user.owner = {driver, std::string(owner), folder && isChannelOwnerGone(descriptorOf(*folder), owner)};
    }
    return user.owner.isGone;
}

void ChannelWalk::take(User& user, ChannelResource resource, std::size_t amount)
{
    left_[resource] -= std::min(left_[resource], amount);
    user.taken[resource] += amount;
}

void ChannelWalk::leaveOut(User& user, LeftOut bound, std::size_t count)
{
    reading_.leftOut.*bound += count;
    user.isCut = true;
}

void ChannelWalk::leaveOutTheRest(User& user)
{
    for (const Folder& folder : user.folders)
        leaveOut(user, &LeftOutChannels::beyondTime, folder.files ? folder.files->size() - folder.filesRead : 1);
    user.folders.clear();
}

} // namespace platform
