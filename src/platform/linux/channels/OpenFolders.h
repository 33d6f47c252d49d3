// SPDX-License-Identifier: Apache-2.0
// The open folders on the way from the root of the channel tree to the folder that was opened last: the next one is
// usually near it, and then opening it takes one call.
#pragma once

#include <cstddef>
#include <dirent.h>
#include <expected>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace platform {

struct CloseFolder {
    void operator()(DIR* folder) const noexcept { ::closedir(folder); }
};
using OpenFolder = std::unique_ptr<DIR, CloseFolder>;

// Opens a folder; on failure returns `errno`. With O_NOFOLLOW it does not follow a link. Any thread.
[[nodiscard]] std::expected<OpenFolder, int> openFolder(int parent, const char* name, int linkFlag);

// Its descriptor, which stays the folder's. Any thread.
[[nodiscard]] int descriptorOf(DIR* folder) noexcept;

// The place of a folder below the root.
struct FolderPlace {
    std::shared_ptr<const FolderPlace> parent; // null: the root
    std::string name;
    std::size_t depth = 0; // 0 for a driver's folder

    // "amp/Speaker", and with a name behind it.
    [[nodiscard]] std::string path() const { return parent ? parent->path() + '/' + name : name; }
};
using SharedPlace = std::shared_ptr<const FolderPlace>;

// One thread.
class OpenFolders {
public:
    explicit OpenFolders(DIR* root) : root_(root) { }

    // The folder, valid until a folder elsewhere is opened; on failure returns `errno`. It does not follow links.
    [[nodiscard]] std::expected<DIR*, int> open(const SharedPlace& place);

private:
    DIR* const root_;
    std::vector<std::pair<SharedPlace, OpenFolder>> open_; // by depth
};

} // namespace platform
