// SPDX-License-Identifier: Apache-2.0
// Reads two sources, one after the other, with the same selections.
#include "platform/linux/channels/LinuxReportingChannels.h"

#include "platform/linux/channels/ChannelDifference.h"
#include "platform/linux/channels/ChannelSelections.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace platform {

// The selected channels, and their number when they were found.
struct LinuxReportingChannels::Selection final : ChannelSet {
    ChannelSelection selection;
    std::size_t count = 0;
};

// What both sources held.
struct LinuxReportingChannels::Reading final : Moment {
    ReportingSample ofTree;
    std::error_code error; // why the tree could not be read
    std::vector<ReportingChannel> ofSoundCards;

    static std::vector<ReportingChannel> select(const std::vector<ReportingChannel>& channels,
                                                const ChannelSelection& selection)
    {
        std::vector<ReportingChannel> selected;
        std::ranges::copy_if(channels, std::back_inserter(selected), [&](const ReportingChannel& channel) {
            return selects(selection, channel.group, channel.subgroup);
        });
        return selected;
    }
    [[nodiscard]] ReportingSample sampleOf(const ChannelSelection& selection) const
    {
        ReportingSample sample{select(ofTree.channels, selection), ofTree.isWhole, ofTree.cutUsers};
        std::ranges::move(select(ofSoundCards, selection), std::back_inserter(sample.channels));
        return sample;
    }
};

std::shared_ptr<const ReportingChannels::Moment>
LinuxReportingChannels::readChannels(const std::vector<ChannelSelection>& selections)
{
    const auto moment = std::make_shared<Reading>();
    moment->ofSoundCards = soundCards_.read(selections);
    if (auto reading = tree_.read(selections, knownDrivers())) {
        complaints_.report(*reading);
        rememberDrivers(reading->channels);
        moment->ofTree = {std::move(reading->channels), reading->isWhole, std::move(reading->cutUsers)};
    } else {
        moment->error = reading.error();
        moment->ofTree.isWhole = false;
    }
    return moment;
}

std::vector<std::string> LinuxReportingChannels::knownDrivers() const
{
    const foundation::Lock lock(lock_);
    return knownDrivers_;
}

void LinuxReportingChannels::rememberDrivers(const std::vector<ReportingChannel>& channels)
{
    std::vector<std::string> drivers;
    for (const ReportingChannel& channel : channels) // in the order of their drivers
        if (drivers.empty() || drivers.back() != *channel.driver)
            drivers.push_back(*channel.driver);
    const foundation::Lock lock(lock_);
    knownDrivers_ = std::move(drivers);
}

ReportingChannels::FoundChannels LinuxReportingChannels::copyChannelsInGroup(std::optional<std::string_view> group,
                                                                             std::optional<std::string_view> subgroup,
                                                                             const Moment& moment)
{
    const auto& reading = dynamic_cast<const Reading&>(moment);
    const auto found = std::make_shared<Selection>();
    found->selection = {std::optional<std::string>(group), std::optional<std::string>(subgroup)};
    found->count = reading.sampleOf(found->selection).channels.size();
    if (reading.error)
        return {.channels = found, .error = reading.error.value()};
    return {.channels = found, .error = {}};
}

std::size_t LinuxReportingChannels::channelCount(const ChannelSet& channels) const
{
    return dynamic_cast<const Selection&>(channels).count;
}

ReportingChannels::Subscribed LinuxReportingChannels::createSubscription(const ChannelSet& channels)
{
    return {.subscription = std::make_shared<Subscription>(),
            .channels = std::make_shared<Selection>(dynamic_cast<const Selection&>(channels)),
            .error = {}};
}

std::expected<ReportingSample, ReportingChannelError>
LinuxReportingChannels::createSamples(const Subscription&, const ChannelSet& channels, const Moment& moment)
{
    const auto& reading = dynamic_cast<const Reading&>(moment);
    ReportingSample sample = reading.sampleOf(dynamic_cast<const Selection&>(channels).selection);
    if (!reading.error)
        return sample;
    if (sample.channels.empty())
        return std::unexpected(reading.error.value());
    complaints_.reportUnreadable(reading.error);
    return sample;
}

std::expected<ReportingSample, ReportingChannelError>
LinuxReportingChannels::createDifference(const ReportingSample& from, const ReportingSample& to)
{
    return channelDifference(from, to);
}

} // namespace platform
