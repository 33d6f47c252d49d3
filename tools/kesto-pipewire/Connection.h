// One connection to a PipeWire server: its events, decoded and fed into a graph of streams.
//
// It only ever looks. It binds clients (for who they are), streams (for their state, volume and format), devices (for
// their state) and, while a stream runs, the profiler (for cycles); links are told by the registry itself.
#pragma once

#include "kesto-pipewire/Graph.h"

#include <pipewire/core.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>

namespace kesto_pipewire {

// All of it on the thread of the context's loop. What it is given outlives it.
class Connection {
public:
    // An object of the server whose events are followed until this is destroyed.
    class Bound;

    // `lost` is called, once, when the server has gone; the connection is then to be destroyed, but not from
    // within that call. Answers nothing when there is no such server.
    [[nodiscard]] static std::unique_ptr<Connection> open(pw_context& context, const std::string& remote, Graph& graph,
                                                          std::function<void()> lost);
    ~Connection();
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;

    [[nodiscard]] Graph& graph() noexcept { return graph_; }
    [[nodiscard]] pw_registry* registry() noexcept { return registry_; }
    // Whether streams run has changed, perhaps.
    void followProfiler();

private:
    Connection(pw_core* core, Graph& graph, std::function<void()> lost);

    void objectAppeared(ObjectID id, std::string_view type, const spa_dict& properties);
    void objectRemoved(ObjectID id);
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
