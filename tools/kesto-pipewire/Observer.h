// SPDX-License-Identifier: Apache-2.0
// Keeps a connection to PipeWire, across restarts of the server, and reports changes of its streams and devices.
//
// When the server goes, every stream goes with it, and the observer waits for the next server: the appearance of its
// socket wakes the observer immediately, and a timer with growing pauses covers a missed appearance.
#pragma once

#include "kesto-pipewire/Diagnostics.h"
#include "kesto-pipewire/FileWatch.h"
#include "kesto-pipewire/Graph.h"
#include "kesto-pipewire/Loop.h"
#include "kesto-pipewire/PipeWireConnection.h"
#include "kesto-pipewire/Stream.h"

#include <memory>
#include <optional>
#include <string>

struct pw_context;

namespace kesto_pipewire {

// All functions run on the loop's thread. The loop, the listeners and the diagnostics must outlive it.
class Observer {
public:
    // `remote` is a server's name or its socket's path; empty means the default of PipeWire's programs. Throws
    // std::system_error if PipeWire's library cannot be set up.
    Observer(Loop& loop, std::string remote, StreamListener& listener, DeviceListener& deviceListener,
             const Diagnostics& diagnostics);
    ~Observer();
    Observer(const Observer&) = delete;
    Observer& operator=(const Observer&) = delete;

    // Connects, now or when a server starts, and again whenever it comes back.
    void start();
    // Ends the observation: reports every stream as gone.
    void stop();

private:
    struct Release {
        void operator()(pw_context* context) const noexcept;
    };

    void connect();
    void waitForServer();
    void serverWasLost();

    Loop& loop_;
    std::string remote_;
    const Diagnostics& diagnostics_;
    Graph graph_;
    Source retry_;
    Source loss_; // a connection must not be destroyed from within its own callback
    Moment lostAt_;
    double pause_;
    std::optional<FileWatch> socketWatch_;
    std::unique_ptr<pw_context, Release> context_;
    std::unique_ptr<PipeWireConnection> connection_;
};

} // namespace kesto_pipewire
