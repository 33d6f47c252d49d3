// SPDX-License-Identifier: Apache-2.0
// The driver-statistics sampler: subscribes once to the channels of audio and haptics drivers, takes snapshots, and
// reports how the drivers' counters changed during a session.
#pragma once

#include "driver/ChannelMoments.h"
#include "driver/KestoReportingIOChannelSubscription.h"
#include "foundation/values/Value.h"
#include "session/DriverSnapShot.h"
#include "session/KestoReportingSession.h"

#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

// The service object makes it once and then uses it on the server queue.
class KestoReportingDriverUtility {
public:
    // Statistics by key, gathered before they become a dictionary.
    using DriverStats = foundation::Dictionary::Entries;

    // Subscribes to the eight driver groups; leaves out a group if this fails.
    KestoReportingDriverUtility();

    [[nodiscard]] const std::vector<KestoReportingIOChannelSubscription>& ioChannelSubscriptions() const
    {
        return ioChannelSubscriptions_;
    }

    // Whether samples need a moment: not without subscriptions.
    [[nodiscard]] bool needsMoments() const { return moments_ != nullptr; }
    // Reads the channels of all subscribed drivers on another thread and gives them to `take` there.
    void readMoment(driver::ChannelMoments::Take take) const { moments_->next(std::move(take)); }

    // A sample of every subscribed driver, by the driver's description. A sample that fails is left out.
    [[nodiscard]] session::DriverSnapShot getSnapShot(const session::DriverMoment& moment) const;

    // Sends the session, and with the turn the analytics bridge, what changed since the session's snapshot: simple
    // values, histograms and states, each as one message, none where nothing changed. The moment is that of the
    // session's end.
    void sendDriverLogsForSession(platform::Turn& turn, const std::shared_ptr<KestoReportingSession>& session,
                                  const session::DriverMoment& moment) const;

    // Each adds one channel of a difference of samples, if it has something to report.
    static void processSimpleData(const platform::ReportingChannel& channel, DriverStats& driverStats);
    static void processHistogramData(const platform::ReportingChannel& channel, DriverStats& driverStats);
    static void processStateData(const platform::ReportingChannel& channel, DriverStats& driverStats);

    // "driver_group_subgroup_type_channel", without the parts that the channel does not have.
    [[nodiscard]] static std::string getDriverStatsKey(const platform::ReportingChannel& channel,
                                                       std::string_view type);

private:
    void subscribe(KestoReportingDriver driver, const platform::ReportingChannels::Moment& moment);

    std::vector<KestoReportingIOChannelSubscription> ioChannelSubscriptions_;
    std::unique_ptr<driver::ChannelMoments> moments_; // null without subscriptions
};
