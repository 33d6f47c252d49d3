// SPDX-License-Identifier: Apache-2.0
// What a client object may ask of the one service object.
#pragma once

#include "client/ActiveSessions.h"
#include "client/LongCalls.h"
#include "client/SessionEnds.h"
#include "foundation/values/Value.h"
#include "session/KestoReportingSession.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

class KestoReportingClientServerInstance;

// On the server queue, unless a comment says otherwise.
class KestoReportingServiceDelegateProtocol {
public:
    using Clients = client::ActiveSessions::Clients;

    virtual ~KestoReportingServiceDelegateProtocol() = default;

    // The service-wide defaults, read once at start. Any thread.
    [[nodiscard]] virtual foundation::Dictionary getDefaults() const = 0;
    // The device-wide settings as they are now, or nothing if none is known.
    [[nodiscard]] virtual std::optional<foundation::Dictionary> getFeaturesState() = 0;
    // The connected clients in the order of registration: the registry itself, not a copy.
    [[nodiscard]] virtual const Clients& getAllClients() const = 0;
    [[nodiscard]] virtual bool isReportingEnabled() const = 0;
    // The started sessions of all clients.
    [[nodiscard]] virtual client::ActiveSessions getAllActiveReportingSessions() = 0;
    // The session of that ID that belongs to the client registered first, or null.
    [[nodiscard]] virtual std::shared_ptr<KestoReportingSession> findReportingSessionForID(std::int64_t reporterID) = 0;
    // Whether the next two need the drivers' channels, which `readDriverMoment` reads on another thread and gives to
    // `take` there; otherwise they get null.
    [[nodiscard]] virtual bool needsDriverMoments() const = 0;
    virtual void readDriverMoment(std::move_only_function<void(session::DriverMoment moment)> take) = 0;
    // A sample of all audio drivers, by driver.
    [[nodiscard]] virtual session::DriverSnapShot getSnapShot(const session::DriverMoment& moment) = 0;
    // Reports to the session how the drivers' channels changed since the session's snapshot.
    virtual void sendDriverLogsForSession(platform::Turn& turn, const std::shared_ptr<KestoReportingSession>& session,
                                          const session::DriverMoment& moment) = 0;
    // Those of all clients.
    [[nodiscard]] virtual std::shared_ptr<client::LongCalls> longCalls() = 0;
    // What stops the sessions of all clients.
    [[nodiscard]] virtual std::shared_ptr<client::SessionEnds> sessionEnds() = 0;
    virtual void removeClient(const std::shared_ptr<KestoReportingClientServerInstance>& client) = 0;
    // Offers the message to the bug-capture manager, which exists only on internal builds, with the process that sent
    // it.
    virtual void handleEventForVorp(const foundation::Dictionary& message, AudioEventCategory category,
                                    std::uint16_t type, const std::shared_ptr<KestoReportingSession>& session,
                                    const std::string& processName) = 0;
    // A counter that the service shows but never changes. Any thread.
    [[nodiscard]] virtual std::int64_t activeSessionCount() const = 0;
    virtual void setActiveSessionCount(std::int64_t count) = 0;

    // Reports that the client's session map gained or lost this ID. The look-up over all clients relies on these calls.
    virtual void reporterIDAdded(std::int64_t reporterID, const KestoReportingClientServerInstance& client,
                                 const std::shared_ptr<KestoReportingSession>& session) = 0;
    virtual void reporterIDRemoved(std::int64_t reporterID, const KestoReportingClientServerInstance& client) = 0;
};
