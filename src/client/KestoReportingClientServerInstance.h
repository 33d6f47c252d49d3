// SPDX-License-Identifier: Apache-2.0
// One connected client: it owns the client's sessions and carries out its calls on them, on the event sinks and
// on the service object.
//
// A call captures its arguments on the connection's thread and does everything else on the server queue.
#pragma once

#include "client/KestoReportingServiceDelegateProtocol.h"
#include "client/KestoReportingServiceProtocol.h"
#include "client/ListAllowance.h"
#include "client/SessionMap.h"
#include "foundation/Mutex.h"
#include "session/StorageBudget.h"
#include "utility/ServerQueue.h"
#include "utility/Slice.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// Always owned by a shared pointer. The operations of the protocol run on a connection thread, and everything else on
// the server queue, unless a comment says otherwise.
class KestoReportingClientServerInstance final
    : public KestoReportingServiceProtocol,
      public std::enable_shared_from_this<KestoReportingClientServerInstance> {
public:
    // The most sessions of one client, and of all clients. The service creates no more; it answers the client as
    // always, logs the first refusal, and logs their number when the client goes. The IDs of all sessions must fit into
    // one frame, because `getAllReporters` answers them.
    static constexpr std::size_t mostSessions = 10'000;
    static constexpr std::size_t mostSessionsOfTheService = 110'000;
    // The limit of a message's size times the number of its receivers. Receivers beyond it do not get the message, but
    // one always does. The client is answered as always, and the log reports this like refused sessions.
    static constexpr std::size_t mostBytesOfADelivery = std::size_t{64} << 20;

    KestoReportingClientServerInstance(std::int32_t processIdentifier,
                                       std::weak_ptr<KestoReportingServiceDelegateProtocol> delegate,
                                       std::uint32_t userIdentifier = 0,
                                       std::shared_ptr<platform::LogShare> logShare = nullptr);
    ~KestoReportingClientServerInstance() override;
    KestoReportingClientServerInstance(const KestoReportingClientServerInstance&) = delete;
    KestoReportingClientServerInstance& operator=(const KestoReportingClientServerInstance&) = delete;

    // Any thread.
    [[nodiscard]] std::int32_t processIdentifier() const { return processIdentifier_; }
    // The number of its connection, which its events carry. Any thread.
    [[nodiscard]] std::uint64_t source() const { return source_; }
    // The lane of the server queue for everything that this client causes. Any thread.
    [[nodiscard]] const std::shared_ptr<platform::Lane>& queue() const { return queue_; }
    // Who is behind that number. Any thread.
    [[nodiscard]] platform::SourceBegin sourceBegin() const;
    // When the client was registered (seconds since 1970), and the name that it had then. Any thread.
    [[nodiscard]] std::optional<double> clientStartDate() const;
    void setClientStartDate(std::optional<double> date);
    [[nodiscard]] std::optional<std::string> clientProcessName() const;
    void setClientProcessName(std::optional<std::string> name);

    [[nodiscard]] const client::SessionMap& clientReportingSessionMap() const { return clientReportingSessionMap_; }
    // This client's session of that ID, or, if the caller allows it, that of any client.
    [[nodiscard]] std::shared_ptr<KestoReportingSession> findReportingSessionForID(std::int64_t reporterID,
                                                                                   bool acrossAllClients) const;

    void createReportingSession(std::int64_t reporterID, SuccessReply reply) override;
    void setServiceType(AudioServiceType serviceType, std::int64_t reporterID, SuccessReply reply) override;
    void getServiceNameForReporterID(std::int64_t reporterID, ServiceTypeReply reply) override;
    void setConfiguration(foundation::Dictionary configuration, std::int64_t reporterID, SuccessReply reply) override;
    void startReportingSessionForID(std::int64_t reporterID, SuccessReply reply) override;
    void sendMessage(foundation::Dictionary message, AudioEventCategory category, std::uint16_t type,
                     std::optional<ReporterIDs> reporterIDs, utility::Reply reply) override;
    void stopReportingSessionForID(std::int64_t reporterID, SuccessReply reply) override;
    void destroyReportingSession(std::int64_t reporterID, SuccessReply reply) override;
    void reporterID(std::int64_t reporterID, DictionaryReply valid) override;
    void getAllReporters(ReportersReply reply) override;
    [[noreturn]] void killService(SuccessReply reply) override;

    // Call this when the connection breaks or ends: it stops and drops all sessions and leaves the registry. A second
    // call has no effect. Any thread.
    void handleConnectionError();

private:
    // What is delivered, and the process that sent it.
    struct Message {
        foundation::Dictionary payload;
        AudioEventCategory category;
        std::uint16_t type;
        std::int32_t sender;
        std::uint32_t user;
        std::string processName;
        std::uint64_t source; // the connection that it came over
    };
    using Session = std::shared_ptr<KestoReportingSession>;
    // A message on its way, and how far it has come.
    struct Delivery {
        Message message;
        std::optional<ReporterIDs> reporterIDs;
        utility::Reply reply;
        std::size_t next = 0; // in the list
        std::shared_ptr<client::ActiveSessions> sessions = nullptr; // without a list
        std::size_t room = 0; // for further receivers
        std::size_t refused = 0;
        client::LongCalls::Place place = nullptr; // if it takes long

        [[nodiscard]] bool mayTakeLong() const;
    };

    // Runs `work(*this, turn)` on the server queue, with this object kept alive.
    template <typename Work> void submit(Work work)
    {
        queue_->submit(
            [self = shared_from_this(), work = std::move(work)](platform::Turn& turn) mutable { work(*self, turn); });
    }
    // The same for work that takes long with many messages, sessions or channels.
    template <typename Work> void submitLong(Work work)
    {
        queue_->submitLong(
            [self = shared_from_this(), work = std::move(work)](platform::Turn& turn) mutable { work(*self, turn); });
    }
    // Runs `work(*this, turn, moment)` with the drivers' channels, which are read now. It runs at once if there are
    // none to read; otherwise later, and this client's next calls wait for it. For an item of `submitLong`, as its last
    // step.
    template <typename Work>
    void withDriverMoment(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate, Work work)
    {
        if (!delegate.needsDriverMoments())
            return work(*this, turn, nullptr);
        delegate.readDriverMoment([self = shared_from_this(), work = std::move(work),
                                   resume = queue_->pause()](session::DriverMoment moment) mutable {
            resume([self = std::move(self), work = std::move(work), moment = std::move(moment)](platform::Turn& later) {
                work(*self, later, moment);
            });
        });
    }
    // Calls `work(*this, turn, place)` when no other long call of this user is under way; until the place is let go of,
    // none is. This client's next calls wait. For an item of `submitLong`, as its last step.
    template <typename Work> void whenAlone(platform::Turn& turn, Work work)
    {
        const auto delegate = delegate_.lock();
        const auto calls = delegate ? delegate->longCalls() : nullptr;
        if (!calls)
            return work(*this, turn, nullptr);
        calls->begin(turn, userIdentifier_, *queue_,
                     [self = shared_from_this(), work = std::move(work)](platform::Turn& later,
                                                                         client::LongCalls::Place place) mutable {
                         work(*self, later, std::move(place));
                     });
    }
    // `utility::inSlices` with `step(*this, turn)` and `then(*this, turn)`.
    template <typename Step, typename Then> void inSlices(platform::Turn& turn, Step step, Then then)
    {
        const auto self = shared_from_this();
        utility::inSlices(
            queue_, turn, [self, step = std::move(step)](platform::Turn& now) mutable { return step(*self, now); },
            [self, then = std::move(then)](platform::Turn& last) mutable { then(*self, last); });
    }
    // Logs the sessions of all clients, in slices, and calls `work(*this, turn, walk)` with the walk over those that
    // are started then. For an item of `submitLong`, as its last step.
    template <typename Work>
    void walkActiveSessions(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate, Work work)
    {
        const auto walk = std::make_shared<client::ActiveSessions>(delegate.getAllActiveReportingSessions());
        inSlices(
            turn, [walk](auto& self, platform::Turn&) { return walk->logNextClient(self.listAllowance_); },
            [walk, work = std::move(work)](auto& self, platform::Turn& last) mutable { work(self, last, walk); });
    }
    // Stops the session and then calls `then(*this, turn)`: at once, or, if the session is long, later, and this
    // client's next calls wait for it. For an item of `submitLong`, as its last step.
    template <typename Then> void stopAndThen(platform::Turn& turn, Session session, Then then)
    {
        const auto delegate = delegate_.lock();
        if (const auto ends = delegate ? delegate->sessionEnds() : nullptr)
            return ends->stop(turn, std::move(session), userIdentifier_, queue_,
                              [self = shared_from_this(), then = std::move(then)](platform::Turn& later) mutable {
                                  then(*self, later);
                              });
        session->stop(turn);
        session.reset();
        then(*this, turn);
    }
    void start(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate, const Session& session,
               const session::DriverMoment& moment, const SuccessReply& reply);
    template <typename Finish> void completeStop(platform::Turn& turn, const Session& session, Finish finish);
    void stopAll(platform::Turn& turn);
    void leave(platform::Turn& turn);
    void collectReporters(platform::Turn& turn, const ReportersReply& reply, client::LongCalls::Place place);
    void deliver(platform::Turn& turn, Delivery delivery);
    void deliverInSlices(platform::Turn& turn, const std::shared_ptr<Delivery>& delivery);
    void deliverToActiveSessions(platform::Turn& turn, const std::shared_ptr<Delivery>& delivery);
    bool deliverToNext(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate, Delivery& delivery);
    void finishDelivery(platform::Turn& turn, const Delivery& delivery);
    void deliverToReporter(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate, Delivery& delivery,
                           std::int64_t reporterID);
    static bool deliverToNextActiveSession(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate,
                                           Delivery& delivery);
    [[nodiscard]] static std::size_t mostReceivers(const Message& message, std::size_t wanted);
    void countRefusedSession(ledger::Tally& tally);
    void countRefusedReceivers(ledger::Tally& tally, const Message& message, std::size_t receivers);
    static void deliverStandalone(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate,
                                  const Message& message);
    static void deliverToSinks(platform::Turn& turn, KestoReportingServiceDelegateProtocol& delegate,
                               const Message& message, const Session& session);
    static void deliverToSession(platform::Turn& turn, const Message& message, const Session& session);
    [[nodiscard]] ledger::Culprit culprit() const;
    template <typename Finish> void logActiveSessions(platform::Turn& turn, Finish finish);
    void addSession(platform::Turn& turn, std::int64_t reporterID, const Session& session);
    void removeSession(platform::Turn& turn, std::int64_t reporterID);

    const std::int32_t processIdentifier_;
    const std::uint32_t userIdentifier_;
    const std::uint64_t source_ = platform::nextOriginNumber();
    const std::shared_ptr<platform::LogShare> logShare_; // of everything that the client causes; null: no limit
    const std::shared_ptr<platform::Lane> queue_ =
        utility::serverQueue()->makeLane({.user = userIdentifier_, .process = processIdentifier_});
    std::optional<double> clientStartDate_ KESTO_GUARDED_BY(registrationLock_);
    std::optional<std::string> clientProcessName_ KESTO_GUARDED_BY(registrationLock_);
    client::SessionMap clientReportingSessionMap_;
    const std::weak_ptr<KestoReportingServiceDelegateProtocol> delegate_;

    std::shared_ptr<session::StorageBudget> budget_;
    client::ListAllowance listAllowance_;
    std::uint64_t sessionsRefused_ = 0;
    std::uint64_t receiversRefused_ = 0;
    std::atomic<bool> isConnectionLost_ = false;
    mutable foundation::Mutex registrationLock_;
};
