// SPDX-License-Identifier: Apache-2.0
// The service object's making, its defaults, and the registry of clients.
#include "service/KestoReportingServiceDelegate.h"

#include "client/KestoReportingClientServerInstance.h"
#include "platform/Platform.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

namespace {
constexpr std::string_view preferencesDomain = "com.quarn.kesto";
constexpr std::string_view deviceNameKey = "device_name";
constexpr std::string_view disableReportingKey = "disable_reporting";
} // namespace

std::shared_ptr<KestoReportingServiceDelegate> KestoReportingServiceDelegate::make()
{
    utility::createServerQueue();
    std::shared_ptr<KestoReportingServiceDelegate> service(new KestoReportingServiceDelegate);
    service->listenForFeatureStateChanges();
    service->driverUtility_ = std::make_unique<KestoReportingDriverUtility>();
    if (KestoReportingUtilityIsInternalBuild()) {
        service->vorpStateManager_ = std::make_unique<KestoReportingUtilityVorpStateManager>();
        platform::current().bugCapture.setStateDescription([weak = std::weak_ptr(service)] {
            const auto self = weak.lock();
            return self ? self->stateForBugCapture() : foundation::Value();
        });
    }
    return service;
}

KestoReportingServiceDelegate::KestoReportingServiceDelegate()
    : defaults_(KestoReportingDefaults()),
      features_{{{.defaultsDomain = "com.quarn.halden",
                  .featureDomain = "spatial-audio-accessory-feature",
                  .notification = "com.quarn.halden.spatial-audio-accessory-feature.changed",
                  .notifyToken = {}},
                 {.defaultsDomain = preferencesDomain,
                  .featureDomain = deviceNameKey,
                  .notification = gReportingNotifydNotificationName,
                  .notifyToken = {}},
                 {.defaultsDomain = {},
                  .featureDomain = "ringerstate",
                  .notification = "com.quarn.halden.ringerstate",
                  .notifyToken = {}}}}
{
}

foundation::Dictionary KestoReportingServiceDelegate::KestoReportingDefaults()
{
    const platform::Preferences& preferences = platform::current().preferences;
    foundation::Dictionary::Entries defaults;
    if (const auto deviceName = preferences.value(preferencesDomain, deviceNameKey))
        defaults.push_back({deviceNameKey, deviceName->text()});
    const auto disabled = preferences.value(preferencesDomain, disableReportingKey);
    defaults.push_back({disableReportingKey, disabled && disabled->asBoolean() ? 1 : 0});
    return defaults;
}

void KestoReportingServiceDelegate::handleEventForVorp(const foundation::Dictionary& message,
                                                       AudioEventCategory category, std::uint16_t type,
                                                       const std::shared_ptr<KestoReportingSession>& session,
                                                       const std::string& processName)
{
    utility::assertServerQueue();
    if (KestoReportingUtilityIsInternalBuild())
        vorpStateManager_->handleEvent(message, category, type, session, processName);
}

void KestoReportingServiceDelegate::registerClient(platform::Turn& turn,
                                                   const std::shared_ptr<KestoReportingClientServerInstance>& client)
{
    utility::assertServerQueue();
    clients_.push_back(client);
    {
        const foundation::Lock lock(lock_);
        reporterIndex_.registerClient(*client);
    }
    client->setClientStartDate(platform::current().clock.secondsSince1970());
    platform::current().processTable.forget(client->processIdentifier()); // an earlier process may have had the number
    client->setClientProcessName(KestoReportingUtilityProcessNameForPID(client->processIdentifier()));
    turn.events.announce(client->sourceBegin());
}

void KestoReportingServiceDelegate::removeClient(const std::shared_ptr<KestoReportingClientServerInstance>& client)
{
    utility::assertServerQueue();
    {
        const foundation::Lock lock(lock_);
        reporterIndex_.unregisterClient(*client);
    }
    std::erase(clients_, client);
}

void KestoReportingServiceDelegate::reporterIDAdded(std::int64_t reporterID,
                                                    const KestoReportingClientServerInstance& client,
                                                    const std::shared_ptr<KestoReportingSession>& session)
{
    utility::assertServerQueue();
    const foundation::Lock lock(lock_);
    reporterIndex_.add(reporterID, client, session);
}

void KestoReportingServiceDelegate::reporterIDRemoved(std::int64_t reporterID,
                                                      const KestoReportingClientServerInstance& client)
{
    utility::assertServerQueue();
    const foundation::Lock lock(lock_);
    reporterIndex_.remove(reporterID, client);
}

client::ActiveSessions KestoReportingServiceDelegate::getAllActiveReportingSessions()
{
    utility::assertServerQueue();
    return {clients_, logSessions};
}

void KestoReportingServiceDelegate::logSessions(const KestoReportingClientServerInstance& client,
                                                client::ListAllowance& allowance)
{
    const client::SessionMap& sessions = client.clientReportingSessionMap();
    const auto describe = [&] {
        return allowance.describe(sessions.size(), [&, place = client::SessionMap::Place{0}]() mutable {
            return sessions.sessionBehind(place);
        });
    };
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "sessions for client {} : {}",
              client.processIdentifier(), describe());
}

std::shared_ptr<KestoReportingSession> KestoReportingServiceDelegate::findReportingSessionForID(std::int64_t reporterID)
{
    utility::assertServerQueue();
    const foundation::Lock lock(lock_);
    if (reporterID == 0 || !reportingEnabled_)
        return nullptr;
    const service::ReporterIndex::Holder* found = reporterIndex_.find(reporterID);
    if (found == nullptr) {
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Error, "failed to find reporting session {}", reporterID);
        return nullptr;
    }
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Info, "found reporting session {} for client {}", reporterID,
              found->client->processIdentifier());
    return found->session.lock();
}
