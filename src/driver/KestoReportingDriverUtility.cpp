// Subscribing to the drivers' channels and sampling them.
#include "driver/KestoReportingDriverUtility.h"

#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

namespace {

std::string_view shown(const std::optional<std::string>& name)
{
    return name ? std::string_view(*name) : KestoReportingDriver::absentName;
}

} // namespace

KestoReportingDriverUtility::KestoReportingDriverUtility()
{
    KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "creating cavlet driver utility");
    subscribe({"QuarnZT4", std::nullopt});
    subscribe({"Speaker", std::nullopt});
    subscribe({std::nullopt, "MCA"});
    subscribe({"Haptics", "Stats"});
    subscribe({"StateTransitionTimes_ms", std::nullopt});
    subscribe({"Rx", std::nullopt});
    subscribe({"Tx", std::nullopt});
    subscribe({std::nullopt, "HwAudio2"});
}

void KestoReportingDriverUtility::subscribe(KestoReportingDriver driver)
{
    platform::ReportingChannels& service = platform::current().reportingChannels;
    const std::string_view group = shown(driver.groupName);
    const std::string_view subgroup = shown(driver.subGroupName);

    const auto found = service.copyChannelsInGroup(driver.groupName, driver.subGroupName);
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

session::DriverSnapShot KestoReportingDriverUtility::getSnapShot() const
{
    utility::assertServerQueue();
    session::DriverSnapShot snapShot;
    for (const auto& [driver, subscription, channels] : ioChannelSubscriptions_) {
        KESTO_LOG(KestoReportingDriverUtilityCategory(), Info, "sampling driver {}", driver.description());
        auto sample = platform::current().reportingChannels.createSamples(*subscription, *channels);
        if (sample)
            snapShot.insert_or_assign(driver.description(), *std::move(sample));
        else
            KESTO_LOG(KestoReportingDriverUtilityCategory(), Error, "creating samples of driver {}: error {}",
                      driver.description(), sample.error());
    }
    return snapShot;
}
