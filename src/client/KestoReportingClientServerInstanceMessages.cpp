// Delivering a message to each of its sessions, and beside each session to every sink.
//
// A message to every started session reaches each session before its sinks; in all other cases the sinks come first.
// Both orders are part of the contract.
#include "client/KestoReportingClientServerInstance.h"
#include "foundation/text/Format.h"
#include "platform/BugCapture.h"
#include "platform/Connection.h"
#include "platform/Platform.h"
#include "sinks/KestoReportingFennicBridge.h"
#include "sinks/KestoReportingGimboUtility.h"
#include "sinks/KestoReportingTrelmBridge.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServiceTraceCodes.h"

#include <algorithm>
#include <span>

void KestoReportingClientServerInstance::sendMessage(foundation::Dictionary message, AudioEventCategory category,
                                                     std::uint16_t type, std::optional<ReporterIDs> reporterIDs,
                                                     utility::Reply reply)
{
    // The sender is the process that makes this call, which need not be the process that this client was made for.
    const platform::Connection* caller = platform::Connection::current();
    const std::int32_t sender = caller != nullptr ? caller->processIdentifier() : processIdentifier_;
    const std::uint32_t user = caller != nullptr ? caller->userIdentifier() : userIdentifier_;
    auto processName = KestoReportingUtilityProcessNameForPID(sender);
    constexpr std::size_t fewReceivers = 16;
    const bool mayTakeLong = !reporterIDs || reporterIDs->size() > fewReceivers;
    auto deliver = [message = Message{std::move(message), category, type, sender, user,
                                      std::move(processName).value_or("(null)"), source_},
                    reporterIDs = std::move(reporterIDs), reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "sending message for reporter {}",
                  reporterIDs ? self.listAllowance_.describe(*reporterIDs) : "(null)");
        utility::emitTraceCode(utility::ServiceTraceCode::ClientSendMessage);
        const auto delegate = self.delegate_.lock();
        if (!delegate)
            return reply(turn, std::nullopt);
        if (!delegate->isReportingEnabled())
            return reply(turn, utility::reportingDisabled);
        if (reporterIDs)
            self.deliverToReporters(turn, *delegate, message, *reporterIDs);
        else
            self.deliverToActiveSessions(turn, *delegate, message);
        reply(turn, std::nullopt);
    };
    if (mayTakeLong)
        submitLong(std::move(deliver));
    else
        submit(std::move(deliver));
}

void KestoReportingClientServerInstance::deliverToReporters(platform::Turn& turn,
                                                            KestoReportingServiceDelegateProtocol& delegate,
                                                            const Message& message, const ReporterIDs& reporterIDs)
{
    std::size_t room = mostReceivers(message, reporterIDs.size());
    std::size_t refused = 0;
    for (const std::int64_t reporterID : reporterIDs) {
        const auto session = reporterID == 0 ? nullptr : findReportingSessionForID(reporterID, true);
        if (!session)
            continue;
        if (room == 0) {
            ++refused;
            continue;
        }
        --room;
        deliverToSinks(turn, delegate, message, session);
        deliverToSession(turn, message, session);
    }
    countRefusedReceivers(turn.tally, message, refused);
}

void KestoReportingClientServerInstance::deliverToActiveSessions(platform::Turn& turn,
                                                                 KestoReportingServiceDelegateProtocol& delegate,
                                                                 const Message& message)
{
    const auto active = delegate.getAllActiveReportingSessions(listAllowance_);
    KESTO_LOG(KestoReportingClientCategory(), Default, "active reporting sessions {} : {}", active.size(),
              listAllowance_.describe(active));
    const std::size_t receivers = std::min(active.size(), mostReceivers(message, active.size()));
    countRefusedReceivers(turn.tally, message, active.size() - receivers);
    for (const auto& session : std::span(active).first(receivers)) {
        deliverToSession(turn, message, session);
        deliverToSinks(turn, delegate, message, session);
    }
    if (active.empty())
        deliverStandalone(turn, delegate, message);
}

// Without this limit, a message of a million bytes to ten thousand sessions would delay all clients for a minute.
std::size_t KestoReportingClientServerInstance::mostReceivers(const Message& message, std::size_t wanted)
{
    if (wanted <= 1)
        return wanted;
    return std::max<std::size_t>(mostBytesOfADelivery / message.payload.roughBytes(), 1);
}

void KestoReportingClientServerInstance::countRefusedReceivers(ledger::Tally& tally, const Message& message,
                                                               std::size_t receivers)
{
    tally.add(ledger::Counter::Deliveries, receivers);
    tally.add(ledger::Counter::RefusedForSize,
              {.user = message.user, .process = message.processName, .application = {}}, receivers);
    if (receiversRefused_ == 0 && receivers != 0)
        KESTO_LOG(
            KestoReportingClientCategory(), Error,
            "a message of client {} is not delivered to {} sessions: it may take {} bytes in all of its receivers; "
            "further ones are counted until the client goes",
            processIdentifier_, receivers, mostBytesOfADelivery);
    receiversRefused_ += receivers;
}

void KestoReportingClientServerInstance::deliverStandalone(platform::Turn& turn,
                                                           KestoReportingServiceDelegateProtocol& delegate,
                                                           const Message& message)
{
    constexpr std::int64_t standaloneReporterID = 1;
    const std::vector ownProcess{platform::current().processTable.ownProcessIdentifier()};
    const auto session = std::make_shared<KestoReportingSession>(standaloneReporterID, ownProcess);
    session->setServiceType(AudioServiceTypeStandalone);
    session->updateConfigurationWithContentsOfConfiguration(
        foundation::Dictionary{{utility::hostApplicationKey, "Unknown"}});
    session->updateConfigurationWithContentsOfConfiguration(delegate.getDefaults());
    deliverToSinks(turn, delegate, message, session);
    deliverToSession(turn, message, session);
}

void KestoReportingClientServerInstance::deliverToSinks(platform::Turn& turn,
                                                        KestoReportingServiceDelegateProtocol& delegate,
                                                        const Message& message, const Session& session)
{
    const auto& [payload, category, type, sender, user, processName, source] = message;
    KestoReportingFennicBridge::handleEvent(turn, payload, category, type, session, source);
    KestoReportingGimboUtility::handleEvent(payload, category, type, session);
    KestoReportingTrelmBridge::handleEvent(payload, category, type, session);
    const platform::BugCapture::SenderScope scope(sender);
    delegate.handleEventForVorp(payload, category, type, session, processName);
}

void KestoReportingClientServerInstance::deliverToSession(platform::Turn& turn, const Message& message,
                                                          const Session& session)
{
    session->sendMessage(turn.tally, message.payload, message.category, message.type, nullptr);
}
