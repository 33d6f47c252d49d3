// The driver-statistics sampler: subscribes once to what the audio and haptics drivers publish, takes snapshots,
// and tells how the drivers' counters changed over a session.
#pragma once

#include "driver/KestoReportingIOChannelSubscription.h"
#include "foundation/values/Value.h"
#include "session/KestoReportingDriverSnapShot.h"
#include "session/KestoReportingSession.h"

#include <memory>
#include <string>
#include <string_view>
#include <vector>

// Made once by the service object; then used on the server queue.
class KestoReportingDriverUtility {
public:
    // Statistics by key, gathered before they become a dictionary.
    using DriverStats = foundation::Dictionary::Entries;

    // Subscribes to the eight driver groups; one that cannot be subscribed to is left out.
    KestoReportingDriverUtility();

    [[nodiscard]] const std::vector<KestoReportingIOChannelSubscription>& ioChannelSubscriptions() const
    {
        return ioChannelSubscriptions_;
    }

    // A sample of every subscribed driver, by the driver's description. One that fails is missing.
    [[nodiscard]] KestoReportingDriverSnapShot getSnapShot() const;

    // Sends the session, and with the turn the analytics bridge, what changed since the session's snapshot: simple
    // values, histograms and states, each as one message, none where nothing changed.
    void sendDriverLogsForSession(platform::Turn& turn, const std::shared_ptr<KestoReportingSession>& session) const;

    // Each adds one channel of a difference of samples, if there is something to say about it.
    static void processSimpleData(const platform::ReportingChannel& channel, DriverStats& driverStats);
    static void processHistogramData(const platform::ReportingChannel& channel, DriverStats& driverStats);
    static void processStateData(const platform::ReportingChannel& channel, DriverStats& driverStats);

    // "driver_group_subgroup_type_channel", without what the channel does not have.
    [[nodiscard]] static std::string getDriverStatsKey(const platform::ReportingChannel& channel,
                                                       std::string_view type);

private:
    void subscribe(KestoReportingDriver driver);

    std::vector<KestoReportingIOChannelSubscription> ioChannelSubscriptions_;
};
