// SPDX-License-Identifier: Apache-2.0
// What the audio drivers' channels held at one moment, by driver.
#pragma once

#include "platform/ReportingChannels.h"

#include <map>
#include <memory>
#include <string>

namespace session {

// The channels of all drivers at one moment, of which samples are taken; null if the service has no channels.
using DriverMoment = std::shared_ptr<const platform::ReportingChannels::Moment>;

using DriverSnapShot = std::map<std::string, platform::ReportingSample>;

} // namespace session
