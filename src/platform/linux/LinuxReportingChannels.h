// The reporting channels of this system: those that programs publish in the channel tree, and what the kernel tells
// about its sound cards.
//
// A subscription is to the question and not to the answer: every sample holds what is there when it is taken, so that
// channels may come and go. What is wrong in the tree is said once, when it is first met, and again only if it was
// right in between.
#pragma once

#include "platform/linux/ChannelTree.h"
#include "platform/linux/ProviderLog.h"
#include "platform/linux/SoundCards.h"

namespace platform {

// One thread at a time for each set of channels; otherwise any. Error codes are the system's (`errno`).
class LinuxReportingChannels final : public ReportingChannels {
public:
    // How many of the channels that are missing are named at once; the rest is counted.
    static constexpr std::size_t mostNamedProblems = 16;

    LinuxReportingChannels(std::filesystem::path channelRoot, std::filesystem::path soundRoot, ProviderLog log)
        : tree_(std::move(channelRoot)),
          soundCards_(std::move(soundRoot)),
          log_(log)
    {
    }

    // When the tree cannot be read, the channels of the sound cards come back beside the error.
    FoundChannels copyChannelsInGroup(std::optional<std::string_view> group,
                                      std::optional<std::string_view> subgroup) override;
    [[nodiscard]] std::size_t channelCount(const ChannelSet& channels) const override;
    Subscribed createSubscription(const ChannelSet& channels) override;
    std::expected<ReportingSample, ReportingChannelError> createSamples(const Subscription& subscription,
                                                                        const ChannelSet& channels) override;
    std::expected<ReportingSample, ReportingChannelError> createDifference(const ReportingSample& from,
                                                                           const ReportingSample& to) override;

private:
    struct Selection;

    const ChannelTree tree_;
    const SoundCards soundCards_;
    const ProviderLog log_;
};

} // namespace platform
