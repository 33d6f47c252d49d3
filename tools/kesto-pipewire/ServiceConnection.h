// The reporting service behind a connection: the reporter's calls, handed to libkesto.
//
// libkesto connects again by itself but does not know what a session is made of. This tells, on the loop's
// thread, when a new connection stands, so that the reporter can make its sessions anew.
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

// All of it on the loop's thread. The loop and the diagnostics outlive it.
class ServiceConnection : public ReportingService {
public:
    struct Handlers {
        std::function<void()> appeared; // a new connection, whose service knows nothing
        std::function<void()> lost;
    };

    // An empty path means where the service is by default.
    ServiceConnection(Loop& loop, std::string socketPath, const Diagnostics& diagnostics);
    ~ServiceConnection() override;

    // Begins to connect. Throws std::system_error when the system grants nothing to do it with.
    void open(Handlers handlers);
    // Delivers what was given so far, waiting for a moment at most, and ends. Answers whether all of it arrived.
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
    std::atomic<std::uint64_t> connections_ = 0; // that were made
    std::atomic<bool> isConnected_ = false;
    std::uint64_t handledConnections_ = 0;
    bool saidThatItIsAway_ = false;
    std::uint64_t refusedCalls_ = 0;
    kesto::Message message_; // used again for every call, so that none allocates
    kesto::Tracer tracer_; // emits nothing while nobody traces
    kesto::Client client_; // last: its thread ends before what its callback uses
};

} // namespace kesto_pipewire
