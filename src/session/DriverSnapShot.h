// What the audio drivers' channels held at one moment, by driver.
#pragma once

#include "platform/ReportingChannels.h"

#include <map>
#include <string>

namespace session {

using DriverSnapShot = std::map<std::string, platform::ReportingSample>;

} // namespace session
