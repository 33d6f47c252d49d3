// SPDX-License-Identifier: Apache-2.0
// Every user may write to the tree: links in it are not followed, and only this user's own entries are trusted.
#include "kesto-pipewire/DriverName.h"

#include <fmt/format.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <optional>
#include <random>

namespace kesto_pipewire {

namespace {

constexpr uid_t administrator = 0;

std::optional<uid_t> ownerOf(const std::filesystem::path& path)
{
    struct stat status = {};
    return ::lstat(path.c_str(), &status) == 0 ? std::optional(status.st_uid) : std::nullopt;
}

// The first of the user's names in the tree with that beginning; else a new random name.
std::string unforeseeableName(const std::filesystem::path& root, const std::string& begin)
{
    std::error_code error;
    for (auto entry = std::filesystem::directory_iterator(root, error);
         !error && entry != std::filesystem::directory_iterator(); entry.increment(error))
        if (auto name = entry->path().filename().string(); name.starts_with(begin) && ownerOf(*entry) == ::geteuid())
            return name;
    return fmt::format("{}{:08x}>", begin, std::random_device()());
}

} // namespace

std::string userName(uid_t user)
{
    std::array<char, 4096> text{};
    passwd entry{};
    passwd* found = nullptr;
    ::getpwuid_r(user, &entry, text.data(), text.size(), &found);
    return found ? found->pw_name : fmt::format("user {}", user);
}

DriverName driverNameIn(const std::filesystem::path& root)
{
    auto name = fmt::format("pipewire-{}", ::geteuid());
    const auto owner = ownerOf(root / name);
    if (!owner || owner == ::geteuid() || owner == administrator)
        return {.name = std::move(name)};
    const auto reason = fmt::format("{} belongs to {}", (root / name).string(), userName(*owner));
    return {.name = unforeseeableName(root, name + "<"), .reason = reason};
}

std::string adviceOn(const std::filesystem::path& root, const std::string& driver)
{
    for (const auto& place : {root / driver, root, root.parent_path()})
        if (const auto owner = ownerOf(place))
            return fmt::format("{} belongs to {}: let {} write there, or name another folder with --channels.",
                               place.string(), userName(*owner), userName(::geteuid()));
    return fmt::format("{} does not exist: start the reporting service, or name another folder with --channels.",
                       root.parent_path().string());
}

} // namespace kesto_pipewire
