// SPDX-License-Identifier: Apache-2.0
// Reporting channels that a test publishes and changes, with failures that it chooses.
#pragma once

#include "platform/ReportingChannels.h"

#include <functional>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace support {

// One thread.
class FakeReportingChannels final : public platform::ReportingChannels {
public:
    using Name = std::optional<std::string>;
    using Error = platform::ReportingChannelError;

    // The failures of queries for one group and subgroup.
    struct Failures {
        std::optional<Error> copy;
        bool copiesAnyway = false; // returns channels beside the error
        bool copiesNothing = false; // returns neither channels nor an error
        std::optional<Error> subscription;
        bool subscribesToNothing = false; // likewise
        bool subscribesAnyway = false; // channels come back beside the error
        bool subscribesWithoutHandle = false; // channels come back, and no subscription
        std::optional<Error> sample;
    };

    // Replaces the channel of the same driver, group, subgroup and name, or adds it.
    void publish(platform::ReportingChannel channel);
    void withdraw(const platform::ReportingChannel& channel);
    void withdrawAll() { channels_.clear(); }
    Failures& failures(Name group, Name subgroup) { return failures_[{std::move(group), std::move(subgroup)}]; }
    // The observer is called before every sample.
    void setSampleObserver(std::function<void()> observer) { sampleObserver_ = std::move(observer); }
    void failDifferences(std::optional<Error> error) { differenceError_ = error; }

    // How often channels were read.
    [[nodiscard]] std::size_t readings() const { return readings_; }
    // The queried groups and subgroups, in order.
    [[nodiscard]] const std::vector<std::pair<Name, Name>>& asked() const { return asked_; }

    // Returns no channel set with an error, and an empty set for a group without channels.
    [[nodiscard]] std::shared_ptr<const Moment>
    readChannels(const std::vector<platform::ChannelSelection>& selections) override;
    FoundChannels copyChannelsInGroup(std::optional<std::string_view> group, std::optional<std::string_view> subgroup,
                                      const Moment& moment) override;
    [[nodiscard]] std::size_t channelCount(const ChannelSet& channels) const override;
    Subscribed createSubscription(const ChannelSet& channels) override;
    std::expected<platform::ReportingSample, Error>
    createSamples(const Subscription& subscription, const ChannelSet& channels, const Moment& moment) override;
    std::expected<platform::ReportingSample, Error> createDifference(const platform::ReportingSample& from,
                                                                     const platform::ReportingSample& to) override;

private:
    struct Selection;
    struct Copy;

    std::vector<platform::ReportingChannel> channels_;
    std::map<std::pair<Name, Name>, Failures> failures_;
    std::optional<Error> differenceError_;
    std::size_t readings_ = 0;
    std::function<void()> sampleObserver_;
    std::vector<std::pair<Name, Name>> asked_;
};

} // namespace support
