// SPDX-License-Identifier: Apache-2.0
// The channel tree: drivers' statistics that programs publish as folders and files.
//
//     <root>/<driver>/<group>/<subgroup>/<channel>
//
// A missing group or subgroup is a folder named "-". Names that begin with a dot are not channels: publishers write new
// files under such names before they put them in place. The files of a publisher that has ended are left out
// (ChannelOwner.h).
//
// Every user may publish, and may put anything there. So every step starts from the open folder before it, and no step
// follows a link; only regular files are opened, without waiting; and limits end every reading. The path of the root
// may contain links, because the administrator made it.
//
// The users share what a reading takes, so that the folders of one do not keep out the channels of another. What is in
// a driver's folder counts for the user who owns that folder.
#pragma once

#include "platform/ReportingChannels.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

namespace platform {

// A channel that is missing from the result, and the reason. A channel that merely went meanwhile is not a problem.
struct ChannelProblem {
    std::string path; // below the root
    std::string_view reason; // a constant
    friend auto operator<=>(const ChannelProblem&, const ChannelProblem&) = default;
};

// The limits of one reading, of all groups together.
struct ChannelTreeLimits {
    std::size_t drivers = 262'144; // entries of the root
    std::size_t folders = 4096; // that it opens
    std::size_t names = 65'536; // entries of these
    std::size_t namesOfAFolder = 16'384; // of one of these, so that users take turns before one has taken all
    std::size_t channels = 8192; // files that it opens
    std::size_t bytes = std::size_t{4} * 1024 * 1024; // of these
    std::chrono::milliseconds time{500};
};

// What one reading left out, for each limit.
struct LeftOutChannels {
    std::size_t beyondDrivers = 0; // entries of the root; at least this many
    std::size_t beyondFolders = 0; // folders
    std::size_t beyondNames = 0; // folders that it did not read completely; at least this many
    std::size_t beyondChannels = 0; // files
    std::size_t beyondBytes = 0; // files
    std::size_t beyondTime = 0; // folders and files; at least this many

    [[nodiscard]] bool isNothing() const noexcept
    {
        return beyondDrivers + beyondFolders + beyondNames + beyondChannels + beyondBytes + beyondTime == 0;
    }
    // A line for each exceeded limit.
    [[nodiscard]] std::vector<std::string> inWords(const ChannelTreeLimits& limits) const;
};

struct ChannelReading {
    std::vector<ReportingChannel> channels; // in the order of their names, an absent one first
    std::vector<ChannelProblem> problems; // in the order of their paths
    LeftOutChannels leftOut;
    bool isWhole = true; // false: a limit ended it before it had seen every driver's name
    std::vector<std::uint32_t> cutUsers; // those of whom a limit left out something; ascending
};

// Any thread.
class ChannelTree {
public:
    using Limits = ChannelTreeLimits;
    using Now = std::function<std::chrono::steady_clock::time_point()>;

    explicit ChannelTree(std::filesystem::path root) : ChannelTree(std::move(root), Limits()) { }
    ChannelTree(std::filesystem::path root, const Limits& limits, Now now = std::chrono::steady_clock::now)
        : root_(std::move(root)),
          limits_(limits),
          now_(std::move(now))
    {
    }

    // Reads the channels that any of the selections selects, in one walk. A missing root counts as empty; the error
    // gives the reason if the root cannot be read. Drivers that are known from an earlier reading, ascending, are read
    // even if a limit ends the search for drivers before it finds them.
    [[nodiscard]] std::expected<ChannelReading, std::error_code>
    read(const std::vector<ChannelSelection>& selections, const std::vector<std::string>& knownDrivers = {}) const;

private:
    const std::filesystem::path root_;
    const Limits limits_;
    const Now now_;
};

} // namespace platform
