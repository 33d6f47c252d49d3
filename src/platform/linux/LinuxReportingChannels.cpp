// Two sources, asked one after the other with the same question; what is wrong in the tree is remembered with the
// question, so that each is told once.
#include "platform/linux/LinuxReportingChannels.h"

#include "platform/linux/ChannelDifference.h"

#include <algorithm>
#include <iterator>

namespace platform {

namespace {

// Remembers what was wrong when it was last looked.
class Problems {
public:
    void tell(ChannelReading& reading, const ProviderLog& log)
    {
        std::ranges::sort(reading.problems);
        std::vector<ChannelProblem> fresh;
        std::ranges::set_difference(reading.problems, told_, std::back_inserter(fresh));
        const std::size_t named = std::min(fresh.size(), LinuxReportingChannels::mostNamedProblems);
        for (std::size_t index = 0; index < named; ++index)
            log.error("channel {} is left out: {}", fresh[index].path, fresh[index].reason);
        if (fresh.size() > named)
            log.error("{} more channels are left out", fresh.size() - named);
        if (reading.leftOut > 0 && leftOutTold_ == 0)
            log.error("{} files are left out: one sample takes {} channels and {} bytes of them", reading.leftOut,
                      ChannelTree::Limits().channels, ChannelTree::Limits().bytes);
        told_ = std::move(reading.problems);
        leftOutTold_ = reading.leftOut;
    }

private:
    std::vector<ChannelProblem> told_;
    std::size_t leftOutTold_ = 0;
};

} // namespace

// What was asked for, how many channels there were then, and what has been said about them.
struct LinuxReportingChannels::Selection final : ChannelSet {
    ChannelSelection selection;
    std::size_t count = 0;
    std::shared_ptr<Problems> problems = std::make_shared<Problems>();
};

ReportingChannels::FoundChannels LinuxReportingChannels::copyChannelsInGroup(std::optional<std::string_view> group,
                                                                             std::optional<std::string_view> subgroup)
{
    const auto found = std::make_shared<Selection>();
    found->selection = {std::optional<std::string>(group), std::optional<std::string>(subgroup)};
    found->count = soundCards_.read(found->selection).size();
    auto reading = tree_.read(found->selection);
    if (!reading)
        return {.channels = found, .error = reading.error().value()};
    found->count += reading->channels.size();
    found->problems->tell(*reading, log_);
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
    auto reading = tree_.read(subscribed.selection);
    if (!reading)
        return std::unexpected(reading.error().value());
    subscribed.problems->tell(*reading, log_);
    ReportingSample sample{std::move(reading->channels)};
    std::ranges::move(soundCards_.read(subscribed.selection), std::back_inserter(sample.channels));
    return sample;
}

std::expected<ReportingSample, ReportingChannelError>
LinuxReportingChannels::createDifference(const ReportingSample& from, const ReportingSample& to)
{
    return channelDifference(from, to);
}

} // namespace platform
