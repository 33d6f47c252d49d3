// SPDX-License-Identifier: Apache-2.0
// The reporting service behind a connection: passes the reporter's calls to libkesto.
//
// libkesto connects again without help, but does not create sessions again. This class reports a new connection on the
// loop's thread, so that the reporter can create its sessions again.
#pragma once

#include "kesto-pipewire/Diagnostics.h"
#include "kesto-pipewire/Loop.h"
#include "kesto-pipewire/ReportingService.h"

#include <kesto/trace.hpp>

#include <atomic>
#include <cstdint>
#include <functional>
#include <string>

namespace kesto_pipewire {

// All functions run on the loop's thread. The loop and the diagnostics must outlive it.
class LibkestoService : public ReportingService {
public:
    struct Handlers {
        std::function<void()> appeared; // the new connection has no sessions
        std::function<void()> lost;
    };

    // An empty path means the service's default.
    LibkestoService(Loop& loop, std::string socketPath, const Diagnostics& diagnostics);
    ~LibkestoService() override;

    // Starts connecting. Throws std::system_error if the system refuses a resource.
    void open(Handlers handlers);
    // Delivers the pending calls, waiting only a moment, and closes. Returns whether all of them arrived.
    [[nodiscard]] bool close();

    void create(ReporterID session) override;
    void setServiceType(ReporterID session, ServiceType type) override;
    void setConfiguration(ReporterID session, const Payload& configuration) override;
    void start(ReporterID session) override;
    void send(ReporterID session, Category category, EventType type, const Payload& message) override;
    void stop(ReporterID session) override;
    void destroy(ReporterID session) override;

private:
    void stateChanged(const kesto::StateChange& change); // on libkesto's thread
    void handleState();
    template <typename Describe> void note(ReporterID session, kesto::Status status, Describe describe);
    const kesto::Message& encode(const Payload& payload);

    Loop& loop_;
    const std::string socketPath_;
    const Diagnostics& diagnostics_;
    Handlers handlers_;
    Source stateSignal_;
    std::atomic<std::uint64_t> connections_ = 0; // the number of connections so far
    std::atomic<bool> isConnected_ = false;
    std::uint64_t handledConnections_ = 0;
    bool hasReportedAbsence_ = false;
    std::uint64_t refusedCalls_ = 0;
    kesto::Message message_; // used for every call, so that calls do not allocate
    kesto::Tracer tracer_; // emits nothing while no trace runs
    kesto::Client client_; // declared last: its thread must end before the members that its callback uses
};

} // namespace kesto_pipewire
