// SPDX-License-Identifier: Apache-2.0
// Device-wide settings as messages: the accessory setting of the home screen, the device's name and the ringer
// switch are sent to a session when it starts, and to all sessions when one of them changes. One change follows the
// other on a lane of their own, so that others go on while a hundred thousand sessions get one.
#include "client/KestoReportingClientServerInstance.h"
#include "platform/Platform.h"
#include "service/KestoReportingServiceDelegate.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"
#include "utility/Slice.h"

#include <cmath>

// A name may be posted as soon as it is registered, so the table is read on the server queue while it is filled here.
void KestoReportingServiceDelegate::listenForFeatureStateChanges()
{
    const Features table = features();
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Info, "listening for features {}", descriptionOf(table));
    for (std::size_t place = 0; place < table.size(); ++place) {
        const auto [status, token] = platform::current().notifications.registerNotification(
            table[place].notification, utility::serverQueue(), [service = weak_from_this()](std::int32_t changed) {
                if (const auto self = service.lock())
                    self->featureChanges_->submitLong(
                        [self, changed](platform::Turn& turn) { self->handleFeatureChange(turn, changed); });
            });
        {
            const foundation::Lock lock(featuresLock_);
            features_[place].notifyToken = token;
        }
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "notify setup result {} token {}", status, token);
    }
}

KestoReportingServiceDelegate::Features KestoReportingServiceDelegate::features() const
{
    const foundation::Lock lock(featuresLock_);
    return features_;
}

std::optional<foundation::Dictionary> KestoReportingServiceDelegate::getFeaturesState()
{
    utility::assertServerQueue();
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "getting features");
    foundation::Dictionary::Entries state;
    const Features table = features();
    for (const Feature& feature : table)
        if (auto value = valueOf(feature))
            state.push_back({feature.featureDomain, *std::move(value)});
    if (state.empty())
        return std::nullopt;
    const platform::Clock& clock = platform::current().clock;
    state.push_back({utility::timestampKey, clock.secondsSince1970()});
    state.push_back({"systemuptime_sec", static_cast<std::int32_t>(std::lround(clock.systemUptime()))});
    return state;
}

std::optional<foundation::Value> KestoReportingServiceDelegate::valueOf(const Feature& feature)
{
    if (feature.defaultsDomain)
        return platform::current().preferences.value(*feature.defaultsDomain, feature.featureDomain);
    if (!feature.notifyToken)
        return std::nullopt;
    const auto state = platform::current().notifications.state(*feature.notifyToken);
    if (!state)
        return std::nullopt;
    return *state == 1;
}

// A session that starts meanwhile has the features from its start, perhaps newer ones.
void KestoReportingServiceDelegate::handleFeatureChange(platform::Turn& turn, std::int32_t token)
{
    utility::assertServerQueue();
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Info, "feature {} changes", token);
    const auto state = getFeaturesState();
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Info, "defaults {}",
              state ? foundation::Value(*state).text() : "(null)");
    const auto send = [state, lastRun = KestoReportingSession::lastRunOfAll()](platform::Turn& now,
                                                                               KestoReportingSession& session) {
        if (session.lastRun() <= lastRun)
            session.sendMessage(now.tally, state, AudioEventCategorySetup, AudioEventTypeSetup, nullptr);
    };
    const auto sendToNext = [send, sessions = client::SessionWalk(clients_)](platform::Turn& now) mutable {
        return sessions.visitNext([&](const auto& entry) { send(now, *entry.session); });
    };
    utility::inSlices(featureChanges_, turn, sendToNext, [](platform::Turn&) { });
}

std::string KestoReportingServiceDelegate::descriptionOf(const Features& features)
{
    std::vector<foundation::Value> table;
    for (const Feature& feature : features) {
        foundation::Dictionary::Entries entry;
        if (feature.defaultsDomain)
            entry.push_back({"defaults_domain", *feature.defaultsDomain});
        entry.push_back({"feature_domain", feature.featureDomain});
        entry.push_back({"notification", feature.notification});
        table.emplace_back(foundation::Dictionary(std::move(entry)));
    }
    return foundation::Value(foundation::Array(std::move(table))).text();
}
