// Delivering a message: to each session that it is for, and beside the session to every sink.
//
// With a list of reporters the sinks come first and the session last; without one, the session comes first.
// Both orders are part of the contract.
#include "client/KestoReportingClientServerInstance.h"
#include "platform/Connection.h"
#include "platform/Platform.h"
#include "sinks/KestoReportingFennicBridge.h"
#include "sinks/KestoReportingGimboUtility.h"
#include "sinks/KestoReportingTrelmBridge.h"
#include "utility/KestoReportingTraceCodes.h"
#include "utility/KestoReportingUtility.h"

#include <fmt/ranges.h>

void KestoReportingClientServerInstance::sendMessage(foundation::Dictionary message, AudioEventCategory category,
                                                     std::uint16_t type, std::optional<ReporterIDs> reporterIDs,
                                                     KestoReportingReply reply)
{
    submit([message = Message{std::move(message), category, type}, reporterIDs = std::move(reporterIDs),
            reply = std::move(reply)](auto& self) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "sending message for reporter {}",
                  reporterIDs ? fmt::format("[{}]", fmt::join(*reporterIDs, ",")) : "(null)");
        KestoReportingEmitTracePoint(KestoReportingTraceCode::ClientSendMessage);
        const auto delegate = self.delegate_.lock();
        if (delegate && !delegate->isReportingEnabled())
            return reply(KestoReportingErrorDisabled);
        if (reporterIDs)
            self.deliverToReporters(message, *reporterIDs);
        else if (delegate)
            deliverToActiveSessions(*delegate, message);
        reply(std::nullopt);
    });
}

void KestoReportingClientServerInstance::deliverToReporters(const Message& message,
                                                            const ReporterIDs& reporterIDs) const
{
    for (const std::int64_t reporterID : reporterIDs) {
        const auto session = reporterID == 0 ? nullptr : findReportingSessionForID(reporterID, true);
        if (!session)
            continue;
        deliverToSinks(message, session);
        deliverToSession(message, session);
    }
}

void KestoReportingClientServerInstance::deliverToActiveSessions(KestoReportingServiceDelegateProtocol& delegate,
                                                                 const Message& message)
{
    const auto active = delegate.getAllActiveReportingSessions();
    KESTO_LOG(KestoReportingClientCategory(), Default, "active reporting sessions {} : {}", active.size(),
              KestoReportingDescriptionOfSessions(active));
    for (const auto& session : active) {
        deliverToSession(message, session);
        deliverToSinks(message, session);
    }
    if (active.empty())
        deliverStandalone(delegate, message);
}

void KestoReportingClientServerInstance::deliverStandalone(KestoReportingServiceDelegateProtocol& delegate,
                                                           const Message& message)
{
    constexpr std::int64_t standaloneReporterID = 1;
    const auto session = std::make_shared<KestoReportingSession>(
        standaloneReporterID, std::vector{platform::current().processTable.ownProcessIdentifier()});
    session->setServiceType(AudioServiceTypeStandalone);
    session->updateConfigurationWithContentsOfConfiguration(
        foundation::Dictionary{{KestoReportingHostApplicationKey, "Unknown"}});
    session->updateConfigurationWithContentsOfConfiguration(delegate.getDefaults());
    deliverToSinks(message, session);
    deliverToSession(message, session);
}

void KestoReportingClientServerInstance::deliverToSinks(const Message& message, const Session& session)
{
    KestoReportingFennicBridge::handleEvent(message.payload, message.category, message.type, session);
    KestoReportingGimboUtility::handleEvent(message.payload, message.category, message.type, session);
    KestoReportingTrelmBridge::handleEvent(message.payload, message.category, message.type, session);
}

void KestoReportingClientServerInstance::deliverToSession(const Message& message, const Session& session)
{
    session->sendMessage(message.payload, message.category, message.type, nullptr);
}
