// SPDX-License-Identifier: Apache-2.0
// The kinds of messages: event categories, event types and service types, with their names and the small policies that
// depend on them.
//
// Clients and stored events use these numbers and names, so they never change. Everything here is a pure function of
// its argument. Any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

// The low 16 bits are a base category, the high 16 bits an optional group such as "DSP".
using AudioEventCategory = std::uint32_t;
// 16 bits on the wire, 32 inside.
using AudioEventType = std::uint32_t;
using AudioServiceType = std::uint16_t;

constexpr AudioEventCategory AudioEventCategorySetup = 8;
constexpr AudioEventCategory AudioEventCategoryError = 11;
constexpr AudioEventCategory AudioEventCategoryVolume = 14;
constexpr AudioEventCategory AudioEventCategoryUndefined = 0xFFFFFFFF;
constexpr AudioEventType AudioEventTypeSetup = 5;
constexpr AudioEventType AudioEventTypeError = 6;
constexpr AudioEventType AudioEventTypeSummary = 11;
constexpr AudioEventType AudioEventTypeUnknown = 65535;
constexpr AudioServiceType AudioServiceTypeAlarms = 4;
constexpr AudioServiceType AudioServiceTypeStandalone = 5;
constexpr AudioServiceType AudioServiceTypeTest = 11;
constexpr AudioServiceType AudioServiceTypeUnknown = 65535;

// "Playback"; with a group "DSP_Playback"; with a group without a name "_Playback".
[[nodiscard]] std::string KestoReportingUtilityCategoryString(AudioEventCategory category);
[[nodiscard]] std::string_view KestoReportingUtilityTypeString(AudioEventType type);

// The name of a service type; numbers above 13 count as "telephony", except 65535, which is "unknown".
[[nodiscard]] std::string_view KestoReportingUtilityGenerateServiceNameFromServiceType(AudioServiceType type);
// The service type of exactly that name, or 65535.
[[nodiscard]] AudioServiceType KestoReportingUtilityGenerateServiceTypeFromServiceName(std::string_view name);

// Every service type except "apiusage" is batched.
[[nodiscard]] bool KestoReportingUtilityShouldBatchBlinReportingEventsForServiceType(AudioServiceType type);
// Whether the category carries a group.
[[nodiscard]] bool KestoReportingUtilityIsABTestModeOn(AudioEventCategory category);
// The category without its group.
[[nodiscard]] AudioEventCategory
KestoReportingUtilityRetrieveBlinReportingCategoryFromCategory(AudioEventCategory category);

// The seconds that output must run to count as playing; the same for every service type.
[[nodiscard]] double KestoReportingUtilityVolumeMinimumPlayingTime(AudioServiceType type);
[[nodiscard]] bool KestoReportingUtilityShouldSendMessage();
[[nodiscard]] bool KestoReportingUtilityAllowSessionTransactions();
