// SPDX-License-Identifier: Apache-2.0
// First decides for a whole channel whether it went on counting, and then subtracts: so no counter of a reset channel
// is subtracted.
#include "platform/linux/channels/ChannelDifference.h"

#include <algorithm>
#include <limits>
#include <tuple>

namespace platform {
namespace {

auto identityOf(const ReportingChannel& channel)
{
    return std::tie(channel.driver, channel.group, channel.subgroup, channel.name);
}

auto identityAt(const ReportingChannel* channel)
{
    return identityOf(*channel);
}

// Finds channels by their names.
class Index {
public:
    explicit Index(const std::vector<ReportingChannel>& channels)
    {
        byIdentity_.reserve(channels.size());
        for (const ReportingChannel& channel : channels)
            byIdentity_.push_back(&channel);
        std::ranges::sort(byIdentity_, {}, identityAt);
    }

    [[nodiscard]] const ReportingChannel* find(const ReportingChannel& channel) const
    {
        const auto found = std::ranges::lower_bound(byIdentity_, identityOf(channel), {}, identityAt);
        return found != byIdentity_.end() && identityOf(**found) == identityOf(channel) ? *found : nullptr;
    }

private:
    std::vector<const ReportingChannel*> byIdentity_;
};

// `later` is at least `earlier`. A difference beyond the type's range becomes its greatest value.
std::int64_t difference(std::int64_t earlier, std::int64_t later)
{
    constexpr std::uint64_t most = std::numeric_limits<std::int64_t>::max();
    const std::uint64_t exact = static_cast<std::uint64_t>(later) - static_cast<std::uint64_t>(earlier);
    return static_cast<std::int64_t>(std::min(exact, most));
}

const StateResidency* stateNamed(const std::string& name, std::size_t place, const std::vector<StateResidency>& states)
{
    if (place < states.size() && states[place].name == name) // usually a state keeps its place
        return &states[place];
    const auto found = std::ranges::find(states, name, &StateResidency::name);
    return found == states.end() ? nullptr : &*found;
}

bool wentOn(const HistogramBucket& earlier, const HistogramBucket& later)
{
    return earlier.lower == later.lower && earlier.upper == later.upper && earlier.hits <= later.hits;
}

bool wentOn(const StateResidency& earlier, std::size_t place, const std::vector<StateResidency>& later)
{
    const StateResidency* state = stateNamed(earlier.name, place, later);
    return state != nullptr && earlier.transitions <= state->transitions && earlier.residency <= state->residency;
}

// Whether no counter was reset in between.
bool wentOn(const ReportingChannel& earlier, const ReportingChannel& later)
{
    if (earlier.format != later.format || earlier.value > later.value || earlier.buckets.size() != later.buckets.size())
        return false;
    for (std::size_t place = 0; place < earlier.buckets.size(); ++place)
        if (!wentOn(earlier.buckets[place], later.buckets[place]))
            return false;
    for (std::size_t place = 0; place < earlier.states.size(); ++place)
        if (!wentOn(earlier.states[place], place, later.states))
            return false;
    return true;
}

void subtract(const ReportingChannel& earlier, ReportingChannel& channel)
{
    channel.value = difference(earlier.value, channel.value);
    for (std::size_t place = 0; place < channel.buckets.size(); ++place)
        channel.buckets[place].hits -= earlier.buckets[place].hits;
    for (std::size_t place = 0; place < channel.states.size(); ++place) {
        StateResidency& state = channel.states[place];
        if (const StateResidency* before = stateNamed(state.name, place, earlier.states)) {
            state.transitions -= before->transitions;
            state.residency -= before->residency;
        }
    }
}

// Whether the channel may have existed without being in the sample.
bool mayHaveMissed(const ReportingSample& sample, const ReportingChannel& channel)
{
    return !sample.isWhole || std::ranges::binary_search(sample.cutUsers, channel.user);
}

void shareOut(std::vector<StateResidency>& states)
{
    double total = 0;
    for (const StateResidency& state : states)
        total += static_cast<double>(state.residency);
    for (StateResidency& state : states)
        state.dutyCycle = total > 0 ? static_cast<double>(state.residency) / total : 0;
}

} // namespace

ReportingSample channelDifference(const ReportingSample& from, const ReportingSample& to)
{
    const Index earlier(from.channels);
    ReportingSample difference{.channels = {}, .isWhole = from.isWhole && to.isWhole};
    difference.channels.reserve(to.channels.size());
    for (const ReportingChannel& now : to.channels) {
        const ReportingChannel* before = earlier.find(now);
        if (before == nullptr && mayHaveMissed(from, now))
            continue;
        ReportingChannel& channel = difference.channels.emplace_back(now);
        if (before != nullptr && wentOn(*before, channel))
            subtract(*before, channel);
        shareOut(channel.states);
    }
    return difference;
}

} // namespace platform
