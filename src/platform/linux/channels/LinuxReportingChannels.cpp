// Reads two sources, one after the other, with the same selection.
#include "platform/linux/channels/LinuxReportingChannels.h"

#include "platform/linux/channels/ChannelDifference.h"

#include <algorithm>
#include <iterator>
#include <utility>

namespace platform {

// The selected channels, their number at that time, and the problems of the last reading.
struct LinuxReportingChannels::Selection final : ChannelSet {
    ChannelSelection selection;
    std::size_t count = 0;
    ChannelComplaints::Memory memory;
};

ReportingChannels::FoundChannels LinuxReportingChannels::copyChannelsInGroup(std::optional<std::string_view> group,
                                                                             std::optional<std::string_view> subgroup)
{
    const auto found = std::make_shared<Selection>();
    found->selection = {std::optional<std::string>(group), std::optional<std::string>(subgroup)};
    found->count = soundCards_.read(found->selection).size();
    found->memory = complaints_.addQuery();
    auto reading = tree_.read(found->selection);
    if (!reading)
        return {.channels = found, .error = reading.error().value()};
    found->count += reading->channels.size();
    complaints_.report({.problems = std::move(reading->problems), .leftOut = reading->leftOut}, found->memory);
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

std::expected<ReportingSample, ReportingChannelError> LinuxReportingChannels::createSamples(const Subscription&,
                                                                                            const ChannelSet& channels)
{
    const auto& subscribed = dynamic_cast<const Selection&>(channels);
    complaints_.forgetDroppedQueries(); // not earlier: at its start the service makes one query after the other
    auto reading = tree_.read(subscribed.selection);
    auto ofSoundCards = soundCards_.read(subscribed.selection);
    if (!reading && ofSoundCards.empty())
        return std::unexpected(reading.error().value());
    ReportingSample sample{.channels = {}, .isWhole = reading && reading->leftOut.isNothing()};
    if (reading) {
        sample.channels = std::move(reading->channels);
        complaints_.report({.problems = std::move(reading->problems), .leftOut = reading->leftOut}, subscribed.memory);
    } else {
        complaints_.reportUnreadable(reading.error(), subscribed.memory);
    }
    std::ranges::move(ofSoundCards, std::back_inserter(sample.channels));
    return sample;
}

std::expected<ReportingSample, ReportingChannelError>
LinuxReportingChannels::createDifference(const ReportingSample& from, const ReportingSample& to)
{
    return channelDifference(from, to);
}

} // namespace platform
