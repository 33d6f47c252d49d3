// SPDX-License-Identifier: Apache-2.0
// The client's life and its operations on sessions. Delivering messages is in a file of its own.
#include "client/KestoReportingClientServerInstance.h"

#include "foundation/text/Format.h"
#include "platform/Connection.h"
#include "platform/Platform.h"
#include "utility/EndProcess.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"
#include "utility/ServiceTraceCodes.h"

#include <algorithm>

using ledger::Counter;

namespace {

std::atomic<std::size_t> sessionsOfTheService = 0; // of all clients, registered or not

bool isRegistered(const KestoReportingServiceDelegateProtocol& delegate,
                  const KestoReportingClientServerInstance& client)
{
    return std::ranges::any_of(delegate.getAllClients(), [&](const auto& other) { return other.get() == &client; });
}

} // namespace

KestoReportingClientServerInstance::KestoReportingClientServerInstance(
    std::int32_t processIdentifier, std::weak_ptr<KestoReportingServiceDelegateProtocol> delegate,
    std::uint32_t userIdentifier, std::shared_ptr<platform::LogShare> logShare)
    : processIdentifier_(processIdentifier),
      userIdentifier_(userIdentifier),
      logShare_(std::move(logShare)),
      delegate_(std::move(delegate)),
      budget_(session::StorageBudget::makeForClient(userIdentifier))
{
    queue_->setLogShare(logShare_);
    KESTO_LOG(KestoReportingClientCategory(), Default, "new client with pid {}", processIdentifier_);
}

KestoReportingClientServerInstance::~KestoReportingClientServerInstance()
{
    sessionsOfTheService -= clientReportingSessionMap_.size();
    if (platform::isInstalled()) {
        platform::current().ledger.count(Counter::SessionsGone, clientReportingSessionMap_.size());
        platform::current().memory.clientGone();
    }
    const platform::LogShare::Writing aboutConnection(logShare_.get(), platform::LogShare::About::Connections);
    if (logShare_ != nullptr)
        platform::reportLeftOutLines(*logShare_);
    if (sessionsRefused_ != 0)
        KESTO_LOG(KestoReportingClientCategory(), Error,
                  "client {} was refused {} sessions: it may have {}, and all clients {}", processIdentifier_,
                  sessionsRefused_, mostSessions, mostSessionsOfTheService);
    if (receiversRefused_ != 0)
        KESTO_LOG(
            KestoReportingClientCategory(), Error,
            "messages of client {} were not delivered {} times: a message may take {} bytes in all of its receivers",
            processIdentifier_, receiversRefused_, mostBytesOfADelivery);
    KESTO_LOG(KestoReportingClientCategory(), Default, "dealloc {} from the server client list", processIdentifier_);
}

std::optional<double> KestoReportingClientServerInstance::clientStartDate() const
{
    const foundation::Lock lock(registrationLock_);
    return clientStartDate_;
}

void KestoReportingClientServerInstance::setClientStartDate(std::optional<double> date)
{
    const foundation::Lock lock(registrationLock_);
    clientStartDate_ = date;
}

std::optional<std::string> KestoReportingClientServerInstance::clientProcessName() const
{
    const foundation::Lock lock(registrationLock_);
    return clientProcessName_;
}

void KestoReportingClientServerInstance::setClientProcessName(std::optional<std::string> name)
{
    const foundation::Lock lock(registrationLock_);
    clientProcessName_ = std::move(name);
}

ledger::Culprit KestoReportingClientServerInstance::culprit() const
{
    return {.user = userIdentifier_, .process = clientProcessName().value_or(std::string()), .application = {}};
}

std::shared_ptr<KestoReportingSession>
KestoReportingClientServerInstance::findReportingSessionForID(std::int64_t reporterID, bool acrossAllClients) const
{
    utility::assertServerQueue();
    if (auto session = clientReportingSessionMap_.find(reporterID))
        return session;
    const auto delegate = acrossAllClients ? delegate_.lock() : nullptr;
    return delegate ? delegate->findReportingSessionForID(reporterID) : nullptr;
}

platform::SourceBegin KestoReportingClientServerInstance::sourceBegin() const
{
    const foundation::Lock lock(registrationLock_);
    return {.number = source_,
            .userIdentifier = userIdentifier_,
            .processIdentifier = processIdentifier_,
            .processName = clientProcessName_.value_or(std::string()),
            .time = clientStartDate_.value_or(0)};
}

void KestoReportingClientServerInstance::addSession(platform::Turn& turn, std::int64_t reporterID,
                                                    const Session& session)
{
    utility::assertServerQueue();
    const std::size_t before = clientReportingSessionMap_.size();
    if (const auto replaced = clientReportingSessionMap_.find(reporterID))
        replaced->announceEnd(turn);
    session->setOwner(source_);
    clientReportingSessionMap_.set(reporterID, session);
    const std::size_t added = clientReportingSessionMap_.size() - before;
    sessionsOfTheService += added;
    turn.tally.add(Counter::SessionsCreated);
    turn.tally.add(Counter::SessionsGone, 1 - added); // the one that it replaces
    if (const auto delegate = delegate_.lock())
        delegate->reporterIDAdded(reporterID, *this, session);
}

void KestoReportingClientServerInstance::removeSession(platform::Turn& turn, std::int64_t reporterID)
{
    utility::assertServerQueue();
    const std::size_t before = clientReportingSessionMap_.size();
    if (const auto session = clientReportingSessionMap_.find(reporterID))
        session->announceEnd(turn);
    clientReportingSessionMap_.remove(reporterID);
    const std::size_t removed = before - clientReportingSessionMap_.size();
    sessionsOfTheService -= removed;
    turn.tally.add(Counter::SessionsGone, removed);
    if (const auto delegate = delegate_.lock())
        delegate->reporterIDRemoved(reporterID, *this);
}

void KestoReportingClientServerInstance::createReportingSession(std::int64_t reporterID, SuccessReply reply)
{
    submitLong([reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "creating session for reporter {}", reporterID);
        utility::emitTraceCode(utility::ServiceTraceCode::ClientCreate);
        const bool replaces = self.clientReportingSessionMap_.find(reporterID) != nullptr;
        const bool isRoom =
            self.clientReportingSessionMap_.size() < mostSessions && sessionsOfTheService < mostSessionsOfTheService;
        if (replaces || isRoom) {
            self.addSession(turn, reporterID,
                            std::make_shared<KestoReportingSession>(reporterID, std::vector{self.processIdentifier_},
                                                                    self.budget_, self.culprit()));
            KESTO_LOG(KestoReportingClientCategory(), Default, "session created for reporter {}", reporterID);
        } else {
            self.countRefusedSession(turn.tally);
        }
        reply(turn, std::nullopt, true);
    });
}

// The first refusal has a log line, in time for the administrator to act. The others are counted, because a client can
// cause any number of them.
void KestoReportingClientServerInstance::countRefusedSession(ledger::Tally& tally)
{
    tally.add(Counter::SessionsRefused);
    if (sessionsRefused_++ == 0)
        KESTO_LOG(KestoReportingClientCategory(), Error,
                  "client {} is refused a session: it may have {}, and all clients {}; further ones are counted until "
                  "it goes",
                  processIdentifier_, mostSessions, mostSessionsOfTheService);
}

void KestoReportingClientServerInstance::setServiceType(AudioServiceType serviceType, std::int64_t reporterID,
                                                        SuccessReply reply)
{
    submit([serviceType, reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "setting service type {} for reporter {}", serviceType,
                  reporterID);
        if (const auto session = reporterID == 0 ? nullptr : self.findReportingSessionForID(reporterID, false)) {
            session->setServiceType(serviceType);
            KESTO_LOG(KestoReportingClientCategory(), Default, "service type {} set for reporter  {}", serviceType,
                      reporterID);
        }
        reply(turn, std::nullopt, true);
    });
}

void KestoReportingClientServerInstance::getServiceNameForReporterID(std::int64_t reporterID, ServiceTypeReply reply)
{
    submit([reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "fetching seviceType");
        if (reporterID == 0)
            reply(turn, std::nullopt, AudioServiceTypeUnknown);
        const auto session = self.findReportingSessionForID(reporterID, true);
        const AudioServiceType serviceType = session ? session->serviceType() : AudioServiceTypeUnknown;
        reply(turn, std::nullopt, serviceType);
        KESTO_LOG(KestoReportingClientCategory(), Default, "returning service type {} for reporter  {}", serviceType,
                  reporterID);
    });
}

void KestoReportingClientServerInstance::setConfiguration(foundation::Dictionary configuration, std::int64_t reporterID,
                                                          SuccessReply reply)
{
    submit([configuration = std::move(configuration), reporterID, reply = std::move(reply)](auto& self,
                                                                                            platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "setting configuration");
        if (const auto session = self.findReportingSessionForID(reporterID, false))
            session->updateConfigurationWithContentsOfConfiguration(configuration);
        reply(turn, std::nullopt, true);
    });
}

void KestoReportingClientServerInstance::startReportingSessionForID(std::int64_t reporterID, SuccessReply reply)
{
    submitLong([reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "starting session for reporter {}", reporterID);
        utility::emitTraceCode(utility::ServiceTraceCode::ClientStart);
        const auto delegate = self.delegate_.lock();
        const auto session = reporterID == 0 ? nullptr : self.findReportingSessionForID(reporterID, false);
        if (!session || session->started() || !delegate)
            return reply(turn, std::nullopt, true);
        self.withDriverMoment(turn, *delegate,
                              [session, reply](auto& client, platform::Turn& later, const auto& moment) {
                                  if (const auto service = client.delegate_.lock())
                                      client.start(later, *service, session, moment, reply);
                                  else
                                      reply(later, std::nullopt, true);
                              });
    });
}

void KestoReportingClientServerInstance::start(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate,
                                               const Session& session, const session::DriverMoment& moment,
                                               const SuccessReply& reply)
{
    session->start();
    turn.tally.add(Counter::SessionsStarted);
    session->setDriverSnapShot(delegate.getSnapShot(moment));
    if (const auto& earlier = session->transactionCompleteBlock())
        earlier(turn, std::nullopt, true);
    session->setTransactionCompleteBlock(reply);
    if (const auto features = delegate.getFeaturesState())
        session->sendMessage(turn.tally, features, AudioEventCategorySetup, AudioEventTypeSetup, nullptr);
    if (session->mayBeTraced())
        reply(turn, std::nullopt, true);
    logActiveSessions(turn, [](auto&) { });
}

void KestoReportingClientServerInstance::stopReportingSessionForID(std::int64_t reporterID, SuccessReply reply)
{
    submitLong([reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "stopping session for reporter {}", reporterID);
        utility::emitTraceCode(utility::ServiceTraceCode::ClientStop);
        if (reporterID == 0)
            return reply(turn, std::nullopt, true);
        const auto session = self.findReportingSessionForID(reporterID, false);
        const auto delegate = self.delegate_.lock();
        const auto finish = [reporterID, reply](platform::Turn& last) {
            KESTO_LOG(KestoReportingClientCategory(), Default, "stopping {}", reporterID);
            reply(last, std::nullopt, true);
        };
        if (!session || !session->started() || !delegate)
            return finish(turn);
        self.withDriverMoment(turn, *delegate,
                              [session, finish](auto& client, platform::Turn& later, const auto& moment) {
                                  const auto service = client.delegate_.lock();
                                  if (!service)
                                      return finish(later);
                                  service->sendDriverLogsForSession(later, session, moment);
                                  session->setDriverSnapShot(std::nullopt);
                                  client.stopAndThen(later, session, [session, finish](auto& me, platform::Turn& last) {
                                      me.completeStop(last, session, finish);
                                  });
                              });
    });
}

template <typename Finish>
void KestoReportingClientServerInstance::completeStop(platform::Turn& turn, const Session& session, Finish finish)
{
    if (const auto& complete = session->transactionCompleteBlock())
        complete(turn, std::nullopt, true);
    session->setTransactionCompleteBlock(nullptr);
    logActiveSessions(turn, std::move(finish));
}

void KestoReportingClientServerInstance::destroyReportingSession(std::int64_t reporterID, SuccessReply reply)
{
    submitLong([reporterID, reply = std::move(reply)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "destroying session for reporter {}", reporterID);
        utility::emitTraceCode(utility::ServiceTraceCode::ClientDestroy);
        if (reporterID == 0)
            return reply(turn, std::nullopt, true);
        const auto finish = [reporterID, reply](auto& client, platform::Turn& last) {
            client.removeSession(last, reporterID);
            KESTO_LOG(KestoReportingClientCategory(), Default, "destroying {}", reporterID);
            reply(last, std::nullopt, true);
        };
        auto session = self.clientReportingSessionMap_.find(reporterID);
        if (session && session->started())
            return self.stopAndThen(turn, std::move(session), finish);
        session.reset(); // the map's is the last, so that the session goes before the answer
        finish(self, turn);
    });
}

void KestoReportingClientServerInstance::reporterID(std::int64_t reporterID, DictionaryReply valid)
{
    submit([reporterID, reply = std::move(valid)](auto& self, platform::Turn& turn) {
        KESTO_LOG(KestoReportingClientCategory(), Debug, "validating reporter {}", reporterID);
        const auto session = self.findReportingSessionForID(reporterID, true);
        const foundation::Dictionary result{
            {"reporterID", session ? reporterID : 0},
            {"serviceType", session ? session->serviceType() : AudioServiceTypeUnknown}};
        KESTO_LOG(KestoReportingClientCategory(), Default, "validating reporter {}", reporterID);
        reply(turn, std::nullopt, result);
    });
}

void KestoReportingClientServerInstance::getAllReporters(ReportersReply reply)
{
    submitLong([reply = std::move(reply)](auto& self, platform::Turn& turn) {
        self.whenAlone(turn, [reply](auto& client, platform::Turn& later, auto place) {
            client.collectReporters(later, reply, std::move(place));
        });
    });
}

void KestoReportingClientServerInstance::collectReporters(platform::Turn& turn, const ReportersReply& reply,
                                                          client::LongCalls::Place place)
{
    if (isConnectionLost_) // the calls that it left waiting must not delay others
        return;
    struct Collected {
        client::LongCalls::Place place;
        client::SessionWalk::Clients clients;
        std::size_t next = 0;
        ReporterIDs reporterIDs = {};
    };
    const auto delegate = delegate_.lock();
    const auto all = std::make_shared<Collected>(std::move(place),
                                                 delegate ? delegate->getAllClients() : client::SessionWalk::Clients());
    const auto collectNext = [all](auto&, platform::Turn&) { // a client at once, so that no ID of it comes twice
        if (all->next == all->clients.size())
            return false;
        const client::SessionMap& sessions = all->clients[all->next++]->clientReportingSessionMap();
        (void)sessions.visitBehind(0, sessions.size(),
                                   [&](const auto& entry) { all->reporterIDs.push_back(entry.reporterID); });
        return true;
    };
    inSlices(turn, collectNext, [all, reply](auto& self, platform::Turn& last) {
        if (!self.isConnectionLost_)
            reply(last, std::nullopt, all->reporterIDs);
    });
}

void KestoReportingClientServerInstance::killService(SuccessReply)
{
    const platform::Connection* caller = platform::Connection::current();
    const std::int32_t sender = caller != nullptr ? caller->processIdentifier() : processIdentifier_;
    KESTO_LOG(KestoReportingClientCategory(), Default, "{} asks the service to end: {}",
              KestoReportingUtilityProcessNameForPID(sender).value_or("(null)"),
              caller != nullptr ? caller->description() : foundation::format("process {}", sender));
    KESTO_LOG(KestoReportingClientCategory(), Default, "DESTROYING SERVICE");
    constexpr int exitStatus = 2;
    utility::endProcess(exitStatus);
}

void KestoReportingClientServerInstance::handleConnectionError()
{
    isConnectionLost_ = true;
    submitLong([](auto& self, platform::Turn& turn) {
        const auto delegate = self.delegate_.lock();
        if (!delegate || !isRegistered(*delegate, self))
            return;
        const auto announceNext = [sessions = client::SessionWalk({self.shared_from_this()})](auto&,
                                                                                              auto& now) mutable {
            return sessions.visitNext(
                [&](const auto& entry) { entry.session->announcePlayingEnd(now, platform::PlayingEnding::Vanished); });
        };
        self.inSlices(turn, announceNext, [](auto& me, platform::Turn& later) { me.stopAll(later); });
    });
}

// In the order of the map. A long session is set aside; many short ones take long, too.
void KestoReportingClientServerInstance::stopAll(platform::Turn& turn)
{
    const auto first = [](auto& self) {
        client::SessionMap::Place place = 0;
        return self.clientReportingSessionMap_.startedBehind(place);
    };
    const auto stopShort = [first](auto& self, platform::Turn& now) {
        const auto session = first(self);
        if (session == nullptr || session->takesLongToStop())
            return false;
        session->stop(now);
        return true;
    };
    inSlices(turn, stopShort, [first](auto& self, platform::Turn& now) {
        Session session = first(self);
        if (session == nullptr)
            return self.leave(now);
        self.stopAndThen(now, std::move(session), [](auto& client, platform::Turn& later) { client.stopAll(later); });
    });
}

// Removes all sessions, and then the client.
void KestoReportingClientServerInstance::leave(platform::Turn& turn)
{
    const auto removeNext = [place = client::SessionMap::Place{0}](auto& self, platform::Turn& now) mutable {
        const auto session = self.clientReportingSessionMap_.sessionBehind(place);
        if (session == nullptr)
            return false;
        self.removeSession(now, session->reporterID());
        return true;
    };
    inSlices(turn, removeNext, [](auto& self, platform::Turn& now) {
        now.events.announceSourceEnd({self.source_, platform::current().clock.secondsSince1970()});
        if (const auto delegate = self.delegate_.lock())
            delegate->removeClient(self.shared_from_this());
        const platform::LogShare::Writing aboutConnection(self.logShare_.get(), platform::LogShare::About::Connections);
        KESTO_LOG(KestoReportingClientCategory(), Default, "removing {} from the server client list",
                  self.processIdentifier_);
    });
}

template <typename Finish>
void KestoReportingClientServerInstance::logActiveSessions(platform::Turn& turn, Finish finish)
{
    const auto delegate = delegate_.lock();
    if (!delegate)
        return finish(turn);
    walkActiveSessions(turn, *delegate,
                       [finish = std::move(finish)](auto& self, platform::Turn& last, const auto& walk) {
                           if (const auto service = self.delegate_.lock())
                               KESTO_LOG(KestoReportingClientCategory(), Default, "{} active reporting session(s) {}",
                                         service->activeSessionCount(), walk->describe(self.listAllowance_));
                           finish(last);
                       });
}
