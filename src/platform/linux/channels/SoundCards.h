// SPDX-License-Identifier: Apache-2.0
// The kernel's statistics of every stream of a sound card, below /proc/asound, as channels.
//
//     card0/id                      PCH              the channel's driver
//     card0/pcm0p/sub0/status       state, pointers  p: played, group "Tx"; c: captured, group "Rx"
//     card0/pcm0p/sub0/hw_params    format           "pcm0p" is the subgroup
//
// A stream has these channels:
//
//     sub0 hw_ptr     simple   frames that the hardware has processed since the stream was prepared
//     sub0 appl_ptr   simple   frames that the program has written or read since then
//     sub0 state      state    the state of the stream, and for how long
//     sub0 format     state    the format, such as S16_LE/48000/2, and for how long the stream has been running
//
// A stream that is not open has pointers of 0 and neither state nor format. The kernel reports since when a stream is
// in its state, but no earlier states: so the channel has one state, entered once, which starts at 0 after a change.
// Times are milliseconds, and are missing for programs that do not ask for time stamps.
#pragma once

#include "platform/ReportingChannels.h"

#include <cstddef>
#include <filesystem>
#include <utility>
#include <vector>

namespace platform {

// Any thread.
class SoundCards {
public:
    // Further streams are left out. No device has so many.
    static constexpr std::size_t mostStreams = 1024;
    // At most this many bytes of a file are read.
    static constexpr std::size_t largestFile = 4096;

    // The folder is /proc/asound, or one of the same form.
    explicit SoundCards(std::filesystem::path root) : root_(std::move(root)) { }

    // The channels that any of the selections selects; none without a sound card. Files that cannot be read or parsed
    // are left out, because cards come and go.
    [[nodiscard]] std::vector<ReportingChannel> read(const std::vector<ChannelSelection>& selections) const;

private:
    const std::filesystem::path root_;
};

} // namespace platform
