// What a client object may ask of the one service object.
#pragma once

#include "foundation/values/Value.h"
#include "session/KestoReportingSession.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

class KestoReportingClientServerInstance;

// On the server queue, but for what says otherwise.
class KestoReportingServiceDelegateProtocol {
public:
    using Clients = std::vector<std::shared_ptr<KestoReportingClientServerInstance>>;
    using Sessions = std::vector<std::shared_ptr<KestoReportingSession>>;

    virtual ~KestoReportingServiceDelegateProtocol() = default;

    // The service-wide defaults, read once at start. Any thread.
    [[nodiscard]] virtual foundation::Dictionary getDefaults() const = 0;
    // The device-wide settings as they are now, or nothing when none is known.
    [[nodiscard]] virtual std::optional<foundation::Dictionary> getFeaturesState() = 0;
    // The connected clients in the order of registration: the registry itself, not a copy.
    [[nodiscard]] virtual const Clients& getAllClients() const = 0;
    [[nodiscard]] virtual bool isReportingEnabled() const = 0;
    // The started sessions of all clients, in the order of registration and then of creation.
    [[nodiscard]] virtual Sessions getAllActiveReportingSessions() = 0;
    // The session of that ID which belongs to the client registered first, or null.
    [[nodiscard]] virtual std::shared_ptr<KestoReportingSession> findReportingSessionForID(std::int64_t reporterID) = 0;
    // A sample of all audio drivers, by driver.
    [[nodiscard]] virtual session::DriverSnapShot getSnapShot() = 0;
    // Reports to the session what the drivers did since its snapshot.
    virtual void sendDriverLogsForSession(platform::Turn& turn,
                                          const std::shared_ptr<KestoReportingSession>& session) = 0;
    virtual void removeClient(const std::shared_ptr<KestoReportingClientServerInstance>& client) = 0;
    // Offers the message of a process to the bug-capture manager, which only internal builds have.
    virtual void handleEventForVorp(const foundation::Dictionary& message, AudioEventCategory category,
                                    std::uint16_t type, const std::shared_ptr<KestoReportingSession>& session,
                                    const std::string& processName) = 0;
    // A counter that is shown and never changed by the service itself. Any thread.
    [[nodiscard]] virtual std::int64_t activeSessionCount() const = 0;
    virtual void setActiveSessionCount(std::int64_t count) = 0;

    // Tells that the client's session map gained or lost this ID, which the look-up over all clients relies on.
    virtual void reporterIDAdded(std::int64_t reporterID, const KestoReportingClientServerInstance& client) = 0;
    virtual void reporterIDRemoved(std::int64_t reporterID, const KestoReportingClientServerInstance& client) = 0;
};
