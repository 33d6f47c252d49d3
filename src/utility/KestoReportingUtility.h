// SPDX-License-Identifier: Apache-2.0
// Functions that the service, its clients, its sessions and its sinks share: waiting, process names, payload
// normalisation, bucketing. They keep no state except the build kind, which is read once.
//
// All of them may be called from any thread.
#pragma once

#include "foundation/Mutex.h"
#include "foundation/values/Value.h"
#include "platform/EventBatch.h"
#include "platform/ProcessTable.h"
#include "utility/LogCategories.h"
#include "utility/MessageKinds.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace utility {

// The payload key of the time that a client gives a message, in seconds since 1970.
constexpr std::string_view timestampKey = platform::timestampKey;
// The configuration and payload key of the application for which a client plays.
constexpr std::string_view hostApplicationKey = "HostApplicationDisplayID";

// A condition variable with its own lock.
struct ConditionWithLock {
    foundation::Mutex lock;
    foundation::Condition signal;
};

} // namespace utility

// Waits until another thread has set the flag. Each wait lasts at most `timeout` seconds (0 for a negative number,
// practically for ever for NaN); a wake-up without the flag begins a new wait. False if a wait timed out.
bool KestoReportingUtilityWait(utility::ConditionWithLock& condition, double timeout, const bool& flag,
                               std::string_view waitMessage, std::string_view timeoutMessage,
                               platform::LogCategory& logCategory);
// Sets the flag and wakes one waiter.
void KestoReportingUtilitySignal(utility::ConditionWithLock& condition, bool& flag);

// Whether the device runs an internal build. Asked once for the life of the process.
[[nodiscard]] bool KestoReportingUtilityIsInternalBuild();

// The short name of that process; nothing for numbers below 1 and for processes that do not exist.
[[nodiscard]] std::optional<std::string> KestoReportingUtilityProcessNameForPID(std::int32_t pid);
// Fills `entry` and returns true if the process exists.
[[nodiscard]] bool KestoReportingUtilityProcessInfoForPID(std::int32_t pid, platform::ProcessTableEntry& entry);

// The host application in the dictionary, or "Unknown".
[[nodiscard]] foundation::Value KestoReportingUtilityRetrieveAppName(const foundation::Dictionary& dictionary);

// The next three functions define what happens to a message. Sessions call the fourth one; the property
// `NormalisedMessage.IsWhatTheThreeStepsMakeOfIt` binds it to the three.
//
// The payload with "audiotag" set to the names of its category and type, such as "PlaybackStart".
[[nodiscard]] foundation::Dictionary KestoReportingUtilityAddAudioMessageTag(const foundation::Dictionary& message,
                                                                             AudioEventCategory category,
                                                                             AudioEventType type);
// The payload without its time stamp; on internal builds, which may keep it, the unchanged payload.
[[nodiscard]] foundation::Dictionary KestoReportingUtilityRemoveEventEpochTime(const foundation::Dictionary& message);
// The payload with "_" for every blank in its keys; of keys that become equal the last one's value stays.
[[nodiscard]] foundation::Dictionary
KestoReportingUtilityRemoveWhiteSpaceFromKeys(const foundation::Dictionary& message);

namespace utility {

// These three one after the other, blanks first and the time stamp last, at the cost of one.
[[nodiscard]] foundation::Dictionary normaliseMessage(const foundation::Dictionary& message,
                                                      AudioEventCategory category, AudioEventType type);

} // namespace utility

// Rounded to that many decimal places, halves away from zero; negative places round to tens, hundreds...
[[nodiscard]] double KestoReportingUtilityRoundWithPlaces(double value, int places);

// Seconds of playing.
constexpr std::array<double, 11> KestoReportingUtilityBucketNumberToStringTimes{0,   1,    5,    10,   30,   60,
                                                                                300, 1800, 3600, 7200, 18000};
// Volumes in steps of a sixteenth.
constexpr std::array<double, 17> KestoReportingUtilityBucketNumberToStringVolumes{
    0.0,    0.0625, 0.125,  0.1875, 0.25,   0.3125, 0.375,  0.4375, 0.5,
    0.5625, 0.625,  0.6875, 0.75,   0.8125, 0.875,  0.9375, 1.0};

// The text of the bucket nearest to the number, the later of two that are equally near: the search stops at the first
// bucket that is farther away than the one before. Nothing without buckets. At most `places` fraction digits, and at
// least one unless `places` is 0.
[[nodiscard]] std::optional<std::string>
KestoReportingUtilityBucketNumberToString(double number, std::span<const double> buckets, unsigned places);

// The session ID of a reporter ID, which is the same number.
[[nodiscard]] std::int64_t KestoReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID);
