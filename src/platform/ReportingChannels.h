// SPDX-License-Identifier: Apache-2.0
// The kernel's reporting channels: counters, histograms and state residencies that audio drivers publish,
// found by group and subgroup, sampled together.
#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

enum class ChannelFormat : std::uint8_t { Invalid = 0, Simple = 1, State = 2, Histogram = 3 };

// How often values fell into one range, in the channel's unit.
struct HistogramBucket {
    std::int64_t lower = 0; // included, in what libkesto publishes
    std::int64_t upper = 0; // not included
    std::int64_t hits = 0;
    std::int32_t boundsError = 0; // not 0 if the bounds could not be read
};

// How often a channel entered a state, and for how long it was in it.
struct StateResidency {
    std::string name;
    std::uint64_t transitions = 0;
    std::uint64_t residency = 0; // the time in this state; its publisher chooses the unit, usually milliseconds
    double dutyCycle = 0; // the share of this state in the time of all, 0 to 1
};

// One channel of a sample. Fields that its format does not have stay empty.
struct ReportingChannel {
    std::uint8_t format = 0; // a `ChannelFormat`, or a number that this service does not know
    std::optional<std::string> driver;
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
    std::optional<std::string> name;
    std::optional<std::string> unit;
    std::uint32_t user = 0; // who publishes it
    std::int64_t value = 0;
    std::int64_t minimum = 0;
    std::int64_t maximum = 0;
    std::vector<HistogramBucket> buckets;
    std::vector<StateResidency> states;
};

struct ReportingSample {
    std::vector<ReportingChannel> channels;
    // Whether all requested channels could be read. If not, an existing channel may be missing.
    bool isWhole = true;
    // The users of whom an existing channel may be missing although the sample is whole for all others; ascending.
    std::vector<std::uint32_t> cutUsers = {};
};

// Selects channels; an absent name means any.
struct ChannelSelection {
    std::optional<std::string> group;
    std::optional<std::string> subgroup;
};

using ReportingChannelError = std::int64_t; // the platform's error code

// Channels are read for all groups together, because one publisher has channels in several: `readChannels` reads them,
// and everything else works with what it read. Only `readChannels` may wait for the disk.
//
// If the platform returns a result and an error together, these functions return both. Any thread.
class ReportingChannels {
public:
    // The platform's own data of a set of channels or a subscription.
    class ChannelSet {
    public:
        virtual ~ChannelSet() = default;
    };
    class Subscription {
    public:
        virtual ~Subscription() = default;
    };
    struct FoundChannels {
        std::shared_ptr<ChannelSet> channels; // null: nothing came back
        std::optional<ReportingChannelError> error;
    };
    // Sampling takes both; one without the other counts as nothing.
    struct Subscribed {
        std::shared_ptr<Subscription> subscription;
        std::shared_ptr<ChannelSet> channels; // null: nothing came back
        std::optional<ReportingChannelError> error;
    };

    // What the selected channels held at one moment; it does not change.
    class Moment {
    public:
        virtual ~Moment() = default;
    };

    virtual ~ReportingChannels() = default;
    // Reads the channels that any of the selections selects.
    [[nodiscard]] virtual std::shared_ptr<const Moment>
    readChannels(const std::vector<ChannelSelection>& selections) = 0;
    // An absent group or subgroup means any. Without publishers it returns an empty set or none, and no error. The
    // moment must have been read for this group.
    virtual FoundChannels copyChannelsInGroup(std::optional<std::string_view> group,
                                              std::optional<std::string_view> subgroup, const Moment& moment) = 0;
    // The number of channels when the set was made.
    [[nodiscard]] virtual std::size_t channelCount(const ChannelSet& channels) const = 0;
    virtual Subscribed createSubscription(const ChannelSet& channels) = 0;
    // The channels that the group and subgroup had at that moment, including those that came after the subscription.
    virtual std::expected<ReportingSample, ReportingChannelError>
    createSamples(const Subscription& subscription, const ChannelSet& channels, const Moment& moment) = 0;
    // The increase of each channel's counters up to the later sample; a new or restarted channel counts with its whole
    // content. Extremes are those of the later sample, and a duty cycle is the share of the difference.
    virtual std::expected<ReportingSample, ReportingChannelError> createDifference(const ReportingSample& from,
                                                                                   const ReportingSample& to) = 0;
};

} // namespace platform
