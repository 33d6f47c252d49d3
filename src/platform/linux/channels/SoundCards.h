// What the kernel's own sound drivers tell about every stream of a sound card, below /proc/asound, as channels.
//
//     card0/id                      PCH              the channel's driver
//     card0/pcm0p/sub0/status       state, pointers  p: played, group "Tx"; c: captured, group "Rx"
//     card0/pcm0p/sub0/hw_params    format           "pcm0p" is the subgroup
//
// A stream has these channels:
//
//     sub0 hw_ptr     simple   frames that the hardware has worked through since the stream was prepared
//     sub0 appl_ptr   simple   frames that the program has written or read since then
//     sub0 state      state    what the stream does, and for how long
//     sub0 format     state    what it plays or captures, such as S16_LE/48000/2, and for how long it has been running
//
// A stream that nobody has open has pointers of 0 and neither state nor format. The kernel tells when a stream took up
// what it does, and nothing of what it did before: so a state stands alone, entered once, and one that begins anew
// counts from there. Times are milliseconds, and there are none for programs that ask for no time stamps.
#pragma once

#include "platform/linux/channels/ChannelTree.h"

#include <cstddef>
#include <filesystem>
#include <utility>
#include <vector>

namespace platform {

// Any thread.
class SoundCards {
public:
    // Streams beyond are left out. More than any device has.
    static constexpr std::size_t mostStreams = 1024;
    // Bytes of a file that are looked at.
    static constexpr std::size_t largestFile = 4096;

    // The folder is /proc/asound, or one that looks like it.
    explicit SoundCards(std::filesystem::path root) : root_(std::move(root)) { }

    // The channels of the selection; none where there is no sound card. What cannot be read or understood is missing:
    // cards come and go.
    [[nodiscard]] std::vector<ReportingChannel> read(const ChannelSelection& selection) const;

private:
    const std::filesystem::path root_;
};

} // namespace platform
