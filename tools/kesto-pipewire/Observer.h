// Keeps a connection to PipeWire and tells what happens to its streams and devices, whatever happens to the server.
//
// When the server goes, every stream goes with it, and the observer waits for the next one: the appearance
// of its socket wakes it at once, a timer with growing pauses covers what that misses.
#pragma once

#include "kesto-pipewire/Connection.h"
#include "kesto-pipewire/Diagnostics.h"
#include "kesto-pipewire/FileWatch.h"
#include "kesto-pipewire/Graph.h"
#include "kesto-pipewire/Loop.h"
#include "kesto-pipewire/Stream.h"

#include <memory>
#include <optional>
#include <string>

struct pw_context;

namespace kesto_pipewire {

// All of it on the loop's thread. The loop, the listeners and the diagnostics outlive it.
class Observer {
public:
    // `remote` is a server's name or its socket's path; empty means what PipeWire's programs use by default.
    // Throws std::system_error when PipeWire's library cannot be set up.
    Observer(Loop& loop, std::string remote, StreamListener& listener, DeviceListener& deviceListener,
             const Diagnostics& diagnostics);
    ~Observer();
    Observer(const Observer&) = delete;
    Observer& operator=(const Observer&) = delete;

    // Connects, now or as soon as there is a server, and again whenever it comes back.
    void start();
    // Ends the observation: every stream is told to be gone.
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
    Source loss_; // a connection cannot be taken down from within its own callback
    Moment lostAt_;
    double pause_;
    std::optional<FileWatch> socketWatch_;
    std::unique_ptr<pw_context, Release> context_;
    std::unique_ptr<Connection> connection_;
};

} // namespace kesto_pipewire
