// SPDX-License-Identifier: Apache-2.0
// A connection's beginning and end: the service makes and registers the client object; when the peer has gone, it stops
// the client's sessions and sends an event with the time that the client was connected.
#include "client/KestoReportingClientServerInstance.h"
#include "client/ServiceProtocolAdapter.h"
#include "platform/Platform.h"
#include "service/KestoReportingServiceDelegate.h"
#include "utility/KestoReportingUtility.h"
#include "utility/ServerQueue.h"

#include <cmath>

bool KestoReportingServiceDelegate::shouldAcceptNewConnection(platform::ConnectionListener&,
                                                              const std::shared_ptr<platform::Connection>& connection)
{
    using Client = KestoReportingClientServerInstance;
    const std::int32_t processIdentifier = connection->processIdentifier();
    const auto logShare = logShares_.ofProcess({.user = connection->userIdentifier(), .process = processIdentifier});
    const platform::LogShare::Writing aboutConnection(logShare.get(), platform::LogShare::About::Connections);
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "newConnection: {}", connection->description());

    std::shared_ptr<Client> client;
    {
        const foundation::Lock lock(lock_);
        client = std::make_shared<Client>(processIdentifier, weak_from_this(), connection->userIdentifier(), logShare);
        connection->setCallHandler(
            [adapter = client::ServiceProtocolAdapter(client, platform::current().ledger)](
                platform::Connection::Call call) mutable { return adapter.handleCall(std::move(call)); });
    }
    const std::weak_ptr<Client> weakClient = client;
    ledger::Workloads& workloads = platform::current().ledger.workloads();
    const auto workload = workloads.open(connection->userIdentifier());
    connection->setLane(client->queue(), workload);
    connection->setLogShare(logShare);
    client->queue()->submit([self = shared_from_this(), weakClient, workload, &workloads](platform::Turn& turn) {
        if (const auto registered = weakClient.lock()) {
            self->registerClient(turn, registered);
            workloads.setProcess(*workload, registered->clientProcessName().value_or(std::string()));
        }
    });
    connection->setInterruptionHandler([weakClient] {
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "interruptionHandler: connection exited");
        if (const auto interrupted = weakClient.lock())
            interrupted->handleConnectionError();
    });
    connection->setInvalidationHandler(
        [weakClient, processIdentifier] { handleInvalidation(processIdentifier, weakClient.lock()); });
    connection->resume();
    return true;
}

void KestoReportingServiceDelegate::handleInvalidation(
    std::int32_t processIdentifier, const std::shared_ptr<KestoReportingClientServerInstance>& client)
{
    std::optional<double> startDate;
    std::optional<std::string> processName;
    if (client) {
        client->handleConnectionError();
        startDate = client->clientStartDate();
        processName = client->clientProcessName();
    }
    const std::string shownName = processName.value_or("unknown");
    const double now = platform::current().clock.secondsSince1970();
    foundation::Number uptime(-1);
    if (startDate) {
        uptime = foundation::Number(std::abs(now - *startDate));
        if (*startDate > now)
            KESTO_LOG(KestoReportingServiceDelegateCategory(), Default,
                      "clientStartDate is in the past. clientpid={} clientprocessname={}", processIdentifier,
                      shownName);
    } else {
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Default,
                  "clientStartDate is nil. clientpid={} clientprocessname={}", processIdentifier, shownName);
    }
    KESTO_LOG(KestoReportingServiceDelegateCategory(), Default,
              "invalidationHandler: connection exited process={} uptime_sec={}", shownName, uptime.int64Value());
    if (!processName) {
        KESTO_LOG(KestoReportingServiceDelegateCategory(), Default, "clientProcessName is nil. clientpid={}",
                  processIdentifier);
        return;
    }
    platform::current().analytics.sendAnalyticsEventLazy(
        platform::outsideTurn, client->sourceBegin(), "com.quarn.kesto.kestoreportingclientuptime",
        [name = *processName, uptime] { return foundation::Dictionary{{"processName", name}, {"seconds", uptime}}; });
}
