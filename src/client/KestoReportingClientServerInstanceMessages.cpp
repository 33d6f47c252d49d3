// SPDX-License-Identifier: Apache-2.0
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

void KestoReportingClientServerInstance::sendMessage(foundation::Dictionary message, AudioEventCategory category,
                                                     std::uint16_t type, std::optional<ReporterIDs> reporterIDs,
                                                     utility::Reply reply)
{
    // The sender is the process that makes this call, which need not be the process that this client was made for.
    const platform::Connection* caller = platform::Connection::current();
    const std::int32_t sender = caller != nullptr ? caller->processIdentifier() : processIdentifier_;
    const std::uint32_t user = caller != nullptr ? caller->userIdentifier() : userIdentifier_;
    auto processName = KestoReportingUtilityProcessNameForPID(sender);
    Delivery delivery{.message = {std::move(message), category, type, sender, user,
                                  std::move(processName).value_or("(null)"), source_},
                      .reporterIDs = std::move(reporterIDs),
                      .reply = std::move(reply)};
    if (!delivery.mayTakeLong())
        return submit([delivery = std::move(delivery)](auto& self, platform::Turn& turn) mutable {
            self.deliver(turn, std::move(delivery));
        });
    submitLong([delivery = std::move(delivery)](auto& self, platform::Turn& turn) mutable {
        self.whenAlone(turn, [delivery = std::move(delivery)](auto& client, platform::Turn& later, auto place) mutable {
            delivery.place = std::move(place);
            client.deliver(later, std::move(delivery));
        });
    });
}

bool KestoReportingClientServerInstance::Delivery::mayTakeLong() const
{
    constexpr std::size_t fewReceivers = 16;
    return !reporterIDs || reporterIDs->size() > fewReceivers;
}

void KestoReportingClientServerInstance::deliver(platform::Turn& turn, Delivery delivery)
{
    KESTO_LOG(KestoReportingClientCategory(), Debug, "sending message for reporter {}",
              delivery.reporterIDs ? listAllowance_.describe(*delivery.reporterIDs) : "(null)");
    utility::emitTraceCode(utility::ServiceTraceCode::ClientSendMessage);
    const auto delegate = delegate_.lock();
    if (!delegate)
        return delivery.reply(turn, std::nullopt);
    if (!delegate->isReportingEnabled())
        return delivery.reply(turn, utility::reportingDisabled);
    if (delivery.reporterIDs) {
        delivery.room = mostReceivers(delivery.message, delivery.reporterIDs->size());
        if (delivery.mayTakeLong())
            return deliverInSlices(turn, std::make_shared<Delivery>(std::move(delivery)));
        while (deliverToNext(turn, *delegate, delivery)) { }
        return finishDelivery(turn, delivery);
    }
    walkActiveSessions(turn, *delegate,
                       [shared = std::make_shared<Delivery>(std::move(delivery))](auto& self, auto& later, auto walk) {
                           shared->sessions = std::move(walk);
                           self.deliverToActiveSessions(later, shared);
                       });
}

void KestoReportingClientServerInstance::deliverInSlices(platform::Turn& turn,
                                                         const std::shared_ptr<Delivery>& delivery)
{
    inSlices(
        turn,
        [delivery](auto& self, platform::Turn& now) {
            const auto service = self.delegate_.lock();
            return service && self.deliverToNext(now, *service, *delivery);
        },
        [delivery](auto& self, platform::Turn& now) { self.finishDelivery(now, *delivery); });
}

void KestoReportingClientServerInstance::deliverToActiveSessions(platform::Turn& turn,
                                                                 const std::shared_ptr<Delivery>& delivery)
{
    const std::size_t active = delivery->sessions->count();
    KESTO_LOG(KestoReportingClientCategory(), Default, "active reporting sessions {} : {}", active,
              delivery->sessions->describe(listAllowance_));
    if (const auto delegate = active == 0 ? delegate_.lock() : nullptr)
        deliverStandalone(turn, *delegate, delivery->message);
    delivery->room = std::min(active, mostReceivers(delivery->message, active));
    delivery->refused = active - delivery->room;
    deliverInSlices(turn, delivery);
}

// False if none is left.
bool KestoReportingClientServerInstance::deliverToNext(platform::Turn& turn,
                                                       KestoReportingServiceDelegateProtocol& delegate,
                                                       Delivery& delivery)
{
    if (!delivery.reporterIDs)
        return deliverToNextActiveSession(turn, delegate, delivery);
    if (delivery.next == delivery.reporterIDs->size())
        return false;
    deliverToReporter(turn, delegate, delivery, (*delivery.reporterIDs)[delivery.next++]);
    return true;
}

void KestoReportingClientServerInstance::finishDelivery(platform::Turn& turn, const Delivery& delivery)
{
    countRefusedReceivers(turn.tally, delivery.message, delivery.refused);
    delivery.reply(turn, std::nullopt);
}

void KestoReportingClientServerInstance::deliverToReporter(platform::Turn& turn,
                                                           KestoReportingServiceDelegateProtocol& delegate,
                                                           Delivery& delivery, std::int64_t reporterID)
{
    const auto session = reporterID == 0 ? nullptr : findReportingSessionForID(reporterID, true);
    if (!session)
        return;
    if (delivery.room == 0) {
        ++delivery.refused;
        return;
    }
    --delivery.room;
    deliverToSinks(turn, delegate, delivery.message, session);
    deliverToSession(turn, delivery.message, session);
}

// A session that has ended since the delivery began does not get the message.
bool KestoReportingClientServerInstance::deliverToNextActiveSession(platform::Turn& turn,
                                                                    KestoReportingServiceDelegateProtocol& delegate,
                                                                    Delivery& delivery)
{
    const auto session = delivery.room == 0 ? std::nullopt : delivery.sessions->step();
    if (!session) {
        turn.tally.add(ledger::Counter::Deliveries, delivery.room);
        turn.tally.add(ledger::Counter::Inert, delivery.room);
        return false;
    }
    if (*session == nullptr)
        return true;
    --delivery.room;
    deliverToSession(turn, delivery.message, *session);
    deliverToSinks(turn, delegate, delivery.message, *session);
    return true;
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
