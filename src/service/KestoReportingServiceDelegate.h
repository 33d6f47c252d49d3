// SPDX-License-Identifier: Apache-2.0
// The one service object: it accepts connections, keeps the registry of clients, and holds the common state of all
// clients: the defaults, the master switch, the device-wide features.
//
// Client objects reach it only through `KestoReportingServiceDelegateProtocol`.
#pragma once

#include "client/KestoReportingServiceDelegateProtocol.h"
#include "driver/KestoReportingDriverUtility.h"
#include "foundation/Mutex.h"
#include "platform/Connection.h"
#include "service/LogShares.h"
#include "service/ReporterIndex.h"
#include "sinks/KestoReportingVorpStateManagerUtility.h"
#include "utility/ServerQueue.h"

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

// Announces that the service's own preferences changed.
constexpr std::string_view gReportingNotifydNotificationName = "com.quarn.kesto.reporting";

// Acceptance and the handlers of a connection's end run on a connection thread; everything else on the server queue,
// unless the protocol says otherwise.
class KestoReportingServiceDelegate final : public KestoReportingServiceDelegateProtocol,
                                            public platform::ConnectionListenerDelegate,
                                            public std::enable_shared_from_this<KestoReportingServiceDelegate> {
public:
    // Makes the server queue and the service object, which reads its defaults and listens for feature changes. Main
    // thread, once.
    static std::shared_ptr<KestoReportingServiceDelegate> make();

    // Reads the defaults from the preferences.
    [[nodiscard]] static foundation::Dictionary KestoReportingDefaults();

    // Always accepts: makes the client object, submits its registration and follows the connection's end.
    bool shouldAcceptNewConnection(platform::ConnectionListener& listener,
                                   const std::shared_ptr<platform::Connection>& connection) override;

    [[nodiscard]] foundation::Dictionary getDefaults() const override { return defaults_; }
    [[nodiscard]] std::optional<foundation::Dictionary> getFeaturesState() override;
    [[nodiscard]] const Clients& getAllClients() const override { return clients_; }
    [[nodiscard]] bool isReportingEnabled() const override { return reportingEnabled_; }
    [[nodiscard]] client::ActiveSessions getAllActiveReportingSessions() override;
    [[nodiscard]] std::shared_ptr<KestoReportingSession> findReportingSessionForID(std::int64_t reporterID) override;
    [[nodiscard]] bool needsDriverMoments() const override { return driverUtility_->needsMoments(); }
    void readDriverMoment(std::move_only_function<void(session::DriverMoment moment)> take) override
    {
        driverUtility_->readMoment(std::move(take));
    }
    [[nodiscard]] session::DriverSnapShot getSnapShot(const session::DriverMoment& moment) override
    {
        return driverUtility_->getSnapShot(moment);
    }
    void sendDriverLogsForSession(platform::Turn& turn, const std::shared_ptr<KestoReportingSession>& session,
                                  const session::DriverMoment& moment) override
    {
        driverUtility_->sendDriverLogsForSession(turn, session, moment);
    }
    void handleEventForVorp(const foundation::Dictionary& message, AudioEventCategory category, std::uint16_t type,
                            const std::shared_ptr<KestoReportingSession>& session,
                            const std::string& processName) override;
    [[nodiscard]] std::shared_ptr<client::LongCalls> longCalls() override { return longCalls_; }
    [[nodiscard]] std::shared_ptr<client::SessionEnds> sessionEnds() override { return sessionEnds_; }
    void removeClient(const std::shared_ptr<KestoReportingClientServerInstance>& client) override;
    [[nodiscard]] std::int64_t activeSessionCount() const override { return activeSessionCount_; }
    void setActiveSessionCount(std::int64_t count) override { activeSessionCount_ = count; }
    void reporterIDAdded(std::int64_t reporterID, const KestoReportingClientServerInstance& client,
                         const std::shared_ptr<KestoReportingSession>& session) override;
    void reporterIDRemoved(std::int64_t reporterID, const KestoReportingClientServerInstance& client) override;

private:
    // A device-wide setting that every session gets. A setting with a defaults domain is read from the preferences
    // under its own name; a setting without one is the state of its notification.
    struct Feature {
        std::optional<std::string_view> defaultsDomain;
        std::string_view featureDomain;
        std::string_view notification;
        std::optional<std::int32_t> notifyToken; // of the registration
    };
    using Features = std::array<Feature, 3>;

    KestoReportingServiceDelegate();
    void listenForFeatureStateChanges();
    void handleFeatureChange(platform::Turn& turn, std::int32_t token);
    [[nodiscard]] Features features() const;
    [[nodiscard]] static std::optional<foundation::Value> valueOf(const Feature& feature);
    [[nodiscard]] static std::string descriptionOf(const Features& features);
    [[nodiscard]] foundation::Value stateForBugCapture() const;
    void registerClient(platform::Turn& turn, const std::shared_ptr<KestoReportingClientServerInstance>& client);
    static void logSessions(const KestoReportingClientServerInstance& client, client::ListAllowance& allowance);
    static void handleInvalidation(std::int32_t processIdentifier,
                                   const std::shared_ptr<KestoReportingClientServerInstance>& client);

    const bool reportingEnabled_ = true;
    std::atomic<std::int64_t> activeSessionCount_{0};
    Clients clients_;
    std::unique_ptr<KestoReportingDriverUtility> driverUtility_;
    const std::shared_ptr<client::LongCalls> longCalls_ = std::make_shared<client::LongCalls>();
    const std::shared_ptr<client::SessionEnds> sessionEnds_ = std::make_shared<client::SessionEnds>();
    const foundation::Dictionary defaults_;
    std::unique_ptr<KestoReportingUtilityVorpStateManager> vorpStateManager_; // on internal builds only

    service::LogShares logShares_; // only for the connection thread

    foundation::Mutex lock_;
    service::ReporterIndex reporterIndex_ KESTO_GUARDED_BY(lock_);

    const std::shared_ptr<platform::Lane> featureChanges_ = utility::serverQueue()->makeLane(platform::theService);
    mutable foundation::Mutex featuresLock_;
    Features features_ KESTO_GUARDED_BY(featuresLock_);
};
