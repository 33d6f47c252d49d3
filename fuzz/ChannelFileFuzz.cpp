// SPDX-License-Identifier: Apache-2.0
// Any program that may publish writes channel files. For all bytes, reading ends with a channel or an error; a channel
// holds only what its kind allows; its difference from itself is empty; and its difference from nothing is the whole
// channel.
//
// The owner's line is foreign, too.
//
// The input is two files, one behind the other, cut in the middle by a zero byte, so that counters of two samples meet.
#include "foundation/values/String.h"
#include "platform/linux/channels/ChannelDifference.h"
#include "platform/linux/channels/ChannelFile.h"
#include "platform/linux/channels/ChannelOwner.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <string_view>

namespace {

using platform::ReportingChannel;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

void requireSound(const ReportingChannel& channel)
{
    require(channel.format >= 1 && channel.format <= 3);
    require(channel.buckets.size() <= platform::mostChannelBuckets);
    require(channel.states.size() <= platform::mostChannelStates);
    require(!channel.unit || foundation::isValidUtf8(*channel.unit));
    for (const auto& bucket : channel.buckets)
        require(bucket.hits >= 0);
    for (const auto& state : channel.states)
        require(!state.name.empty() && foundation::isValidUtf8(state.name) && std::isfinite(state.dutyCycle));
}

// Shares are of a whole, or of nothing.
void requireShares(const ReportingChannel& channel)
{
    double total = 0;
    for (const auto& state : channel.states)
        total += state.dutyCycle;
    require(total == 0 || std::abs(total - 1) < 1e-6);
}

ReportingChannel difference(const platform::ReportingSample& from, const ReportingChannel& to)
{
    auto sample = platform::channelDifference(from, {{to}});
    require(sample.channels.size() == 1);
    requireShares(sample.channels[0]);
    return sample.channels[0];
}

// Reads as the service does.
auto read(std::string_view text)
{
    const std::size_t size = text.size();
    const std::string_view owner = platform::takeChannelOwner(text);
    require(owner.empty() ? text.size() == size : text.size() + platform::channelOwnerLine(owner).size() == size);
    return platform::parseChannelFile(text);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string_view input(reinterpret_cast<const char*>(data), size);
    const std::size_t cut = std::min(input.find('\0'), input.size());
    const auto first = read(input.substr(0, cut));
    const auto second = read(input.substr(std::min(cut + 1, input.size())));
    for (const auto* channel : {&first, &second}) {
        if (!*channel)
            continue;
        requireSound(**channel);
        const ReportingChannel none = difference({{**channel}}, **channel);
        require(none.value == 0);
        require(std::ranges::all_of(none.buckets, [](const auto& bucket) { return bucket.hits == 0; }));
        const ReportingChannel all = difference({}, **channel);
        require(all.value == (*channel)->value);
    }
    if (first && second) {
        const ReportingChannel changed = difference({{*first}}, *second);
        for (std::size_t place = 0; place < changed.buckets.size(); ++place)
            require(changed.buckets[place].hits <= second->buckets[place].hits);
        for (std::size_t place = 0; place < changed.states.size(); ++place)
            require(changed.states[place].residency <= second->states[place].residency);
    }
    return 0;
}
