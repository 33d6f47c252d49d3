// SPDX-License-Identifier: Apache-2.0
// Both events of a message share one payload, which is built when the first event needs it.
#include "sinks/KestoReportingFennicBridge.h"

#include "foundation/text/Format.h"
#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

#include <array>
#include <mutex>
#include <optional>
#include <string>

namespace {

class LazyPayload {
public:
    LazyPayload(foundation::Dictionary message, std::shared_ptr<const sinks::SinkSession> session)
        : message_(std::move(message)),
          session_(std::move(session))
    {
    }

    // Any thread.
    foundation::Dictionary build()
    {
        std::call_once(built_, [this] {
            if (!message_.contains(utility::hostApplicationKey))
                message_ = message_.with(utility::hostApplicationKey,
                                         KestoReportingUtilityRetrieveAppName(session_->configuration()));
        });
        return message_;
    }

private:
    std::once_flag built_;
    foundation::Dictionary message_;
    const std::shared_ptr<const sinks::SinkSession> session_;
};

// The names of a message's two events.
struct EventNames {
    AudioEventCategory category;
    AudioEventType type;
    AudioServiceType serviceType;
    std::string ofAllServices;
    std::string ofItsService;
};

EventNames makeEventNames(AudioEventCategory category, AudioEventType type, AudioServiceType serviceType)
{
    const std::string categoryName = KestoReportingUtilityCategoryString(category);
    const std::string_view typeName = KestoReportingUtilityTypeString(type);
    const auto serviceName = KestoReportingUtilityGenerateServiceNameFromServiceType(serviceType);
    return {category, type, serviceType, foundation::format("com.quarn.kesto.{}.{}", categoryName, typeName),
            foundation::format("com.quarn.{}.{}.{}", serviceName, categoryName, typeName)};
}

// Sessions repeat a few kinds of messages: each thread caches the recent names, each at a place that its numbers
// determine.
const EventNames& eventNames(AudioEventCategory category, AudioEventType type, AudioServiceType serviceType)
{
    constexpr std::size_t remembered = 64;
    thread_local std::array<std::optional<EventNames>, remembered> recent;
    auto& names = recent[(category * 5 + type * 3 + serviceType) % remembered];
    if (!names || names->category != category || names->type != type || names->serviceType != serviceType)
        names = makeEventNames(category, type, serviceType);
    return *names;
}

} // namespace

void KestoReportingFennicBridge::handleEvent(platform::Turn& turn, const foundation::Dictionary& message,
                                             AudioEventCategory category, AudioEventType type,
                                             const std::shared_ptr<sinks::SinkSession>& session, std::uint64_t source)
{
    utility::assertServerQueue();
    platform::Analytics& analytics = platform::current().analytics;
    std::shared_ptr<LazyPayload> payload;
    platform::Origin origin;
    const auto offer = [&](const std::string& eventName) {
        if (!analytics.isAnalyticsEventUsed(eventName)) {
            turn.tally.add(ledger::Counter::Events);
            return turn.tally.add(ledger::Counter::Unwanted);
        }
        if (!payload) {
            payload = std::make_shared<LazyPayload>(message, session);
            origin = session->announcedOrigin(turn);
            origin.source = source != 0 ? source : origin.source;
        }
        analytics.sendAnalyticsEventLazy(turn, origin, eventName, [payload] { return payload->build(); });
    };
    const EventNames& names = eventNames(category, type, session->serviceType());
    offer(names.ofAllServices);
    offer(names.ofItsService);
}
