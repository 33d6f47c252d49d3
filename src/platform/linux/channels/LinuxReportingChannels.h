// SPDX-License-Identifier: Apache-2.0
// The room of channels: the figures that drivers publish. It reads the channel tree and /proc/asound, and does not
// write.
//
// The reporting channels of this system: those that programs publish in the channel tree, and those of the kernel's
// sound cards.
//
// A subscription is to a selection and not to a list of channels: every sample holds the channels that exist at that
// moment, so channels may come and go.
#pragma once

#include "foundation/Mutex.h"
#include "platform/linux/channels/ChannelComplaints.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/channels/SoundCards.h"
#include "platform/linux/log/ProviderLog.h"

namespace platform {

// Any thread. Error codes are the system's (`errno`).
class LinuxReportingChannels final : public ReportingChannels {
public:
    LinuxReportingChannels(const std::filesystem::path& channelRoot, std::filesystem::path soundRoot,
                           ledger::Ledger& ledger, ProviderLog log, const ChannelTree::Limits& limits = {})
        : tree_(channelRoot, limits),
          soundCards_(std::move(soundRoot)),
          complaints_(channelRoot, limits, ledger, log)
    {
    }

    // One walk through the tree, and one look at the sound cards.
    [[nodiscard]] std::shared_ptr<const Moment> readChannels(const std::vector<ChannelSelection>& selections) override;
    // If the tree could not be read, it returns the channels of the sound cards beside the error.
    FoundChannels copyChannelsInGroup(std::optional<std::string_view> group, std::optional<std::string_view> subgroup,
                                      const Moment& moment) override;
    [[nodiscard]] std::size_t channelCount(const ChannelSet& channels) const override;
    Subscribed createSubscription(const ChannelSet& channels) override;
    // If the tree could not be read, the sample holds the channels of the sound cards; without such channels it returns
    // the error.
    std::expected<ReportingSample, ReportingChannelError>
    createSamples(const Subscription& subscription, const ChannelSet& channels, const Moment& moment) override;
    std::expected<ReportingSample, ReportingChannelError> createDifference(const ReportingSample& from,
                                                                           const ReportingSample& to) override;

private:
    struct Selection;
    struct Reading;

    [[nodiscard]] std::vector<std::string> knownDrivers() const;
    void rememberDrivers(const std::vector<ReportingChannel>& channels);

    const ChannelTree tree_;
    const SoundCards soundCards_;
    ChannelComplaints complaints_;
    mutable foundation::Mutex lock_;
    // Those that had channels when the tree was read last, ascending. A user who fills the root with folders does not
    // keep them out.
    std::vector<std::string> knownDrivers_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
