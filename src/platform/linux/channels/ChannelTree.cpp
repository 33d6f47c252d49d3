// One walk for each query, in the order of the names, with one budget of names, channels and bytes.
#include "platform/linux/channels/ChannelTree.h"

#include "foundation/text/Format.h"
#include "foundation/values/String.h"
#include "platform/linux/channels/ChannelFile.h"
#include "platform/linux/channels/ChannelOwner.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <sys/stat.h>

namespace platform {
namespace {

constexpr std::string_view missingName = "-";

// An open folder.
struct CloseFolder {
    void operator()(DIR* folder) const noexcept { ::closedir(folder); }
};
using Folder = std::unique_ptr<DIR, CloseFolder>;

// Opens a folder; on failure returns `errno`. Below the root it does not follow links.
std::expected<Folder, int> openFolder(int parent, const char* name, int linkFlag)
{
    const int descriptor = ::openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC | linkFlag);
    if (descriptor < 0)
        return std::unexpected(errno);
    Folder folder(::fdopendir(descriptor));
    if (folder)
        return folder;
    const int error = errno;
    ::close(descriptor);
    return std::unexpected(error);
}

struct FolderEntry {
    std::string name;
    unsigned char type; // as of readdir
};

std::optional<std::string> nameOrNothing(const std::string& folder)
{
    return folder == missingName ? std::nullopt : std::optional(folder);
}

// One walk through the tree.
class Reader {
public:
    Reader(const ChannelSelection& selection, const ChannelTree::Limits& limits) : selection_(selection), left_(limits)
    {
    }

    void readFolder(DIR* folder, std::size_t level)
    {
        if (level == groupLevel)
            driver_ = {.folder = ::dirfd(folder)};
        for (const FolderEntry& entry : entriesOf(folder)) {
            names_[level] = entry.name;
            if (!foundation::isValidUtf8(entry.name))
                fail("its name is not UTF-8", level);
            else if (level == channelLevel)
                readChannel(::dirfd(folder), entry.type);
            else if (isSelected(level) && (entry.type == DT_DIR || entry.type == DT_LNK || entry.type == DT_UNKNOWN))
                descend(::dirfd(folder), level);
        }
    }

    [[nodiscard]] ChannelReading take() && { return std::move(reading_); }

private:
    enum Level : std::size_t { driverLevel, groupLevel, subgroupLevel, channelLevel, levels };

    // Sorted, so that the result does not depend on the order in which files were made.
    std::vector<FolderEntry> entriesOf(DIR* folder)
    {
        std::vector<FolderEntry> entries;
        while (const dirent* entry = ::readdir(folder)) {
            if (left_.names == 0) {
                ++reading_.leftOut.beyondNames;
                break;
            }
            --left_.names;
            if (entry->d_name[0] != '.')
                entries.push_back({entry->d_name, entry->d_type});
        }
        std::ranges::sort(entries, {}, &FolderEntry::name);
        return entries;
    }

    [[nodiscard]] bool isSelected(std::size_t level) const
    {
        const auto isMeant = [&](const std::optional<std::string>& name) {
            return !name || nameOrNothing(names_[level]) == name;
        };
        return level == groupLevel   ? isMeant(selection_.group)
            : level == subgroupLevel ? isMeant(selection_.subgroup)
                                     : true;
    }

    void descend(int parent, std::size_t level)
    {
        if (const auto folder = openFolder(parent, names_[level].c_str(), O_NOFOLLOW))
            readFolder(folder->get(), level + 1);
        else if (folder.error() != ENOENT)
            fail(systemErrorText(folder.error()), level);
    }

    void readChannel(int folder, unsigned char type)
    {
        if (left_.channels == 0 || left_.bytes == 0) {
            ++(left_.channels == 0 ? reading_.leftOut.beyondChannels : reading_.leftOut.beyondBytes);
            return;
        }
        if (type != DT_REG && type != DT_UNKNOWN) // merely opening a device may have an effect
            return fail("it is not a regular file");
        const auto text = readFile(folder, type);
        if (!text)
            return;
        std::string_view content = *text;
        if (const auto owner = takeChannelOwner(content); !owner.empty() && isGone(owner))
            return;
        auto channel = parseChannelFile(content);
        if (!channel)
            return fail(description(channel.error()));
        channel->driver = names_[driverLevel];
        channel->group = nameOrNothing(names_[groupLevel]);
        channel->subgroup = nameOrNothing(names_[subgroupLevel]);
        channel->name = names_[channelLevel];
        reading_.channels.push_back(*std::move(channel));
        --left_.channels;
    }

    // The content, valid until the next call; nothing if the file cannot be read, which is noted unless the file has
    // gone.
    std::optional<std::string_view> readFile(int folder, unsigned char type)
    {
        const FileDescriptor file(
            ::openat(folder, names_[channelLevel].c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
        if (file && type == DT_UNKNOWN && !isRegular(file.get())) {
            fail("it is not a regular file");
            return std::nullopt;
        }
        // One call reads the whole file, because publishers replace files and never change them.
        const ssize_t count = file ? ::read(file.get(), buffer_.data(), buffer_.size()) : -1;
        if (count < 0) {
            if (errno != ENOENT)
                fail(systemErrorText(errno));
            return std::nullopt;
        }
        const std::string_view text(buffer_.data(), static_cast<std::size_t>(count));
        left_.bytes -= std::min(left_.bytes, text.size());
        if (text.size() <= largestChannelFile)
            return text;
        fail("it is too large");
        return std::nullopt;
    }

    bool isGone(std::string_view owner)
    {
        if (driver_.owner != owner)
            driver_ = {driver_.folder, std::string(owner), isChannelOwnerGone(driver_.folder, owner)};
        return driver_.isOwnerGone;
    }

    static bool isRegular(int file)
    {
        struct stat status = {};
        return ::fstat(file, &status) == 0 && S_ISREG(status.st_mode);
    }

    void fail(std::string_view reason, std::size_t level = channelLevel)
    {
        std::string path = names_[0];
        for (std::size_t below = 1; below <= level; ++below)
            path.append("/").append(names_[below]);
        reading_.problems.push_back({std::move(path), reason});
    }

    // The driver that is being read. Usually all its channels have one owner.
    struct Driver {
        int folder = -1;
        std::string owner = {}; // the last one that was looked up
        bool isOwnerGone = false;
    };

    const ChannelSelection& selection_;
    Driver driver_;
    std::array<std::string, levels> names_; // of the folders on the way, and of the channel
    ChannelReading reading_;
    ChannelTree::Limits left_;
    std::array<char, largestChannelFile + 1> buffer_;
};

} // namespace

std::vector<std::string> LeftOutChannels::inWords(const ChannelTreeLimits& limits) const
{
    std::vector<std::string> lines;
    if (beyondChannels > 0)
        lines.push_back(foundation::format("channels left out of a sample: {}, beyond the {} that it takes",
                                           beyondChannels, limits.channels));
    if (beyondBytes > 0)
        lines.push_back(
            foundation::format("channels left out of a sample: {}, beyond the {} bytes of files that it takes",
                               beyondBytes, limits.bytes));
    if (beyondNames > 0)
        lines.push_back(foundation::format("folders left out of a sample, in part or whole: at least {}, beyond the {} "
                                           "names that it looks at",
                                           beyondNames, limits.names));
    return lines;
}

std::expected<ChannelReading, std::error_code> ChannelTree::read(const ChannelSelection& selection) const
{
    const auto folder = openFolder(AT_FDCWD, root_.c_str(), 0);
    if (!folder && folder.error() == ENOENT)
        return ChannelReading();
    if (!folder)
        return std::unexpected(std::error_code(folder.error(), std::generic_category()));
    Reader reader(selection, limits_);
    reader.readFolder(folder->get(), 0);
    return std::move(reader).take();
}

} // namespace platform
