// SPDX-License-Identifier: Apache-2.0
// One live subscription to a driver's channels.
#pragma once

#include "driver/KestoReportingDriver.h"
#include "platform/ReportingChannels.h"

#include <memory>

struct KestoReportingIOChannelSubscription {
    KestoReportingDriver driver;
    std::shared_ptr<platform::ReportingChannels::Subscription> subscription;
    std::shared_ptr<platform::ReportingChannels::ChannelSet> subscribedChannels;
};
