// SPDX-License-Identifier: Apache-2.0
// One step for each message: it is not a report, or repeats the last one, or is counted, or is the second report, which
// requests a snapshot.
#include "sinks/KestoReportingVorpStateManagerUtility.h"

#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

namespace {
constexpr AudioEventType typeGimbo = 8;
constexpr std::string_view hapticTimeKey = "Haptic_Active_Hardware_Time_Seconds";

// A message that goes to several sessions is one report, even if it holds a NaN, which equals nothing.
bool isRepeat(const foundation::Dictionary& message, const foundation::Dictionary& last)
{
    return message.isSameObject(last) || message == last;
}
} // namespace

void KestoReportingUtilityVorpStateManager::handleEvent(const std::optional<foundation::Dictionary>& message,
                                                        AudioEventCategory category, AudioEventType type,
                                                        const std::shared_ptr<const sinks::SinkSession>& session,
                                                        std::string_view processName)
{
    utility::assertServerQueue();
    if (!message || type != typeGimbo || !message->contains(hapticTimeKey) || isRepeat(*message, messageCache_))
        return;
    if (leakedHapticsSessionCounter_ != 1) {
        messageCache_ = *message;
        KESTO_LOG(KestoReportingVorpLogCategory(), Info, "Incrementing Vorp counter. {}", processName);
        ++leakedHapticsSessionCounter_;
        return;
    }
    requestSnapshot(category, *session, processName);
    leakedHapticsSessionCounter_ = 0;
    messageCache_ = {};
}

void KestoReportingUtilityVorpStateManager::requestSnapshot(AudioEventCategory category,
                                                            const sinks::SinkSession& session,
                                                            std::string_view processName)
{
    KESTO_LOG(KestoReportingVorpLogCategory(), Info, "Getting snapshot with Ulmet Reporter");
    ulmetReporter_ = platform::current().bugCapture.makeReporter();
    auto signature = ulmetReporter_->makeSignature(
        "Sonalis", KestoReportingUtilityGenerateServiceNameFromServiceType(session.serviceType()),
        KestoReportingUtilityCategoryString(category), KestoReportingUtilityTypeString(typeGimbo), processName,
        std::nullopt);
    ulmetReporter_->requestSnapshot(
        std::move(signature), 0, std::nullopt, std::nullopt, [](const foundation::Dictionary& response) {
            KESTO_LOG(KestoReportingVorpLogCategory(), Info, "Response from ulmetReporter : {}",
                      foundation::Value(response).text());
        });
}
