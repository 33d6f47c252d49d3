// SPDX-License-Identifier: Apache-2.0
// The tables of the names. A name's index in its table is its number.
#include "utility/MessageKinds.h"

#include <algorithm>
#include <array>
#include <utility>

namespace {

constexpr std::array<std::string_view, 16> categoryNames{
    "Undefined",     "Generic",     "Record", "Input",  "Playback",    "Output", "PlaybackAndRecord", "IO", "Setup",
    "ClientRequest", "RouteChange", "Error",  "Cavlet", "Performance", "Volume", "HearingHealth"};

constexpr std::array<std::pair<AudioEventCategory, std::string_view>, 6> groupNames{{{0x04000000, "MIDI"},
                                                                                     {0x08000000, "Session"},
                                                                                     {0x10000000, "DSP"},
                                                                                     {0x20000000, "HAL"},
                                                                                     {0x40000000, "Routing"},
                                                                                     {0x80000000, "Toolbox"}}};

constexpr std::array<std::string_view, 19> typeNames{"Generic",
                                                     "Start",
                                                     "Stop",
                                                     "Activate",
                                                     "Deactivate",
                                                     "Setup",
                                                     "Error",
                                                     "IssueDetector",
                                                     "Gimbo",
                                                     "AudioUnitUsage",
                                                     "MIDIDriver",
                                                     "Summary",
                                                     "HeadphoneAudioExposure",
                                                     "AudioExposure",
                                                     "Listeningenhancement",
                                                     "Tivra",
                                                     "Simple",
                                                     "Histogram",
                                                     "State"};

constexpr std::array<std::string_view, 14> serviceNames{
    "generic",         "merla",         "telephony",        "haptics",          "alarms", "standalone",
    "soundautoconfig", "longformaudio", "nonlongformaudio", "audiodeviceusage", "alerts", "test",
    "apiusage",        "systemsounds"};
constexpr AudioServiceType serviceTelephony = 2;
constexpr AudioServiceType serviceAPIUsage = 12;
constexpr std::string_view unknownServiceName = "unknown";

constexpr AudioEventCategory baseMask = 0x0000FFFF;
constexpr AudioEventCategory groupMask = 0xFFFF0000;

std::string_view groupName(AudioEventCategory category)
{
    const auto found =
        std::ranges::find(groupNames, category & groupMask, [](const auto& group) { return group.first; });
    return found == groupNames.end() ? std::string_view() : found->second;
}

} // namespace

std::string KestoReportingUtilityCategoryString(AudioEventCategory category)
{
    std::string name;
    if (KestoReportingUtilityIsABTestModeOn(category)) {
        name += groupName(category);
        name += '_';
    }
    const AudioEventCategory base = KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(category);
    name += categoryNames[base < categoryNames.size() ? base : 0];
    return name;
}

std::string_view KestoReportingUtilityTypeString(AudioEventType type)
{
    if (type == AudioEventTypeUnknown)
        return "Unknown";
    return typeNames[type < typeNames.size() ? type : 0];
}

std::string_view KestoReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type)
{
    if (type == AudioServiceTypeUnknown)
        return unknownServiceName;
    return serviceNames[type < serviceNames.size() ? type : serviceTelephony];
}

AudioServiceType KestoReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name)
{
    const auto found = std::ranges::find(serviceNames, name);
    return found == serviceNames.end() ? AudioServiceTypeUnknown
                                       : static_cast<AudioServiceType>(found - serviceNames.begin());
}

bool KestoReportingUtilityShouldBatchBlinReportingEventsForServiceType(AudioServiceType type)
{
    return type != serviceAPIUsage;
}

bool KestoReportingUtilityIsABTestModeOn(AudioEventCategory category)
{
    return category >= 0x00010000 && category <= 0xFFFFFFFE;
}

AudioEventCategory KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(AudioEventCategory category)
{
    return category & baseMask;
}

double KestoReportingUtilityVolumeMinimumPlayingTime(AudioServiceType)
{
    return 0.5;
}

bool KestoReportingUtilityShouldSendMessage()
{
    return true;
}

bool KestoReportingUtilityAllowSessionTransactions()
{
    return false;
}
