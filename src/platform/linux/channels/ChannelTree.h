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
#pragma once

#include "platform/ReportingChannels.h"

#include <cstddef>
#include <expected>
#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

namespace platform {

// Selects channels; an absent name means any.
struct ChannelSelection {
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
};

// A channel that is missing from the result, and the reason. A channel that merely went meanwhile is not a problem.
struct ChannelProblem {
    std::string path; // below the root
    std::string_view reason; // a constant
    friend auto operator<=>(const ChannelProblem&, const ChannelProblem&) = default;
};

// The limits of one reading.
struct ChannelTreeLimits {
    std::size_t channels = 4096;
    std::size_t bytes = std::size_t{2} * 1024 * 1024; // of their files
    std::size_t names = 65'536; // of all entries in folders
};

// The number of channels that one reading left out, for each limit.
struct LeftOutChannels {
    std::size_t beyondChannels = 0; // files
    std::size_t beyondBytes = 0; // files
    std::size_t beyondNames = 0; // folders that were not read completely; at least this many

    [[nodiscard]] bool isNothing() const noexcept { return beyondChannels + beyondBytes + beyondNames == 0; }
    // A line for each exceeded limit.
    [[nodiscard]] std::vector<std::string> inWords(const ChannelTreeLimits& limits) const;
};

struct ChannelReading {
    std::vector<ReportingChannel> channels; // in the order of their names
    std::vector<ChannelProblem> problems;
    LeftOutChannels leftOut;
};

// Any thread.
class ChannelTree {
public:
    using Limits = ChannelTreeLimits;

    explicit ChannelTree(std::filesystem::path root) : ChannelTree(std::move(root), Limits()) { }
    ChannelTree(std::filesystem::path root, const Limits& limits) : root_(std::move(root)), limits_(limits) { }

    // Reads the selected channels. A missing root counts as empty; the error gives the reason if the root cannot be
    // read.
    [[nodiscard]] std::expected<ChannelReading, std::error_code> read(const ChannelSelection& selection) const;

private:
    const std::filesystem::path root_;
    const Limits limits_;
};

} // namespace platform
