// SPDX-License-Identifier: Apache-2.0
// The description of the service in a bug capture: the numbers of clients and sessions, and the first sessions, so few
// that the description does not delay the requesting thread.
#include "client/KestoReportingClientServerInstance.h"
#include "service/KestoReportingServiceDelegate.h"
#include "utility/MessageKinds.h"
#include "utility/ServerQueue.h"

foundation::Value KestoReportingServiceDelegate::stateForBugCapture() const
{
    utility::assertServerQueue();
    constexpr std::size_t mostShown = 200;
    std::size_t count = 0;
    std::vector<foundation::Value> shown;
    for (const auto& client : clients_) {
        const std::string processName = client->clientProcessName().value_or(std::string());
        count += client->clientReportingSessionMap().size();
        client->clientReportingSessionMap().visitBehind(0, mostShown - shown.size(), [&](const auto& entry) {
            const auto& [reporterID, session] = entry;
            const auto service = KestoReportingUtilityGenerateServiceNameFromServiceType(session->serviceType());
            shown.emplace_back(foundation::Dictionary{{"process", processName},
                                                      {"pid", client->processIdentifier()},
                                                      {"reporterID", reporterID},
                                                      {"service", service},
                                                      {"started", session->started()}});
        });
    }
    return foundation::Dictionary{
        {"clients", clients_.size()}, {"sessions", count}, {"shown", foundation::Array(std::move(shown))}};
}
