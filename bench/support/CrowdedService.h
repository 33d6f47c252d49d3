// SPDX-License-Identifier: Apache-2.0
// A service inside this process with any number of clients, without the delays of sockets.
#pragma once

#include "platform/Connection.h"
#include "service/KestoReportingServiceDelegate.h"
#include "support/Harness.h"

#include <stdexcept>

namespace bench {

// The IDs of the clients' sessions count up from 1.
class CrowdedService {
public:
    static constexpr std::int64_t sessionsEach = 10;
    enum class Sessions : std::uint8_t { Created, Started };

    explicit CrowdedService(std::int64_t clients, Sessions sessions = Sessions::Created)
    {
        constexpr int createReportingSession = 1;
        constexpr int startReporterID = 5;
        NoListener listener;
        for (std::int64_t client = 0; client < clients; ++client) {
            const auto& connection = connections_.emplace_back(std::make_shared<Connection>());
            service_->shouldAcceptNewConnection(listener, connection);
            for (std::int64_t session = 1; session <= sessionsEach; ++session) {
                connection->deliver({1, createReportingSession, client * sessionsEach + session});
                if (sessions == Sessions::Started)
                    connection->deliver({2, startReporterID, client * sessionsEach + session});
            }
        }
    }

    // Pending answers hold their connections, which hold the handlers.
    ~CrowdedService()
    {
        for (const auto& connection : connections_)
            connection->end();
    }
    CrowdedService(const CrowdedService&) = delete;
    CrowdedService& operator=(const CrowdedService&) = delete;

    void find(std::int64_t reporterID)
    {
        const auto session = service_->findReportingSessionForID(reporterID);
        if (!session)
            throw std::runtime_error("a session is not found");
        use(session);
    }

private:
    class NoListener final : public platform::ConnectionListener {
        void setDelegate(platform::ConnectionListenerDelegate&) override { }
        void resume() override { }
        void stop() override { }
    };

    // A connection without a socket: it delivers the calls that the measurement makes.
    class Connection final : public platform::Connection, public std::enable_shared_from_this<Connection> {
    public:
        void deliver(foundation::Array call) { (void)callHandler_({std::move(call), shared_from_this()}); }
        void end() { callHandler_ = nullptr; }

    private:
        [[nodiscard]] std::int32_t processIdentifier() const override { return 1; }
        [[nodiscard]] std::uint32_t userIdentifier() const override { return 0; }
        [[nodiscard]] std::string description() const override { return "connection"; }
        void setCallHandler(CallHandler handler) override { callHandler_ = std::move(handler); }
        void setInterruptionHandler(EndHandler) override { }
        void setInvalidationHandler(EndHandler) override { }
        void setLane(std::shared_ptr<platform::Lane>, std::shared_ptr<ledger::Workload>) override { }
        void setLogShare(std::shared_ptr<platform::LogShare>) override { }
        void resume() override { }
        void send(platform::Turn&, std::string) override { }
        void write(std::string) override { }

        CallHandler callHandler_;
    };

    std::vector<std::shared_ptr<Connection>> connections_;
    std::shared_ptr<KestoReportingServiceDelegate> service_ = KestoReportingServiceDelegate::make();
};

} // namespace bench
