// SPDX-License-Identifier: Apache-2.0
// One connection to a PipeWire server: its events, decoded and fed into a graph of streams.
//
// It only observes. It binds clients (for their identity), streams (for their state, volume and format), filters from
// their first link with a device on (for their state), devices (for their state and rate) and, while a stream runs, the
// profiler (for cycles); the registry itself reports links.
#pragma once

#include "kesto-pipewire/Graph.h"

#include <pipewire/core.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>

namespace kesto_pipewire {

// All functions run on the thread of the context's loop. Its arguments must outlive it.
class PipeWireConnection {
public:
    // Follows the events of one object of the server until it is destroyed.
    class Bound;

    // Calls `lost`, once, when the server has gone; the owner must then destroy the connection, but not from within
    // that call. Returns null if the server is not running.
    [[nodiscard]] static std::unique_ptr<PipeWireConnection> open(pw_context& context, const std::string& remote,
                                                                  Graph& graph, std::function<void()> lost);
    ~PipeWireConnection();
    PipeWireConnection(const PipeWireConnection&) = delete;
    PipeWireConnection& operator=(const PipeWireConnection&) = delete;

    [[nodiscard]] Graph& graph() noexcept { return graph_; }
    [[nodiscard]] pw_registry* registry() noexcept { return registry_; }
    // Called when the running streams may have changed.
    void followProfiler();

private:
    PipeWireConnection(pw_core* core, Graph& graph, std::function<void()> lost);

    void objectAppeared(ObjectID id, std::string_view type, const spa_dict& properties);
    void objectRemoved(ObjectID id);
    void linkAppeared(ObjectID id, const spa_dict& properties);
    void nodeAppeared(ObjectID id, const spa_dict& properties);
    void failed(ObjectID id, int error);

    static const pw_core_events coreEvents;
    static const pw_registry_events registryEvents;

    Graph& graph_;
    std::function<void()> lost_;
    pw_core* core_;
    spa_hook coreHook_{};
    pw_registry* registry_;
    spa_hook registryHook_{};
    std::unordered_map<ObjectID, std::unique_ptr<Bound>> bound_;
    std::optional<ObjectID> profilerID_;
    std::unique_ptr<Bound> profiler_;
};

} // namespace kesto_pipewire
