// SPDX-License-Identifier: Apache-2.0
// The numbers of the public headers are those of the service.
#include "client/ServiceOperations.h"
#include "utility/MessageKinds.h"

#include "kesto/kesto.hpp"

#include <array>
#include <gtest/gtest.h>
#include <string_view>
#include <utility>

namespace {

using kesto::Category;
using kesto::EventType;
using kesto::Group;
using kesto::ServiceType;

TEST(Vocabulary, CategoriesAreTheServices)
{
    constexpr std::array<std::pair<Category, std::string_view>, 15> names{
        {{Category::Generic, "Generic"},
         {Category::Record, "Record"},
         {Category::Input, "Input"},
         {Category::Playback, "Playback"},
         {Category::Output, "Output"},
         {Category::PlaybackAndRecord, "PlaybackAndRecord"},
         {Category::IO, "IO"},
         {Category::Setup, "Setup"},
         {Category::ClientRequest, "ClientRequest"},
         {Category::RouteChange, "RouteChange"},
         {Category::Error, "Error"},
         {Category::Cavlet, "Cavlet"},
         {Category::Performance, "Performance"},
         {Category::Volume, "Volume"},
         {Category::HearingHealth, "HearingHealth"}}};
    for (const auto& [category, name] : names)
        EXPECT_EQ(KestoReportingUtilityCategoryString(static_cast<AudioEventCategory>(category)), name);
}

TEST(Vocabulary, GroupsAreTheServices)
{
    constexpr std::array<std::pair<Group, std::string_view>, 6> names{{{Group::MIDI, "MIDI_Playback"},
                                                                       {Group::Session, "Session_Playback"},
                                                                       {Group::DSP, "DSP_Playback"},
                                                                       {Group::HAL, "HAL_Playback"},
                                                                       {Group::Routing, "Routing_Playback"},
                                                                       {Group::Toolbox, "Toolbox_Playback"}}};
    for (const auto& [group, name] : names)
        EXPECT_EQ(KestoReportingUtilityCategoryString(static_cast<AudioEventCategory>(group | Category::Playback)),
                  name);
}

TEST(Vocabulary, EventTypesAreTheServices)
{
    constexpr std::array<std::pair<EventType, std::string_view>, 19> names{
        {{EventType::Start, "Start"},
         {EventType::Stop, "Stop"},
         {EventType::Activate, "Activate"},
         {EventType::Deactivate, "Deactivate"},
         {EventType::Setup, "Setup"},
         {EventType::Error, "Error"},
         {EventType::IssueDetector, "IssueDetector"},
         {EventType::Gimbo, "Gimbo"},
         {EventType::AudioUnitUsage, "AudioUnitUsage"},
         {EventType::MIDIDriver, "MIDIDriver"},
         {EventType::Summary, "Summary"},
         {EventType::HeadphoneAudioExposure, "HeadphoneAudioExposure"},
         {EventType::AudioExposure, "AudioExposure"},
         {EventType::ListeningEnhancement, "Listeningenhancement"},
         {EventType::Tivra, "Tivra"},
         {EventType::Simple, "Simple"},
         {EventType::Histogram, "Histogram"},
         {EventType::State, "State"},
         {EventType::Unknown, "Unknown"}}};
    for (const auto& [type, name] : names)
        EXPECT_EQ(KestoReportingUtilityTypeString(static_cast<AudioEventType>(type)), name);
}

TEST(Vocabulary, OperationsAreTheServices)
{
    using kesto::Operation;
    constexpr auto names = std::to_array<std::pair<Operation, std::string_view>>(
        {{Operation::CreateSession, "createReportingSession"},
         {Operation::SetServiceType, "setServiceType"},
         {Operation::GetServiceType, "getServiceNameForReporterID"},
         {Operation::SetConfiguration, "setConfiguration"},
         {Operation::StartSession, "startReportingSessionForID"},
         {Operation::Send, "sendMessage"},
         {Operation::StopSession, "stopReportingSessionForID"},
         {Operation::DestroySession, "destroyReportingSession"},
         {Operation::Validate, "reporterID"},
         {Operation::GetAllReporters, "getAllReporters"},
         {Operation::KillService, "killService"}});
    static_assert(names.size() == client::serviceOperations.size());
    for (const auto& [operation, name] : names)
        EXPECT_EQ(client::serviceOperationNumbered(static_cast<std::int64_t>(operation))->name(), name);
}

TEST(Vocabulary, ServiceTypesAreTheServices)
{
    constexpr std::array<std::pair<ServiceType, std::string_view>, 15> names{
        {{ServiceType::Generic, "generic"},
         {ServiceType::Merla, "merla"},
         {ServiceType::Telephony, "telephony"},
         {ServiceType::Haptics, "haptics"},
         {ServiceType::Alarms, "alarms"},
         {ServiceType::Standalone, "standalone"},
         {ServiceType::SoundAutoConfig, "soundautoconfig"},
         {ServiceType::LongFormAudio, "longformaudio"},
         {ServiceType::NonLongFormAudio, "nonlongformaudio"},
         {ServiceType::AudioDeviceUsage, "audiodeviceusage"},
         {ServiceType::Alerts, "alerts"},
         {ServiceType::Test, "test"},
         {ServiceType::APIUsage, "apiusage"},
         {ServiceType::SystemSounds, "systemsounds"},
         {ServiceType::Unknown, "unknown"}}};
    for (const auto& [type, name] : names)
        EXPECT_EQ(KestoReportingUtilityGenerateServiceNameFromServiceType(static_cast<AudioServiceType>(type)), name);
}

} // namespace
