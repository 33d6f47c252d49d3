// SPDX-License-Identifier: Apache-2.0
// The loss of a server is noticed inside a callback of its connection, which must not destroy the connection: so the
// callback notes the time of the loss, and the loop's next turn handles it.
#include "kesto-pipewire/Observer.h"

#include "platform/linux/process/Environment.h"

#include <pipewire/context.h>
#include <pipewire/extensions/profiler.h>
#include <pipewire/impl.h>
#include <pipewire/keys.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

namespace kesto_pipewire {

namespace {

// A starting server is ready within the first pauses; without a server the program wakes up twice a minute, in case it
// misses the socket's appearance.
constexpr double firstPause = 0.1;
constexpr double longestPause = 30;

// Where PipeWire's own library looks for the server's socket.
std::filesystem::path socketPath(std::string remote)
{
    if (remote.empty())
        remote = platform::environment("PIPEWIRE_REMOTE");
    if (remote.empty())
        remote = "pipewire-0";
    for (const auto* folder : {"PIPEWIRE_RUNTIME_DIR", "XDG_RUNTIME_DIR", "USERPROFILE"})
        if (const auto path = platform::environment(folder); !path.empty())
            return std::filesystem::path(path) / remote; // which an absolute path replaces
    return std::filesystem::path("/run/pipewire") / remote;
}

} // namespace

void Observer::Release::operator()(pw_context* context) const noexcept
{
    pw_context_destroy(context);
}

Observer::Observer(Loop& loop, std::string remote, StreamListener& listener, DeviceListener& deviceListener,
                   const Diagnostics& diagnostics)
    : loop_(loop),
      remote_(std::move(remote)),
      diagnostics_(diagnostics),
      graph_(listener, deviceListener),
      retry_(loop.addTimer([this] { connect(); })),
      loss_(loop.addWakeup([this] { serverWasLost(); })),
      pause_(firstPause)
      // No configuration file: an ordinary client loads it for streams of its own.
      ,
      context_(pw_context_new(loop.raw(), pw_properties_new(PW_KEY_CONFIG_NAME, "null", nullptr), 0))
{
    const auto load = [this](const char* module) {
        return pw_context_load_module(context_.get(), module, nullptr, nullptr) != nullptr;
    };
    if (!context_ || !load("libpipewire-module-protocol-native") || !load(PW_EXTENSION_MODULE_PROFILER))
        throw std::system_error(errno, std::generic_category(), "cannot set up PipeWire's library");
}

Observer::~Observer() = default;

void Observer::start()
{
    connect();
}

void Observer::stop()
{
    loop_.disarm(retry_);
    socketWatch_.reset();
    connection_.reset();
    graph_.endStreams(currentMoment());
    if (const auto ignored = graph_.ignoredObjects())
        diagnostics_.say("{} of PipeWire's objects were ignored, because there were too many at the same time",
                         ignored);
}

void Observer::connect()
{
    if (connection_)
        return;
    connection_ = PipeWireConnection::open(*context_, remote_, graph_, [this] {
        lostAt_ = currentMoment();
        loop_.wake(loss_);
    });
    if (!connection_)
        return waitForServer();
    diagnostics_.detail("connected to PipeWire");
    loop_.disarm(retry_);
    socketWatch_.reset();
    pause_ = firstPause;
}

void Observer::waitForServer()
{
    if (!socketWatch_) {
        diagnostics_.say("waiting for PipeWire at {}", socketPath(remote_).string());
        socketWatch_.emplace(loop_, socketPath(remote_), [this] {
            pause_ = firstPause;
            loop_.arm(retry_, 0); // later, because this watch must not be destroyed from within its own callback
        });
    }
    loop_.arm(retry_, pause_);
    pause_ = std::min(pause_ * 2, longestPause);
}

void Observer::serverWasLost()
{
    if (!connection_)
        return;
    diagnostics_.say("PipeWire has gone");
    connection_.reset();
    graph_.clear(lostAt_);
    waitForServer();
}

} // namespace kesto_pipewire
