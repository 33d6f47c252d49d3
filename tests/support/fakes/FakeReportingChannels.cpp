// SPDX-License-Identifier: Apache-2.0
// A sample is a copy of the channels at that moment; a difference is computed as by the real platform.
#include "support/fakes/FakeReportingChannels.h"

#include "platform/linux/channels/ChannelDifference.h"
#include "platform/linux/channels/ChannelSelections.h"

#include <algorithm>
#include <iterator>
#include <tuple>

namespace support {

using platform::ReportingChannel;
using platform::ReportingSample;

// A channel set keeps its query and the number of channels that it found.
struct FakeReportingChannels::Selection final : ChannelSet {
    Selection(Name givenGroup, Name givenSubgroup)
        : group(std::move(givenGroup)),
          subgroup(std::move(givenSubgroup)) { }
    Name group;
    Name subgroup;
    std::size_t count = 0;
};

// A moment is a copy of the selected channels.
struct FakeReportingChannels::Copy final : Moment {
    std::vector<ReportingChannel> channels;

    [[nodiscard]] std::vector<ReportingChannel> select(const Selection& selection) const
    {
        std::vector<ReportingChannel> selected;
        std::ranges::copy_if(channels, std::back_inserter(selected), [&](const ReportingChannel& channel) {
            return platform::selects({selection.group, selection.subgroup}, channel.group, channel.subgroup);
        });
        return selected;
    }
};

namespace {

bool isSameChannel(const ReportingChannel& left, const ReportingChannel& right)
{
    const auto identity = [](const ReportingChannel& channel) {
        return std::tie(channel.driver, channel.group, channel.subgroup, channel.name);
    };
    return identity(left) == identity(right);
}

} // namespace

void FakeReportingChannels::publish(ReportingChannel channel)
{
    const auto found =
        std::ranges::find_if(channels_, [&](const auto& other) { return isSameChannel(other, channel); });
    if (found == channels_.end())
        channels_.push_back(std::move(channel));
    else
        *found = std::move(channel);
}

void FakeReportingChannels::withdraw(const ReportingChannel& channel)
{
    std::erase_if(channels_, [&](const auto& other) { return isSameChannel(other, channel); });
}

std::shared_ptr<const platform::ReportingChannels::Moment>
FakeReportingChannels::readChannels(const std::vector<platform::ChannelSelection>& selections)
{
    ++readings_;
    const auto moment = std::make_shared<Copy>();
    std::ranges::copy_if(channels_, std::back_inserter(moment->channels), [&](const ReportingChannel& channel) {
        return platform::selects(selections, channel.group, channel.subgroup);
    });
    return moment;
}

platform::ReportingChannels::FoundChannels
FakeReportingChannels::copyChannelsInGroup(std::optional<std::string_view> group,
                                           std::optional<std::string_view> subgroup, const Moment& moment)
{
    const auto selection = std::make_shared<Selection>(Name(group), Name(subgroup));
    const Failures& failing = failures(selection->group, selection->subgroup);
    selection->count = dynamic_cast<const Copy&>(moment).select(*selection).size();
    asked_.emplace_back(selection->group, selection->subgroup);
    if (failing.copiesNothing || (failing.copy && !failing.copiesAnyway))
        return {.channels = nullptr, .error = failing.copy};
    return {.channels = selection, .error = failing.copy};
}

std::size_t FakeReportingChannels::channelCount(const ChannelSet& channels) const
{
    return dynamic_cast<const Selection&>(channels).count;
}

platform::ReportingChannels::Subscribed FakeReportingChannels::createSubscription(const ChannelSet& channels)
{
    const auto& selection = dynamic_cast<const Selection&>(channels);
    const Failures& failing = failures(selection.group, selection.subgroup);
    auto subscription = failing.subscribesWithoutHandle ? nullptr : std::make_shared<Subscription>();
    if (failing.subscribesToNothing || (failing.subscription && !failing.subscribesAnyway))
        return {.subscription = std::move(subscription), .channels = nullptr, .error = failing.subscription};
    return {.subscription = std::move(subscription),
            .channels = std::make_shared<Selection>(selection),
            .error = failing.subscription};
}

std::expected<ReportingSample, platform::ReportingChannelError>
FakeReportingChannels::createSamples(const Subscription&, const ChannelSet& channels, const Moment& moment)
{
    if (sampleObserver_)
        sampleObserver_();
    const auto& selection = dynamic_cast<const Selection&>(channels);
    if (const auto error = failures(selection.group, selection.subgroup).sample)
        return std::unexpected(*error);
    return ReportingSample{dynamic_cast<const Copy&>(moment).select(selection)};
}

std::expected<ReportingSample, platform::ReportingChannelError>
FakeReportingChannels::createDifference(const ReportingSample& from, const ReportingSample& to)
{
    if (differenceError_)
        return std::unexpected(*differenceError_);
    return platform::channelDifference(from, to);
}

} // namespace support
