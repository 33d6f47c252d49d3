// SPDX-License-Identifier: Apache-2.0
// Whether an open database still has its files: the database itself, its write-ahead log and the log's index may be
// removed or replaced under the service, which then would write where no reader looks.
//
// Such a change also changes the directory. So a look at the directory is enough as long as that stays as it was.
#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <ctime>
#include <filesystem>
#include <string_view>

namespace platform {

// The files that SQLite keeps beside a database, by the ends of their names.
inline constexpr std::array<std::string_view, 2> databaseCompanions = {"-wal", "-shm"};

[[nodiscard]] inline std::filesystem::path withSuffix(const std::filesystem::path& path, std::string_view suffix)
{
    return std::filesystem::path(path).concat(suffix);
}

// One thread.
class FilesInPlace {
public:
    enum class Change : std::uint8_t {
        None,
        Companions, // the database is in its place, but not its log or the log's index
        Database
    };
    // File systems give changes times in steps of at most two seconds: only a directory that did not change for longer
    // cannot have changed again at the same time.
    static constexpr std::chrono::seconds longestStep{2};

    // Notes which files are there before the database is opened. Opening makes the others; they are noted when they are
    // first looked at.
    explicit FilesInPlace(std::filesystem::path path, std::chrono::seconds step = longestStep);

    // Once the database is open.
    [[nodiscard]] Change change();
    // Removes those companions that were noted and still are in their place: they belong to a database that is not.
    void removeNotedCompanions() const;
    // Removes all companions, those of other databases too.
    void removeCompanions() const;

private:
    struct Identity {
        std::uint64_t device = 0;
        std::uint64_t inode = 0; // 0: no file
        friend bool operator==(const Identity&, const Identity&) = default;
    };
    struct DirectoryState {
        Identity identity;
        std::int64_t seconds = 0; // of its last change
        std::int64_t nanoseconds = 0;
        friend bool operator==(const DirectoryState&, const DirectoryState&) = default;
    };

    [[nodiscard]] static Identity identityOf(const std::filesystem::path& path);
    [[nodiscard]] static DirectoryState stateOf(const std::filesystem::path& directory);
    [[nodiscard]] bool isSettled(const DirectoryState& state) const;
    [[nodiscard]] static bool isInPlace(Identity& noted, const std::filesystem::path& path);
    [[nodiscard]] Change compare();

    const std::filesystem::path path_;
    const std::filesystem::path directory_;
    const std::array<std::filesystem::path, databaseCompanions.size()> companionPaths_;
    const std::chrono::seconds step_;
    Identity database_;
    std::array<Identity, databaseCompanions.size()> companions_;
    DirectoryState unchanged_; // the state in which all files were in their place, once it is settled
};

} // namespace platform
