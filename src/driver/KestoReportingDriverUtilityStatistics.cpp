// SPDX-License-Identifier: Apache-2.0
// How the drivers' channels changed during a session, as text: one entry for each channel, in a dictionary for each
// kind of channel.
#include "driver/KestoReportingDriverUtility.h"
#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "sinks/KestoReportingFennicBridge.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

#include <algorithm>
#include <iterator>

namespace {

using DriverStats = KestoReportingDriverUtility::DriverStats;
using platform::ChannelFormat;

constexpr AudioEventCategory categoryCavlet = 12;
constexpr AudioEventType typeSimple = 16;
constexpr AudioEventType typeHistogram = 17;
constexpr AudioEventType typeState = 18;

struct DriverStatsByFormat {
    DriverStats simple;
    DriverStats histogram;
    DriverStats state;
};

void processChannel(const platform::ReportingChannel& channel, DriverStatsByFormat& stats)
{
    switch (static_cast<ChannelFormat>(channel.format)) {
    case ChannelFormat::Simple: return KestoReportingDriverUtility::processSimpleData(channel, stats.simple);
    case ChannelFormat::State: return KestoReportingDriverUtility::processStateData(channel, stats.state);
    case ChannelFormat::Histogram: return KestoReportingDriverUtility::processHistogramData(channel, stats.histogram);
    default: break;
    }
    KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "channel format {} is not supported, group {}, subgroup {}",
              channel.format, channel.group.value_or("(null)"), channel.subgroup.value_or("(null)"));
}

// How the driver's channels changed since the snapshot; on failure it logs the error and returns nothing.
std::optional<platform::ReportingSample> differenceSince(const session::DriverSnapShot& snapShot,
                                                         const std::string& driver,
                                                         const platform::ReportingSample& sample)
{
    constexpr platform::ReportingChannelError noBaseline = -1;
    const auto baseline = snapShot.find(driver);
    auto difference = baseline == snapShot.end()
        ? std::unexpected(noBaseline)
        : platform::current().reportingChannels.createDifference(baseline->second, sample);
    if (!difference) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Error,
                  "creating the difference of samples of driver {}: error {}", driver, difference.error());
        return std::nullopt;
    }
    return *std::move(difference);
}

void send(platform::Turn& turn, const std::shared_ptr<KestoReportingSession>& session, DriverStats stats,
          AudioEventType type)
{
    if (stats.empty())
        return;
    const foundation::Dictionary message(std::move(stats));
    session->sendMessage(turn.tally, message, categoryCavlet, type, nullptr);
    KestoReportingFennicBridge::handleEvent(turn, message, categoryCavlet, type, session);
}

// Keys join their parts with "_", so parts must not contain one.
void appendCleaned(std::string_view component, std::string& key)
{
    std::ranges::copy_if(component, std::back_inserter(key),
                         [](char character) { return character != '_' && character != ' '; });
}

void appendComponent(const std::optional<std::string>& component, std::string& key)
{
    if (!component)
        return;
    appendCleaned(*component, key);
    key += '_';
}

} // namespace

void KestoReportingDriverUtility::sendDriverLogsForSession(platform::Turn& turn,
                                                           const std::shared_ptr<KestoReportingSession>& session,
                                                           const session::DriverMoment& moment) const
{
    utility::assertServerQueue();
    DriverStatsByFormat stats;
    for (const auto& [driver, subscription, channels] : ioChannelSubscriptions_) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "getting latest samples");
        const auto sample = platform::current().reportingChannels.createSamples(*subscription, *channels, *moment);
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "done getting latest samples");
        if (!sample) {
            KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "creating samples of driver {}: error {}",
                      driver.description(), sample.error());
            continue;
        }
        const auto& snapShot = session->driverSnapShot();
        const auto difference = snapShot ? differenceSince(*snapShot, driver.description(), *sample) : std::nullopt;
        if (!difference)
            continue;
        for (const auto& channel : difference->channels)
            processChannel(channel, stats);
    }
    send(turn, session, std::move(stats.simple), typeSimple);
    send(turn, session, std::move(stats.histogram), typeHistogram);
    send(turn, session, std::move(stats.state), typeState);
}

void KestoReportingDriverUtility::processSimpleData(const platform::ReportingChannel& channel, DriverStats& driverStats)
{
    if (channel.value >= 1)
        driverStats.push_back({std::string_view(getDriverStatsKey(channel, "Simple")), channel.value});
}

void KestoReportingDriverUtility::processHistogramData(const platform::ReportingChannel& channel,
                                                       DriverStats& driverStats)
{
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::string buckets;
    for (const auto& bucket : channel.buckets) {
        if (bucket.boundsError != 0)
            KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "Error in getting the bucket bounds : {}",
                      bucket.boundsError);
        lower = std::min(lower, bucket.lower);
        upper = std::max(upper, bucket.upper);
        if (bucket.hits != 0)
            foundation::format_to(std::back_inserter(buckets), "{}-{}:{};", bucket.lower, bucket.upper, bucket.hits);
    }
    if (buckets.empty())
        return;
    buckets.pop_back();
    driverStats.push_back(
        {std::string_view(getDriverStatsKey(channel, "Histogram")),
         foundation::format("count={},lower={},upper={},min={},max={},unit={}::{}", channel.buckets.size(), lower,
                            upper, channel.minimum, channel.maximum, channel.unit.value_or("(null)"), buckets)});
}

void KestoReportingDriverUtility::processStateData(const platform::ReportingChannel& channel, DriverStats& driverStats)
{
    std::string data;
    for (const auto& state : channel.states)
        if (state.residency != 0)
            foundation::format_to(std::back_inserter(data), "name:{},transition:{},residency:{},duty_cycle:{:f};",
                                  state.name, state.transitions, state.residency, state.dutyCycle);
    KESTO_LOG(KestoReportingDriverUtilityCategory(), Debug, "the current reported data is : {}", data);
    driverStats.push_back({std::string_view(getDriverStatsKey(channel, "State")), data});
}

std::string KestoReportingDriverUtility::getDriverStatsKey(const platform::ReportingChannel& channel,
                                                           std::string_view type)
{
    std::string key;
    appendComponent(
        channel.driver.transform([](const std::string& driver) { return driver.substr(0, driver.find('<')); }), key);
    appendComponent(channel.group, key);
    appendComponent(channel.subgroup, key);
    key += type;
    key += '_';
    appendCleaned(channel.name.value_or(""), key);
    return key;
}
