// SPDX-License-Identifier: Apache-2.0
// The interface that the service exports on every client connection.
//
// Every operation is one-way. It answers through its reply, perhaps later than operations that were called after it,
// and one operation answers twice. Clients choose reporter IDs; 0 means no session.
#pragma once

#include "foundation/values/Value.h"
#include "utility/MessageKinds.h"
#include "utility/Reply.h"

#include <cstdint>
#include <optional>
#include <tuple>
#include <vector>

// Called on a connection thread; replies are called on the server queue.
class KestoReportingServiceProtocol {
public:
    using SuccessReply = utility::ResultReply<bool>;
    using ServiceTypeReply = utility::ResultReply<AudioServiceType>;
    using DictionaryReply = utility::ResultReply<const foundation::Dictionary&>;
    using ReporterIDs = std::vector<std::int64_t>;
    using ReportersReply = utility::ResultReply<const ReporterIDs&>;

    virtual ~KestoReportingServiceProtocol() = default;

    // In the order of `client::serviceOperations`.
    virtual void createReportingSession(std::int64_t reporterID, SuccessReply reply) = 0;
    virtual void setServiceType(AudioServiceType serviceType, std::int64_t reporterID, SuccessReply reply) = 0;
    // Answers ID 0 twice: first 65535, without a wait, and then what the look-up finds.
    virtual void getServiceNameForReporterID(std::int64_t reporterID, ServiceTypeReply reply) = 0;
    virtual void setConfiguration(foundation::Dictionary configuration, std::int64_t reporterID,
                                  SuccessReply reply) = 0;
    // Answered when the started session's work ends.
    virtual void startReportingSessionForID(std::int64_t reporterID, SuccessReply reply) = 0;
    // No list means all started sessions of all clients.
    virtual void sendMessage(foundation::Dictionary message, AudioEventCategory category, std::uint16_t type,
                             std::optional<ReporterIDs> reporterIDs, utility::Reply reply) = 0;
    virtual void stopReportingSessionForID(std::int64_t reporterID, SuccessReply reply) = 0;
    virtual void destroyReportingSession(std::int64_t reporterID, SuccessReply reply) = 0;
    // Answers {"reporterID", "serviceType"}; they are 0 and 65535 without such a session.
    virtual void reporterID(std::int64_t reporterID, DictionaryReply valid) = 0;
    virtual void getAllReporters(ReportersReply reply) = 0;
    // Ends the process with exit status 2; the reply is never called.
    virtual void killService(SuccessReply reply) = 0;
};

namespace client {

// In the same order.
inline constexpr std::tuple serviceProtocolFunctions{
    &KestoReportingServiceProtocol::createReportingSession,
    &KestoReportingServiceProtocol::setServiceType,
    &KestoReportingServiceProtocol::getServiceNameForReporterID,
    &KestoReportingServiceProtocol::setConfiguration,
    &KestoReportingServiceProtocol::startReportingSessionForID,
    &KestoReportingServiceProtocol::sendMessage,
    &KestoReportingServiceProtocol::stopReportingSessionForID,
    &KestoReportingServiceProtocol::destroyReportingSession,
    &KestoReportingServiceProtocol::reporterID,
    &KestoReportingServiceProtocol::getAllReporters,
    &KestoReportingServiceProtocol::killService,
};

} // namespace client
