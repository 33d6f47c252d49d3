// What the audio drivers' channels held at one moment, by driver.
#pragma once

#include "platform/ReportingChannels.h"

#include <map>
#include <string>

using KestoReportingDriverSnapShot = std::map<std::string, platform::ReportingSample>;
