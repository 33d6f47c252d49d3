// Both events of a message share one payload, which is built when the first of them needs it.
#include "sinks/KestoReportingFennicBridge.h"

#include "foundation/Format.h"
#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"

#include <mutex>

namespace {

class LazyPayload {
public:
    LazyPayload(foundation::Dictionary message, std::shared_ptr<const KestoReportingSinkSession> session)
        : message_(std::move(message)),
          session_(std::move(session))
    {
    }

    // Any thread.
    foundation::Dictionary build()
    {
        std::call_once(built_, [this] {
            if (!message_.contains(KestoReportingHostApplicationKey))
                message_ = message_.with(KestoReportingHostApplicationKey,
                                         KestoReportingUtilityRetrieveAppName(session_->configuration()));
            session_.reset();
        });
        return message_;
    }

private:
    std::once_flag built_;
    foundation::Dictionary message_;
    std::shared_ptr<const KestoReportingSinkSession> session_;
};

} // namespace

void KestoReportingFennicBridge::handleEvent(const foundation::Dictionary& message, AudioEventCategory category,
                                             AudioEventType type,
                                             const std::shared_ptr<const KestoReportingSinkSession>& session)
{
    const std::string categoryName = KestoReportingUtilityCategoryString(category);
    const std::string_view typeName = KestoReportingUtilityTypeString(type);
    const auto serviceName = KestoReportingUtilityGenerateServiceNameFromServiceType(session->serviceType());

    platform::Analytics& analytics = platform::current().analytics;
    std::shared_ptr<LazyPayload> payload;
    const auto offer = [&](std::string eventName) {
        if (!analytics.isAnalyticsEventUsed(eventName))
            return;
        if (!payload)
            payload = std::make_shared<LazyPayload>(message, session);
        analytics.sendAnalyticsEventLazy(std::move(eventName), [payload] { return payload->build(); });
    };
    offer(foundation::format("com.quarn.kesto.{}.{}", categoryName, typeName));
    offer(foundation::format("com.quarn.{}.{}.{}", serviceName, categoryName, typeName));
}
