// SPDX-License-Identifier: Apache-2.0
// Subscribing to the drivers' channels and sampling them.
#include "driver/KestoReportingDriverUtility.h"

#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

#include <algorithm>
#include <functional>
#include <iterator>
#include <utility>

namespace {

std::string_view shown(const std::optional<std::string>& name)
{
    return name ? std::string_view(*name) : KestoReportingDriver::absentName;
}

template <typename Drivers, typename DriverOf>
std::vector<platform::ChannelSelection> selectionsOf(const Drivers& drivers, DriverOf driverOf)
{
    std::vector<platform::ChannelSelection> selections;
    std::ranges::transform(drivers, std::back_inserter(selections), &KestoReportingDriver::selection, driverOf);
    return selections;
}

} // namespace

KestoReportingDriverUtility::KestoReportingDriverUtility()
{
    KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "creating cavlet driver utility");
    const std::vector<KestoReportingDriver> drivers{{"QuarnZT4", std::nullopt},
                                                    {"Speaker", std::nullopt},
                                                    {std::nullopt, "MCA"},
                                                    {"Haptics", "Stats"},
                                                    {"StateTransitionTimes_ms", std::nullopt},
                                                    {"Rx", std::nullopt},
                                                    {"Tx", std::nullopt},
                                                    {std::nullopt, "HwAudio2"}};
    const auto moment = platform::current().reportingChannels.readChannels(selectionsOf(drivers, std::identity()));
    for (const KestoReportingDriver& driver : drivers)
        subscribe(driver, *moment);
    if (!ioChannelSubscriptions_.empty())
        moments_ = std::make_unique<driver::ChannelMoments>(
            [of = selectionsOf(ioChannelSubscriptions_, &KestoReportingIOChannelSubscription::driver)] {
                return platform::current().reportingChannels.readChannels(of);
            });
}

void KestoReportingDriverUtility::subscribe(KestoReportingDriver driver,
                                            const platform::ReportingChannels::Moment& moment)
{
    platform::ReportingChannels& service = platform::current().reportingChannels;
    const std::string_view group = shown(driver.groupName);
    const std::string_view subgroup = shown(driver.subGroupName);

    const auto found = service.copyChannelsInGroup(driver.groupName, driver.subGroupName, moment);
    if (found.error)
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "error {} getting channels for driver {}-{}",
                  *found.error, group, subgroup);
    if (!found.channels)
        return;
    if (service.channelCount(*found.channels) < 1) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "couldn't find any channels for driver group {}-{}",
                  group, subgroup);
        return;
    }
    auto subscribed = service.createSubscription(*found.channels);
    if (subscribed.subscription && subscribed.channels) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "subscribed to group group {}-{}", group, subgroup);
        ioChannelSubscriptions_.push_back(
            {std::move(driver), std::move(subscribed.subscription), std::move(subscribed.channels)});
    } else if (subscribed.error) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "error {} creating subscription for {}-{}",
                  *subscribed.error, group, subgroup);
    }
}

session::DriverSnapShot KestoReportingDriverUtility::getSnapShot(const session::DriverMoment& moment) const
{
    utility::assertServerQueue();
    session::DriverSnapShot snapShot;
    for (const auto& [driver, subscription, channels] : ioChannelSubscriptions_) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "sampling driver {}", driver.description());
        auto sample = platform::current().reportingChannels.createSamples(*subscription, *channels, *moment);
        if (sample)
            snapShot.insert_or_assign(driver.description(), *std::move(sample));
        else
            KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "creating samples of driver {}: error {}",
                      driver.description(), sample.error());
    }
    return snapShot;
}
