// SPDX-License-Identifier: Apache-2.0
// The root is a link, so that one step exchanges the trees. Both have channels in every group. They are in memory, as
// the runtime directory of a service is.
#include "neighbours/ChannelCrowd.h"

#include "neighbours/FloodProcesses.h"

#include <array>
#include <fmt/format.h>
#include <fstream>
#include <string_view>
#include <unistd.h>

namespace bench {
namespace {

namespace fs = std::filesystem;

constexpr int channelCount = 4096;
constexpr int folderCount = 65'000;
constexpr std::array<std::string_view, 8> groups{
    "QuarnZT4/-", "Speaker/-", "-/MCA", "Haptics/Stats", "StateTransitionTimes_ms/-", "Rx/-", "Tx/-", "-/HwAudio2"};

void makeChannels(const fs::path& tree, int countEach)
{
    for (const std::string_view group : groups) {
        const fs::path folder = tree / "amp" / group;
        fs::create_directories(folder);
        for (int channel = 0; channel < countEach; ++channel)
            std::ofstream(folder / fmt::format("channel {:04}", channel)) << "simple\n" << channel << '\n';
    }
}

fs::path folderOf(const fs::path& tree, int number)
{
    return tree / fmt::format("folder {:05}", number);
}

// Of another user than the channels', where this process may give it away.
void makeFolderOfAnother(const fs::path& folder)
{
    fs::create_directory(folder);
    [[maybe_unused]] const int refused = ::lchown(folder.c_str(), otherUser, otherUser);
}

fs::path placeInMemory()
{
    const fs::path memory = "/dev/shm";
    return fs::exists(memory) ? memory : fs::temp_directory_path();
}

} // namespace

ChannelCrowd::ChannelCrowd()
    : directory_(placeInMemory()),
      few_(directory_.path() / "few"),
      many_(directory_.path() / "many")
{
    makeChannels(few_, 1);
    makeChannels(many_, channelCount / static_cast<int>(groups.size()));
    for (int folder = 0; folder < folderCount; ++folder)
        makeFolderOfAnother(folderOf(many_, folder));
    showFew();
}

// One by one: removing a folder with all that is in it takes minutes with so many folders.
ChannelCrowd::~ChannelCrowd()
{
    std::error_code ignored;
    for (int folder = 0; folder < folderCount; ++folder)
        fs::remove(folderOf(many_, folder), ignored);
}

fs::path ChannelCrowd::root() const
{
    return directory_.path() / "root";
}

void ChannelCrowd::show(const fs::path& tree) const
{
    const fs::path link = directory_.path() / "link";
    fs::create_directory_symlink(tree, link);
    fs::rename(link, root());
}

} // namespace bench
