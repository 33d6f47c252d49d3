// The channel tree: what programs publish about drivers, as folders and files.
//
//     <root>/<driver>/<group>/<subgroup>/<channel>
//
// A missing group or subgroup is a folder named "-". Names that begin with a dot are no channels: publishers write new
// files under such names before they put them in place. What a publisher left that is gone is not there
// (ChannelOwner.h).
//
// Whoever may publish may put anything there. So every step is taken from the folder before it and none through a link;
// only what is a regular file is opened, and nothing that would wait; and however much there is, reading ends. The root
// itself may be reached through links: it is the administrator's.
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

// Which channels are meant; an absent name stands for any.
struct ChannelSelection {
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
};

// A channel that is missing from what was read, and why. Nothing when it merely went away meanwhile.
struct ChannelProblem {
    std::string path; // below the root
    std::string_view reason; // a constant
    friend auto operator<=>(const ChannelProblem&, const ChannelProblem&) = default;
};

// What one reading takes at most.
struct ChannelTreeLimits {
    std::size_t channels = 4096;
    std::size_t bytes = std::size_t{2} * 1024 * 1024; // of their files
    std::size_t names = 65'536; // in folders, whatever they stand for
};

// What one reading did not take, by the limit that it met.
struct LeftOutChannels {
    std::size_t beyondChannels = 0; // files
    std::size_t beyondBytes = 0; // files
    std::size_t beyondNames = 0; // folders that were not read to their end; at least so many

    [[nodiscard]] bool isNothing() const noexcept { return beyondChannels + beyondBytes + beyondNames == 0; }
    // A line for each limit that was met.
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

    // Reads the channels of the selection. A root that is not there holds none; the error is why it cannot be read.
    [[nodiscard]] std::expected<ChannelReading, std::error_code> read(const ChannelSelection& selection) const;

private:
    const std::filesystem::path root_;
    const Limits limits_;
};

} // namespace platform
